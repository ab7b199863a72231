// The "web-config" workers: a package's portal fragments published while it runs, the
// user's part of the portal kept in step, and the real nginx serving the portal.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "corv/service.h"
#include "corv/vlibc.h"
#include "corv/web.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/http.h"
#include "support/later_worker.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;

namespace {

const int kPort = 5000;  // the system web server's HTTP port
const char kAppDir[] = "/usr/corv/etc/www/app.d/";
const char kPortalRequest[] =
    R"({"app-portal":{"json-relpath":"ui/%s.json","mustache-relpath":"ui/%s.mustache"}})";

std::string portalRequest(const std::string& name) {
    std::string text = kPortalRequest;
    for (size_t at; (at = text.find("%s")) != std::string::npos;) {
        text.replace(at, 2, name);
    }
    return text;
}

// A package whose portal serves its www/ directory.
testutil::TestPackage portalPackage(const std::string& name, const std::string& page,
                                    const std::string& fragment = "") {
    testutil::TestPackage pkg(name);
    pkg.payload["ui/" + name + ".json"] =
        fragment.empty() ? R"({"id":"com.corv.)" + name + R"(","application":")" + name + "\"}"
                         : fragment;
    pkg.payload["ui/" + name + ".mustache"] = "alias {{target}}/www/;\nindex index.html;\n";
    pkg.payload["www/index.html"] = page;
    pkg.conf["resource"] = "{\"web-config\":" + portalRequest(name) + "}";
    return pkg;
}

PackageInfo Registered(const testutil::TestPackage& pkg) {
    testutil::installFixture(pkg);
    PackageInfo info;
    EXPECT_TRUE(PMSLoadPKGInfoFile("/var/packages/" + pkg.name, info, nullptr, PKG_INFO_MASK_ALL));
    return info;
}

bool Acquire(Resource::TIMING timing, const PackageInfo& info,
             PKG_INSTALLATION_TYPE type = PKG_START) {
    CORV::PkgUtils::WorkerResp resp;
    return Resource::Acquire(timing, info, type, resp, nullptr, "");
}

bool Release(Resource::TIMING timing, const PackageInfo& info,
             PKG_INSTALLATION_TYPE type = PKG_STOP) {
    CORV::PkgUtils::WorkerResp resp;
    return Resource::Release(timing, info, type, resp, nullptr, "");
}

std::string OwnOf(const std::string& name) {
    Json::Value own;
    Resource::GetOwnObject(name, "web-config", own);
    return toString(own);
}

bool Regenerate() {
    corvw3::Engine engine;
    return engine.W3FwReGenAll();
}

testutil::HttpReply PageOnceItIs(const std::string& path, int status) {
    return testutil::httpGetUntil(
        kPort, path, [status](const testutil::HttpReply& r) { return r.status == status; });
}

class ResourceWebConfig : public ::testing::Test {
  protected:
    void SetUp() override {
        if (!testutil::exists("/usr/sbin/nginx")) {
            GTEST_SKIP() << "nginx is not installed (scripts/setup-deps.sh installs it)";
        }
        ASSERT_EQ(VLIBServiceStart("nginx", 0), 0)
            << testutil::readFile("/var/log/corv-init/nginx.log");
    }
};

TEST_F(ResourceWebConfig, ThePortalIsServedWhileThePackageRuns) {
    testutil::TestPackage pkg = portalPackage("notes", "<h1>notes</h1>\n");
    PackageInfo info = Registered(pkg);
    ASSERT_TRUE(Acquire(Resource::TIMING_STARTUP, info));
    EXPECT_EQ(testutil::readFile(std::string(kAppDir) + "notes.mustache"),
              pkg.payload["ui/notes.mustache"]);
    EXPECT_EQ(testutil::modeOf(std::string(kAppDir) + "notes.json"), 0644u);
    EXPECT_EQ(OwnOf("notes"), R"({"linked":["/usr/corv/etc/www/app.d/notes.json",)"
                              R"("/usr/corv/etc/www/app.d/notes.mustache"]})");
    ASSERT_TRUE(Regenerate());
    testutil::HttpReply page = PageOnceItIs("/notes/", 200);
    EXPECT_EQ(page.status, 200);
    EXPECT_EQ(page.body, "<h1>notes</h1>\n");

    // A second start in the same span keeps the published file and records it again.
    testutil::writeFile("/var/packages/notes/target/ui/notes.mustache", "return 418;\n");
    ASSERT_TRUE(Acquire(Resource::TIMING_STARTUP, info));
    EXPECT_EQ(testutil::readFile(std::string(kAppDir) + "notes.mustache"),
              pkg.payload["ui/notes.mustache"]);
    Json::Value own;
    ASSERT_TRUE(Resource::GetOwnObject("notes", "web-config", own));
    EXPECT_EQ(own["linked"].size(), 4u);

    ASSERT_TRUE(Release(Resource::TIMING_DISABLE, info));
    EXPECT_FALSE(testutil::exists(std::string(kAppDir) + "notes.json"));
    EXPECT_FALSE(testutil::exists(std::string(kAppDir) + "notes.mustache"));
    EXPECT_EQ(OwnOf("notes"), "{}");
    ASSERT_TRUE(Regenerate());
    EXPECT_NE(PageOnceItIs("/notes/", 0).status, 200);
}

