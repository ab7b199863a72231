// The PAM files that "pam-config" generates, and which descriptions it takes.
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>

#include "corvpkg/json_util.h"
#include "resource/workers/pam_config.h"
#include "support/files.h"

using CORVPackageTool::Resource::NeedInstallConfig;
using CORVPackageTool::Resource::PAMConfig;

namespace {

Json::Value Parse(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(CORVPackageTool::fromString(text, value)) << text;
    return value;
}

// The generated file of a description, "" when it does not load or generate.
std::string Generated(const std::string& config) {
    PAMConfig::Params params;
    std::string path;
    if (!params.Load(Parse(config)) || !params.Generate(path)) {
        return "";
    }
    std::string text = testutil::readFile(path);
    unlink(path.c_str());
    return text;
}

const char kLong[] = " acct_expired=die authtok_expired=die new_authtok_reqd=die default=ignore]";
const char kShort[] = " acct_expired=die default=ignore]";

}  // namespace

TEST(PamConfigRules, LocalWithAutoblockSkipsOnlyTheFailureLogger) {
    EXPECT_EQ(Generated(R"({"filename":"demo","auth-types":["local"],)"
                        R"("autoblock":{"service-name":"demo","log-failure":true}})"),
              std::string("auth\trequisite\tpam_corv_autoblock.so\n") + "auth\t[success=1" + kLong +
                  "\tpam_unix.so\n" + "auth\t[default=die]\tpam_corv_log_fail.so\t[demo]\n" +
                  "auth\t[default=done]\tpam_corv_log_success.so\t[demo] log=no\n" +
                  "account\t[success=1" + kLong + "\tpam_unix.so\n" +
                  "account\t[default=die]\tpam_corv_log_fail.so\t[demo]\n" +
                  "account\t[default=done]\tpam_corv_log_success.so\t[demo] log=no\n");
}

TEST(PamConfigRules, JumpsCountTheSourcesStillToComeInEachGroupsOrder) {
    // Account sources come in the opposite order, so the jumps swap between the groups.
    EXPECT_EQ(Generated(R"({"filename":"demo","auth-types":["ldap","local","local"],)"
                        R"("autoblock":{"service-name":"svc","log-success":true}})"),
              std::string("auth\trequisite\tpam_corv_autoblock.so\n") + "auth\t[success=2" + kLong +
                  "\tpam_unix.so\n" + "auth\t[success=1" + kLong + "\tpam_ldap.so\n" +
                  "auth\t[default=die]\tpam_corv_log_fail.so\t[svc] log=no\n" +
                  "auth\t[default=done]\tpam_corv_log_success.so\t[svc]\n" + "account\t[success=2" +
                  kLong + "\tpam_ldap.so\n" + "account\t[success=1" + kLong + "\tpam_unix.so\n" +
                  "account\t[default=die]\tpam_corv_log_fail.so\t[svc] log=no\n" +
                  "account\t[default=done]\tpam_corv_log_success.so\t[svc]\n");
    const std::string all = Generated(R"({"filename":"d","auth-types":["ldap","domain","local"],)"
                                      R"("autoblock":{"service-name":"s"}})");
    EXPECT_NE(
        all.find("auth\t[success=3" + std::string(kLong) + "\tpam_unix.so\n" + "auth\t[success=2" +
                 kShort + "\tpam_winbind.so\n" + "auth\t[success=1" + kLong + "\tpam_ldap.so\n"),
        std::string::npos)
        << all;
}

TEST(PamConfigRules, WithoutAutoblockEverySourceIsDoneAndThePrivilegeComesFirst) {
    EXPECT_EQ(Generated(R"({"filename":"demo","auth-types":["domain","ldap","local"],)"
                        R"("app-privilege":{"app-id":"Corv.Demo"}})"),
              std::string("account\trequisite\tpam_corv_privilege.so\t[Corv.Demo]\n") +
                  "auth\t[success=done" + kLong + "\tpam_unix.so\n" + "auth\t[success=done" +
                  kShort + "\tpam_winbind.so\n" + "auth\t[success=done" + kLong +
                  "\tpam_ldap.so\n" + "account\t[success=done" + kLong + "\tpam_ldap.so\n" +
                  "account\t[success=done" + kShort + "\tpam_winbind.so\n" +
                  "account\t[success=done" + kLong + "\tpam_unix.so\n");
}

