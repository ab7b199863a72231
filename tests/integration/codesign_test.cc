// The reference platform's signature tool, corv-codesign: verdicts by exit status, signing
// in place, the key store, and what the package engine makes of the verdicts.
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include "corv/vlibc.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgbuild.h"
#include "support/codesign_kit.h"
#include "support/files.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;
using testutil::SigningKey;

namespace {

enum Verdict { kMaker = 0, kPublisher = 1, kUnknown = 2, kUnsigned = 3, kExpired = 4, kBad = 5 };
constexpr int kFailed = 6;  // this and anything above: the tool failed

const char kFeed[] = "https://feed.example.test/packages";
const char kOtherFeed[] = "https://other.example.test/packages";

class Codesign : public ::testing::Test {
  protected:
    void SetUp() override { ASSERT_TRUE(testutil::installCodesignTool()); }

    // A fresh package file signed with `key`.
    std::string signedCpk(const SigningKey& key, const std::string& name = "demo") {
        const std::string path = testutil::makeCpk("/tmp/" + name + ".cpk");
        EXPECT_EQ(testutil::signCpk(key, path), 0);
        return path;
    }
};

int count(const std::vector<std::string>& names, const std::string& name) {
    return static_cast<int>(std::count(names.begin(), names.end(), name));
}

}  // namespace

TEST_F(Codesign, VerdictsByWhoSigned) {
    SigningKey maker("maker");
    SigningKey publisher("publisher");
    SigningKey stranger("stranger");
    const std::string byMaker = signedCpk(maker, "by-maker");
    const std::string byPublisher = signedCpk(publisher, "by-publisher");
    const std::string byStranger = signedCpk(stranger, "by-stranger");
    const std::string unsignedCpk = testutil::makeCpk("/tmp/unsigned.cpk");

    // Before any key is trusted every signature is by an unknown key.
    EXPECT_EQ(testutil::verifyCpk(byMaker), kUnknown);
    EXPECT_EQ(testutil::verifyCpk(unsignedCpk), kUnsigned);

    ASSERT_TRUE(testutil::trustAsMaker(maker));
    ASSERT_TRUE(testutil::trustForFeed({&publisher}, kFeed));
    EXPECT_EQ(testutil::verifyCpk(byMaker), kMaker);
    EXPECT_EQ(testutil::verifyCpk(byPublisher), kPublisher);
    EXPECT_EQ(testutil::verifyCpk(byStranger), kUnknown);
    EXPECT_EQ(testutil::verifyCpk(unsignedCpk), kUnsigned);

    const testutil::RunResult listed = testutil::codesign({"--list"});
    EXPECT_EQ(listed.status, 0);
    EXPECT_NE(listed.out.find("maker " + maker.fingerprint()), std::string::npos) << listed.out;
    EXPECT_NE(listed.out.find(std::string("feed ") + kFeed + " " + publisher.fingerprint()),
              std::string::npos)
        << listed.out;
}

TEST_F(Codesign, VerificationIgnoresTheCallersKeyring) {
    SigningKey maker("maker");
    const std::string cpk = signedCpk(maker);
    ASSERT_TRUE(testutil::trustAsMaker(maker));
    // The signer's own keyring knows the key, the store does not know the stranger.
    SigningKey stranger("stranger");
    const std::string byStranger = signedCpk(stranger, "by-stranger");
    EXPECT_EQ(testutil::codesign({"--verify", byStranger}, stranger.home()).status, kUnknown);
    EXPECT_EQ(testutil::codesign({"--verify", cpk}, stranger.home()).status, kMaker);
}

