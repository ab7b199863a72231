// The INFO reader: one selective read of a package's INFO file into a PackageInfo.
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <strings.h>

#include <string>

#include "catalogue/pkginfo_private.h"
#include "common/regular_file.h"
#include "common/vlibc_holders.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

namespace {

constexpr int kKeyCapacity = 0x200;
constexpr size_t kLangKeySize = 256;
constexpr size_t kLangSize = 4096;
constexpr size_t kMaxNameLength = 492;

// The keys wanted by one read and the values found.
class InfoKeys {
  public:
    InfoKeys() : list_(kKeyCapacity), hash_(kKeyCapacity) {}

    bool ok() const { return list_ && hash_; }
    void want(const char* key) { VLIBCSzListPush(list_.addr(), key); }
    int load(const char* path) { return VLIBCFileGetKeys(path, list_.get(), hash_.addr(), "="); }
    // The value of a key, or null when the file does not have it.
    const char* get(const char* key) const { return VLIBCSzHashGetValue(hash_.get(), key); }
    const char* get(unsigned long long number) const {
        return get(g_MappingPKGInfoFields.at(number).c_str());
    }

  private:
    SzList list_;
    SzHash hash_;
};

bool isEmpty(const char* value) {
    return value == nullptr || value[0] == '\0';
}
bool isYes(const char* value) {
    return value != nullptr && strcasecmp(value, "yes") == 0;
}
bool isNo(const char* value) {
    return value != nullptr && strcasecmp(value, "no") == 0;
}

unsigned int archMask(const char* value, std::vector<std::string>& tokens) {
    unsigned int mask = 0;
    tokens = PMSExplodeString(value, " \t");
    for (const std::string& token : tokens) {
        mask |= static_cast<unsigned int>(PMSMapSystemArch(token.c_str()));
    }
    return mask;
}

// The language of the display texts: the caller's, else the system's. Empty when neither.
std::string readLanguage(const char* language) {
    if (language != nullptr) {
        char buf[kLangSize];
        snprintf(buf, sizeof(buf), "%s", language);
        return buf;
    }
    char buf[kLangSize] = "";
    if (VLIBCFileGetKeyValue(VLIBC_INFO_PATH, "language", buf, sizeof(buf), 0) <= 0) {
        return "";
    }
    return buf;
}

std::string langKey(const char* key, const std::string& lang) {
    char buf[kLangKeySize];
    snprintf(buf, sizeof(buf), "%s_%s", key, lang.c_str());
    return buf;
}

}  // namespace

void PMSParseOSVersion(const char* text, int out[3]) {
    out[0] = out[1] = out[2] = 0;
    // Numbers that the text does not reach stay 0, so "6.1" reads as 6.1-0.
    if (sscanf(text, "%d.%d-%d", &out[0], &out[1], &out[2]) < 0) {
        out[0] = out[1] = out[2] = 0;
    }
}

bool PMSIsLegalName(const char* name, const char* forbidden) {
    if (name == nullptr || name[0] == '\0') {
        return false;
    }
    if (strcmp(name, ".") == 0 || strcmp(name, "..") == 0 || CORVEAIsHiddenDir(name)) {
        return false;
    }
    if (strpbrk(name, forbidden) != nullptr) {
        return false;
    }
    return strlen(name) < kMaxNameLength;
}

std::vector<std::string> PMSExplodeString(const std::string& text, const std::string& separators) {
    std::vector<std::string> pieces;
    size_t pos = 0;
    while (pos < text.size()) {
        size_t start = text.find_first_not_of(separators, pos);
        if (start == std::string::npos) {
            break;
        }
        size_t end = text.find_first_of(separators, start);
        if (end == std::string::npos) {
            end = text.size();
        }
        pieces.push_back(text.substr(start, end - start));
        pos = end;
    }
    return pieces;
}

