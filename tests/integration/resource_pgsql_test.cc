// The "pgsql-db" worker against the PostgreSQL server that the platform's service
// manager runs: roles and databases made, used by the package's role, kept or dropped.
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;

namespace {

const char kPrivilege[] = R"({"defaults":{"run-as":"package"},"username":"%s"})";

std::string privilegeFor(const std::string& user) {
    std::string text = kPrivilege;
    text.replace(text.find("%s"), 2, user);
    return text;
}

class ResourcePgsql : public ::testing::Test {
  protected:
    void SetUp() override {
        if (!testutil::exists("/usr/bin/psql")) {
            GTEST_SKIP() << "PostgreSQL is not installed (scripts/setup-deps.sh installs it)";
        }
        ASSERT_EQ(VLIBServiceStart("pgsql", 0), 0)
            << testutil::readFile("/var/log/corv-init/pgsql.log");
    }

    // A package, by default "notes" run by the user "notes", registered with this request.
    PackageInfo Registered(const std::string& resource, const std::string& name = "notes",
                           const std::string& user = "") {
        testutil::TestPackage pkg(name);
        pkg.conf["privilege"] = privilegeFor(user.empty() ? name : user);
        pkg.conf["resource"] = resource;
        testutil::installFixture(pkg);
        PackageInfo info;
        EXPECT_TRUE(PMSLoadPKGInfoFile("/var/packages/" + name, info, nullptr, PKG_INFO_MASK_ALL));
        return info;
    }

    static bool Acquire(const PackageInfo& info, PKG_INSTALLATION_TYPE type = PKG_INSTALL) {
        CORV::PkgUtils::WorkerResp resp;
        return Resource::Acquire(Resource::TIMING_PREINST, info, type, resp, nullptr, "");
    }
    static bool Release(const PackageInfo& info, PKG_INSTALLATION_TYPE type = PKG_UNINSTALL) {
        CORV::PkgUtils::WorkerResp resp;
        return Resource::Release(Resource::TIMING_PREUNINST, info, type, resp, nullptr, "");
    }

    // A query as the superuser, or as `role` on `db`; the trimmed output.
    static std::string Sql(const std::string& query, const std::string& role = "postgres",
                           const std::string& db = "postgres") {
        testutil::RunResult r =
            testutil::run("/usr/bin/psql", {"-X", "-q", "-U", role, "-d", db, "-tAc", query});
        std::string out = r.status == 0 ? r.out : "error: " + r.err;
        while (!out.empty() && out.back() == '\n') {
            out.pop_back();
        }
        return out;
    }
    // A backend goes on for a moment after its client has gone; until then the server
    // refuses to drop its database.
    static void WaitIdle(const std::string& db) {
        const std::string query =
            "SELECT count(*) FROM pg_stat_activity WHERE datname = '" + db + "'";
        for (int i = 0; i < 100 && Sql(query) != "0"; ++i) {
            usleep(20000);
        }
    }
    static std::string Databases() {
        return Sql(
            "SELECT string_agg(datname, ' ' ORDER BY datname) FROM pg_database "
            "WHERE NOT datistemplate AND datname <> 'postgres'");
    }
    static std::string Own(const std::string& name = "notes") {
        Json::Value own;
        Resource::GetOwnObject(name, "pgsql-db", own);
        return toString(own);
    }
};

TEST_F(ResourcePgsql, ThePackageRoleUsesItsDatabasesUntilUninstallDropsThem) {
    Sql("CREATE ROLE readers");
    PackageInfo info = Registered(R"({"pgsql-db":{
        "create-user": true,
        "grant-user": {"group": ["readers", "nobody_here"], "createdb": true},
        "create-database": [{"db-name": "notes_main", "db-encoding": "UTF8"},
                            {"db-name": "notes_plain", "db-encoding": "LATIN1"},
                            {"db-encoding": "UTF8"}],
        "drop-db-uninst": true, "drop-user-uninst": true}})");
    ASSERT_TRUE(Acquire(info));
    EXPECT_EQ(Own(), R"({"db-created":["notes_main","notes_plain"]})");

    // The package's own role, with no password: the platform's server trusts local users.
    EXPECT_EQ(Sql("CREATE TABLE memo (t text); INSERT INTO memo VALUES ('hi'); "
                  "SELECT t FROM memo",
                  "notes", "notes_main"),
              "hi");
    EXPECT_EQ(Sql("SELECT pg_encoding_to_char(encoding) || ' ' || "
                  "pg_get_userbyid(datdba) FROM pg_database WHERE datname = 'notes_main'"),
              "UTF8 notes");
    EXPECT_EQ(Sql("SELECT pg_encoding_to_char(encoding) FROM pg_database "
                  "WHERE datname = 'notes_plain'"),
              "SQL_ASCII")
        << "only UTF8 changes the encoding";
    EXPECT_EQ(Sql("SELECT rolcreatedb FROM pg_roles WHERE rolname = 'notes'"), "t");
    EXPECT_EQ(Sql("SELECT pg_has_role('notes', 'readers', 'MEMBER')"), "t");

    // A database the role made itself goes with the others.
    ASSERT_EQ(Sql("CREATE DATABASE notes_extra", "notes", "notes_main"), "");
    WaitIdle("notes_main");
    ASSERT_TRUE(Release(info));
    EXPECT_EQ(Databases(), "");
    EXPECT_EQ(Sql("SELECT count(*) FROM pg_roles WHERE rolname = 'notes'"), "0");
}

