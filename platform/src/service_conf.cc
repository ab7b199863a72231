// Protocol files: the ports that packages declare (format in corv/service_conf.h).
#include "corv/service_conf.h"

#include <errno.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <memory>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"

namespace {

constexpr int kPackageType = 2;

struct ListDeleter {
    void operator()(PVLIBSZLIST list) const { VLIBCSzListFree(list); }
};
struct HashDeleter {
    void operator()(PVLIBSZHASH hash) const { VLIBCSzHashFree(hash); }
};

bool parseNumber(const std::string& text, int& out) {
    if (text.empty() || text.size() > 5 ||
        text.find_first_not_of("0123456789") != std::string::npos) {
        return false;
    }
    out = atoi(text.c_str());
    return out >= 1 && out <= 65535;
}

// "8080,9000:9010/tcp,udp" into ranges of `service`.
bool parsePorts(const std::string& service, const std::string& text,
                std::vector<CORVSERVICECONFPORT>& out) {
    const size_t slash = text.rfind('/');
    if (slash == std::string::npos) {
        return false;
    }
    std::vector<std::string> protocols;
    std::string protoText = text.substr(slash + 1);
    for (size_t start = 0; start <= protoText.size();) {
        size_t comma = protoText.find(',', start);
        std::string p =
            protoText.substr(start, comma == std::string::npos ? std::string::npos : comma - start);
        if (p != "tcp" && p != "udp") {
            return false;
        }
        protocols.push_back(p);
        if (comma == std::string::npos) {
            break;
        }
        start = comma + 1;
    }
    std::string list = text.substr(0, slash);
    for (size_t start = 0; start <= list.size();) {
        size_t comma = list.find(',', start);
        std::string item =
            list.substr(start, comma == std::string::npos ? std::string::npos : comma - start);
        size_t colon = item.find(':');
        int from = 0;
        int to = 0;
        if (!parseNumber(item.substr(0, colon), from) ||
            !parseNumber(
                colon == std::string::npos ? item.substr(0, colon) : item.substr(colon + 1), to) ||
            from > to) {
            return false;
        }
        for (const std::string& p : protocols) {
            out.push_back({service, p, from, to});
        }
        if (comma == std::string::npos) {
            break;
        }
        start = comma + 1;
    }
    return true;
}

bool validName(const char* name) {
    return name != nullptr && name[0] != '\0' && name[0] != '.' && strchr(name, '/') == nullptr;
}

int installAs(const char* name, const char* path, int type, PCORVSERVICECONFPORTS* ports,
              bool replace) {
    if (ports != nullptr) {
        *ports = nullptr;
    }
    if (!validName(name) || path == nullptr || type != kPackageType) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    PCORVSERVICECONFPORTS parsed = nullptr;
    if (CORVServiceConfParse(path, &parsed) != 0) {
        return -1;
    }
    std::unique_ptr<CORVSERVICECONFPORTS> owner(parsed);
    if (CORVFSMkdirP(CORV_SERVICE_CONF_PKG_DIR, nullptr, 1, -1, -1, 0755) != 0) {
        return -1;
    }
    const std::string destination = std::string(CORV_SERVICE_CONF_PKG_DIR) + "/" + name;
    if (!replace && access(destination.c_str(), F_OK) == 0) {
        VLIBCErrSet(ERR_CREATE_FAILED);
        return -1;
    }
    if (!CORV::PkgUtils::InstallConfigFile(path, destination, 0644, true)) {
        return -1;
    }
    if (ports != nullptr) {
        *ports = owner.release();
    }
    return 0;
}

}  // namespace

int CORVServiceConfParse(const char* path, PCORVSERVICECONFPORTS* ports) {
    if (path == nullptr || ports == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    *ports = nullptr;
    if (VLIBCFileExist(path) != 1) {
        VLIBCErrSet(ERR_NO_SUCH_FILE);
        return -1;
    }
    std::unique_ptr<VLIBSZLIST, ListDeleter> sections(VLIBCSzListAlloc(16));
    PVLIBSZLIST raw = sections.get();
    if (VLIBCFileEnumSection(path, &raw) < 1) {
        VLIBCErrSet(ERR_MALFORMED);
        return -1;
    }
    std::unique_ptr<CORVSERVICECONFPORTS> out(new CORVSERVICECONFPORTS);
    for (int i = 0; VLIBCSzListGet(raw, i) != nullptr; ++i) {
        const std::string service = VLIBCSzListGet(raw, i);
        std::unique_ptr<VLIBSZHASH, HashDeleter> keys(VLIBCSzHashAlloc(16));
        PVLIBSZHASH hash = keys.get();
        const char* value = nullptr;
        if (VLIBCFileGetSection(path, service.c_str(), &hash) < 0 ||
            (value = VLIBCSzHashGetValue(hash, "dst.ports")) == nullptr ||
            !parsePorts(service, value, out->ports)) {
            CORV_LOG_ERR("Bad ports of [%s] in %s", service.c_str(), path);
            VLIBCErrSet(ERR_MALFORMED);
            return -1;
        }
    }
    *ports = out.release();
    return 0;
}

int CORVServiceConfInstallBaseName(const char* name, const char* path, int type,
                                   PCORVSERVICECONFPORTS* ports) {
    return installAs(name, path, type, ports, false);
}

int CORVServiceConfUpdateBaseName(const char* name, const char* path, int type,
                                  PCORVSERVICECONFPORTS* ports) {
    return installAs(name, path, type, ports, true);
}

int VLIBServiceConfRemoveBaseName(const char* name, int type) {
    if (!validName(name) || type != kPackageType) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    const std::string path = std::string(CORV_SERVICE_CONF_PKG_DIR) + "/" + name;
    if (unlink(path.c_str()) != 0 && errno != ENOENT) {
        VLIBCErrSet(ERR_UNLINK_FAILED);
        return -1;
    }
    return 0;
}

void CORVServiceConfPortsFree(PCORVSERVICECONFPORTS ports) {
    delete ports;
}

int CORVServiceConfPortTaken(const char* protocol, int from, int to, const char* exceptName) {
    std::unique_ptr<VLIBSZLIST, ListDeleter> names(VLIBCSzListAlloc(16));
    PVLIBSZLIST raw = names.get();
    if (protocol == nullptr || VLIBCFileEnumDir(CORV_SERVICE_CONF_PKG_DIR, ".sc", &raw, 0) < 0) {
        return 0;
    }
    for (int i = 0; VLIBCSzListGet(raw, i) != nullptr; ++i) {
        const std::string name = VLIBCSzListGet(raw, i);
        if (exceptName != nullptr && name == exceptName) {
            continue;
        }
        PCORVSERVICECONFPORTS ports = nullptr;
        const std::string path = std::string(CORV_SERVICE_CONF_PKG_DIR) + "/" + name;
        if (CORVServiceConfParse(path.c_str(), &ports) != 0) {
            continue;
        }
        std::unique_ptr<CORVSERVICECONFPORTS> owner(ports);
        for (const CORVSERVICECONFPORT& port : ports->ports) {
            if (port.protocol == protocol && port.from <= to && from <= port.to) {
                return 1;
            }
        }
    }
    return 0;
}
