// The one-shot hand-over of a caller's context to the job that starts or stops a package.
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <string>

#include "common/vlibc_holders.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/service.h"

namespace CORVPackageTool {
namespace Service {

std::string ExtraEnvPath(const std::string& name) {
    return "/tmp/corvpkgctl.tmp-" + name;
}

bool DumpExtraEnv(const std::string& name, PKG_INSTALLATION_TYPE type, const char* language,
                  const char* userName) {
    if (name.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    const std::string path = ExtraEnvPath(name);
    SzHash hash(0x400);
    char action[16];
    snprintf(action, sizeof(action), "0x%04x", static_cast<unsigned>(type));
    bool ok = static_cast<bool>(hash);
    auto set = [&](const char* key, const char* value) {
        if (ok && value != nullptr && VLIBCSzHashSetValue(hash.addr(), key, value) < 0) {
            CORV_LOG_ERR("Failed to set %s=%s [0x%04X %s:%d]", key, value, VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            ok = false;
        }
    };
    set("action", action);
    set("language", language);
    set("username", userName);
    if (ok && VLIBCFileSetPair(path.c_str(), hash.get(), 0) < 0) {
        CORV_LOG_ERR("Failed to dump %s [0x%04X %s:%d]", path.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        ok = false;
    }
    if (!ok) {
        unlink(path.c_str());
    }
    return ok;
}

bool LoadExtraEnv(const std::string& name, PKG_INSTALLATION_TYPE* type, char** language,
                  char** userName) {
    if (name.empty() || type == nullptr || (language != nullptr && *language != nullptr) ||
        (userName != nullptr && *userName != nullptr)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    const std::string path = ExtraEnvPath(name);
    // One reader only: the file goes whatever the outcome.
    struct Remover {
        const std::string& path;
        ~Remover() { unlink(path.c_str()); }
    } remover{path};

    SzHash hash(0x400);
    if (!hash) {
        return false;
    }
    if (VLIBCFileGetPair(path.c_str(), hash.addr()) < 0) {
        if (VLIBCErrGet() == ERR_OPEN_FAILED) {
            *type = static_cast<PKG_INSTALLATION_TYPE>(0);
            return true;
        }
        CORV_LOG_ERR("Failed to load %s [0x%04X %s:%d]", path.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    const char* action = VLIBCSzHashGetValue(hash.get(), "action");
    if (action != nullptr) {
        *type = static_cast<PKG_INSTALLATION_TYPE>(strtol(action, nullptr, 16));
    }
    struct Out {
        char** target;
        const char* key;
    } outs[] = {{language, "language"}, {userName, "username"}};
    for (const Out& out : outs) {
        const char* value = VLIBCSzHashGetValue(hash.get(), out.key);
        if (out.target == nullptr || value == nullptr) {
            continue;
        }
        *out.target = strdup(value);
        if (*out.target == nullptr) {
            VLIBCErrSet(ERR_OUT_OF_MEMORY);
            return false;
        }
    }
    return true;
}

}  // namespace Service
}  // namespace CORVPackageTool