TEST_F(ResourcePgsql, AnUpgradeKeepsTheDataAndTheCollisionPolicyDecides) {
    PackageInfo info = Registered(R"({"pgsql-db":{"create-user": true,
        "create-database": [{"db-name": "notes_main", "db-collision": "skip"}],
        "drop-db-uninst": true}})");
    ASSERT_TRUE(Acquire(info));
    Sql("CREATE TABLE memo (t text); INSERT INTO memo VALUES ('kept')", "notes", "notes_main");
    WaitIdle("notes_main");

    ASSERT_TRUE(Release(info, PKG_UPGRADE));
    ASSERT_TRUE(Acquire(info, PKG_UPGRADE)) << "skip: the database is there, and stays";
    EXPECT_EQ(Sql("SELECT t FROM memo", "notes", "notes_main"), "kept");
    WaitIdle("notes_main");
    EXPECT_EQ(Own(), R"({"db-created":["notes_main"]})") << "and is dropped with the package";

    ASSERT_TRUE(Release(info));
    EXPECT_EQ(Databases(), "");
    EXPECT_EQ(Sql("SELECT count(*) FROM pg_roles WHERE rolname = 'notes'"), "1")
        << "the role stays without drop-user-uninst";
}

TEST_F(ResourcePgsql, CollisionsWithADatabaseThatIsThere) {
    struct Case {
        const char* collision;  // "" for none
        bool acquired;
        const char* owner;  // afterwards
        const char* rows;   // of the table that stood there
    };
    const std::vector<Case> cases = {
        {"skip", true, "notes", "1"},
        {"drop", true, "notes", "error"},
        {"", false, "postgres", "1"},
        {"merge", false, "postgres", "1"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string("db-collision: ") + c.collision);
        Sql("DROP DATABASE IF EXISTS notes_main");
        Sql("CREATE DATABASE notes_main");
        Sql("CREATE TABLE old (x int); INSERT INTO old VALUES (1)", "postgres", "notes_main");
        WaitIdle("notes_main");
        std::string db = R"({"db-name": "notes_main")";
        if (*c.collision != '\0') {
            db += std::string(R"(, "db-collision": ")") + c.collision + "\"";
        }
        PackageInfo info =
            Registered(R"({"pgsql-db":{"create-user": true, "create-database": [)" + db + "}]}}");
        EXPECT_EQ(Acquire(info), c.acquired);
        EXPECT_EQ(Sql("SELECT pg_get_userbyid(datdba) FROM pg_database "
                      "WHERE datname = 'notes_main'"),
                  c.owner);
        const std::string rows = Sql("SELECT count(*) FROM old", "postgres", "notes_main");
        EXPECT_EQ(rows.rfind("error", 0) == 0 ? "error" : rows, c.rows);
    }
}