TEST_F(Codesign, DelserverForgetsTheFeedsKeys) {
    SigningKey publisher("publisher");
    SigningKey shared("shared");
    const std::string byPublisher = signedCpk(publisher, "by-publisher");
    const std::string byShared = signedCpk(shared, "by-shared");
    ASSERT_TRUE(testutil::trustForFeed({&publisher, &shared}, kFeed));
    ASSERT_TRUE(testutil::trustForFeed({&shared}, kOtherFeed));
    EXPECT_EQ(testutil::verifyCpk(byPublisher), kPublisher);
    EXPECT_EQ(testutil::verifyCpk(byShared), kPublisher);

    EXPECT_EQ(testutil::codesign({"--delserver", kFeed}).status, 0);
    EXPECT_EQ(testutil::verifyCpk(byPublisher), kUnknown);
    EXPECT_EQ(testutil::verifyCpk(byShared), kPublisher) << "the other feed still lists it";
    const testutil::RunResult listed = testutil::codesign({"--list"});
    EXPECT_EQ(listed.out.find(publisher.fingerprint()), std::string::npos)
        << "the key left the keyring too:\n"
        << listed.out;

    EXPECT_EQ(testutil::codesign({"--delserver", kFeed}).status, 0) << "nothing left to forget";
    EXPECT_EQ(testutil::codesign({"--delserver", kOtherFeed}).status, 0);
    EXPECT_EQ(testutil::verifyCpk(byShared), kUnknown);
}

TEST_F(Codesign, AddserverReplacesTheFeedsKeys) {
    SigningKey first("first");
    SigningKey second("second");
    const std::string byFirst = signedCpk(first, "by-first");
    const std::string bySecond = signedCpk(second, "by-second");
    ASSERT_TRUE(testutil::trustForFeed({&first}, kFeed));
    EXPECT_EQ(testutil::verifyCpk(byFirst), kPublisher);
    // The engine hands over the feed's whole key list on every read of the feed.
    ASSERT_TRUE(testutil::trustForFeed({&second}, kFeed));
    EXPECT_EQ(testutil::verifyCpk(byFirst), kUnknown);
    EXPECT_EQ(testutil::verifyCpk(bySecond), kPublisher);
}

TEST_F(Codesign, KeyFilesArmoredBinaryOrSeveral) {
    SigningKey one("one");
    SigningKey two("two");
    SigningKey three("three");
    const std::string byOne = signedCpk(one, "by-one");
    const std::string byTwo = signedCpk(two, "by-two");
    const std::string byThree = signedCpk(three, "by-three");

    testutil::writeFile("/tmp/binary.gpg", one.publicKey(false));
    EXPECT_EQ(testutil::codesign({"--addserver", "/tmp/binary.gpg", kFeed}).status, 0);
    testutil::writeFile("/tmp/two-keys.asc", two.publicKey() + three.publicKey());
    const testutil::RunResult added = testutil::codesign({"--add-maker", "/tmp/two-keys.asc"});
    EXPECT_EQ(added.status, 0) << added.err;

    EXPECT_EQ(testutil::verifyCpk(byOne), kPublisher);
    EXPECT_EQ(testutil::verifyCpk(byTwo), kMaker);
    EXPECT_EQ(testutil::verifyCpk(byThree), kMaker);
}

TEST_F(Codesign, UnusableKeyFilesAreRefused) {
    SigningKey key("key");
    testutil::writeFile("/tmp/empty.asc", "");
    testutil::writeFile("/tmp/garbage.asc", "this is no key\n");
    testutil::writeFile("/tmp/empty.json", "[]");
    const testutil::RunResult exported =
        key.gpg({"--batch", "--pinentry-mode", "loopback", "--passphrase", "", "--armor",
                 "--export-secret-keys", key.fingerprint()});
    ASSERT_EQ(exported.status, 0) << exported.err;
    testutil::writeFile("/tmp/secret.asc", exported.out);
    for (const char* file : {"/tmp/empty.asc", "/tmp/garbage.asc", "/tmp/empty.json",
                             "/tmp/secret.asc", "/tmp/missing.asc"}) {
        const testutil::RunResult result = testutil::codesign({"--addserver", file, kFeed});
        EXPECT_GE(result.status, kFailed) << file;
        EXPECT_FALSE(result.err.empty()) << file;
    }
    const std::string cpk = signedCpk(key);
    EXPECT_EQ(testutil::verifyCpk(cpk), kUnknown) << "nothing of the secret key file was kept";
}

