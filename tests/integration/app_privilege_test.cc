// Desktop application rights granted when a package starts, with the platform's privilege
// store, group membership, directory state and application configuration underneath.
#include <gtest/gtest.h>

#include <map>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "corv/app_priv.h"
#include "corv/nds_jsconfig.h"
#include "corv/vlibc.h"
#include "corvpkg/corvpkg.h"
#include "support/files.h"
#include "support/run.h"

namespace {

using Grants = std::map<std::string, std::set<std::string>>;

// Accounts of every case: alice is an administrator through a supplementary group, bob
// through his primary group, carol is none; "admin" and "corvelcms" are administrators
// too but the system's own accounts.
void makeAccounts() {
    const std::vector<std::vector<std::string>> commands = {
        {"/usr/sbin/groupadd", "administrators"},
        {"/usr/sbin/useradd", "-M", "alice"},
        {"/usr/sbin/usermod", "-aG", "administrators", "alice"},
        {"/usr/sbin/useradd", "-M", "-g", "administrators", "bob"},
        {"/usr/sbin/useradd", "-M", "carol"},
        {"/usr/sbin/useradd", "-M", "-G", "administrators", "admin"},
        {"/usr/sbin/useradd", "-M", "-G", "administrators", "corvelcms"},
    };
    for (const auto& command : commands) {
        std::vector<std::string> args(command.begin() + 1, command.end());
        testutil::RunResult r = testutil::run(command[0], args);
        ASSERT_EQ(r.status, 0) << command[0] << " " << args.back() << ": " << r.err;
    }
}

Json::Value parse(const std::string& text) {
    Json::Value value;
    Json::Reader reader;
    EXPECT_TRUE(reader.parse(text, value)) << text;
    return value;
}

struct Store {
    Grants users;
    Grants groups;
    Grants denied;  // of users and groups alike: nothing here denies
};

Store readStore() {
    Store store;
    if (!testutil::exists(APP_PRIV_STORE_PATH)) {
        return store;
    }
    Json::Value root = parse(testutil::readFile(APP_PRIV_STORE_PATH));
    for (const char* kind : {"users", "groups"}) {
        for (const std::string& name : root[kind].getMemberNames()) {
            for (const Json::Value& app : root[kind][name]["allow"]) {
                (kind[0] == 'u' ? store.users : store.groups)[name].insert(app.asString());
            }
            for (const Json::Value& app : root[kind][name]["deny"]) {
                store.denied[name].insert(app.asString());
            }
        }
    }
    return store;
}

void resetSystem(const std::vector<std::pair<std::string, std::string>>& units,
                 const std::string& directory) {
    testutil::removeAll(APP_PRIV_STORE_PATH);
    testutil::removeAll(NDS_JSCONFIG_DIR);
    testutil::removeAll(CORV_DIRECTORY_CONF);
    for (const auto& unit : units) {
        testutil::writeFile(std::string(NDS_JSCONFIG_DIR "/") + unit.first + ".json", unit.second);
    }
    if (!directory.empty()) {
        testutil::writeFile(CORV_DIRECTORY_CONF, directory);
    }
}

std::string show(const Grants& grants) {
    std::string out;
    for (const auto& entry : grants) {
        out += entry.first + ":";
        for (const std::string& app : entry.second) {
            out += " " + app;
        }
        out += "; ";
    }
    return out;
}

const char kLdap[] = "ldap_bound=\"yes\"\nldap_suffix=\"corp.example.com\"\n";
const char kDomain[] =
    "wins_joined=\"yes\"\ndomain_admin_groups=\"CORP\\Domain Admins, CORP\\Enterprise Admins\"\n";
const char kLocalAdvanced[] =
    R"({"app.X": {"grantPrivilege": "local", "advanceGrantPrivilege": true}})";
const char kAllAdvanced[] =
    R"({"app.X": {"grantPrivilege": "all", "advanceGrantPrivilege": true}})";
const char kLocalPlain[] = R"({"app.X": {"grantPrivilege": "local"}})";

struct Case {
    const char* what;
    std::vector<std::pair<std::string, std::string>> units;
    std::string directory;
    const char* user;
    std::string apps;
    const char* language;
    Grants users;
    Grants groups;
};

const std::set<std::string> kX = {"app.X"};

}  // namespace

