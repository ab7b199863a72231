// The fixed tables of the catalogue: INFO keys and their mask bits, restartable daemons,
// architectures and operation names. All are built at load and never change.
#include <string.h>

#include <string>

#include "catalogue/pkginfo_private.h"
#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

const std::map<unsigned long long, std::string> g_MappingPKGInfoFields = {
    {0, "package"},
    {1, "version"},
    {2, "description"},
    {3, "displayname"},
    {4, "maintainer"},
    {5, "distributor"},
    {6, "arch"},
    {7, "exclude_arch"},
    {8, "model"},
    {9, "adminprotocol"},
    {10, "adminurl"},
    {11, "adminport"},
    {12, "firmware"},
    {13, "nosuidir"},
    {14, "nosappname"},
    {15, "checkport"},
    {16, "startable"},
    {17, "helpurl"},
    {18, "install_reboot"},
    {19, "install_dep_packages"},
    {20, "install_dep_services"},
    {21, "instuninst_restart_services"},
    {22, "startstop_restart_services"},
    {23, "start_dep_services"},
    {24, "checksum"},
    {25, "package_icon"},
    {26, "package_icon_256"},
    {27, "report_url"},
    {28, "support_center"},
    {29, "support_url"},
    {30, "allow_altport"},
    {31, "extractsize"},
    {32, "install_conflict_packages"},
    {34, "distributor_url"},
    {35, "maintainer_url"},
    {36, "silent_install"},
    {37, "silent_upgrade"},
    {38, "silent_uninstall"},
    {39, "install_type"},
    {40, "precheckstartstop"},
    {41, "beta"},
    {42, "os_min_ver"},
    {43, "os_max_ver"},
    {44, "ctl_uninstall"},
    {45, "ctl_stop"},
};

const std::map<unsigned long long, unsigned long long> g_MappingPKGInfoAdditional = {
    {2, INFO_MASK_DESCRIPTION},
    {3, INFO_MASK_DISPLAYNAME},
    {4, INFO_MASK_MAINTAINER},
    {5, INFO_MASK_DISTRIBUTOR},
    {9, INFO_MASK_ADMIN},
    {10, INFO_MASK_ADMIN},
    {11, INFO_MASK_ADMIN},
    {14, INFO_MASK_NOSAPPNAME},
    {16, INFO_MASK_STARTABLE},
    {17, INFO_MASK_HELPURL},
    {18, INFO_MASK_INSTALL_REBOOT},
    {19, INFO_MASK_DEP_PACKAGES},
    {20, INFO_MASK_INSTALL_DEP_SERVICES},
    {21, INFO_MASK_RESTART_SERVICES},
    {22, INFO_MASK_RESTART_SERVICES},
    {23, INFO_MASK_START_DEP_SERVICES},
    {25, INFO_MASK_ICONS},
    {26, INFO_MASK_ICONS},
    {27, INFO_MASK_BETA},
    {28, INFO_MASK_SUPPORT_CENTER},
    {29, INFO_MASK_SUPPORT_URL},
    {32, INFO_MASK_CONFLICT_PACKAGES},
    {34, INFO_MASK_DISTRIBUTOR_URL},
    {35, INFO_MASK_MAINTAINER_URL},
    {36, INFO_MASK_SILENT_INSTALL},
    {37, INFO_MASK_SILENT_UPGRADE},
    {38, INFO_MASK_SILENT_UNINSTALL},
    {39, INFO_MASK_INSTALL_TYPE},
    {41, INFO_MASK_BETA},
    {44, INFO_MASK_CTL_UNINSTALL},
    {45, INFO_MASK_STARTABLE},
};

namespace {

// "firewall" and "nginx" share a restart bit on purpose: a web server reload also
// reloads the firewall rules, and only the firewall reports its health.
const MappingPKGRestartServices kRestartServices = {
    {"nginx", {0x40000000, 0}},
    {"mdns", {0x00020000, 0}},
    {"samba", {0x00000004, 0}},
    {"applenetwork", {0x00000001, 0}},
    {"cron", {0x00000008, 0}},
    {"nfs", {0x00008000, 0}},
    {"firewall", {0x40000000, 0x04000000}},
};

struct ArchEntry {
    const char* token;
    unsigned int mask;
};

const ArchEntry kArchTable[] = {
    {"88f5281", 0x00000040},     {"powerpc", 0x00000002},    {"ppc824x", 0x00000004},
    {"ppc854x", 0x00000008},     {"ixp420", 0x00000010},     {"ppc853x", 0x00000020},
    {"88f6281", 0x00000080},     {"88f6282", 0x00000080},    {"x86", 0x00000100},
    {"x64", 0x00000100},         {"bromolow", 0x00000200},   {"cedarview", 0x00000400},
    {"qoriq", 0x00000800},       {"armadaxp", 0x00001000},   {"armada370", 0x00002000},
    {"i686", 0x00008000},        {"armv5", 0x00000080},      {"ppc", 0x00000800},
    {"broadwellnk", 0x20000000}, {"armada37xx", 0x80000000}, {"armada375", 0x00040000},
    {"ti816x", 0x00004000},      {"evansport", 0x00008000},  {"catalina", 0x00010000},
    {"avoton", 0x00020000},      {"braswell", 0x00080000},   {"grantley", 0x00100000},
    {"broadwell", 0x00200000},   {"dockerx64", 0x00400000},  {"kvmx64", 0x00800000},
    {"alpine", 0x01000000},      {"alpine4k", 0x02000000},   {"apollolake", 0x04000000},
    {"rtd1296", 0x10000000},     {"x86_64", 0x6CFA0700},     {"armv7", 0x03000000},
    {"armv8", 0x90000000},       {"denverton", 0x08000000},  {"purley", 0x40000000},
    {"noarch", 0xFFFFFFFF},
};

}  // namespace

const MappingPKGRestartServices& PMSGetRestartServiceMap() {
    return kRestartServices;
}

int ServiceErrorEnum(std::vector<std::string>& names, int requested, int healthy) {
    const unsigned int req = static_cast<unsigned int>(requested);
    const unsigned int ok = static_cast<unsigned int>(healthy);
    for (const auto& [name, daemon] : kRestartServices) {
        if (daemon.status_bit != 0 && (req & daemon.restart_bit) != 0 &&
            (ok & daemon.status_bit) == 0) {
            names.push_back(name);
        }
    }
    return static_cast<int>(names.size());
}

unsigned long PMSConvMapRestartService(const char* words) {
    if (words == nullptr) {
        return 0;
    }
    unsigned long mask = 0;
    for (const std::string& word : PMSExplodeString(words, " \t")) {
        auto it = kRestartServices.find(word);
        if (it != kRestartServices.end()) {
            mask |= it->second.restart_bit;
        }
    }
    return mask;
}

const char* parseInstallTypeToStr(PKG_INSTALLATION_TYPE type) {
    switch (static_cast<int>(type)) {
        case PKG_INSTALL:
            return "install";
        case PKG_UPGRADE:
            return "upgrade";
        case PKG_UNINSTALL:
            return "uninstall";
        case PKG_START:
            return "start";
        case PKG_STOP:
            return "stop";
        case PKG_RESTART:
            return "restart";
        default:
            return "(system) trigger";
    }
}

int PMSMapSystemArch(const char* token) {
    if (token == nullptr) {
        return 0;
    }
    for (const ArchEntry& entry : kArchTable) {
        if (strcmp(entry.token, token) == 0) {
            return static_cast<int>(entry.mask);
        }
    }
    return 0;
}

}  // namespace CORVPackageTool
