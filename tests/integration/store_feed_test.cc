// Feeds, HTTPS and the command line against real corv-store servers on loopback.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgcurltool.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgvolume.h"
#include "support/files.h"
#include "support/run.h"
#include "support/store_kit.h"

using namespace CORVPackageTool;
using testutil::StoreServer;

namespace {

Json::Value entries(const std::vector<std::pair<std::string, std::string>>& items) {
    Json::Value out(Json::arrayValue);
    for (const auto& item : items) {
        out.append(testutil::storeEntry(item.first, item.second));
    }
    return out;
}

std::vector<std::string> merged(const Json::Value& list, const char* sourceKey) {
    std::vector<std::string> out;
    for (const Json::Value& entry : list) {
        out.push_back(entry["package"].asString() + " " + entry["version"].asString() + " " +
                      entry[sourceKey].asString());
    }
    return out;
}

class StoreFeeds : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_TRUE(maker_.running() && objectFeed_.running() && arrayFeed_.running());
        maker_.setPackages(entries({{"official", "1.0"}}));
        objectFeed_.setPackages(entries({{"a", "1.0"}, {"b", "2.0"}, {"official", "9.0"}}));
        arrayFeed_.setPackages(entries({{"a", "1.1"}, {"c", "1.0"}}));
        testutil::setDefaultsKey("package_server", maker_.base());
        std::string error;
        ASSERT_TRUE(CORVPackageServer::AddFeed(objectUrl(), error)) << error;
        ASSERT_TRUE(CORVPackageServer::AddFeed("http://127.0.0.1:1/feed", error)) << error;
        ASSERT_TRUE(CORVPackageServer::AddFeed(arrayUrl(), error)) << error;
    }
    std::string objectUrl() const { return objectFeed_.base() + "/feed"; }
    std::string arrayUrl() const { return arrayFeed_.base() + "/feed/array"; }

    // The object feed's keyring, written before its server starts: text that is no key.
    static bool writeKeyring() {
        CORVFSMkdirP("/tmp/store-feed1", nullptr, 1, -1, -1, 0755);
        testutil::writeFile("/tmp/store-feed1/keyring.asc", "this is not a key\n");
        return true;
    }

    StoreServer maker_{"/tmp/store-maker"};
    bool keyring_ = writeKeyring();
    StoreServer objectFeed_{"/tmp/store-feed1", {"--keyring", "/tmp/store-feed1/keyring.asc"}};
    StoreServer arrayFeed_{"/tmp/store-feed2"};
};

TEST_F(StoreFeeds, FeedsMergeTheHigherVersionWinsTheMakerShadowsAndDeadFeedsAreSkipped) {
    // GET of the array feed answers nonsense once: the client asks again by POST.
    arrayFeed_.setFaults(StoreServer::rulesFromText(
        R"([{"path":"/feed/array","method":"GET","times":1,"body":"<html>busy</html>"}])"));
    Json::Value out;
    ASSERT_TRUE(CORVPackageServer::PMSQueryOtherPkgServer(true, "enu", out));
    EXPECT_EQ(merged(out, "feed"),
              (std::vector<std::string>{"a 1.1 " + arrayUrl(), "b 2.0 " + objectUrl(),
                                        "c 1.0 " + arrayUrl()}));
    const std::vector<Json::Value> log = arrayFeed_.requests();
    ASSERT_EQ(log.size(), 2u);
    EXPECT_EQ(log[0]["method"].asString(), "GET");
    EXPECT_EQ(log[1]["method"].asString(), "POST");
    EXPECT_EQ(log[1]["form"]["language"].asString(), "enu");
    EXPECT_EQ(log[1]["form"]["build"].asString(), "15101");
    EXPECT_TRUE(log[1]["query"].empty());
}