TEST(AppPrivilege, GrantsFollowTheDesktopConfiguration) {
    makeAccounts();
    const std::vector<Case> cases = {
        {"a plain grant goes to the administrators by name, not to the system accounts",
         {{"apps", kLocalPlain}},
         "",
         "carol",
         "app.X",
         "enu",
         {{"alice", kX}, {"bob", kX}},
         {}},
        {"the first unit by name with a valid grant wins",
         {{"a", kLocalAdvanced}, {"b", kLocalPlain}},
         "",
         nullptr,
         "app.X",
         "enu",
         {},
         {{"administrators", kX}}},
        {"units go by name, not by number",
         {{"9-late", kLocalAdvanced}, {"10-early", kLocalPlain}},
         "",
         nullptr,
         "app.X",
         "enu",
         {{"alice", kX}, {"bob", kX}},
         {}},
        {"\"none\", entries that are no object and grants that are no text are passed over",
         {{"a", R"({"app.X": {"grantPrivilege": "none", "advanceGrantPrivilege": true}})"},
          {"b", R"({"app.X": "local"})"},
          {"c", R"({"app.X": {"grantPrivilege": 1, "advanceGrantPrivilege": true}})"},
          {"d", R"({"other": {"grantPrivilege": "all", "advanceGrantPrivilege": true}})"},
          {"e", R"({"app.X": {"grantPrivilege": "all"}})"}},
         "",
         nullptr,
         "app.X",
         "enu",
         {{"alice", kX}, {"bob", kX}},
         {}},
        {"configablePrivilege false or not a boolean keeps the application out; true and "
         "missing let it in",
         {{"a", R"({"app.F": {"grantPrivilege": "local", "configablePrivilege": false,
                              "advanceGrantPrivilege": true},
                   "app.S": {"grantPrivilege": "local", "configablePrivilege": "yes"},
                   "app.T": {"grantPrivilege": "local", "configablePrivilege": true}})"},
          {"b", R"({"app.F": {"grantPrivilege": "local"}})"}},
         "",
         "alice",
         "app.F app.S app.T",
         "enu",
         {{"alice", {"app.T"}}, {"bob", {"app.T"}}},
         {}},
        {"an administrator who acts gets a group-granted application by name",
         {{"apps", kLocalAdvanced}},
         "",
         "alice",
         "app.X",
         "enu",
         {{"alice", kX}},
         {{"administrators", kX}}},
        {"an administrator through the primary group too",
         {{"apps", kLocalAdvanced}},
         "",
         "bob",
         "app.X",
         "enu",
         {{"bob", kX}},
         {{"administrators", kX}}},
        {"one who is no administrator gets nothing by name",
         {{"apps", kLocalAdvanced}},
         "",
         "carol",
         "app.X",
         "enu",
         {},
         {{"administrators", kX}}},
        {"an unknown user gets nothing by name",
         {{"apps", kLocalAdvanced}},
         "",
         "nobody-here",
         "app.X",
         "enu",
         {},
         {{"administrators", kX}}},
        {"\"admin\" never gets a grant by name",
         {{"apps", kLocalAdvanced}},
         "",
         "admin",
         "app.X",
         "enu",
         {},
         {{"administrators", kX}}},
        {"\"CorvelCMS\" never gets a grant by name, whatever its case",
         {{"apps", kLocalAdvanced}},
         "",
         "corvelcms",
         "app.X",
         "enu",
         {},
         {{"administrators", kX}}},
        {"local and advanced: administrators only, even bound and on a domain",
         {{"apps", kLocalAdvanced}},
         std::string(kLdap) + kDomain,
         nullptr,
         "app.X",
         "enu",
         {},
         {{"administrators", kX}}},
        {"all and advanced on LDAP: the suffixed administrators too",
         {{"apps", kAllAdvanced}},
         kLdap,
         nullptr,
         "app.X",
         "enu",
         {},
         {{"administrators", kX}, {"administrators@corp.example.com", kX}}},
        {"all and advanced on a domain: the domain's administrator groups too",
         {{"apps", kAllAdvanced}},
         kDomain,
         nullptr,
         "app.X",
         "enu",
         {},
         {{"administrators", kX}, {"CORP\\Domain Admins", kX}, {"CORP\\Enterprise Admins", kX}}},
        {"all and advanced, bound and joined",
         {{"apps", kAllAdvanced}},
         std::string(kLdap) + kDomain,
         nullptr,
         "app.X",
         "enu",
         {},
         {{"administrators", kX},
          {"administrators@corp.example.com", kX},
          {"CORP\\Domain Admins", kX},
          {"CORP\\Enterprise Admins", kX}}},
        {"bound without a suffix: the grant ends after the administrators",
         {{"apps", kAllAdvanced}},
         std::string("ldap_bound=\"yes\"\n") + kDomain,
         nullptr,
         "app.X",
         "enu",
         {},
         {{"administrators", kX}}},
        {"not bound, not joined: the administrators alone",
         {{"apps", kAllAdvanced}},
         "ldap_bound=\"no\"\nldap_suffix=\"corp.example.com\"\n",
         nullptr,
         "app.X",
         "enu",
         {},
         {{"administrators", kX}}},
        {"each application keeps its own grant value",
         {{"apps", R"({"app.N": {"grantPrivilege": "local", "configablePrivilege": false},
                      "app.A": {"grantPrivilege": "all", "advanceGrantPrivilege": true},
                      "app.L": {"grantPrivilege": "local", "advanceGrantPrivilege": true}})"}},
         kLdap,
         nullptr,
         "app.N app.A app.L",
         "enu",
         {},
         {{"administrators", {"app.A", "app.L"}}, {"administrators@corp.example.com", {"app.A"}}}},
        {"blanks around and between ids; unknown ids pass",
         {{"apps",
           R"({"app.X": {"grantPrivilege": "local"}, "app.Y": {"grantPrivilege": "all"}})"}},
         "",
         nullptr,
         "  app.X \t unknown.app   app.Y ",
         "enu",
         {{"alice", {"app.X", "app.Y"}}, {"bob", {"app.X", "app.Y"}}},
         {}},
        {"no applications: nothing", {{"apps", kLocalPlain}}, "", "alice", "", "enu", {}, {}},
        {"no language: nothing", {{"apps", kLocalPlain}}, "", "alice", "app.X", nullptr, {}, {}},
        {"no configuration: nothing", {}, "", "alice", "app.X", "enu", {}, {}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string(c.what) + " | user=" + (c.user ? c.user : "(null)") + " apps='" +
                     c.apps + "' directory='" + c.directory + "'");
        resetSystem(c.units, c.directory);
        CORVPackageTool::PMSSetAppPrivilege(c.user, c.apps, c.language);
        Store store = readStore();
        EXPECT_EQ(store.users, c.users) << "users: " << show(store.users);
        EXPECT_EQ(store.groups, c.groups) << "groups: " << show(store.groups);
        EXPECT_TRUE(store.denied.empty()) << show(store.denied);
    }
}

