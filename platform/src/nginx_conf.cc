// Regeneration of the web server's package configuration.
#include "corv/nginx_conf.h"

#include <errno.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <sstream>
#include <string>

#include "app_portal.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "io_util.h"

namespace corvw3 {

namespace {

const char kNginx[] = "/usr/sbin/nginx";

bool ReadFile(const std::string& path, std::string& text, bool& present) {
    std::ifstream in(path);
    present = static_cast<bool>(in);
    if (!present) {
        return errno == ENOENT;
    }
    std::stringstream buffer;
    buffer << in.rdbuf();
    text = buffer.str();
    return true;
}

bool WriteAtomically(const std::string& path, const std::string& text) {
    return corvplat::replaceWhole(path, text, 0644, nullptr);
}

}  // namespace

NginxConfManager::NginxConfManager(int scope) : scope_(scope) {}

const char* NginxConfManager::PackageConfDir() {
    return "/usr/corv/etc/nginx/package.d";
}

const char* NginxConfManager::GeneratedPath() {
    return "/etc/nginx/conf.d/corv-packages.conf";
}

int NginxConfManager::run() {
    if (scope_ != 4) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (access(kNginx, X_OK) != 0) {
        VLIBCErrSet(ERR_NOT_APPLICABLE);
        return -1;
    }
    std::string text = "# Package web configurations. Generated; do not edit.\n";
    if (VLIBCFileCheckDir(PackageConfDir()) == 1) {
        PVLIBSZLIST list = VLIBCSzListAlloc(64);
        if (list == nullptr || VLIBCFileEnumDir(PackageConfDir(), ".conf", &list, 0) < 0) {
            VLIBCSzListFree(list);
            return -1;
        }
        for (int i = 0; i < VLIBCSzListCount(list); ++i) {
            text +=
                std::string("include ") + PackageConfDir() + "/" + VLIBCSzListGet(list, i) + ";\n";
        }
        VLIBCSzListFree(list);
    }
    text += RenderPortalServer();
    const std::string path = GeneratedPath();
    std::string previous;
    bool hadPrevious = false;
    if (!ReadFile(path, previous, hadPrevious)) {
        VLIBCErrSet(ERR_READ_FAILED);
        return -1;
    }
    if (CORVFSMkdirP("/etc/nginx/conf.d", nullptr, 1, -1, -1, 0755) != 0 ||
        !WriteAtomically(path, text)) {
        return -1;
    }
    if (VLIBCExecl(kNginx, 0xbb, "-t", "-q", nullptr) != 0) {
        CORV_LOG_ERR("nginx refuses the configuration with %s", path.c_str());
        if (hadPrevious) {
            WriteAtomically(path, previous);
        } else {
            unlink(path.c_str());
        }
        VLIBCErrSet(ERR_MALFORMED);
        return -1;
    }
    return 0;
}

}  // namespace corvw3