namespace {

// Asks for every key that is always read or that the mask selects, and for the language
// variants of the texts when texts for display are wanted. Returns the language read.
std::string wantKeys(InfoKeys& keys, const char* language, unsigned long long mask) {
    for (const auto& [number, key] : g_MappingPKGInfoFields) {
        auto optional = g_MappingPKGInfoAdditional.find(number);
        if (optional == g_MappingPKGInfoAdditional.end() || (mask & optional->second) != 0) {
            keys.want(key.c_str());
        }
    }
    if ((mask & (INFO_MASK_DESCRIPTION | INFO_MASK_DISPLAYNAME)) == 0) {
        return "";
    }
    const std::string lang = readLanguage(language);
    if (lang.empty()) {
        if (mask & INFO_MASK_DESCRIPTION) {
            keys.want("description_enu");
        }
        return lang;
    }
    if (mask & INFO_MASK_DISPLAYNAME) {
        keys.want(langKey("displayname", lang).c_str());
    }
    if (mask & INFO_MASK_DESCRIPTION) {
        keys.want(langKey("description", lang).c_str());
        if (language == nullptr || strcasecmp(language, "enu") != 0) {
            keys.want("description_enu");
        }
    }
    return lang;
}

// Name, version, maintainer and distributor: the keys without which there is no package.
bool readIdentity(const InfoKeys& keys, const std::string& infoPath, unsigned long long mask,
                  PackageInfo& info) {
    const char* value = keys.get(PKG_INFO_PACKAGE);
    if (value == nullptr) {
        CORV_LOG_ERR("key [%s] not found in %s corverr=[0x%04X]", "package", infoPath.c_str(),
                     VLIBCErrGet());
        return false;
    }
    if (!PMSIsLegalName(value, kPackageNameForbidden)) {
        CORV_LOG_ERR("key [%s] %s is illegal", "package", value);
        return false;
    }
    info.package = value;

    value = keys.get(PKG_INFO_VERSION);
    if (isEmpty(value)) {
        CORV_LOG_ERR("key [%s] not found", "version");
        return false;
    }
    info.version = value;

    if (mask & INFO_MASK_MAINTAINER) {
        value = keys.get(PKG_INFO_MAINTAINER);
        if (isEmpty(value)) {
            CORV_LOG_ERR("key [%s] not found", "maintainer");
            return false;
        }
        info.maintainer = value;
    }
    if (mask & INFO_MASK_MAINTAINER_URL) {
        value = keys.get(PKG_INFO_MAINTAINER_URL);
        info.maintainer_url = value ? value : "";
    }
    if (mask & INFO_MASK_DISTRIBUTOR) {
        value = keys.get(PKG_INFO_DISTRIBUTOR);
        info.distributor = value ? value : "";
    }
    if (mask & INFO_MASK_DISTRIBUTOR_URL) {
        value = keys.get(PKG_INFO_DISTRIBUTOR_URL);
        info.distributor_url = value ? value : "";
    }
    return true;
}

// The description and display name, in the wanted language where the file has one.
bool readTexts(const InfoKeys& keys, const std::string& lang, unsigned long long mask,
               PackageInfo& info) {
    const char* value;
    if (mask & INFO_MASK_DESCRIPTION) {
        value = keys.get(PKG_INFO_DESCRIPTION);
        if (isEmpty(value)) {
            CORV_LOG_ERR("key [%s] not found", "description");
            return false;
        }
        info.description = value;
        value = keys.get("description_enu");
        if (!isEmpty(value)) {
            info.description_enu = value;
        }
    }
    if (mask & INFO_MASK_DISPLAYNAME) {
        value = keys.get(PKG_INFO_DISPLAYNAME);
        info.displayname = value ? value : "";
        if (!lang.empty()) {
            value = keys.get(langKey("displayname", lang).c_str());
            if (!isEmpty(value)) {
                info.displayname = value;
            }
        }
    }
    if ((mask & INFO_MASK_DESCRIPTION) && !lang.empty()) {
        value = keys.get(langKey("description", lang).c_str());
        if (!isEmpty(value)) {
            info.description = value;
        }
    }
    return true;
}

// The web entry of the package. The port check lets 65536 through on purpose.
bool readAdmin(const InfoKeys& keys, unsigned long long mask, PackageInfo& info) {
    if ((mask & INFO_MASK_ADMIN) == 0) {
        return true;
    }
    const char* value = keys.get(PKG_INFO_ADMINURL);
    if (value != nullptr) {
        info.adminurl = value;
    }
    value = keys.get(PKG_INFO_ADMINPORT);
    if (value != nullptr) {
        long port = strtol(value, nullptr, 10);
        info.adminport = static_cast<int>(port);
        if (static_cast<unsigned long>(port) > 65536UL) {
            CORV_LOG_ERR("key [%s] %d is illegal", "adminport", info.adminport);
            return false;
        }
    }
    value = keys.get(PKG_INFO_ADMINPROTOCOL);
    if (isEmpty(value)) {
        info.adminprotocol.push_back("http");
    } else {
        info.adminprotocol = PMSExplodeString(value, " \t");
    }
    return true;
}

// Architectures, models and OS versions: "os_min_ver" is the newer name of "firmware"
// and wins over it.
void readPlatforms(const InfoKeys& keys, PackageInfo& info) {
    PackageInfoExtraPrivate* extra = info.extra.priv();
    const char* value = keys.get(PKG_INFO_ARCH);
    info.arch = isEmpty(value) ? 0xFFFFFFFF : archMask(value, info.arch_list);
    value = keys.get(PKG_INFO_EXCLUDE_ARCH);
    if (value != nullptr) {
        info.exclude_arch = archMask(value, info.exclude_arch_list);
    }
    value = keys.get(PKG_INFO_MODEL);
    if (value != nullptr) {
        info.model_list = PMSExplodeString(value, " \t");
    }
    value = keys.get(PKG_INFO_OS_MIN_VER);
    if (value == nullptr) {
        value = keys.get(PKG_INFO_FIRMWARE);
    }
    if (value != nullptr) {
        PMSParseOSVersion(value, extra->os_min_ver);
        PMSParseOSVersion(value, info.firmware);
    }
    value = keys.get(PKG_INFO_OS_MAX_VER);
    if (value != nullptr) {
        PMSParseOSVersion(value, extra->os_max_ver);
    }
}

// Daemons to restart and services required.
void readServices(const InfoKeys& keys, unsigned long long mask, PackageInfo& info) {
    PackageInfoExtraPrivate* extra = info.extra.priv();
    if (mask & INFO_MASK_RESTART_SERVICES) {
        info.instuninst_restart_services = static_cast<unsigned int>(
            PMSConvMapRestartService(keys.get(PKG_INFO_INSTUNINST_RESTART_SERVICES)));
        info.startstop_restart_services = static_cast<unsigned int>(
            PMSConvMapRestartService(keys.get(PKG_INFO_STARTSTOP_RESTART_SERVICES)));
    }
    if (mask & INFO_MASK_INSTALL_DEP_SERVICES) {
        const char* value = keys.get(PKG_INFO_INSTALL_DEP_SERVICES);
        info.install_dep_services = PackageManager::PMSExplodeServiceString(value);
        extra->install_dep_service_set = PackageManager::getServiceSetFromString(value);
    }
    if (mask & INFO_MASK_START_DEP_SERVICES) {
        const char* value = keys.get(PKG_INFO_START_DEP_SERVICES);
        info.start_dep_services = PackageManager::PMSExplodeServiceString(value);
        extra->start_dep_service_set = PackageManager::getServiceSetFromString(value);
    }
}

// Help, UI directory and application name. The UI directory name ends up in paths, so it
// obeys the name rule too.
bool readDesktop(const InfoKeys& keys, unsigned long long mask, PackageInfo& info) {
    if (isNo(keys.get(PKG_INFO_CHECKPORT))) {
        info.checkport = false;
    }
    const char* value;
    if (mask & INFO_MASK_HELPURL) {
        value = keys.get(PKG_INFO_HELPURL);
        if (value != nullptr) {
            info.helpurl = value;
        }
    }
    value = keys.get(PKG_INFO_NOSUIDIR);
    if (!isEmpty(value)) {
        if (!PMSIsLegalName(value, kUIDirNameForbidden)) {
            CORV_LOG_ERR("key [%s] %s is illegal", "nosuidir", value);
            return false;
        }
        info.nosuidir = value;
    }
    if (mask & INFO_MASK_NOSAPPNAME) {
        value = keys.get(PKG_INFO_NOSAPPNAME);
        if (!isEmpty(value)) {
            info.nosappname = value;
        }
    }
    return true;
}

// Dependencies and conflicts: the section file, when there is one, replaces the INFO key
// entirely.
void readRelations(const InfoKeys& keys, const std::string& dir, unsigned long long mask,
                   PackageInfo& info) {
    const std::string depsPath = dir + "/conf/PKG_DEPS";
    const std::string conxPath = dir + "/conf/PKG_CONX";
    const char* value;
    if (mask & INFO_MASK_DEP_PACKAGES) {
        if (VLIBCFileExist(depsPath.c_str())) {
            PMSLoadDepConfFile(depsPath.c_str(), info.dep_packages);
        } else if ((value = keys.get(PKG_INFO_INSTALL_DEP_PACKAGES)) != nullptr) {
            PMSExplodeDepPKGString(value, info.dep_packages);
        }
    }
    if (mask & INFO_MASK_CONFLICT_PACKAGES) {
        if (VLIBCFileExist(conxPath.c_str())) {
            PMSLoadDepConfFile(conxPath.c_str(), info.conflict_packages);
        } else if ((value = keys.get(PKG_INFO_INSTALL_CONFLICT_PACKAGES)) != nullptr) {
            PMSExplodeDepPKGString(value, info.conflict_packages);
        }
    }
}

// Yes/no switches. "ctl_stop" is the newer name of "startable" and alone decides when
// present; a package with a place to report problems is a beta, whatever "beta" says.
void readSwitches(const InfoKeys& keys, unsigned long long mask, PackageInfo& info) {
    PackageInfoExtraPrivate* extra = info.extra.priv();
    if ((mask & INFO_MASK_INSTALL_REBOOT) && isYes(keys.get(PKG_INFO_INSTALL_REBOOT))) {
        info.install_reboot = true;
    }
    if (mask & INFO_MASK_STARTABLE) {
        const char* value = keys.get(PKG_INFO_CTL_STOP);
        if (value == nullptr) {
            value = keys.get(PKG_INFO_STARTABLE);
        }
        if (isNo(value)) {
            info.startable = false;
        }
    }
    if ((mask & INFO_MASK_SILENT_INSTALL) && isYes(keys.get(PKG_INFO_SILENT_INSTALL))) {
        info.silent_install = true;
    }
    if ((mask & INFO_MASK_SILENT_UPGRADE) && isYes(keys.get(PKG_INFO_SILENT_UPGRADE))) {
        info.silent_upgrade = true;
    }
    if ((mask & INFO_MASK_SILENT_UNINSTALL) && isYes(keys.get(PKG_INFO_SILENT_UNINSTALL))) {
        info.silent_uninstall = true;
    }
    if (mask & INFO_MASK_BETA) {
        const char* value = keys.get(PKG_INFO_REPORT_URL);
        if (!isEmpty(value)) {
            info.report_url = value;
            info.beta = true;
        }
        if (isYes(keys.get(PKG_INFO_BETA))) {
            info.beta = true;
        }
    }
    if ((mask & INFO_MASK_SUPPORT_CENTER) && isYes(keys.get(PKG_INFO_SUPPORT_CENTER))) {
        info.support_center = true;
    }
    if (isYes(keys.get(PKG_INFO_PRECHECKSTARTSTOP))) {
        extra->precheckstartstop = true;
    }
    if ((mask & INFO_MASK_CTL_UNINSTALL) && isNo(keys.get(PKG_INFO_CTL_UNINSTALL))) {
        extra->ctl_uninstall = false;
    }
}

// Plain values copied as they stand: checksum, icons, support page, size, install type.
void readValues(const InfoKeys& keys, unsigned long long mask, PackageInfo& info) {
    const char* value = keys.get(PKG_INFO_CHECKSUM);
    if (value != nullptr) {
        info.checksum = value;
    }
    if (mask & INFO_MASK_ICONS) {
        value = keys.get(PKG_INFO_PACKAGE_ICON);
        if (value != nullptr) {
            info.package_icon = value;
        }
        value = keys.get(PKG_INFO_PACKAGE_ICON_256);
        if (value != nullptr) {
            info.package_icon_256 = value;
        }
    }
    if (mask & INFO_MASK_SUPPORT_URL) {
        value = keys.get(PKG_INFO_SUPPORT_URL);
        if (value != nullptr) {
            info.support_url = value;
        }
    }
    value = keys.get(PKG_INFO_EXTRACTSIZE);
    if (value != nullptr) {
        // The key counts KiB.
        info.extractsize = static_cast<long long>(
            static_cast<unsigned long long>(strtoll(value, nullptr, 10)) << 10);
    }
    if (mask & INFO_MASK_INSTALL_TYPE) {
        value = keys.get(PKG_INFO_INSTALL_TYPE);
        if (value != nullptr) {
            info.install_type = value;
        }
    }
}

}  // namespace

