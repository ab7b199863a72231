// Ports in use on this machine, and the system web server's own ports.
#include "corv/web.h"
#include "corv/handles.h"

#include <dirent.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <string>

#include "corv/firewall.h"
#include "corv/nginx_conf.h"
#include "corv/service.h"
#include "corv/service_conf.h"
#include "corv/vlibc.h"

namespace {

constexpr int kListenState = 0x0A;

// A socket listening on a port of the range, from the kernel's socket tables.
bool listening(const char* table, int from, int to) {
    CORVUniqueFile f{fopen(table, "re")};
    if (!f) {
        return false;
    }
    char line[512];
    bool found = false;
    if (fgets(line, sizeof(line), f.get()) != nullptr) {  // the header
        while (!found && fgets(line, sizeof(line), f.get()) != nullptr) {
            char local[128];
            char remote[128];
            int state = 0;
            if (sscanf(line, "%*d: %127s %127s %x", local, remote, &state) != 3) {
                continue;
            }
            const char* colon = strrchr(local, ':');
            if (colon == nullptr || state != kListenState) {
                continue;
            }
            long port = strtol(colon + 1, nullptr, 16);
            found = port >= from && port <= to;
        }
    }
    return found;
}

// A port that an installed package declared, even while the package is stopped.
bool declaredByPackage(int from, int to) {
    CORVUniqueDir dir{opendir("/var/packages")};
    if (!dir) {
        return false;
    }
    bool found = false;
    while (!found) {
        struct dirent* entry = readdir(dir.get());
        if (entry == nullptr) {
            break;
        }
        if (entry->d_name[0] == '.') {
            continue;
        }
        std::string info = std::string("/var/packages/") + entry->d_name + "/INFO";
        char value[32] = "";
        if (VLIBCFileGetKeyValue(info.c_str(), "adminport", value, sizeof(value), 0) > 0) {
            long port = strtol(value, nullptr, 10);
            found = port >= from && port <= to;
        }
    }
    return found;
}

int configuredPort(const char* key, int fallback) {
    char value[32] = "";
    if (VLIBCFileGetKeyValue(VLIBC_INFO_PATH, key, value, sizeof(value), 0) > 0) {
        long port = strtol(value, nullptr, 10);
        if (port > 0 && port < 65536) {
            return static_cast<int>(port);
        }
    }
    return fallback;
}

}  // namespace

namespace WebUtils {

bool IsPortConflict(const char*, int from, int to) {
    if (from > to) {
        return false;
    }
    return listening("/proc/net/tcp", from, to) || listening("/proc/net/tcp6", from, to) ||
           declaredByPackage(from, to) || CORVServiceConfPortTaken("tcp", from, to, nullptr) == 1;
}

}  // namespace WebUtils

namespace corvw3 {

Engine::Engine() = default;

bool Engine::W3FwReGenAll() {
    if (NginxConfManager(4).run() < 0) {
        return false;
    }
    // A reload of a web server that does not run is nothing to do (0).
    return VLIBServiceReload("nginx") == 0;
}

bool Engine::HupFirewall() {
    return CORVFwRuleHup() == 0;
}

NOS::NOS(Engine* engine) : engine_(engine) {}
int NOS::GetHttpPort() const {
    return configuredPort("http_port", 5000);
}
int NOS::GetHttpsPort() const {
    return configuredPort("https_port", 5001);
}

}  // namespace corvw3
