// The package's service file: how the platform's service layer knows a package.
#include <sys/stat.h>
#include <unistd.h>

#include <set>
#include <string>

#include "corv/file_replace.h"
#include "corv/log.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/service.h"

namespace CORVPackageTool {
namespace Service {

namespace {

// Validated before it gets its name, so the service layer never reads a file it refuses.
bool WriteServiceCfgFile(const std::string& path, const Json::Value& cfg) {
    return CORVFileReplace(path, toString(cfg), 0644, [](const char* written) {
        if (VLIBServicecfgValidate(written) < 0) {
            CORV_LOG_ERR("Invalid %s[0x%04X %s:%d]", written, VLIBCErrGet(), VLIBCErrorGetFile(),
                         VLIBCErrorGetLine());
            return false;
        }
        return true;
    });
}

}  // namespace

bool GenServiceCfg(const std::string& name, const Json::Value& /*conf*/, bool force) {
    if (name.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    const std::string path = ServiceCfgPath(name);
    const std::string job = PackageJobName(name);
    if (force || VLIBCFileExist(path.c_str()) != 1) {
        std::set<std::string> required;
        bool ok =
            GetDependentPkg(name, required, PackageJobName) && GetDependentService(name, required);
        if (ok) {
            Json::Value cfg(Json::objectValue);
            cfg["init_job_map"]["upstart"].append(job);
            if (!required.empty()) {
                Json::Value& list = cfg["required_corvservice"];
                list = Json::Value(Json::arrayValue);
                for (const std::string& service : required) {
                    list.append(service);
                }
            }
            cfg["auto_start"] = "no";
            cfg["is_package"] = "yes";
            ok = WriteServiceCfgFile(path, cfg);
        }
        if (!ok) {
            CORV_LOG_ERR("Failed to generate service cfg for %s [0x%04X %s:%d]", name.c_str(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return false;
        }
    }
    const std::string enabled = "/var/packages/" + name + "/enabled";
    const int key = VLIBCFileExist(enabled.c_str()) == 1 ? 1 : 2;
    if (VLIBServicecfgRunKeySet(job.c_str(), key) < 0) {
        CORV_LOG_ERR("Failed to set runkey=%d for %s [0x%04X %s:%d]", key, job.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    return true;
}

}  // namespace Service
}  // namespace CORVPackageTool