TEST_F(Codesign, ExpiredKeys) {
    SigningKey old("old", true);
    SigningKey current("current");
    const std::string byOld = signedCpk(old, "by-old");
    EXPECT_EQ(testutil::verifyCpk(byOld), kUnknown)
        << "an untrusted key is unknown, expired or not";

    ASSERT_TRUE(testutil::trustAsMaker(old));
    EXPECT_EQ(testutil::verifyCpk(byOld), kExpired);

    // The same for a publisher's key; the maker's store no longer has it.
    testutil::removeAll("/usr/corv/etc/codesign/maker");
    ASSERT_TRUE(testutil::trustForFeed({&old, &current}, kFeed));
    EXPECT_EQ(testutil::verifyCpk(byOld), kExpired);
    EXPECT_EQ(testutil::verifyCpk(signedCpk(current, "by-current")), kPublisher);
}

TEST_F(Codesign, RevokedKeyCountsAsExpired) {
    SigningKey maker("maker");
    const std::string cpk = signedCpk(maker);
    ASSERT_TRUE(maker.revoke());
    ASSERT_TRUE(testutil::trustAsMaker(maker));  // exported with its revocation
    EXPECT_EQ(testutil::verifyCpk(cpk), kExpired);
    EXPECT_NE(testutil::signCpk(maker, cpk), 0) << "a revoked key signs no more";
}

TEST_F(Codesign, ChangesAfterSigningAreBadSignatures) {
    SigningKey maker("maker");
    ASSERT_TRUE(testutil::trustAsMaker(maker));
    const std::string cpk = signedCpk(maker);
    const std::string signature = testutil::tarMember(cpk, testutil::kSignatureMember);
    ASSERT_NE(signature.find("BEGIN PGP SIGNATURE"), std::string::npos);
    auto members = testutil::cpkMembers();
    members[1].second = testutil::tarMember(cpk, "package.tgz");

    // The same members repacked in another order, at another time: still the same package.
    auto repacked = members;
    std::reverse(repacked.begin(), repacked.end());
    repacked.emplace(repacked.begin(), testutil::kSignatureMember, signature);
    EXPECT_EQ(testutil::verifyCpk(testutil::makeCpk("/tmp/repacked.cpk", repacked)), kMaker);

    // INFO changed, the old signature kept.
    auto changed = members;
    changed[0].second += "maintainer=\"Somebody Else\"\n";
    changed.emplace_back(testutil::kSignatureMember, signature);
    EXPECT_EQ(testutil::verifyCpk(testutil::makeCpk("/tmp/changed.cpk", changed)), kBad);

    // A member appended, a member removed, a mode changed, a member renamed.
    testutil::writeFile("/tmp/extra/scripts/postinst", "#!/bin/sh\nexit 0\n");
    const std::string added = "/tmp/added.cpk";
    testutil::writeFile(added, testutil::readFile(cpk));
    ASSERT_EQ(
        testutil::run("/bin/tar", {"rf", added, "-C", "/tmp/extra", "scripts/postinst"}).status, 0);
    EXPECT_EQ(testutil::verifyCpk(added), kBad);

    const std::string removed = "/tmp/removed.cpk";
    testutil::writeFile(removed, testutil::readFile(cpk));
    ASSERT_EQ(testutil::run("/bin/tar", {"--delete", "-f", removed, "package.tgz"}).status, 0);
    EXPECT_EQ(testutil::verifyCpk(removed), kBad);

    auto withSignature = members;
    withSignature.emplace_back(testutil::kSignatureMember, signature);
    testutil::makeCpk("/tmp/plain.cpk", withSignature);
    ASSERT_EQ(testutil::run("/bin/tar", {"xf", "/tmp/plain.cpk", "-C", "/tmp/extra"}).status, 0);
    ASSERT_EQ(testutil::run("/bin/tar", {"cf", "/tmp/mode.cpk", "--mode=0755", "-C", "/tmp/extra",
                                         "INFO", "package.tgz", testutil::kSignatureMember})
                  .status,
              0);
    EXPECT_EQ(testutil::verifyCpk("/tmp/mode.cpk"), kBad);

    auto renamed = withSignature;
    renamed[0].first = "INFO.orig";
    EXPECT_EQ(testutil::verifyCpk(testutil::makeCpk("/tmp/renamed.cpk", renamed)), kBad);
}

