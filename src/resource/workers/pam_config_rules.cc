// "pam-config": the rules of one generated PAM file, and the file itself.
//
// With autoblock, the file reads: the autoblock check, the account sources of the auth
// group, the failure logger, the success logger, then the account group's sources in the
// opposite order with the same two loggers. A source that succeeds jumps over the sources
// after it and the failure logger, so its jump is the number of sources still to come
// plus one; a source that fails falls through to the next one and, after the last, into
// the failure logger, which ends the stack.
#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>

#include <memory>
#include <string>
#include <vector>

#include "corv/log.h"
#include "resource/workers/pam_config.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kAutoblockModule[] = "pam_corv_autoblock.so";
const char kLogFailModule[] = "pam_corv_log_fail.so";
const char kLogSuccessModule[] = "pam_corv_log_success.so";
const char kPrivilegeModule[] = "pam_corv_privilege.so";
const char kUnixModule[] = "pam_unix.so";
const char kWinbindModule[] = "pam_winbind.so";
const char kLdapModule[] = "pam_ldap.so";

struct Source {
    PAMConfig::AUTH_TYPE type;
    const char* module;
    bool shortForm;
};

const Source kAuthOrder[] = {
    {PAMConfig::AUTH_TYPE_LOCAL, kUnixModule, false},
    {PAMConfig::AUTH_TYPE_DOMAIN, kWinbindModule, true},
    {PAMConfig::AUTH_TYPE_LDAP, kLdapModule, false},
};
const Source kAccountOrder[] = {
    {PAMConfig::AUTH_TYPE_LDAP, kLdapModule, false},
    {PAMConfig::AUTH_TYPE_DOMAIN, kWinbindModule, true},
    {PAMConfig::AUTH_TYPE_LOCAL, kUnixModule, false},
};

struct FileCloser {
    void operator()(FILE* file) const { fclose(file); }
};

std::string LoggerArg(const std::string& serviceName, bool log) {
    return "[" + serviceName + "]" + (log ? "" : " log=no");
}

}  // namespace

std::string PAMConfig::Rule::ToString() const {
    std::string line = type + "\t" + control + "\t" + module;
    if (!args.empty()) {
        line += "\t" + args;
    }
    return line;
}

std::string PAMConfig::Params::GenConfigControl(unsigned int jump, bool shortForm) {
    const std::string action = jump == 0 ? "done" : std::to_string(jump);
    return "[success=" + action +
           (shortForm ? " acct_expired=die default=ignore]"
                      : " acct_expired=die authtok_expired=die new_authtok_reqd=die "
                        "default=ignore]");
}

bool PAMConfig::Params::AppendAppPrivRule(std::vector<Rule>& rules) const {
    rules.push_back({"account", "requisite", kPrivilegeModule, "[" + appId + "]"});
    return true;
}

bool PAMConfig::Params::AppendRulesWithAutoblock(std::vector<Rule>& rules) const {
    const unsigned int count = static_cast<unsigned int>(authTypes.size());
    const std::string failArg = LoggerArg(serviceName, logFailure);
    const std::string successArg = LoggerArg(serviceName, logSuccess);
    rules.push_back({"auth", "requisite", kAutoblockModule, ""});
    for (const auto& group :
         {std::make_pair("auth", kAuthOrder), std::make_pair("account", kAccountOrder)}) {
        unsigned int jump = count;
        for (size_t i = 0; i < 3; ++i) {
            const Source& source = group.second[i];
            if (HasAuthType(source.type)) {
                rules.push_back(
                    {group.first, GenConfigControl(jump, source.shortForm), source.module, ""});
                --jump;
            }
        }
        rules.push_back({group.first, "[default=die]", kLogFailModule, failArg});
        rules.push_back({group.first, "[default=done]", kLogSuccessModule, successArg});
    }
    return true;
}

bool PAMConfig::Params::AppendRulesWithoutAutoblock(std::vector<Rule>& rules) const {
    for (const auto& group :
         {std::make_pair("auth", kAuthOrder), std::make_pair("account", kAccountOrder)}) {
        for (size_t i = 0; i < 3; ++i) {
            const Source& source = group.second[i];
            if (HasAuthType(source.type)) {
                rules.push_back(
                    {group.first, GenConfigControl(0, source.shortForm), source.module, ""});
            }
        }
    }
    return true;
}

bool PAMConfig::Params::DumpToFile(FILE* file, const std::vector<Rule>& rules) const {
    for (const Rule& rule : rules) {
        if (fprintf(file, "%s\n", rule.ToString().c_str()) < 0) {
            return false;
        }
    }
    return fflush(file) == 0;
}

bool PAMConfig::Params::Generate(std::string& path) const {
    std::string tmpPath = "/tmp/" + filename + ".XXXXXX";
    const int fd = mkstemp(&tmpPath[0]);
    if (fd < 0) {
        CORV_LOG_ERR("Failed to create tmp file");
        return false;
    }
    std::unique_ptr<FILE, FileCloser> file(fdopen(fd, "w"));
    if (!file) {
        CORV_LOG_ERR("Failed to create tmp file");
        close(fd);
        unlink(tmpPath.c_str());
        return false;
    }
    std::vector<Rule> rules;
    if (appPrivilege) {
        AppendAppPrivRule(rules);
    }
    if (!(autoblock ? AppendRulesWithAutoblock(rules) : AppendRulesWithoutAutoblock(rules))) {
        CORV_LOG_ERR("Failed to append pam config rules");
        unlink(tmpPath.c_str());
        return false;
    }
    const bool dumped = DumpToFile(file.get(), rules);
    if (fclose(file.release()) != 0 || !dumped) {
        CORV_LOG_ERR("Failed to dump tmp file");
        unlink(tmpPath.c_str());
        return false;
    }
    path = tmpPath;
    return true;
}

}  // namespace Resource
}  // namespace CORVPackageTool
