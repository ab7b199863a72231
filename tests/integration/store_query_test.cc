// The store client against a real corv-store on loopback: the fields of a query, the
// token, the caches, and what bad replies do (and do not do) to them.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgcurltool.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "support/files.h"
#include "support/store_kit.h"

using namespace CORVPackageTool;
using testutil::StoreServer;

namespace {

const char kStoreDir[] = "/tmp/maker-store";

std::string makerCache() {
    std::string dir;
    EXPECT_TRUE(PMSGetListTmpDir(dir));
    return dir + "corvserver.enu";
}

class StoreQuery : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_TRUE(server_.running());
        Json::Value entries(Json::arrayValue), needsHello(Json::objectValue);
        needsHello["hello"] = Json::Value(Json::objectValue);
        entries.append(testutil::storeEntry("greeter", "1.1", needsHello));
        entries.append(testutil::storeEntry("hello", "1.0"));
        server_.setPackages(entries);
        testutil::setDefaultsKey("package_server", server_.base() + "/");
    }
    StoreServer server_{kStoreDir};
};

TEST_F(StoreQuery, ACatalogueQueryCarriesEveryFieldAndTheUserAgent) {
    Json::Value out;
    ASSERT_TRUE(CORVPackageServer::PMSQueryCorvPkgServer(true, "ger", out));
    ASSERT_EQ(out["packages"].size(), 2u);
    const std::vector<Json::Value> log = server_.requests();
    ASSERT_EQ(log.size(), 1u);
    const Json::Value& request = log[0];
    EXPECT_EQ(request["method"].asString(), "GET");
    EXPECT_EQ(request["path"].asString(), "/api/getPackageList.php");
    const Json::Value& q = request["query"];
    EXPECT_EQ(q["language"].asString(), "ger");
    EXPECT_EQ(q["package_update_channel"].asString(), "stable");
    EXPECT_EQ(q["timezone"].asString(), "UTC");
    EXPECT_EQ(q["unique"].asString().rfind("corv_", 0), 0u) << q;
    EXPECT_EQ(q["arch"].asString(), PMSGetSystemArchString());
    EXPECT_EQ(q["major"].asString(), "6");
    EXPECT_EQ(q["minor"].asString(), "1");
    EXPECT_EQ(q["build"].asString(), "15101");
    // No store account on this device: no token.
    EXPECT_FALSE(q.isMember("ns_time"));
    EXPECT_FALSE(q.isMember("ns_token"));
    EXPECT_EQ(request["user_agent"].asString(),
              "CorvNOS/6.1-15101 (" + q["unique"].asString() + ") package");
    // The links of a relative catalogue are made absolute on the address asked.
    EXPECT_EQ(out["packages"][1]["link"].asString(), server_.base() + "/hello-1.0.cpk");
}