TEST_F(Codesign, BogusSignatureMembersAreBadSignatures) {
    SigningKey maker("maker");
    ASSERT_TRUE(testutil::trustAsMaker(maker));
    auto members = testutil::cpkMembers();
    members.emplace_back(testutil::kSignatureMember, "not a signature\n");
    EXPECT_EQ(testutil::verifyCpk(testutil::makeCpk("/tmp/garbage.cpk", members)), kBad);

    // A second signature member appended to a signed file.
    const std::string cpk = signedCpk(maker);
    const std::string signature = testutil::tarMember(cpk, testutil::kSignatureMember);
    testutil::writeFile(std::string("/tmp/second/") + testutil::kSignatureMember, signature);
    ASSERT_EQ(
        testutil::run("/bin/tar", {"rf", cpk, "-C", "/tmp/second", testutil::kSignatureMember})
            .status,
        0);
    EXPECT_EQ(testutil::verifyCpk(cpk), kBad);
}

TEST_F(Codesign, SigningReplacesTheSignature) {
    SigningKey first("first");
    SigningKey second("second");
    ASSERT_TRUE(testutil::trustAsMaker(second));
    ASSERT_TRUE(testutil::trustForFeed({&first}, kFeed));
    const std::string cpk = signedCpk(first);
    ASSERT_EQ(chmod(cpk.c_str(), 0640), 0);
    const std::string info = testutil::tarMember(cpk, "INFO");
    EXPECT_EQ(testutil::verifyCpk(cpk), kPublisher);

    ASSERT_EQ(testutil::signCpk(second, cpk), 0);
    EXPECT_EQ(testutil::verifyCpk(cpk), kMaker);
    const std::vector<std::string> names = testutil::tarMembers(cpk);
    EXPECT_EQ(count(names, testutil::kSignatureMember), 1);
    EXPECT_EQ(names.size(), 3u);
    EXPECT_EQ(testutil::tarMember(cpk, "INFO"), info);
    struct stat st;
    ASSERT_EQ(stat(cpk.c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0640u);

    // Signing by user id; a key the signer does not have fails and leaves the file alone.
    EXPECT_EQ(testutil::codesign({"--sign", first.email(), cpk}, first.home()).status, 0);
    EXPECT_EQ(testutil::verifyCpk(cpk), kPublisher);
    const std::string before = testutil::readFile(cpk);
    const testutil::RunResult refused =
        testutil::codesign({"--sign", "nobody@example.test", cpk}, first.home());
    EXPECT_GE(refused.status, kFailed);
    EXPECT_NE(refused.err.find("nobody@example.test"), std::string::npos) << refused.err;
    EXPECT_EQ(testutil::readFile(cpk), before);
    for (const auto& entry : std::filesystem::directory_iterator("/tmp")) {
        EXPECT_NE(entry.path().filename().string().rfind(".demo.cpk.", 0), 0u)
            << "a temporary file is left: " << entry.path();
    }
}

TEST_F(Codesign, LongNamesInEveryTarFormat) {
    SigningKey maker("maker");
    ASSERT_TRUE(testutil::trustAsMaker(maker));
    const std::string deep = "WIZARD_UIFILES/" + std::string(60, 'd') + "/" + std::string(90, 'n') +
                             "_uifile";  // over 100, under 255 bytes
    const std::string longer = "conf/" + std::string(200, 'x') + "/" + std::string(120, 'y');
    for (const char* format : {"gnu", "pax", "ustar"}) {
        SCOPED_TRACE(format);
        auto members = testutil::cpkMembers();
        members.emplace_back(deep, "[]\n");
        if (std::string(format) != "ustar") {
            members.emplace_back(longer, "long\n");
        }
        const std::string cpk =
            testutil::makeCpk(std::string("/tmp/") + format + ".cpk", members, format);
        ASSERT_EQ(testutil::signCpk(maker, cpk), 0);
        EXPECT_EQ(testutil::verifyCpk(cpk), kMaker);
        EXPECT_EQ(testutil::tarMember(cpk, deep), "[]\n");

        auto changed = members;
        changed.back().second = "changed\n";
        changed.emplace_back(testutil::kSignatureMember,
                             testutil::tarMember(cpk, testutil::kSignatureMember));
        EXPECT_EQ(testutil::verifyCpk(testutil::makeCpk("/tmp/changed.cpk", changed, format)),
                  kBad);
    }
}

TEST_F(Codesign, ManifestIsTheSameInEveryTarFormat) {
    const std::string deep =
        "WIZARD_UIFILES/" + std::string(60, 'd') + "/" + std::string(90, 'n') + "_uifile";
    auto members = testutil::cpkMembers();
    members.emplace_back(deep, "[]\n");
    members.emplace_back("LICENSE 100%", "free\n");
    testutil::writeFile("/tmp/src/conf/PKG_DEPS", "");
    ASSERT_EQ(symlink("../INFO", "/tmp/src/conf/info-link"), 0);
    std::string first;
    for (const char* format : {"gnu", "pax", "ustar"}) {
        SCOPED_TRACE(format);
        const std::string cpk =
            testutil::makeCpk(std::string("/tmp/") + format + ".cpk", members, format);
        ASSERT_EQ(testutil::run("/bin/tar", {"rf", cpk, "--format=" + std::string(format), "-C",
                                             "/tmp/src", "conf"})
                      .status,
                  0);
        const testutil::RunResult manifest = testutil::codesign({"--manifest", cpk});
        ASSERT_EQ(manifest.status, 0) << manifest.err;
        if (first.empty()) {
            first = manifest.out;
        }
        EXPECT_EQ(manifest.out, first);
    }
    EXPECT_EQ(first.rfind("corv-codesign manifest 1\n", 0), 0u) << first;
    for (const std::string& line : std::vector<std::string>{
             "d 0755 - conf/\n", "l 0777 - conf/info-link ../INFO\n", " " + deep + "\n",
             " LICENSE%20100%25\n",
             // sha256 of "free\n"
             "f 0644 0cf9340d8bc2f1f7836e0ce6e2178d5fd382bde7fc50dc845dbf228dee3713b4 LICENSE"}) {
        EXPECT_NE(first.find(line), std::string::npos) << line << " in\n" << first;
    }
}

TEST_F(Codesign, BrokenFilesAreFailures) {
    SigningKey maker("maker");
    ASSERT_TRUE(testutil::trustAsMaker(maker));
    const std::string cpk = signedCpk(maker);
    const std::string content = testutil::readFile(cpk);
    testutil::writeFile("/tmp/text.cpk", "package=\"not a tar\"\n");
    testutil::writeFile("/tmp/noise.cpk", std::string(4096, 'x'));
    testutil::writeFile("/tmp/empty.cpk", "");
    testutil::writeFile("/tmp/mid-member.cpk", content.substr(0, 700));   // in INFO's content
    testutil::writeFile("/tmp/mid-header.cpk", content.substr(0, 1200));  // in the next header
    std::string corrupt = content;
    corrupt[0] ^= 0x20;  // the first header's checksum no longer holds
    testutil::writeFile("/tmp/corrupt.cpk", corrupt);
    for (const char* file :
         {"/tmp/text.cpk", "/tmp/noise.cpk", "/tmp/empty.cpk", "/tmp/mid-header.cpk",
          "/tmp/mid-member.cpk", "/tmp/corrupt.cpk", "/tmp/missing.cpk", "/tmp"}) {
        const testutil::RunResult result = testutil::codesign({"--verify", file});
        EXPECT_GE(result.status, kFailed) << file;
        EXPECT_FALSE(result.err.empty()) << file;
        EXPECT_GE(testutil::codesign({"--sign", maker.fingerprint(), file}, maker.home()).status,
                  kFailed)
            << file;
    }
    EXPECT_EQ(testutil::verifyCpk(cpk), kMaker);

    // A broken key store is the tool's failure too, not a verdict.
    SigningKey publisher("publisher");
    ASSERT_TRUE(testutil::trustForFeed({&publisher}, kFeed));
    testutil::writeFile("/usr/corv/etc/codesign/feeds/broken", "this is not a feed file\n");
    EXPECT_GE(testutil::verifyCpk(signedCpk(publisher, "by-publisher")), kFailed);
}

TEST_F(Codesign, CommandLineErrors) {
    const std::string cpk = testutil::makeCpk("/tmp/demo.cpk");
    ASSERT_EQ(chdir("/tmp"), 0);
    const testutil::RunResult relative = testutil::codesign({"--verify", "demo.cpk"});
    EXPECT_GE(relative.status, kFailed);
    EXPECT_NE(relative.err.find("absolute"), std::string::npos) << relative.err;
    EXPECT_NE(relative.err.find("usage"), std::string::npos) << relative.err;
    for (const std::vector<std::string>& args :
         std::vector<std::vector<std::string>>{{},
                                               {"--verify"},
                                               {"--verify", cpk, cpk},
                                               {"--sign", cpk},
                                               {"--addserver", "/tmp/key.asc"},
                                               {"--delserver"},
                                               {"--frobnicate"}}) {
        EXPECT_GE(testutil::codesign(args).status, kFailed) << args.size();
    }
    EXPECT_EQ(testutil::codesign({"--help"}).status, 0);
}

TEST_F(Codesign, TheEngineTakesTheVerdicts) {
    SigningKey maker("maker");
    SigningKey publisher("publisher");
    ASSERT_TRUE(testutil::trustAsMaker(maker));
    ASSERT_TRUE(testutil::trustForFeed({&publisher}, kFeed));

    // The package builder signs through the tool, with the keyring of GNUPGHOME.
    testutil::TestPackage pkg("signed", "1.0-0001");
    pkg.scripts["start-stop-status"] = testutil::statusScript(0);
    testutil::writePackageDir("/tmp/signed-src", pkg);
    ASSERT_EQ(setenv("GNUPGHOME", maker.home().c_str(), 1), 0);
    std::string error;
    ASSERT_TRUE(
        PMSBuildPackageFile("/tmp/signed-src", "/tmp/signed.cpk", maker.fingerprint(), error))
        << error;
    unsetenv("GNUPGHOME");
    const std::string byPublisher = signedCpk(publisher, "by-publisher");
    const std::string unsignedCpk = testutil::makeCpk("/tmp/unsigned.cpk");

    ASSERT_EQ(VLIBCINFOSetKeyValue("pkg_source_trust_level", "0"), 0);
    EXPECT_EQ(PackageManager::verifyPackageSignature("/tmp/signed.cpk"), PKG_SIGNATURE_OK);
    EXPECT_EQ(PackageManager::verifyPackageSignature(byPublisher.c_str()),
              PKG_ERR_NOT_MAKER_SIGNED);
    EXPECT_EQ(PackageManager::verifyPackageSignature(unsignedCpk.c_str()), PKG_ERR_NO_SIGNATURE);
    ASSERT_EQ(VLIBCINFOSetKeyValue("pkg_source_trust_level", "1"), 0);
    EXPECT_EQ(PackageManager::verifyPackageSignature(byPublisher.c_str()), PKG_SIGNATURE_OK);
    ASSERT_EQ(chdir("/tmp"), 0);
    EXPECT_EQ(PackageManager::verifyPackageSignature("signed.cpk"), PKG_SIGNATURE_OK)
        << "the engine hands the tool an absolute path";
}
