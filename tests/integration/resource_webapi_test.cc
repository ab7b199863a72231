// The two "webapi-desc" workers: a package's web API files linked into the platform's web
// API directory with its user stamped in, and its API daemon's libraries and socket.
#include <gtest/gtest.h>
#include <limits.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;

namespace {

const char kWebApi[] = "/usr/corv/corvman/webapi/";

const char kApis[] = R"([
    {"type": "webapi", "auth": ["webapi/notes.auth"], "lib": ["webapi/notes.lib"],
     "api-dir": "webapi/cgi", "link-name": "notes-cgi"},
    {"type": "other", "lib": ["webapi/other.lib"]},
    {"type": "cgi", "lib": ["webapi/cgi.lib"], "api-dir": "webapi/cgi"}])";

testutil::TestPackage apiPackage(const std::string& name, const std::string& section) {
    testutil::TestPackage pkg(name);
    pkg.conf["privilege"] = R"({"defaults":{"run-as":"package"},"username":")" + name + "\"}";
    pkg.payload["webapi/notes.auth"] = R"({"Notes.Auth":{"lib":"libnotes-auth.so"}})";
    pkg.payload["webapi/notes.lib"] =
        R"({"Notes.Api":{"lib":"libnotes.so"},"Notes.Admin":{"lib":"libadmin.so","runAs":"root"}})";
    pkg.payload["webapi/other.lib"] = R"({"Other":{"lib":"libother.so"}})";
    pkg.payload["webapi/cgi.lib"] = R"({"Cgi":{"lib":"libcgi.so"}})";
    pkg.payload["webapi/cgi/index.cgi"] = "#!/bin/sh\n";
    pkg.payload["daemon/daemon.json"] =
        R"({"sock_path":"/run/notes-api.sock","preload_libs":["libz.so","libnotes.so"]})";
    pkg.conf["resource"] = R"({"webapi-desc":)" + section + "}";
    return pkg;
}

std::string section(const std::string& apis, bool preload = true) {
    return R"({"apis":)" + apis +
           R"(,"apidaemon":{"daemon_config":"daemon/daemon.json","auto_preload_webapi_libs":)" +
           (preload ? "true" : "false") + "}}";
}

PackageInfo Registered(const testutil::TestPackage& pkg) {
    testutil::installFixture(pkg);
    PackageInfo info;
    EXPECT_TRUE(PMSLoadPKGInfoFile("/var/packages/" + pkg.name, info, nullptr, PKG_INFO_MASK_ALL));
    return info;
}

bool Phase(bool acquire, const PackageInfo& info) {
    CORV::PkgUtils::WorkerResp resp;
    return acquire ? Resource::Acquire(Resource::TIMING_STARTUP, info, PKG_START, resp, nullptr, "")
                   : Resource::Release(Resource::TIMING_DISABLE, info, PKG_STOP, resp, nullptr, "");
}

// The names in the web API directory with where each leads, "name>target ...".
std::string Links() {
    std::string out;
    for (const char* name : {"notes.auth", "notes.lib", "notes-cgi", "other.lib", "cgi.lib"}) {
        char target[PATH_MAX];
        const ssize_t n = readlink((std::string(kWebApi) + name).c_str(), target, sizeof target);
        if (n > 0) {
            out += (out.empty() ? "" : " ") + std::string(name) + ">" + std::string(target, n);
        }
    }
    return out;
}

std::string Payload(const std::string& pkg, const std::string& relpath) {
    Json::Value value;
    fromFile("/var/packages/" + pkg + "/target/" + relpath, value);
    return toString(value);
}

