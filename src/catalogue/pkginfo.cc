// Construction and copying of the package model.
#include "catalogue/pkginfo_private.h"

#include <utility>

namespace CORVPackageTool {

PackageBasicInfoExtra::PackageBasicInfoExtra() : d(new PackageBasicInfoExtraPrivate()) {}
PackageBasicInfoExtra::PackageBasicInfoExtra(const PackageBasicInfoExtra& from)
    : d(new PackageBasicInfoExtraPrivate(*from.d)) {}
PackageBasicInfoExtra::PackageBasicInfoExtra(PackageBasicInfoExtra& from)
    : d(new PackageBasicInfoExtraPrivate(*from.d)) {}
PackageBasicInfoExtra::~PackageBasicInfoExtra() {
    delete d;
}
PackageBasicInfoExtra& PackageBasicInfoExtra::operator=(const PackageBasicInfoExtra& from) {
    if (this != &from) {
        *d = *from.d;
    }
    return *this;
}
PackageBasicInfoExtra& PackageBasicInfoExtra::operator=(PackageBasicInfoExtra& from) {
    return *this = static_cast<const PackageBasicInfoExtra&>(from);
}

PackageBasicInfo::PackageBasicInfo() = default;
PackageBasicInfo::PackageBasicInfo(std::string name, std::string ver)
    : package(std::move(name)), version(std::move(ver)) {}

bool DepPkgVector::pushDepPkg(std::string name, std::string version, PKG_VERSION_COMPOP op) {
    if (name == "Python") {
        return false;
    }
    PackageBasicInfo entry(std::move(name), std::move(version));
    entry.compop = op;
    push_back(std::move(entry));
    return true;
}

void PackageInfoExtra::copy(const PackageInfoExtra& from, PackageInfoExtraPrivate** to) {
    if (*to == nullptr) {
        *to = new PackageInfoExtraPrivate(*from.d);
    } else {
        **to = *from.d;
    }
}

PackageInfoExtra::PackageInfoExtra() : d(new PackageInfoExtraPrivate()) {}
PackageInfoExtra::PackageInfoExtra(const PackageInfoExtra& from) : d(nullptr) {
    copy(from, &d);
}
PackageInfoExtra::PackageInfoExtra(PackageInfoExtra& from) : d(nullptr) {
    copy(from, &d);
}
PackageInfoExtra::~PackageInfoExtra() {
    delete d;
}
PackageInfoExtra& PackageInfoExtra::operator=(const PackageInfoExtra& from) {
    if (this != &from) {
        copy(from, &d);
    }
    return *this;
}
PackageInfoExtra& PackageInfoExtra::operator=(PackageInfoExtra& from) {
    return *this = static_cast<const PackageInfoExtra&>(from);
}

PackageInfo::PackageInfo() = default;
PackageInfo::PackageInfo(const PackageInfo& from) = default;
PackageInfo::~PackageInfo() = default;

int* PMSGetOSMinVer(PackageInfo& info) {
    return info.extra.priv()->os_min_ver;
}
int* PMSGetOSMaxVer(PackageInfo& info) {
    return info.extra.priv()->os_max_ver;
}
bool PMSGetCtlUninstall(const PackageInfo& info) {
    return info.extra.priv()->ctl_uninstall;
}
bool PMSGetPrecheckStartStop(const PackageInfo& info) {
    return info.extra.priv()->precheckstartstop;
}
const std::set<std::string>& PMSGetInstallDepServiceSet(const PackageInfo& info) {
    return info.extra.priv()->install_dep_service_set;
}
const std::set<std::string>& PMSGetStartDepServiceSet(const PackageInfo& info) {
    return info.extra.priv()->start_dep_service_set;
}

}  // namespace CORVPackageTool