TEST(PamConfigRules, NoSourcesWithAutoblockLeaveTheCheckAndTheLoggers) {
    EXPECT_EQ(Generated(R"({"filename":"x","auth-types":[],"autoblock":{"service-name":"x"}})"),
              "auth\trequisite\tpam_corv_autoblock.so\n"
              "auth\t[default=die]\tpam_corv_log_fail.so\t[x] log=no\n"
              "auth\t[default=done]\tpam_corv_log_success.so\t[x] log=no\n"
              "account\t[default=die]\tpam_corv_log_fail.so\t[x] log=no\n"
              "account\t[default=done]\tpam_corv_log_success.so\t[x] log=no\n");
}

TEST(PamConfigRules, DescriptionsThatDoNotLoad) {
    const char* kCases[] = {
        R"("not an object")",
        R"({"auth-types":["local"]})",
        R"({"filename":"","auth-types":["local"]})",
        R"({"filename":7,"auth-types":["local"]})",
        R"({"filename":"demo"})",
        R"({"filename":"demo","auth-types":"local"})",
        R"({"filename":"demo","auth-types":["local","kerberos"]})",
        R"({"filename":"demo","auth-types":["local",1]})",
        R"({"filename":"demo","auth-types":["local"],"id":3})",
        R"({"filename":"demo","auth-types":["local"],"autoblock":true})",
        R"({"filename":"demo","auth-types":["local"],"autoblock":{}})",
        R"({"filename":"demo","auth-types":["local"],"autoblock":{"service-name":"s","log-success":"yes"}})",
        R"({"filename":"demo","auth-types":["local"],"app-privilege":{"app":"x"}})",
        // Names that would leave /etc/pam.d or write rules of their own.
        R"({"filename":"../shadow","auth-types":["local"]})",
        R"({"filename":"sub/demo","auth-types":["local"]})",
        R"({"filename":".hidden","auth-types":["local"]})",
        R"({"filename":"a b","auth-types":["local"]})",
        R"({"filename":"demo","auth-types":["local"],"autoblock":{"service-name":"x]\nauth sufficient pam_permit.so"}})",
        R"({"filename":"demo","auth-types":["local"],"autoblock":{"service-name":"x y"}})",
        R"({"filename":"demo","auth-types":["local"],"autoblock":{"service-name":""}})",
        R"({"filename":"demo","auth-types":["local"],"app-privilege":{"app-id":"a]\taccount"}})",
    };
    for (const char* config : kCases) {
        PAMConfig::Params params;
        EXPECT_FALSE(params.Load(Parse(config))) << config;
    }
    PAMConfig::Params params;
    ASSERT_TRUE(params.Load(Parse(R"({"filename":"demo-1.x_y","auth-types":["local"],"id":"a"})")));
    EXPECT_EQ(params.GetFilename(), "demo-1.x_y");
    EXPECT_EQ(params.GetId(), "a");
    EXPECT_TRUE(params.HasAuthType(PAMConfig::AUTH_TYPE_LOCAL));
    EXPECT_FALSE(params.HasAuthType(PAMConfig::AUTH_TYPE_LDAP));
}

TEST(PamConfigRules, SelectionTakesTheFirstListThatIsNotEmpty) {
    const struct {
        const char* id;
        const char* idList;
        const char* installed;
        const char* defaults;
        bool install;
    } kCases[] = {
        {"", R"(["a"])", R"(["a"])", R"(["a"])", true},
        {"a", "[]", "[]", "[]", true},
        {"a", R"(["b"])", R"(["a"])", R"(["a"])", false},
        {"a", R"(["a"])", R"(["b"])", R"(["b"])", true},
        {"a", "[]", R"(["b"])", R"(["a"])", false},
        {"a", "[]", R"(["a"])", R"(["b"])", true},
        {"a", "[]", "[]", R"(["b"])", false},
        {"a", "[]", "[]", R"(["a"])", true},
    };
    for (const auto& c : kCases) {
        EXPECT_EQ(NeedInstallConfig(c.id, Parse(c.idList), Parse(c.installed), Parse(c.defaults)),
                  c.install)
            << c.id << " " << c.idList << " " << c.installed << " " << c.defaults;
    }
}