TEST_F(StoreQuery, ADeviceWithoutAChannelCannotQuery) {
    VLIBCFileRemoveKey(VLIBC_INFO_PATH, "package_update_channel");
    Json::Value out;
    EXPECT_FALSE(CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", out));
    EXPECT_EQ(out["key"].asString(), "fail_connect_server");
    EXPECT_TRUE(server_.requests().empty());
}

TEST(StoreToken, AnAccountSendsATokenTheServerAcceptsAndWithoutOneTheRefusalIsPassedOn) {
    StoreServer server(kStoreDir, {"--check-token"});
    ASSERT_TRUE(server.running());
    server.setPackages(Json::Value(Json::arrayValue));
    testutil::setDefaultsKey("package_server", server.base());
    Json::Value out;
    EXPECT_FALSE(CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", out));
    EXPECT_EQ(out["sec"].asString(), "pkgmgr");
    EXPECT_EQ(out["key"].asString(), "pkgmgr_token_invalid");
    EXPECT_FALSE(testutil::exists(makerCache())) << "a refusal must not be cached";

    testutil::setDefaultsKey("corvpkg_server", "account");
    Json::Value list;
    ASSERT_TRUE(CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", list)) << list;
    const Json::Value q = server.requests().back()["query"];
    EXPECT_EQ(q["ns_token"].asString().size(), 32u);
    EXPECT_FALSE(q["ns_time"].asString().empty());
}

TEST_F(StoreQuery, TheCacheAnswersWithinTheHourAndForceAsksAgain) {
    Json::Value out;
    ASSERT_TRUE(CORVPackageServer::PMSQueryCorvPkgServer(false, "enu", out));
    ASSERT_TRUE(CORVPackageServer::PMSQueryCorvPkgServer(false, "enu", out));
    EXPECT_EQ(server_.requests().size(), 1u);
    ASSERT_TRUE(CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", out));
    EXPECT_EQ(server_.requests().size(), 2u);
    // Sorted, what greeter depends on comes first; the cache keeps the order received.
    Json::Value sorted;
    ASSERT_TRUE(CORVPackageServer::PMSQueryCorvPkgServer(false, "enu", sorted, true));
    EXPECT_EQ(sorted["packages"][0]["package"].asString(), "hello");
    Json::Value cached;
    ASSERT_TRUE(fromFile(makerCache(), cached));
    EXPECT_EQ(cached["packages"][0]["package"].asString(), "greeter");
}

TEST_F(StoreQuery, BadRepliesFailAndNeverOverwriteTheCache) {
    Json::Value out;
    ASSERT_TRUE(CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", out));
    const std::string good = testutil::readFile(makerCache());
    const char* path = "/api/getPackageList.php";
    struct Case {
        const char* name;
        const char* rule;   // without its path
        const char* words;  // what PMSGetLastStoreFailure says
    } cases[] = {
        {"not JSON", R"({"body":"<html>maintenance</html>","content_type":"text/html"})",
         "the reply is not JSON"},
        {"HTML error page", R"({"status":503,"body":"<html>down</html>"})",
         "the server answered HTTP 503"},
        {"wrong shape", R"({"body":"{\"packages\":5}"})", "the reply is not a package list"},
        {"bare array", R"({"body":"[{\"package\":\"a\"}]"})", "the reply is not a package list"},
        {"empty body", R"({"body":""})", "the server sent an empty reply"},
        {"huge", R"({"fill":34000000})", "larger than 32 MiB"},
        {"truncated", R"({"cut_after":20})", "the reply was cut off"},
        {"redirect loop", R"({"redirect":"/api/getPackageList.php"})", "redirected too many times"},
        {"not found", R"({"status":404})", "HTTP 404"},
    };
    for (const Case& c : cases) {
        Json::Value rule = Json::Value();
        ASSERT_TRUE(fromString(c.rule, rule)) << c.name;
        rule["path"] = path;
        Json::Value rules(Json::arrayValue);
        rules.append(rule);
        server_.setFaults(rules);
        Json::Value failed = "before";
        EXPECT_FALSE(CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", failed)) << c.name;
        EXPECT_NE(PMSGetLastStoreFailure().find(c.words), std::string::npos)
            << c.name << ": " << PMSGetLastStoreFailure();
        EXPECT_EQ(testutil::readFile(makerCache()), good) << c.name;
    }
    server_.setFaults(Json::Value(Json::arrayValue));
    EXPECT_TRUE(CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", out));
}

TEST_F(StoreQuery, AChunkedReplyWithoutLengthAndADelayedOneAreRead) {
    server_.setFaults(testutil::StoreServer::rulesFromText(
        R"([{"path":"/api/getPackageList.php","chunked":true,"delay_ms":300}])"));
    Json::Value out;
    ASSERT_TRUE(CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", out));
    EXPECT_EQ(out["packages"].size(), 2u);
    EXPECT_TRUE(server_.requests().back()["fault"].asBool());
}

TEST(StoreUnreachable, AClosedPortIsAHardFailureAndAnUnknownHostIsRetriedThreeTimes) {
    testutil::setDefaultsKey("package_server", "http://127.0.0.1:1");
    Json::Value out;
    EXPECT_FALSE(CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", out));
    EXPECT_EQ(out["sec"].asString(), "pkgmgr");
    EXPECT_EQ(out["key"].asString(), "fail_connect_server");
    EXPECT_NE(PMSGetLastStoreFailure().find("could not be reached"), std::string::npos);

    std::vector<std::string> lines;
    CORVLogSetSink([&lines](int, const std::string& line) { lines.push_back(line); });
    testutil::setDefaultsKey("package_server", "http://store.invalid");
    Json::Value unknown;
    const bool ok = CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", unknown);
    CORVLogSetSink(nullptr);
    EXPECT_FALSE(ok);
    EXPECT_EQ(unknown["sec"].asString(), "common");
    EXPECT_EQ(unknown["key"].asString(), "commfail");
    int fallbacks = 0, unsupported = 0;
    for (const std::string& line : lines) {
        fallbacks += line.find("Fallback dns to 8.8.8.8") != std::string::npos;
        unsupported += line.find("Failed to set CURLOPT_DNS_SERVERS") != std::string::npos;
    }
    EXPECT_EQ(fallbacks, 3);
    EXPECT_EQ(unsupported, 3) << "Debian's libcurl has no CURLOPT_DNS_SERVERS";
}

TEST_F(StoreQuery, NamedPackagesAreAskedWithPkgList) {
    PackageInfo info;
    info.package = "greeter";
    info.version = "1.0";
    ASSERT_TRUE(CORVPackageServer::PMSGetPkgFromServer("enu", info));
    EXPECT_EQ(info.version, "1.1");
    EXPECT_EQ(info.link, server_.base() + "/greeter-1.1.cpk");
    const Json::Value request = server_.requests().back();
    EXPECT_EQ(request["path"].asString(), "/api/getPackages.php");
    EXPECT_EQ(request["query"]["pkg_list"].asString(), R"([{"id":"greeter","version":"1.0"}])");

    PackageInfo missing;
    missing.package = "nothing";
    EXPECT_FALSE(CORVPackageServer::PMSGetPkgFromServer("enu", missing));
    EXPECT_EQ(CORVPackageServer::getResult(), PKG_ERR_NOT_INSTALLED);
}

TEST_F(StoreQuery, TheInstallOrderComesFromTheStoresDependencies) {
    Json::Value entries(Json::arrayValue);
    Json::Value needsBase(Json::objectValue), needsMid(Json::objectValue);
    needsBase["base"] = Json::Value(Json::objectValue);
    needsMid["mid"] = Json::Value(Json::objectValue);
    entries.append(testutil::storeEntry("top", "1", needsMid));
    entries.append(testutil::storeEntry("other", "1"));
    entries.append(testutil::storeEntry("mid", "1", needsBase));
    entries.append(testutil::storeEntry("base", "1"));
    server_.setPackages(entries);
    PackageManager pm;
    std::vector<PackageInfo> pkgs;
    ASSERT_TRUE(pm.getAncestryDepOrderByServer("top", "enu", pkgs));
    std::vector<std::string> names;
    for (const PackageInfo& info : pkgs) {
        names.push_back(info.package);
    }
    EXPECT_EQ(names, (std::vector<std::string>{"top", "mid", "base"}));
    EXPECT_FALSE(pm.getAncestryDepOrderByServer("absent", "enu", pkgs));
    EXPECT_EQ(pm.getResult(), PKG_ERR_NOT_INSTALLED);
}

TEST(StoreDownload, AFileComesWithItsTypeAndAStalledOneTimesOutAfterThreeAttempts) {
    StoreServer server(kStoreDir);
    ASSERT_TRUE(server.running());
    testutil::writeFile(std::string(kStoreDir) + "/icons/a.png", std::string(300, 'p'));
    std::string type, effective;
    const std::string target = "/tmp/a.png";
    ASSERT_TRUE(PMSDownloadFile((server.base() + "/icons/a.png").c_str(), target.c_str(), &type,
                                &effective, nullptr));
    EXPECT_EQ(testutil::readFile(target).size(), 300u);
    EXPECT_EQ(type, "image/png");
    EXPECT_EQ(effective, server.base() + "/icons/a.png");

    server.setFaults(
        testutil::StoreServer::rulesFromText(R"([{"path":"/icons/a.png","stall_after":100}])"));
    int timeout = 2;
    EXPECT_FALSE(PMSDownloadFile((server.base() + "/icons/a.png").c_str(), target.c_str(), nullptr,
                                 nullptr, &timeout));
    EXPECT_EQ(getResult(), PKG_ERR_SERVER);
    EXPECT_EQ(server.requests().size(), 4u);
    EXPECT_NE(PMSGetLastStoreFailure().find("did not answer in time"), std::string::npos);
}

}  // namespace