TEST_F(StoreFeeds, TheCacheHoldsUntilTheFeedsFileChanges) {
    Json::Value out;
    ASSERT_TRUE(CORVPackageServer::PMSQueryOtherPkgServer(false, "enu", out));
    ASSERT_TRUE(CORVPackageServer::PMSQueryOtherPkgServer(false, "enu", out));
    EXPECT_EQ(objectFeed_.requests().size(), 1u);
    std::string error;
    ASSERT_TRUE(CORVPackageServer::RemoveFeed("http://127.0.0.1:1/feed", error)) << error;
    ASSERT_TRUE(CORVPackageServer::PMSQueryOtherPkgServer(false, "enu", out));
    EXPECT_EQ(objectFeed_.requests().size(), 2u);
    EXPECT_EQ(out.size(), 3u);
}

TEST_F(StoreFeeds, AKeyringThatIsNotAKeyIsNotTrustedAndTheListStillCounts) {
    std::vector<std::string> lines;
    CORVLogSetSink([&lines](int, const std::string& line) { lines.push_back(line); });
    Json::Value out;
    const bool ok = CORVPackageServer::PMSQueryOtherPkgServer(true, "enu", out);
    CORVLogSetSink(nullptr);
    ASSERT_TRUE(ok);
    EXPECT_EQ(out.size(), 3u);
    bool refused = false;
    for (const std::string& line : lines) {
        refused = refused || (line.find("--addserver") != std::string::npos &&
                              line.find(objectUrl()) != std::string::npos);
    }
    EXPECT_TRUE(refused) << "the signature tool refuses the key file";
    testutil::RunResult keys = testutil::run("/usr/corv/bin/corv-codesign", {"--list"});
    EXPECT_EQ(keys.out.find(objectUrl()), std::string::npos) << keys.out;
}

TEST_F(StoreFeeds, TheMergedListNamesEachSourceInDependencyOrder) {
    Json::Value needsA(Json::objectValue);
    needsA["a"] = Json::Value(Json::objectValue);
    Json::Value makerEntries = entries({{"official", "1.0"}});
    makerEntries[0]["conf_deppkgs"] = needsA;
    maker_.setPackages(makerEntries);
    Json::Value list, errors;
    ASSERT_TRUE(CORVPackageServer::PMSGetAllPkgList(true, "enu", list, errors));
    EXPECT_TRUE(errors.empty()) << errors;
    std::vector<std::string> names = merged(list, "source");
    ASSERT_EQ(names.size(), 4u);
    auto at = [&names](const std::string& text) {
        return std::find(names.begin(), names.end(), text) - names.begin();
    };
    EXPECT_LT(at("a 1.1 " + arrayUrl()), at("official 1.0 maker"));
    EXPECT_LT(at("b 2.0 " + objectUrl()), 4);
}

TEST(StoreFeedsFile, BadUrlsAndDuplicatesAreRefused) {
    std::string error;
    EXPECT_FALSE(CORVPackageServer::AddFeed("ftp://x/feed", error));
    EXPECT_FALSE(CORVPackageServer::AddFeed("http://", error));
    EXPECT_FALSE(CORVPackageServer::AddFeed("http://x/a b", error));
    ASSERT_TRUE(CORVPackageServer::AddFeed("https://x/feed", error));
    EXPECT_FALSE(CORVPackageServer::AddFeed("https://x/feed", error));
    EXPECT_NE(error.find("there already"), std::string::npos);
    EXPECT_FALSE(CORVPackageServer::RemoveFeed("https://y/feed", error));
    std::vector<std::string> feeds;
    ASSERT_TRUE(CORVPackageServer::ListFeeds(feeds));
    EXPECT_EQ(feeds, std::vector<std::string>{"https://x/feed"});
    testutil::writeFile(PKG_FEEDS_FILE, "");
    Json::Value out;
    EXPECT_TRUE(CORVPackageServer::PMSQueryOtherPkgServer(true, "enu", out));
    EXPECT_TRUE(out.isArray() && out.empty());
}

