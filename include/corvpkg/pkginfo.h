// The value types that every part of the engine passes around: the full description of a
// package, its short identity, dependency lists and the table of restartable daemons.
// All are plain copyable values; copies never share an extension record.
#pragma once

#include <json/json.h>

#include <map>
#include <set>
#include <string>
#include <vector>

#include "corvpkg/pkgtypes.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {

class PackageBasicInfoExtraPrivate;
class PackageInfoExtraPrivate;

// Room for later fields of PackageBasicInfo without changing its layout. Owns one heap
// record, deep-copied on copy and assignment.
class CORVPKG_API PackageBasicInfoExtra {
  public:
    PackageBasicInfoExtra();
    PackageBasicInfoExtra(const PackageBasicInfoExtra& from);
    PackageBasicInfoExtra(PackageBasicInfoExtra& from);
    ~PackageBasicInfoExtra();
    PackageBasicInfoExtra& operator=(const PackageBasicInfoExtra& from);
    PackageBasicInfoExtra& operator=(PackageBasicInfoExtra& from);

  private:
    PackageBasicInfoExtraPrivate* d;
};

// The identity of a package, or one entry of a dependency list: in an entry, `version`
// is the bound and `compop` how the other package's version must relate to it.
class CORVPKG_API PackageBasicInfo {
  public:
    PackageBasicInfo();
    PackageBasicInfo(std::string name, std::string version);

    // Whether this package stands in relation `op` to `other`: false for different names;
    // PKG_COMPOP_NONE holds for the same name. Versions are compared number by number after
    // bringing both to the same count of dotted parts; "." and "-" delimit alike.
    bool compare(const PackageBasicInfo& other, PKG_VERSION_COMPOP op) const;

    std::string package;
    std::string version;
    PKG_VERSION_COMPOP compop = PKG_COMPOP_NONE;
    bool beta = false;
    PackageBasicInfoExtra extra;
};

// A dependency or conflict list.
class CORVPKG_API DepPkgVector : public std::vector<PackageBasicInfo> {
  public:
    // Appends one entry. A package named "Python" is never a dependency or a conflict:
    // it is dropped here, where every form of list passes, and false is returned.
    bool pushDepPkg(std::string name, std::string version, PKG_VERSION_COMPOP op);
    // The JSON form: {"name": {">=": "1.0", "<=": "2.0"}, "other": ""}; null when empty.
    void toJSON(Json::Value& out) const;
};

// Package name to identity, ordered by byte comparison of the name.
class CORVPKG_API PackageBasicInfoMap : public std::map<std::string, PackageBasicInfo> {
  public:
    // Inserts an entry under `name`; an existing entry stays.
    void insertPackagae(std::string name, std::string version, bool beta, PKG_VERSION_COMPOP op);
};

// Extension of PackageInfo, deep-copied: two PackageInfo values never share one.
class CORVPKG_API PackageInfoExtra {
  public:
    PackageInfoExtra();
    PackageInfoExtra(const PackageInfoExtra& from);
    PackageInfoExtra(PackageInfoExtra& from);
    ~PackageInfoExtra();
    PackageInfoExtra& operator=(const PackageInfoExtra& from);
    PackageInfoExtra& operator=(PackageInfoExtra& from);

    PackageInfoExtraPrivate* priv() { return d; }
    const PackageInfoExtraPrivate* priv() const { return d; }

  private:
    static void copy(const PackageInfoExtra& from, PackageInfoExtraPrivate** to);
    PackageInfoExtraPrivate* d;
};

// Everything known about one package. Filled from INFO, from a package file, from the
// package server's entries, and by the wizard and dependency readers.
class CORVPKG_API PackageInfo {
  public:
    PackageInfo();
    PackageInfo(const PackageInfo& from);
    PackageInfo& operator=(const PackageInfo& from) = default;
    ~PackageInfo();

    std::string package;
    std::string version;
    std::string description;
    std::string description_enu;
    std::string maintainer;
    std::string maintainer_url;
    std::string distributor;
    std::string distributor_url;
    std::string adminurl;
    std::string displayname;
    std::string license;
    std::string nosuidir;
    std::string nosappname;
    std::string helpurl;
    std::string checksum;
    std::string package_icon;
    std::string package_icon_256;
    std::string report_url;
    bool beta = false;
    bool support_center = false;
    std::string support_url;
    std::vector<std::string> adminprotocol;
    unsigned int instuninst_restart_services = 0;
    unsigned int startstop_restart_services = 0;
    unsigned int install_dep_services = 0;
    unsigned int start_dep_services = 0;
    int adminport = 0;
    unsigned int script_mask = 0;
    unsigned int arch = 0;
    unsigned int exclude_arch = 0;
    bool checkport = true;
    bool startable = true;
    bool install_reboot = false;
    bool has_uninstall_wizard = false;
    std::vector<std::string> arch_list;
    std::vector<std::string> exclude_arch_list;
    std::vector<std::string> model_list;
    int firmware[3] = {0, 0, 0};  // major, minor, build
    DepPkgVector dep_packages;
    DepPkgVector conflict_packages;
    Json::Value wizard;
    long long extractsize = 0;
    bool silent_install = false;
    bool silent_upgrade = false;
    bool silent_uninstall = false;
    std::string install_type;
    std::string link;
    unsigned long long size = 0;
    unsigned int type = 0;
    std::string md5;
    PackageInfoExtra extra;
};

// The extension's fields, for callers outside the reader.
CORVPKG_API int* PMSGetOSMinVer(PackageInfo& info);  // three numbers: major, minor, build
CORVPKG_API int* PMSGetOSMaxVer(PackageInfo& info);  // all zero: no limit
CORVPKG_API bool PMSGetCtlUninstall(const PackageInfo& info);
CORVPKG_API bool PMSGetPrecheckStartStop(const PackageInfo& info);
CORVPKG_API const std::set<std::string>& PMSGetInstallDepServiceSet(const PackageInfo& info);
CORVPKG_API const std::set<std::string>& PMSGetStartDepServiceSet(const PackageInfo& info);

// A system daemon that packages can have restarted around their operations.
struct DAEMON_INFO {
    unsigned int restart_bit;
    unsigned int status_bit;
};
typedef std::map<std::string, DAEMON_INFO> MappingPKGRestartServices;
// Built at load, never changed.
CORVPKG_API const MappingPKGRestartServices& PMSGetRestartServiceMap();

// Appends, in name order, each daemon whose status bit is set, that was requested and
// is not healthy. Returns names.size().
CORVPKG_API int ServiceErrorEnum(std::vector<std::string>& names, int requested, int healthy);
// The OR of the restart bits of the blank-separated daemon names; unknown names add 0.
CORVPKG_API unsigned long PMSConvMapRestartService(const char* words);
// "install", "upgrade", ... or "(system) trigger" for 0 and any combination.
CORVPKG_API const char* parseInstallTypeToStr(PKG_INSTALLATION_TYPE type);

}  // namespace CORVPackageTool