TEST_F(ResourcePgsql, ASecondPackageCannotTakeTheFirstOnesDatabase) {
    PackageInfo first = Registered(R"({"pgsql-db":{"create-user": true,
        "create-database": [{"db-name": "shared_db"}], "drop-db-uninst": true}})",
                                   "first");
    ASSERT_TRUE(Acquire(first));
    Sql("CREATE TABLE mine (x int); INSERT INTO mine VALUES (7)", "first", "shared_db");
    PackageInfo second = Registered(R"({"pgsql-db":{"create-user": true,
        "create-database": [{"db-name": "shared_db"}], "drop-db-uninst": true}})",
                                    "second");
    EXPECT_FALSE(Acquire(second));
    EXPECT_EQ(Own("second"), R"({"db-created":[]})");
    EXPECT_EQ(Sql("SELECT x FROM mine", "first", "shared_db"), "7");
    ASSERT_TRUE(Release(second));
    EXPECT_EQ(Sql("SELECT x FROM mine", "first", "shared_db"), "7")
        << "the second package's uninstall drops only what it holds";
}

TEST_F(ResourcePgsql, MalformedSectionsAndInjectedNamesAreRefused) {
    struct Case {
        const char* section;
    };
    const std::vector<Case> cases = {
        {R"({"create-user": true, "create-database": {"db-name": "x"}})"},
        {R"({"create-user": true, "create-database": [{"db-name": 5}]})"},
        {R"({"create-user": true, "create-database": [{"db-name": ""}]})"},
        {R"({"create-user": true, "create-database": [{"db-name": "x'; DROP DATABASE keep; --"}]})"},
        {R"({"create-user": true, "create-database": [{"db-name": "x\"; DROP DATABASE keep; --"}]})"},
        {R"({"create-user": true, "create-database": [{"db-name": "-Tkeep"}]})"},
        {R"({"create-user": true, "create-database": [{"db-name": "a b"}]})"},
        {R"({"create-user": true, "grant-user": {"group": ["pg'; DROP DATABASE keep; --"]}})"},
        {R"({"create-user": true, "grant-user": {"group": "readers"}})"},
    };
    Sql("CREATE DATABASE keep");
    for (const Case& c : cases) {
        SCOPED_TRACE(c.section);
        PackageInfo info = Registered(std::string(R"({"pgsql-db":)") + c.section + "}");
        EXPECT_FALSE(Acquire(info));
        EXPECT_EQ(Databases(), "keep");
    }
    // The role is the package's user, which must itself be a plain name.
    PackageInfo info = Registered(R"({"pgsql-db":{"create-user": true}})", "odd", "odd'name");
    EXPECT_FALSE(Acquire(info));
    EXPECT_EQ(Sql("SELECT count(*) FROM pg_roles WHERE rolname LIKE 'odd%'"), "0");
}

TEST_F(ResourcePgsql, WithPostgresDownTheInstallFailsBeforePreinst) {
    ASSERT_EQ(VLIBServiceStop("pgsql", 0), 0);
    testutil::TestPackage pkg = testutil::recordingPackage("notes");
    pkg.conf["privilege"] = privilegeFor("notes");
    pkg.conf["resource"] =
        R"({"service-cfg":{}, "pgsql-db":{"create-user": true,
            "create-database": [{"db-name": "notes_main"}]}})";
    PackageManager pm;
    EXPECT_EQ(testutil::installBuilt(pm, pkg), 0);
    EXPECT_TRUE(testutil::scriptsRan("notes").empty()) << "preinst never ran";
    EXPECT_FALSE(testutil::exists("/var/packages/notes"));

    ASSERT_EQ(VLIBServiceStart("pgsql", 0), 0);
    PackageManager again;
    ASSERT_EQ(testutil::installBuilt(again, pkg), 1) << toString(again.getJsonParam("worker_msg"));
    EXPECT_EQ(Sql("SELECT 1", "notes", "notes_main"), "1");
}

}  // namespace