// A test CA and, for 127.0.0.1 and signed by it, a server certificate (server.crt) and
// one that expired in 2020 (expired.crt, the same key), made with openssl(1).
void makeCertificates(const std::string& dir) {
    const std::string script =
        "set -e; cd " + dir +
        "; openssl req -x509 -newkey rsa:2048 -nodes -keyout ca.key -out ca.crt -days 2"
        " -subj '/CN=Corv Test CA' 2>/dev/null"
        "; openssl req -newkey rsa:2048 -nodes -keyout server.key -out server.csr"
        " -subj '/CN=127.0.0.1' 2>/dev/null"
        "; printf 'subjectAltName=IP:127.0.0.1\\n' > ext"
        "; openssl x509 -req -in server.csr -CA ca.crt -CAkey ca.key -CAcreateserial"
        " -out server.crt -days 2 -extfile ext 2>/dev/null"
        // x509 -req only dates from now on; the ca command takes any dates.
        "; printf '[ca]\\ndefault_ca=test\\n[test]\\ndatabase=index.txt\\nnew_certs_dir=.\\n"
        "serial=serial\\ndefault_md=sha256\\npolicy=any\\n[any]\\ncommonName=supplied\\n' > ca.cnf"
        "; : > index.txt; echo 01 > serial"
        "; openssl ca -batch -notext -config ca.cnf -cert ca.crt -keyfile ca.key -in server.csr"
        " -out expired.crt -startdate 20200101000000Z -enddate 20200102000000Z -extfile ext"
        " 2>/dev/null";
    testutil::RunResult made = testutil::run("/bin/sh", {"-c", script});
    ASSERT_EQ(made.status, 0) << made.err;
}

void trustCa(const std::string& dir) {
    testutil::writeFile("/usr/local/share/ca-certificates/corv-test-ca.crt",
                        testutil::readFile(dir + "/ca.crt"));
    testutil::RunResult trust = testutil::run("/usr/sbin/update-ca-certificates", {});
    ASSERT_EQ(trust.status, 0) << trust.err;
}

