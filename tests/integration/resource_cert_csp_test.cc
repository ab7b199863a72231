// The "certificate-config" and "csp-rule" workers: a package's services registered with
// the certificate tools and given the machine's certificate, its reloader run, and the
// content-security header that nginx sends for its portal.
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corv/service.h"
#include "corv/vlibc.h"
#include "corv/web.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/http.h"
#include "support/later_worker.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;

namespace {

const char kArchive[] = "/usr/corv/etc/certificate/_archive";
const char kDeployed[] = "/usr/local/etc/certificate/notes/notes-web";
const char kConfig[] = "/usr/local/share/certificate.d/notes.cfg";
const char kReloader[] = "/usr/local/libexec/certificate.d/notes";
const char kServices[] =
    R"([{"display_name":"Notes","display_name_i18n":"notes:title","service":"notes-web"}])";

PackageInfo Registered(const testutil::TestPackage& pkg) {
    testutil::installFixture(pkg);
    PackageInfo info;
    EXPECT_TRUE(PMSLoadPKGInfoFile("/var/packages/" + pkg.name, info, nullptr, PKG_INFO_MASK_ALL));
    return info;
}

bool Phase(bool acquire, Resource::TIMING timing, const PackageInfo& info,
           PKG_INSTALLATION_TYPE type) {
    CORV::PkgUtils::WorkerResp resp;
    return acquire ? Resource::Acquire(timing, info, type, resp, nullptr, "")
                   : Resource::Release(timing, info, type, resp, nullptr, "");
}

// A certificate for `cn`, issued by openssl and made the machine's default.
void IssueDefault(const std::string& cn) {
    const std::string dir = std::string(kArchive) + "/test";
    testutil::writeFile(dir + "/.keep", "");
    testutil::RunResult r =
        testutil::run("/usr/bin/openssl",
                      {"req", "-x509", "-newkey", "ec", "-pkeyopt", "ec_paramgen_curve:prime256v1",
                       "-nodes", "-days", "2", "-subj", "/CN=" + cn, "-keyout",
                       dir + "/privkey.pem", "-out", dir + "/cert.pem"});
    ASSERT_EQ(r.status, 0) << r.err;
    testutil::writeFile(dir + "/fullchain.pem", testutil::readFile(dir + "/cert.pem"));
    testutil::writeFile(std::string(kArchive) + "/DEFAULT", "test\n");
}

std::string SubjectOf(const std::string& pemFile) {
    return testutil::run("/usr/bin/openssl", {"x509", "-noout", "-subject", "-in", pemFile}).out;
}

testutil::TestPackage certPackage(const std::string& services = kServices) {
    testutil::TestPackage pkg("notes");
    pkg.conf["privilege"] = R"({"defaults":{"run-as":"package"},"username":"notes"})";
    pkg.payload["bin/reload-certs"] = "#!/bin/sh\nopenssl x509 -noout -subject -in " +
                                      std::string(kDeployed) + "/cert.pem >> /tmp/reloaded\n";
    pkg.conf["resource"] = std::string(R"({"certificate-config":{"reloader-relpath":)") +
                           R"("bin/reload-certs","services":)" + services + "}}";
    return pkg;
}

TEST(ResourceCertificate, ServicesGetTheMachinesCertificateAndTheReloaderRuns) {
    ASSERT_EQ(testutil::run("/usr/sbin/useradd", {"-r", "-M", "notes"}).status, 0);
    IssueDefault("corv-test");
    PackageInfo info = Registered(certPackage());
    ASSERT_TRUE(Phase(true, Resource::TIMING_POSTINST, info, PKG_INSTALL));
    EXPECT_EQ(testutil::modeOf(kReloader), 0755u);
    Json::Value config;
    ASSERT_TRUE(fromFile(kConfig, config));
    Json::Value services;
    ASSERT_TRUE(fromString(kServices, services));
    EXPECT_EQ(config["services"], services);
    EXPECT_EQ(config["owner"].asString(), "notes");
    EXPECT_EQ(config["isPkg"], Json::Value(true));
    EXPECT_EQ(SubjectOf(std::string(kDeployed) + "/cert.pem"), "subject=CN = corv-test\n");
    EXPECT_EQ(testutil::readFile(std::string(kDeployed) + "/privkey.pem"),
              testutil::readFile(std::string(kArchive) + "/test/privkey.pem"));
    EXPECT_EQ(testutil::modeOf(std::string(kDeployed) + "/privkey.pem"), 0600u);
    std::string uid = testutil::run("/usr/bin/id", {"-u", "notes"}).out;
    std::string gid = testutil::run("/usr/bin/id", {"-g", "notes"}).out;
    uid.pop_back();
    gid.pop_back();
    EXPECT_EQ(testutil::ownerOf(std::string(kDeployed) + "/privkey.pem"), uid + ":" + gid);
    EXPECT_EQ(testutil::readFile("/tmp/reloaded"), "subject=CN = corv-test\n");
    Json::Value store;
    ASSERT_TRUE(fromFile(std::string(kArchive) + "/INFO", store));
    EXPECT_EQ(store["test"]["services"][0]["subscriber"].asString(), "notes");
    EXPECT_EQ(store["test"]["services"].size(), 1u);

    // An upgrade keeps the registration and takes the package's files, which come back.
    ASSERT_TRUE(Phase(false, Resource::TIMING_PREUNINST, info, PKG_UPGRADE));
    EXPECT_FALSE(testutil::exists(kConfig));
    EXPECT_FALSE(testutil::exists(kReloader));
    EXPECT_TRUE(testutil::exists(std::string(kDeployed) + "/cert.pem"));
    ASSERT_TRUE(Phase(true, Resource::TIMING_POSTINST, info, PKG_UPGRADE));
    ASSERT_TRUE(fromFile(std::string(kArchive) + "/INFO", store));
    EXPECT_EQ(store["test"]["services"].size(), 1u) << "registered once, not twice";

    ASSERT_TRUE(Phase(false, Resource::TIMING_PREUNINST, info, PKG_UNINSTALL));
    EXPECT_FALSE(testutil::exists("/usr/local/etc/certificate/notes"));
    ASSERT_TRUE(fromFile(std::string(kArchive) + "/INFO", store));
    EXPECT_EQ(store["test"]["services"].size(), 0u);
}

TEST(ResourceCertificate, AMachineWithoutCertificateIssuesItsOwn) {
    testutil::TestPackage pkg = certPackage();
    pkg.conf.erase("privilege");
    ASSERT_TRUE(Phase(true, Resource::TIMING_POSTINST, Registered(pkg), PKG_INSTALL));
    Json::Value config;
    ASSERT_TRUE(fromFile(kConfig, config));
    EXPECT_EQ(config["owner"].asString(), "root") << "a package without a user";
    EXPECT_EQ(SubjectOf(std::string(kDeployed) + "/cert.pem"), "subject=CN = localhost\n");
    EXPECT_TRUE(testutil::exists(std::string(kArchive) + "/DEFAULT"));
}

TEST(ResourceCertificate, BadSectionsAreRefused) {
    struct Case {
        const char* section;
        bool acquired;
        bool reloader;  // installed afterwards
        bool config;    // written afterwards
    };
    const std::vector<Case> cases = {
        {R"({"reloader-relpath":"bin/reload-certs","services":[]})", true, true, false},
        {R"({"services":[]})", true, false, false},
        {R"({"reloader-relpath":"bin/reload-certs","services":{"service":"x"}})", false, true,
         false},
        {R"({"services":[{"display_name":"N","service":"notes-web"}]})", false, false, false},
        {R"({"services":["notes-web"]})", false, false, false},
        {R"({"reloader-relpath":"../../../../bin/sh","services":[]})", false, false, false},
        {R"({"reloader-relpath":"bin/none","services":[]})", false, false, false},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.section);
        testutil::removeAll(kReloader);
        testutil::TestPackage pkg = certPackage();
        pkg.conf["resource"] = std::string(R"({"certificate-config":)") + c.section + "}";
        EXPECT_EQ(Phase(true, Resource::TIMING_POSTINST, Registered(pkg), PKG_INSTALL), c.acquired);
        EXPECT_EQ(testutil::exists(kReloader), c.reloader);
        EXPECT_EQ(testutil::exists(kConfig), c.config);
    }
}