TEST(ResourceWebApi, LinksStampsAndTheDaemonsLibrariesUntilTheRelease) {
    PackageInfo info = Registered(apiPackage("notes", section(kApis)));
    ASSERT_TRUE(Phase(true, info));
    const std::string root = "/var/packages/notes/target/webapi/";
    EXPECT_EQ(Links(), "notes.auth>" + root + "notes.auth notes.lib>" + root +
                           "notes.lib notes-cgi>" + root + "cgi cgi.lib>" + root + "cgi.lib");
    EXPECT_EQ(testutil::readFile(std::string(kWebApi) + "notes-cgi/index.cgi"), "#!/bin/sh\n");
    EXPECT_EQ(
        Payload("notes", "webapi/notes.lib"),
        R"({"Notes.Admin":{"lib":"libadmin.so","runAs":"root","socket":"/run/notes-api.sock"},)"
        R"("Notes.Api":{"lib":"libnotes.so","runAs":"notes","socket":"/run/notes-api.sock"}})");
    EXPECT_EQ(Payload("notes", "webapi/notes.auth"),
              R"({"Notes.Auth":{"lib":"libnotes-auth.so","runAs":"notes"}})");
    EXPECT_EQ(Payload("notes", "webapi/cgi.lib"), R"({"Cgi":{"lib":"libcgi.so","runAs":"notes"}})")
        << "a cgi entry's libraries get no socket";
    EXPECT_EQ(Payload("notes", "webapi/other.lib"), R"({"Other":{"lib":"libother.so"}})");
    EXPECT_EQ(Payload("notes", "daemon/daemon.json"),
              R"({"preload_libs":["libadmin.so","libnotes.so","libz.so"],)"
              R"("sock_path":"/run/notes-api.sock"})");
    Json::Value own;
    ASSERT_TRUE(Resource::GetOwnObject("notes", "webapi-desc", own));
    EXPECT_EQ(own["apis"].size(), 2u) << "the entries handled, not the other type";

    ASSERT_TRUE(Phase(false, info));
    EXPECT_EQ(Links(), "");
    ASSERT_TRUE(Resource::GetOwnObject("notes", "webapi-desc", own));
    EXPECT_EQ(toString(own), "{}");
}

TEST(ResourceWebApi, WithoutPreloadOnlyTheSocketIsWritten) {
    PackageInfo info = Registered(apiPackage("notes", section(kApis, false)));
    ASSERT_TRUE(Phase(true, info));
    EXPECT_EQ(Payload("notes", "daemon/daemon.json"),
              R"({"preload_libs":["libz.so","libnotes.so"],"sock_path":"/run/notes-api.sock"})");
    EXPECT_NE(Payload("notes", "webapi/notes.lib").find("\"socket\":\"/run/notes-api.sock\""),
              std::string::npos);
}

TEST(ResourceWebApi, BadSectionsFailAndLeaveNoLink) {
    const std::vector<std::string> sections = {
        R"({"apis":{"type":"webapi"}})",
        section(R"([{"type":"webapi","lib":"webapi/notes.lib"}])"),
        section(R"([{"type":"webapi","lib":[5]}])"),
        section(R"([{"type":"webapi","auth":["webapi/notes.auth"],)"
                R"("lib":["../../../../etc/passwd"]}])"),
        section(R"([{"type":"webapi","auth":["webapi/notes.auth"],"lib":["webapi/none.lib"]}])"),
        section(R"([{"type":"webapi","auth":["webapi/notes.auth"],)"
                R"("api-dir":"webapi/cgi","link-name":"../../../../tmp/evil"}])"),
        section(R"([{"type":"webapi","api-dir":"../../..","link-name":"root"}])"),
        R"({"apis":[],"apidaemon":{"daemon_config":"daemon/daemon.json"}})",
        R"({"apis":[],"apidaemon":{"daemon_config":"../../../../etc/passwd",)"
        R"("auto_preload_webapi_libs":true}})",
    };
    for (const std::string& text : sections) {
        SCOPED_TRACE(text);
        PackageInfo info = Registered(apiPackage("notes", text));
        EXPECT_FALSE(Phase(true, info));
        EXPECT_EQ(Links(), "") << "what was linked before the failure is taken back";
        EXPECT_FALSE(testutil::exists("/tmp/evil"));
        testutil::removeAll("/var/packages/notes/conf/resource.own");
    }
    testutil::TestPackage noSocket = apiPackage("notes", section("[]"));
    noSocket.payload["daemon/daemon.json"] = "{}";
    EXPECT_FALSE(Phase(true, Registered(noSocket)));
}

TEST(ResourceWebApi, ASecondPackageCannotTakeTheFirstOnesNames) {
    const std::string apis = R"([{"type":"webapi","lib":["webapi/notes.lib"]}])";
    PackageInfo first = Registered(apiPackage("notes", section(apis)));
    ASSERT_TRUE(Phase(true, first));
    PackageInfo second = Registered(apiPackage("copycat", section(apis)));
    EXPECT_FALSE(Phase(true, second));
    EXPECT_EQ(Links(), "notes.lib>/var/packages/notes/target/webapi/notes.lib");
    ASSERT_TRUE(Phase(false, second));
    EXPECT_EQ(Links(), "notes.lib>/var/packages/notes/target/webapi/notes.lib")
        << "its release leaves the first package's link alone";
}

}  // namespace