// One test for both refusals: trusting the test CA (update-ca-certificates) takes seconds.
TEST(StoreHttps, AnUntrustedOrAnExpiredCertificateIsRefusedAndNothingCached) {
    const std::string dir = "/tmp/store-tls";
    CORVFSMkdirP(dir.c_str(), nullptr, 1, -1, -1, 0755);
    makeCertificates(dir);
    StoreServer server(dir, {"--tls", dir + "/server.crt", dir + "/server.key"});
    ASSERT_TRUE(server.running());
    ASSERT_EQ(server.base().rfind("https://", 0), 0u);
    server.setPackages(entries({{"secure", "1.0"}}));
    testutil::setDefaultsKey("package_server", server.base());
    std::string cacheDir;
    ASSERT_TRUE(PMSGetListTmpDir(cacheDir));
    const std::string cache = cacheDir + "corvserver.enu";

    Json::Value out;
    EXPECT_FALSE(CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", out));
    EXPECT_NE(PMSGetLastStoreFailure().find("certificate is not trusted"), std::string::npos)
        << PMSGetLastStoreFailure();
    EXPECT_FALSE(testutil::exists(cache));

    trustCa(dir);
    ASSERT_TRUE(CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", out)) << out;
    EXPECT_EQ(out["packages"][0]["link"].asString(), server.base() + "/secure-1.0.cpk");
    const std::string good = testutil::readFile(cache);
    ASSERT_NE(good.find("secure-1.0"), std::string::npos) << good;

    // Signed by the CA now trusted, for the right address, but out of date.
    StoreServer expired("/tmp/store-expired", {"--tls", dir + "/expired.crt", dir + "/server.key"});
    ASSERT_TRUE(expired.running());
    expired.setPackages(entries({{"secure", "2.0"}}));
    testutil::setDefaultsKey("package_server", expired.base());
    EXPECT_FALSE(CORVPackageServer::PMSQueryCorvPkgServer(true, "enu", out));
    EXPECT_NE(PMSGetLastStoreFailure().find("certificate is not trusted"), std::string::npos)
        << PMSGetLastStoreFailure();
    EXPECT_EQ(testutil::readFile(cache), good);
    EXPECT_TRUE(expired.requests().empty()) << "no request gets through the handshake";
}

// ---------------------------------------------------------------------------------------
// The command line over a store published with corv-store index.

testutil::RunResult cli(const std::vector<std::string>& args) {
    return testutil::run(CORVPKG_CLI_PATH, args);
}

TEST(StoreCommandLine, APublishedFeedIsListedAndFailuresAreSaidInWords) {
    const std::string dir = "/tmp/store-examples";
    testutil::RunResult built = testutil::run(
        "/bin/sh", {std::string(CORVPKG_SOURCE_DIR) + "/examples/build.sh", CORVPKG_CLI_PATH, dir});
    ASSERT_EQ(built.status, 0) << built.err;
    testutil::writeFile(dir + "/broken.cpk", "not a tar");
    testutil::RunResult indexed = testutil::run(CORV_STORE_PATH, {"index", dir});
    EXPECT_EQ(indexed.status, 1) << "the broken file is skipped";
    EXPECT_NE(indexed.err.find("skipped broken.cpk"), std::string::npos) << indexed.err;
    StoreServer feed(dir);
    StoreServer maker("/tmp/store-empty-maker");
    ASSERT_TRUE(feed.running() && maker.running());
    testutil::setDefaultsKey("package_server", maker.base());

    ASSERT_EQ(cli({"feed", "add", feed.base() + "/feed"}).status, 0);
    testutil::RunResult listed = cli({"store", "list", "--json"});
    ASSERT_EQ(listed.status, 0) << listed.err;
    Json::Value list;
    ASSERT_TRUE(fromString(listed.out, list)) << listed.out;
    EXPECT_EQ(merged(list["packages"], "source"),
              (std::vector<std::string>{"hello 1.0.0-0001 " + feed.base() + "/feed",
                                        "greeter 1.1.0-0001 " + feed.base() + "/feed",
                                        "notes 1.1.0-0001 " + feed.base() + "/feed"}));
    testutil::RunResult info = cli({"store", "info", "greeter"});
    ASSERT_EQ(info.status, 0) << info.err;
    EXPECT_NE(info.out.find("depends on:    hello"), std::string::npos) << info.out;
    EXPECT_NE(info.out.find("link:          " + feed.base() + "/greeter-1.1.0-0001.cpk"),
              std::string::npos)
        << info.out;
    testutil::RunResult deps = cli({"store", "deps", "greeter"});
    EXPECT_EQ(deps.status, 1);
    EXPECT_NE(deps.err.find("the maker store does not offer greeter"), std::string::npos)
        << deps.err;

    testutil::setDefaultsKey("package_server", "http://127.0.0.1:1");
    testutil::RunResult down = cli({"store", "list", "--refresh"});
    EXPECT_EQ(down.status, 1);
    EXPECT_NE(down.err.find("the server could not be reached"), std::string::npos) << down.err;
    EXPECT_NE(down.err.find("pkgmgr:fail_connect_server"), std::string::npos) << down.err;
}

TEST(StoreCommandLine, AutoUpdateChoiceIsStoredAndListed) {
    ASSERT_EQ(cli({"autoupdate", "set", "hello", "greeter"}).status, 0);
    testutil::RunResult listed = cli({"autoupdate", "list", "--json"});
    ASSERT_EQ(listed.status, 0) << listed.err;
    EXPECT_EQ(listed.out, "{\"mode\":\"chosen\",\"packages\":[\"hello\",\"greeter\"]}\n");
    ASSERT_EQ(cli({"autoupdate", "set", "--off"}).status, 0);
    listed = cli({"autoupdate", "list", "--json"});
    EXPECT_EQ(listed.out, "{\"mode\":\"off\",\"packages\":[\"hello\",\"greeter\"]}\n");
    EXPECT_EQ(cli({"autoupdate", "set", "--all", "x"}).status, 2);
}

}  // namespace