class ResourceCsp : public ::testing::Test {
  protected:
    void SetUp() override {
        if (!testutil::exists("/usr/sbin/nginx")) {
            GTEST_SKIP() << "nginx is not installed (scripts/setup-deps.sh installs it)";
        }
        ASSERT_EQ(VLIBServiceStart("nginx", 0), 0)
            << testutil::readFile("/var/log/corv-init/nginx.log");
    }

    // A package with a portal that serves its www/ and rules in ui/csp.json.
    static PackageInfo PortalWithRules(const std::string& rules, const std::string& conf) {
        testutil::TestPackage pkg("notes");
        pkg.payload["ui/notes.json"] = R"({"id":"com.corv.notes","application":"notes"})";
        pkg.payload["ui/notes.mustache"] = "alias {{target}}/www/;\n";
        pkg.payload["www/index.html"] = "notes\n";
        pkg.payload["ui/csp.json"] = rules;
        pkg.conf["resource"] = R"({"web-config":{"app-portal":{"json-relpath":"ui/notes.json",)"
                               R"("mustache-relpath":"ui/notes.mustache"}},"csp-rule":{"conf":")" +
                               conf + R"("}})";
        return Registered(pkg);
    }

    static std::string HeaderOnceItIs(const std::string& expected) {
        return testutil::httpGetUntil(
                   5000, "/notes/",
                   [&](const testutil::HttpReply& r) {
                       auto it = r.headers.find("content-security-policy");
                       return r.status == 200 &&
                              (it == r.headers.end() ? std::string() : it->second) == expected;
                   })
            .headers["content-security-policy"];
    }
};