TEST(AppPrivilege, GrantsAreAddedToWhatIsThere) {
    makeAccounts();
    resetSystem({{"apps", kLocalPlain}}, "");
    ASSERT_EQ(VLIBAppPrivGroupDenyOne("guests", "app.X"), 0);
    ASSERT_EQ(VLIBAppPrivUserAddOne("alice", "app.Old"), 0);
    CORVPackageTool::PMSSetAppPrivilege(nullptr, "app.X", "enu");
    CORVPackageTool::PMSSetAppPrivilege(nullptr, "app.X", "enu");
    Store store = readStore();
    EXPECT_EQ(store.users, (Grants{{"alice", {"app.Old", "app.X"}}, {"bob", kX}}));
    EXPECT_EQ(store.denied, (Grants{{"guests", kX}}));
}

TEST(AppPrivilege, StoreChangesAreIdempotentAndExclusive) {
    ASSERT_EQ(VLIBAppPrivUserAddOne("alice", "app.X"), 0);
    ASSERT_EQ(VLIBAppPrivUserAddOne("alice", "app.X"), 0);
    ASSERT_EQ(VLIBAppPrivGroupDenyOne("guests", "app.X"), 0);
    ASSERT_EQ(VLIBAppPrivGroupAddOne("guests", "app.Y"), 0);
    Json::Value root = parse(testutil::readFile(APP_PRIV_STORE_PATH));
    EXPECT_EQ(root["users"]["alice"]["allow"], parse(R"(["app.X"])"));
    EXPECT_EQ(root["groups"]["guests"]["deny"], parse(R"(["app.X"])"));
    EXPECT_EQ(root["groups"]["guests"]["allow"], parse(R"(["app.Y"])"));

    // A grant after a denial moves the application, and back.
    ASSERT_EQ(VLIBAppPrivGroupAddOne("guests", "app.X"), 0);
    root = parse(testutil::readFile(APP_PRIV_STORE_PATH));
    EXPECT_EQ(root["groups"]["guests"]["allow"], parse(R"(["app.Y", "app.X"])"));
    EXPECT_EQ(root["groups"]["guests"]["deny"], parse("[]"));
    ASSERT_EQ(VLIBAppPrivGroupDenyOne("guests", "app.X"), 0);
    root = parse(testutil::readFile(APP_PRIV_STORE_PATH));
    EXPECT_EQ(root["groups"]["guests"]["allow"], parse(R"(["app.Y"])"));
    EXPECT_EQ(root["groups"]["guests"]["deny"], parse(R"(["app.X"])"));
}