bool PMSLoadPKGInfoFile(const std::string& dir, PackageInfo& info, const char* language,
                        unsigned long long mask) {
    const std::string infoPath = dir + "/INFO";
    info = PackageInfo();

    // Not a package directory: quietly no. An INFO that is no regular file (a named
    // pipe would stall the read) is no INFO.
    if (!VLIBCFileCheckDir(dir.c_str()) || !PMSIsRegularFile(infoPath)) {
        return false;
    }
    InfoKeys keys;
    if (!keys.ok()) {
        CORV_LOG_ERR("Out of memory!!");
        return false;
    }
    const std::string lang = wantKeys(keys, language, mask);
    // One read of the file for every key.
    if (keys.load(infoPath.c_str()) < 0) {
        CORV_LOG_ERR("VLIBCFileGetKeys() failed!! szFile=[%s], corverr=[0x%04X]", infoPath.c_str(),
                     VLIBCErrGet());
        return false;
    }
    // The order of the checks decides which of several bad keys is logged.
    if (!readIdentity(keys, infoPath, mask, info) || !readTexts(keys, lang, mask, info) ||
        !readAdmin(keys, mask, info)) {
        return false;
    }
    readPlatforms(keys, info);
    readServices(keys, mask, info);
    if (!readDesktop(keys, mask, info)) {
        return false;
    }
    readSwitches(keys, mask, info);
    readRelations(keys, dir, mask, info);
    readValues(keys, mask, info);
    return true;
}

int PMSCompareOSVersion(const int version[3]) {
    if (version[0] == 0) {
        return (version[1] == 0 && version[2] == 0) ? 0 : 1;
    }
    if (version[0] != PKG_OS_MAJOR) {
        return version[0] < PKG_OS_MAJOR ? 1 : -1;
    }
    if (version[1] != PKG_OS_MINOR) {
        return version[1] < PKG_OS_MINOR ? 1 : -1;
    }
    if (version[2] == PKG_OS_BUILD) {
        return 0;
    }
    return version[2] < PKG_OS_BUILD ? 1 : -1;
}

}  // namespace CORVPackageTool
