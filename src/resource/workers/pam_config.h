// "pam-config": PAM service files that a package brings, each generated from a
// declarative description and installed under /etc/pam.d/.
//
// A description (one element of the section's "configs") names the file, the account
// sources that may sign in ("local", "domain", "ldap"), and optionally the platform's
// autoblock with its sign-in loggers and an application privilege that the account must
// hold. The generated rules are ordered so that each authentication module that succeeds
// jumps over the remaining ones and the failure logger onto the success logger.
#pragma once

#include <stdio.h>

#include <set>
#include <string>
#include <vector>

#include "corv/pkgutils.h"

namespace CORVPackageTool {
namespace Resource {

class PAMConfig : public CORV::PkgUtils::IWorker {
  public:
    enum AUTH_TYPE {
        AUTH_TYPE_UNKNOWN = 0,
        AUTH_TYPE_LOCAL = 1,
        AUTH_TYPE_DOMAIN = 2,
        AUTH_TYPE_LDAP = 8,
    };

    // One line of a PAM file: type, control, module and, when not empty, args, separated
    // by tabs.
    struct Rule {
        std::string type;
        std::string control;
        std::string module;
        std::string args;
        std::string ToString() const;
    };

    // One element of "configs".
    class Params {
      public:
        Params();
        // False, with a log line, when the element is not an object or a field is missing
        // or malformed. Names that end up in the file or its path must be plain words: a
        // filename of [A-Za-z0-9._-] not starting with '.', a service name and an app id
        // without blanks, brackets or control characters - anything else could add rules
        // of its own to the file or put it outside /etc/pam.d.
        bool Load(const Json::Value& config);
        const std::string& GetFilename() const { return filename; }
        const std::string& GetId() const { return id; }
        bool HasAuthType(AUTH_TYPE type) const { return authTypes.count(type) != 0; }

        // The rules, written to a new file "/tmp/<filename>.XXXXXX" whose path goes to
        // `path`. On failure nothing is left behind and `path` is untouched.
        bool Generate(std::string& path) const;
        // "[success=<jump, or done for 0> ...]": the long form for pam_unix and pam_ldap,
        // the short one for pam_winbind.
        static std::string GenConfigControl(unsigned int jump, bool shortForm);
        bool AppendAppPrivRule(std::vector<Rule>& rules) const;
        bool AppendRulesWithAutoblock(std::vector<Rule>& rules) const;
        bool AppendRulesWithoutAutoblock(std::vector<Rule>& rules) const;
        bool DumpToFile(FILE* file, const std::vector<Rule>& rules) const;

      private:
        bool LoadFilename(const Json::Value& config);
        bool LoadAuthTypes(const Json::Value& config);
        bool LoadId(const Json::Value& config);
        bool LoadAutoblock(const Json::Value& config);
        bool LoadAppPriv(const Json::Value& config);

        std::string filename;
        std::set<AUTH_TYPE> authTypes;
        std::string id;
        bool autoblock;
        std::string serviceName;
        bool logSuccess;
        bool logFailure;
        bool appPrivilege;
        std::string appId;
    };

    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override;
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override;
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override;
    bool IsUpdatable() override { return true; }
};

// "local", "domain", "ldap"; AUTH_TYPE_UNKNOWN for anything else.
PAMConfig::AUTH_TYPE GetAuthTypeFromString(const std::string& word);
// Whether `array` is an array holding the string `id`.
bool IdInArray(const std::string& id, const Json::Value& array);
// Whether the config with `id` is installed now: one without id always; else, by the first
// of these that is not empty, when `idList` (the caller's choice), `installedIds` (what
// was installed before) or `defaults` holds it; with all three empty, always.
bool NeedInstallConfig(const std::string& id, const Json::Value& idList,
                       const Json::Value& installedIds, const Json::Value& defaults);

}  // namespace Resource
}  // namespace CORVPackageTool