TEST(AppPrivilege, BadNamesAndDamagedStoresAreRefused) {
    const struct {
        const char* name;
        const char* app;
    } bad[] = {{nullptr, "app"}, {"", "app"},        {"alice", nullptr},
               {"alice", ""},    {"al\nice", "app"}, {"alice", "a\tpp"}};
    for (const auto& b : bad) {
        SCOPED_TRACE(std::string(b.name ? b.name : "(null)") + " / " + (b.app ? b.app : "(null)"));
        EXPECT_EQ(VLIBAppPrivUserAddOne(b.name, b.app), -1);
        EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);
    }
    EXPECT_FALSE(testutil::exists(APP_PRIV_STORE_PATH));

    const struct {
        const char* text;
        int error;
    } damaged[] = {{"{not json", ERR_READ_FAILED},
                   {"[]", ERR_MALFORMED},
                   {R"({"users": []})", ERR_MALFORMED},
                   {R"({"users": {"alice": "app"}})", ERR_MALFORMED},
                   {R"({"users": {"alice": {"allow": "app"}}})", ERR_MALFORMED}};
    for (const auto& d : damaged) {
        SCOPED_TRACE(d.text);
        testutil::writeFile(APP_PRIV_STORE_PATH, d.text);
        EXPECT_EQ(VLIBAppPrivUserAddOne("alice", "app.X"), -1);
        EXPECT_EQ(VLIBCErrGet(), d.error);
        EXPECT_EQ(testutil::readFile(APP_PRIV_STORE_PATH), d.text) << "left as it was";
    }
}

TEST(AppPrivilege, GroupMembership) {
    makeAccounts();
    const struct {
        const char* user;
        int expected;
        int error;
    } cases[] = {{"alice", 1, 0},
                 {"bob", 1, 0},
                 {"carol", 0, 0},
                 {"admin", 1, 0},
                 {"root", 0, 0},
                 {"nobody-here", -1, ERR_NO_SUCH_USER},
                 {"", -1, ERR_BAD_PARAMETERS}};
    for (const auto& c : cases) {
        SCOPED_TRACE(c.user);
        EXPECT_EQ(VLIBGroupIsAdminGroupMem(c.user, 0), c.expected);
        if (c.expected < 0) {
            EXPECT_EQ(VLIBCErrGet(), c.error);
        }
    }

    PVLIBSZLIST list = VLIBCSzListAlloc(4);
    VLIBCSzListPush(&list, "kept");
    EXPECT_EQ(CORVGroupListMember("administrators", &list), 4);
    std::vector<std::string> members(list->items.begin() + 1, list->items.end());
    EXPECT_EQ(std::set<std::string>(members.begin(), members.end()),
              (std::set<std::string>{"alice", "admin", "corvelcms", "bob"}));
    EXPECT_EQ(list->items.back(), "bob") << "primary members follow the listed ones";
    EXPECT_EQ(CORVGroupListMember("no-such-group", &list), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_GROUP);
    EXPECT_EQ(VLIBCSzListCount(list), 5);
    VLIBCSzListFree(list);
}

TEST(AppPrivilege, NoAdministratorsGroup) {
    ASSERT_EQ(testutil::run("/usr/bin/getent", {"group", "administrators"}).status, 2)
        << "the base system has no group administrators";
    EXPECT_EQ(VLIBGroupIsAdminGroupMem("root", 0), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_GROUP);
}

