// Internals of the package model: the extension records and the INFO key tables.
#pragma once

#include <map>
#include <set>
#include <string>
#include <vector>

#include "corvpkg/pkginfo.h"

namespace Json {
class Value;
}

namespace CORVPackageTool {

class PackageBasicInfoExtraPrivate {};

class PackageInfoExtraPrivate {
  public:
    bool precheckstartstop = false;
    int os_min_ver[3] = {0, 0, 0};
    int os_max_ver[3] = {0, 0, 0};
    bool ctl_uninstall = true;
    std::set<std::string> install_dep_service_set;
    std::set<std::string> start_dep_service_set;
};

// INFO key number to key text; built at load, never changed.
extern const std::map<unsigned long long, std::string> g_MappingPKGInfoFields;
// For the optional keys: the mask bits that select them. A key not in this map is
// always read.
extern const std::map<unsigned long long, unsigned long long> g_MappingPKGInfoAdditional;

// Mask bits of the optional INFO keys.
enum : unsigned long long {
    INFO_MASK_DESCRIPTION = 0x1,
    INFO_MASK_DISTRIBUTOR = 0x8,
    INFO_MASK_DISTRIBUTOR_URL = 0x10,
    INFO_MASK_MAINTAINER = 0x20,
    INFO_MASK_MAINTAINER_URL = 0x40,
    INFO_MASK_NOSAPPNAME = 0x80,
    INFO_MASK_HELPURL = 0x100,
    INFO_MASK_BETA = 0x204,
    INFO_MASK_STARTABLE = 0x400,
    INFO_MASK_SUPPORT_URL = 0x800,
    INFO_MASK_INSTALL_REBOOT = 0x1000,
    INFO_MASK_ADMIN = 0x2000,
    INFO_MASK_SILENT_INSTALL = 0x40000,
    INFO_MASK_SILENT_UPGRADE = 0x80000,
    INFO_MASK_SILENT_UNINSTALL = 0x100000,
    INFO_MASK_INSTALL_TYPE = 0x200000,
    INFO_MASK_SUPPORT_CENTER = 0x800000,
    INFO_MASK_DEP_PACKAGES = 0x1000000,
    INFO_MASK_START_DEP_SERVICES = 0x2000000,
    INFO_MASK_ICONS = 0x8000000,
    INFO_MASK_DISPLAYNAME = 0x10000000,
    INFO_MASK_RESTART_SERVICES = 0x20000000,
    INFO_MASK_INSTALL_DEP_SERVICES = 0x40000000,
    INFO_MASK_CONFLICT_PACKAGES = 0xFFFFFFFF80000000ULL,
    INFO_MASK_CTL_UNINSTALL = 0x100000000ULL,
};

// A name is legal when it is not empty, not "." or "..", not the hidden metadata
// directory name, holds no character of `forbidden`, and is shorter than 492 bytes.
bool PMSIsLegalName(const char* name, const char* forbidden);

// "major.minor-build" with the build in four digits, as messages show an OS version.
std::string PMSOSVersionText(const int v[3]);

// Reads "major.minor-build" into `out`; numbers the text does not reach are 0.
void PMSParseOSVersion(const char* text, int out[3]);

// The wizard files that may describe an operation of `type`, relative to a package
// directory, most specific first: "WIZARD_UIFILES/<base>_<lang>.sh", "<base>.sh",
// "<base>_<lang>", "<base>". Without a language the two with one are left out.
std::vector<std::string> PMSUIFileCandidates(const char* language, PKG_INSTALLATION_TYPE type);

// The dependencies of a store entry, as PMSMapJsonToPackageInfo reads them into
// dep_packages; nothing for an entry that is not an object.
void PMSMapJsonDependencies(const Json::Value& entry, DepPkgVector& deps);

constexpr const char* kPackageNameForbidden = ":/<>=|";
constexpr const char* kUIDirNameForbidden = ":/";

}  // namespace CORVPackageTool