TEST_F(ResourceCsp, NginxSendsThePackagesRulesWhileItIsEnabled) {
    PackageInfo info =
        PortalWithRules(R"({"default-src":["'self'"],"img-src":"'self'  data:"})", "ui/csp.json");
    ASSERT_TRUE(Phase(true, Resource::TIMING_ENABLE, info, PKG_START));
    ASSERT_TRUE(Phase(true, Resource::TIMING_STARTUP, info, PKG_START));
    ASSERT_TRUE(corvw3::Engine().W3FwReGenAll());
    EXPECT_EQ(HeaderOnceItIs("default-src 'self'; img-src 'self' data:"),
              "default-src 'self'; img-src 'self' data:");

    // An update takes the package's changed file.
    testutil::writeFile("/var/packages/notes/target/ui/csp.json", R"({"script-src":[]})");
    CORV::PkgUtils::WorkerResp resp;
    ASSERT_TRUE(Resource::Update(info, "csp-rule", Json::Value(), resp));
    EXPECT_EQ(HeaderOnceItIs("script-src 'none'"), "script-src 'none'");

    ASSERT_TRUE(Phase(false, Resource::TIMING_DISABLE, info, PKG_STOP));
    EXPECT_FALSE(testutil::exists("/usr/corv/etc/www/csp.d/notes.json"));
    EXPECT_EQ(HeaderOnceItIs(""), "") << "the portal stays until it is released, its rules went";
}

TEST_F(ResourceCsp, BadRulesAreRefusedAndNeverReachTheWebServer) {
    struct Case {
        const char* rules;
        const char* conf;
        int error;
    };
    const std::vector<Case> cases = {
        {"{}", "", 0x0600},
        {"{}", "ui/none.json", 0x0600},
        {"{}", "../../../../etc/hostname", 0xBE00},
        {R"(["default-src"])", "ui/csp.json", 0x4000},
        {"not json", "ui/csp.json", 0x4000},
        {R"({"default-src":["'self'\"; add_header X-Evil 1; #"]})", "ui/csp.json", 0x4000},
        {R"({"default-src":"'self'; script-src *"})", "ui/csp.json", 0x4000},
        {R"({"Default Src":["'self'"]})", "ui/csp.json", 0x4000},
        {R"({"default-src":[5]})", "ui/csp.json", 0x4000},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string(c.rules) + " in [" + c.conf + "]");
        PackageInfo info = PortalWithRules(c.rules, c.conf);
        CORV::PkgUtils::WorkerResp resp;
        EXPECT_FALSE(
            Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""));
        EXPECT_EQ(VLIBCErrGet(), c.error);
        EXPECT_FALSE(testutil::exists("/usr/corv/etc/www/csp.d/notes.json"));
    }
    EXPECT_EQ(testutil::readFile("/etc/nginx/conf.d/corv-packages.conf").find("Evil"),
              std::string::npos);
}

TEST_F(ResourceCsp, AFailingLaterWorkerTakesTheRulesBack) {
    testutil::registerLaterWorker(CORVPKG_TEST_PLUGIN_PATH, "later", "0x0044");
    PackageInfo info = PortalWithRules(R"({"default-src":["'self'"]})", "ui/csp.json");
    testutil::writeFile(
        "/var/packages/notes/conf/resource",
        std::string(R"({"csp-rule":{"conf":"ui/csp.json"},)") + R"("later":{"fail":["acquire"]}})");
    EXPECT_FALSE(Phase(true, Resource::TIMING_ENABLE, info, PKG_START));
    EXPECT_FALSE(testutil::exists("/usr/corv/etc/www/csp.d/notes.json"));
}

TEST_F(ResourceCsp, HttpsServesTheMachinesCertificate) {
    IssueDefault("corv-https");
    PackageInfo info = PortalWithRules(R"({"default-src":["'self'"]})", "ui/csp.json");
    ASSERT_TRUE(Phase(true, Resource::TIMING_STARTUP, info, PKG_START));
    ASSERT_TRUE(corvw3::Engine().W3FwReGenAll());
    testutil::RunResult r;
    for (int i = 0; i < 50; ++i) {
        r = testutil::run("/bin/sh", {"-c",
                                      "openssl s_client -connect 127.0.0.1:5001 </dev/null "
                                      "2>/dev/null | openssl x509 -noout -subject"});
        if (r.out == "subject=CN = corv-https\n") {
            break;
        }
        usleep(100000);
    }
    EXPECT_EQ(r.out, "subject=CN = corv-https\n") << r.err;
}

}  // namespace