TEST_F(ResourceWebConfig, InstallStopStartAndUninstallThroughTheEngine) {
    testutil::TestPackage pkg = portalPackage("notes", "notes page\n");
    testutil::TestPackage recording = testutil::recordingPackage("notes");
    pkg.scripts = recording.scripts;
    pkg.info["startstop_restart_services"] = "nginx";
    pkg.info["instuninst_restart_services"] = "nginx";
    pkg.conf["resource"] = "{\"service-cfg\":{},\"web-config\":" + portalRequest("notes") + "}";
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, pkg), 1);
    EXPECT_EQ(PageOnceItIs("/notes/", 200).body, "notes page\n");

    ASSERT_EQ(pm.serviceControl(static_cast<PKG_INSTALLATION_TYPE>(0x10), "notes", false, nullptr,
                                nullptr, nullptr, true, true),
              1);
    EXPECT_NE(PageOnceItIs("/notes/", 0).status, 200) << "a stopped package has no portal";
    EXPECT_FALSE(testutil::exists(std::string(kAppDir) + "notes.json"));
    ASSERT_EQ(pm.serviceControl(static_cast<PKG_INSTALLATION_TYPE>(8), "notes", true, nullptr,
                                nullptr, nullptr, true, true),
              1);
    EXPECT_EQ(PageOnceItIs("/notes/", 200).body, "notes page\n");

    ASSERT_EQ(pm.uninstall("notes", nullptr, "enu", PKG_UNINSTALL, false, nullptr), 1);
    EXPECT_NE(PageOnceItIs("/notes/", 0).status, 200);
    EXPECT_FALSE(testutil::exists(std::string(kAppDir) + "notes.mustache"));
}

TEST_F(ResourceWebConfig, MalformedSectionsPublishNothingOrFail) {
    struct Case {
        const char* section;
        bool acquired;
        const char* published;  // files of app.d afterwards
    };
    const std::vector<Case> cases = {
        {R"({"app-portal":{"json-relpath":"ui/notes.json"}})", true, "notes.json"},
        {R"({"app-portal":{"json-relpath":"ui/notes.json","app-portal":{}}})", false, ""},
        {R"({"app-portal":{"app-portal":"x"}})", false, ""},
        {R"({"app-portal":"ui/notes.json"})", true, ""},
        {R"({"app-portal":{"json-relpath":5}})", true, ""},
        {R"({"app-portal":{"json-relpath":"../../../../etc/notes.json"}})", true, ""},
        {R"({"app-portal":{"json-relpath":"/ui/notes.json"}})", true, ""},
        {R"({"app-portal":{"json-relpath":"ui/"}})", true, ""},
        {R"({"app-portal":{"json-relpath":"ui/.json"}})", true, ""},
        {R"({"app-portal":{"json-relpath":"ui/missing.json"}})", true, ""},
        {R"({"app-portal":{"json-relpath":"ui/outside.json"}})", true, ""},
        {R"({"app-portal":{"mustache-relpath":"ui/notes.json"}})", true, ""},
        {R"({"app-portal":{"json-relpath":"ui/notes.mustache",)"
         R"("mustache-relpath":"ui/notes.mustache"}})",
         true, "notes.mustache"},
    };
    testutil::writeFile("/etc/notes.json", "{}");
    for (const Case& c : cases) {
        SCOPED_TRACE(c.section);
        testutil::TestPackage pkg = portalPackage("notes", "x");
        pkg.conf["resource"] = std::string("{\"web-config\":") + c.section + "}";
        PackageInfo info = Registered(pkg);
        testutil::removeAll("/var/packages/notes/target/ui/outside.json");
        symlink("/etc/notes.json", "/var/packages/notes/target/ui/outside.json");
        EXPECT_EQ(Acquire(Resource::TIMING_STARTUP, info), c.acquired);
        std::string published;
        for (const char* name : {"notes.json", "notes.mustache"}) {
            if (testutil::exists(std::string(kAppDir) + name)) {
                published += (published.empty() ? "" : " ") + std::string(name);
            }
        }
        EXPECT_EQ(published, c.published);
        Release(Resource::TIMING_DISABLE, info);
        testutil::removeAll("/var/packages/notes/conf/resource.own");
    }
}

