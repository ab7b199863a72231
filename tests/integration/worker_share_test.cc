// "data-share" on the reference platform: shares are directories on the volume whose POSIX
// ACLs grant the package's user lists, read back with getfacl, and entries of the share
// registry.
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corv/share.h"
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

void addUser(const std::string& name) {
    ASSERT_EQ(testutil::run("/usr/sbin/useradd", {"-M", "-N", name}).status, 0) << name;
}

// The entries of getfacl for `path` without its header, as "user:alice:rwx" lines.
std::vector<std::string> acl(const std::string& path) {
    testutil::RunResult r = testutil::run("/usr/bin/getfacl", {"-cp", path});
    std::vector<std::string> out;
    size_t start = 0;
    while (start < r.out.size()) {
        size_t end = r.out.find('\n', start);
        if (end == std::string::npos) {
            end = r.out.size();
        }
        std::string line = r.out.substr(start, end - start);
        const size_t comment = line.find('\t');
        if (comment != std::string::npos) {
            line = line.substr(0, comment);  // "#effective:..." remarks
        }
        if (line.rfind("user:", 0) == 0 && line != "user::rwx") {
            out.push_back(line);
        }
        start = end + 1;
    }
    return out;
}

testutil::TestPackage sharing(const std::string& name, const std::string& section) {
    testutil::TestPackage pkg = testutil::recordingPackage(name);
    pkg.conf["resource"] = R"({"service-cfg":{},"data-share":)" + section + "}";
    return pkg;
}

Json::Value own(const std::string& pkg) {
    Json::Value value;
    fromFile("/var/packages/" + pkg + "/conf/resource.own", value);
    return value["data-share"];
}

PackageInfo infoOf(const std::string& name) {
    PackageInfo info;
    PMSLoadPKGInfoFile("/var/packages/" + name, info, nullptr, PKG_INFO_MASK_ALL);
    return info;
}

bool startup(const std::string& name) {
    CORV::PkgUtils::WorkerResp resp;
    return Resource::Acquire(Resource::TIMING_STARTUP, infoOf(name), PKG_INSTALL, resp, nullptr,
                             "");
}

}  // namespace

TEST(DataShareWorker, InstallMakesTheShareWithTheUsersACLsAndUninstallKeepsIt) {
    ASSERT_NO_FATAL_FAILURE(addUser("alice"));
    ASSERT_NO_FATAL_FAILURE(addUser("bob"));
    ASSERT_NO_FATAL_FAILURE(addUser("carol"));
    // carol is in both lists and ends as read only; nosuch and the names with odd
    // characters are no users and are passed over.
    PackageManager pm;
    ASSERT_EQ(
        testutil::installBuilt(pm, sharing("photos", R"({"shares":[{"name":"media","permission":{
                          "rw":["alice","carol","nosuch","al,ice","x:y","../root"],"ro":["bob","carol"]}}]})")),
        1);
    EXPECT_EQ(acl("/volume1/media"),
              (std::vector<std::string>{"user:alice:rwx", "user:bob:r-x", "user:carol:r-x"}));
    EXPECT_EQ(testutil::modeOf("/volume1/media") & 0007, 0u);
    EXPECT_EQ(own("photos")["shares"][0]["target"].asString(), "media");
    EXPECT_TRUE(own("photos")["shares"][0]["created"].asBool());
    EXPECT_FALSE(own("photos")["shares"][0].isMember("name")) << toString(own("photos"));

    testutil::RunResult system = testutil::run(CORVPKG_CLI_PATH, {"system"});
    EXPECT_NE(system.out.find("media"), std::string::npos) << system.out;
    EXPECT_NE(system.out.find("rw: alice"), std::string::npos) << system.out;
    EXPECT_NE(testutil::readFile("/var/log/corvevents.log").find("media"), std::string::npos);

    testutil::writeFile("/volume1/media/photo.jpg", "data");
    ASSERT_EQ(pm.uninstall("photos", nullptr, "enu", PKG_UNINSTALL, false, nullptr), 1);
    EXPECT_EQ(testutil::readFile("/volume1/media/photo.jpg"), "data");
    PCORVSHARE share = nullptr;
    ASSERT_EQ(CORVShareGet("media", &share), 0);
    CORVShareFree(share);
}

TEST(DataShareWorker, StartupReappliesPermissionsUnlessTheShareIsMadeOnce) {
    ASSERT_NO_FATAL_FAILURE(addUser("alice"));
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, sharing("two", R"({"shares":[
                  {"name":"always","permission":{"rw":["alice"]}},
                  {"name":"onlyonce","once":true,"permission":{"rw":["alice"]}}]})")),
              1);
    for (const char* dir : {"/volume1/always", "/volume1/onlyonce"}) {
        ASSERT_EQ(testutil::run("/usr/bin/setfacl", {"-b", dir}).status, 0);
        ASSERT_TRUE(acl(dir).empty()) << dir;
    }
    EXPECT_TRUE(startup("two"));
    EXPECT_EQ(acl("/volume1/always"), std::vector<std::string>{"user:alice:rwx"});
    EXPECT_TRUE(acl("/volume1/onlyonce").empty());
}

TEST(DataShareWorker, BadShareNamesMakeNothingAndAreRetriedAtStartup) {
    struct Case {
        const char* name;
    };
    const Case cases[] = {{"../escape"}, {"a/b"}, {""}, {".hidden"}, {"semi;colon"}};
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string("share name '") + c.name + "'");
        const std::string pkg = "bad" + std::to_string(&c - cases);
        Json::Value section;
        section["shares"][0]["name"] = c.name;
        PackageManager pm;
        // A failing postinst worker rolls nothing back; the install reports it.
        EXPECT_EQ(testutil::installBuilt(pm, sharing(pkg, toString(section))), 0);
        EXPECT_EQ(pm.getResult(), PKG_ERR_INSTALL_FAILED);
        EXPECT_FALSE(own(pkg)["shares"][0]["created"].asBool());
        EXPECT_FALSE(startup(pkg));
    }
    EXPECT_FALSE(testutil::exists("/escape"));
    EXPECT_FALSE(testutil::exists("/volume1/escape"));
    std::vector<std::string> names;
    EXPECT_EQ(CORVShareEnum(&names), 0);
}

TEST(DataShareWorker, AnExistingShareIsTakenOverAndAGrownRequestStopsAtTheRecordedEnd) {
    ASSERT_NO_FATAL_FAILURE(addUser("alice"));
    ASSERT_EQ(CORVShareDefaultShareCreate("shared", "/volume1/shared", 0), 0);
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(
                  pm, sharing("taker",
                              R"({"shares":[{"name":"shared","permission":{"ro":["alice"]}}]})")),
              1);
    EXPECT_EQ(acl("/volume1/shared"), std::vector<std::string>{"user:alice:r-x"});
    // The request grows by a share after the own-file was recorded: startup stops there.
    testutil::writeFile(
        "/var/packages/taker/conf/resource",
        R"({"service-cfg":{},"data-share":{"shares":[{"name":"shared"},{"name":"later"}]}})");
    EXPECT_TRUE(startup("taker"));
    EXPECT_FALSE(testutil::exists("/volume1/later"));
    EXPECT_EQ(own("taker")["shares"].size(), 1u);
}