TEST(AppPrivilege, DirectoryState) {
    char suffix[64];
    EXPECT_EQ(CORVLDAPIsBinded(), 0) << "no file: not bound";
    EXPECT_EQ(CORVWinsIsJoined(), 0);
    EXPECT_EQ(CORVLDAPLoginSuffixGet(suffix, sizeof(suffix)), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_NOT_APPLICABLE);

    testutil::writeFile(CORV_DIRECTORY_CONF,
                        "ldap_bound=\"yes\"\nldap_suffix=\"corp.example.com\"\n"
                        "wins_joined=\"yes\"\ndomain_admin_groups=\" A , B C,,\"\n"
                        "domain_admin_users=\"X\"\n");
    EXPECT_EQ(CORVLDAPIsBinded(), 1);
    EXPECT_EQ(CORVWinsIsJoined(), 1);
    EXPECT_EQ(CORVLDAPLoginSuffixGet(suffix, sizeof(suffix)), 16);
    EXPECT_STREQ(suffix, "corp.example.com");
    char tiny[16];
    EXPECT_EQ(CORVLDAPLoginSuffixGet(tiny, sizeof(tiny)), -1) << "a cut suffix is refused";
    EXPECT_EQ(VLIBCErrGet(), ERR_BUF_TOO_SMALL);

    PVLIBSZLIST groups = VLIBCSzListAlloc(4);
    PVLIBSZLIST users = VLIBCSzListAlloc(4);
    EXPECT_EQ(CORVGroupDomainAdminListGet(&groups, &users), 2);
    EXPECT_EQ(groups->items, (std::vector<std::string>{"A", "B C"}));
    EXPECT_EQ(users->items, (std::vector<std::string>{"X"}));

    testutil::writeFile(CORV_DIRECTORY_CONF, "ldap_bound=\"yes\"\nwins_joined=\"Yes\"\n");
    EXPECT_EQ(CORVLDAPLoginSuffixGet(suffix, sizeof(suffix)), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_KEY_NOT_FOUND);
    EXPECT_EQ(CORVWinsIsJoined(), 0) << "only \"yes\" joins";
    EXPECT_EQ(CORVGroupDomainAdminListGet(&groups, &users), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_NOT_APPLICABLE);
    VLIBCSzListFree(groups);
    VLIBCSzListFree(users);
}

TEST(AppPrivilege, ConfigurationUnits) {
    testutil::removeAll(NDS_JSCONFIG_DIR);
    CORV::NDS::JSConfigParser missing("enu");
    EXPECT_TRUE(missing.Parse(NULL)) << "no directory is no configuration";
    EXPECT_EQ(missing.GetJSConfigs(), Json::Value(Json::objectValue));

    testutil::writeFile(NDS_JSCONFIG_DIR "/b.json", R"({"app.B": {"grantPrivilege": "all"}})");
    testutil::writeFile(NDS_JSCONFIG_DIR "/a.json", R"({"app.A": {}})");
    testutil::writeFile(NDS_JSCONFIG_DIR "/broken.json", "{");
    testutil::writeFile(NDS_JSCONFIG_DIR "/list.json", "[1]");
    testutil::writeFile(NDS_JSCONFIG_DIR "/notes.txt", "{}");
    testutil::writeFile(NDS_JSCONFIG_DIR "/.c.json", "{}");
    CORV::NDS::JSConfigParser parser("ger");
    EXPECT_EQ(parser.GetLanguage(), "ger");
    ASSERT_TRUE(parser.Parse(NULL));
    Json::Value configs = parser.GetJSConfigs();
    EXPECT_EQ(configs.getMemberNames(), (std::vector<std::string>{"a", "b"}));
    EXPECT_EQ(configs["b"]["app.B"]["grantPrivilege"].asString(), "all");

    testutil::writeFile(NDS_JSCONFIG_DIR "/c.json", R"({"app.C": {}})");
    EXPECT_TRUE(parser.Parse("c"));
    EXPECT_EQ(parser.GetJSConfigs().getMemberNames(), (std::vector<std::string>{"a", "b", "c"}));
    EXPECT_FALSE(parser.Parse("missing"));
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_FILE);
    EXPECT_FALSE(parser.Parse("broken"));
    EXPECT_EQ(VLIBCErrGet(), ERR_READ_FAILED);
    EXPECT_FALSE(parser.Parse("../etc/passwd"));
    EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);

    CORV::NDS::CorvConf conf;
    conf.jsconfigDir = "/tmp/other-jsconfig";
    testutil::writeFile("/tmp/other-jsconfig/z.json", "{}");
    CORV::NDS::JSConfigParser other(conf, "enu");
    ASSERT_TRUE(other.Parse(NULL));
    EXPECT_EQ(other.GetJSConfigs().getMemberNames(), (std::vector<std::string>{"z"}));
}