TEST_F(ResourceWebConfig, OnePackageCannotKeepTheOthersOffTheWebServer) {
    // "a" and "b" both ask for the alias "shared": the first in name order keeps it.
    // "c" has a template that cannot be rendered. "d" is fine.
    std::vector<testutil::TestPackage> pkgs = {
        portalPackage("a", "page a\n", R"({"id":"a","application":"a","alias":"shared"})"),
        portalPackage("b", "page b\n", R"({"id":"b","application":"b","alias":"shared"})"),
        portalPackage("c", "page c\n"),
        portalPackage("d", "page d\n"),
    };
    pkgs[2].payload["ui/c.mustache"] = "{{#open}}\nalias {{target}}/www/;\n";
    for (const testutil::TestPackage& pkg : pkgs) {
        ASSERT_TRUE(Acquire(Resource::TIMING_STARTUP, Registered(pkg))) << pkg.name;
    }
    ASSERT_TRUE(Regenerate());
    EXPECT_EQ(PageOnceItIs("/shared/", 200).body, "page a\n");
    EXPECT_EQ(PageOnceItIs("/d/", 200).body, "page d\n");
    EXPECT_EQ(testutil::httpGet(kPort, "/b/").status, 404);
    EXPECT_EQ(testutil::httpGet(kPort, "/c/").status, 404);

    // A package's own fragment cannot reach the configuration around its portal.
    testutil::TestPackage evil = portalPackage(
        "e", "page e\n", R"({"id":"e","application":"e","root":"/; } server { listen 81; x"})");
    evil.payload["ui/e.mustache"] = "root {{root}};\n";
    ASSERT_TRUE(Acquire(Resource::TIMING_STARTUP, Registered(evil)));
    ASSERT_TRUE(Regenerate());
    EXPECT_EQ(PageOnceItIs("/d/", 200).body, "page d\n");
    EXPECT_EQ(testutil::readFile("/etc/nginx/conf.d/corv-packages.conf").find("listen 81"),
              std::string::npos);
}

TEST_F(ResourceWebConfig, TheUsersPortalFollowsThePackageAcrossAnUpgrade) {
    testutil::TestPackage pkg = portalPackage("notes", "notes page\n");
    PackageInfo info = Registered(pkg);
    const std::string user = "/usr/corv/etc/packages/notes/AppPortal.json";
    testutil::writeFile(user, R"({"id":"old.id","application":"old","alias":"mine"})");
    ASSERT_TRUE(Acquire(Resource::TIMING_POSTINST, info, PKG_INSTALL));
    Json::Value portal;
    ASSERT_TRUE(fromFile(user, portal));
    EXPECT_EQ(toString(portal), R"({"alias":"mine","application":"notes","id":"com.corv.notes"})")
        << "id and application follow the package, the rest is the user's";
    ASSERT_TRUE(Acquire(Resource::TIMING_STARTUP, info));
    ASSERT_TRUE(Regenerate());
    EXPECT_EQ(PageOnceItIs("/mine/", 200).body, "notes page\n") << "the user's alias holds";

    ASSERT_TRUE(Release(Resource::TIMING_PREUNINST, info, PKG_UPGRADE));
    EXPECT_TRUE(testutil::exists(user)) << "an upgrade keeps the user's part";
    ASSERT_TRUE(Release(Resource::TIMING_PREUNINST, info, PKG_UNINSTALL));
    EXPECT_FALSE(testutil::exists(user));
    EXPECT_NE(testutil::readFile("/run/corvfw/reloads").find(" reload\n"), std::string::npos);
    EXPECT_EQ(PageOnceItIs("/notes/", 200).body, "notes page\n") << "the alias is the name again";

    // No JSON fragment: the postinst acquire fails without touching anything.
    pkg.conf["resource"] =
        R"({"web-config":{"app-portal":{"mustache-relpath":"ui/notes.mustache"}}})";
    testutil::writeFile(user, R"({"id":"x","application":"y"})");
    EXPECT_FALSE(Acquire(Resource::TIMING_POSTINST, Registered(pkg), PKG_INSTALL));
    EXPECT_EQ(testutil::readFile(user), R"({"id":"x","application":"y"})");
}

TEST_F(ResourceWebConfig, AFailingLaterWorkerTakesThePortalBack) {
    testutil::registerLaterWorker(CORVPKG_TEST_PLUGIN_PATH, "later", "0x0048");
    testutil::TestPackage pkg = portalPackage("notes", "x");
    pkg.conf["resource"] =
        "{\"web-config\":" + portalRequest("notes") + R"(,"later":{"fail":["acquire"]}})";
    EXPECT_FALSE(Acquire(Resource::TIMING_STARTUP, Registered(pkg)));
    EXPECT_FALSE(testutil::exists(std::string(kAppDir) + "notes.json"));
    EXPECT_FALSE(testutil::exists(std::string(kAppDir) + "notes.mustache"));
}

}  // namespace
