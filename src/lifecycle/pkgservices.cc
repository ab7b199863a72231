// Reloads of the system daemons whose configuration packages change.
#include <string>
#include <vector>

#include "common/vlibc_holders.h"
#include "corv/firewall.h"
#include "corv/log.h"
#include "corv/nginx_conf.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkginfo.h"

namespace CORVPackageTool {

namespace {

enum : unsigned long {
    kRestartAppleNetwork = 0x1,
    kRestartSamba = 0x4,
    kRestartCron = 0x8,
    kRestartNfs = 0x8000,
    kRestartMdns = 0x20000,
    kRestartWeb = 0x40000000,  // nginx and the firewall: one word asks for both
};

}  // namespace

unsigned long long PackageManager::findRestartServices(const std::vector<std::string>& names) {
    unsigned long long mask = getPackageInfoData().startstop_restart_services;
    if (names.size() <= 1) {
        return mask;
    }
    SzList keys(0x400);
    SzHash hash(0x400);
    if (!keys || !hash) {
        CORV_LOG_ERR("Out of memory!!");
        return 0;
    }
    VLIBCSzListPush(keys.addr(), "startstop_restart_services");
    for (size_t i = 0; i + 1 < names.size(); ++i) {
        const std::string path = "/var/packages/" + names[i] + "/INFO";
        if (VLIBCFileExist(path.c_str()) != 1) {
            continue;
        }
        VLIBCHashRemoveAll(hash.get());
        if (VLIBCFileGetKeys(path.c_str(), keys.get(), hash.addr(), "=") < 0) {
            CORV_LOG_ERR("VLIBCFileGetKeys() failed!! szFile=[%s], corverr=[0x%04X]", path.c_str(),
                         VLIBCErrGet());
            continue;
        }
        const char* value = VLIBCSzHashGetValue(hash.get(), "startstop_restart_services");
        if (value != nullptr) {
            mask |= PMSConvMapRestartService(value);
        }
    }
    return mask;
}

int PackageManager::RestartServices(PKG_INSTALLATION_TYPE type, unsigned long long mask) {
    if (type == 0) {
        return 0;
    }
    if (mask == 0) {
        const PackageInfo& info = getPackageInfoData();
        mask = (type & (PKG_START | PKG_STOP)) != 0 ? info.startstop_restart_services
                                                    : info.instuninst_restart_services;
    }
    return RestartServicesAction(static_cast<unsigned long>(mask & 0xFFFFFFFFULL));
}

int PackageManager::RestartServicesAction(unsigned long mask) {
    if (mask == 0) {
        return 1;
    }
    // Daemon reloads can take long; nobody should wait for the package lock meanwhile.
    UnLock();
    Json::Value failed(Json::arrayValue);
    auto reload = [&failed](unsigned long bits, unsigned long bit, const char* service,
                            const char* word) {
        if ((bits & bit) != 0 && VLIBServiceReload(service) != 0) {
            failed.append(word);
        }
    };
    reload(mask, kRestartNfs, "nfsd", "nfs");
    reload(mask, kRestartAppleNetwork, "atalk", "applenetwork");
    reload(mask, kRestartMdns, "avahi", "mdns");
    if ((mask & kRestartWeb) != 0) {
        if (corvw3::NginxConfManager(4).run() < 0 || VLIBServiceReload("nginx") != 0) {
            CORV_LOG_ERR("VLIBServiceReload(%s) failed [0x%04X %s:%d]", "nginx", VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            failed.append("nginx");
        }
    }
    reload(mask, kRestartCron, "crond", "cron");
    if ((mask & kRestartSamba) != 0) {
        if (VLIBServiceReload("samba") != 0 || VLIBServiceReload("winbindd") != 0 ||
            VLIBServiceReload("nmbd") != 0) {
            failed.append("samba");
        }
    }
    std::vector<std::string> names;
    ServiceErrorEnum(names, static_cast<int>(mask & ~static_cast<unsigned long>(kRestartWeb)), 0);
    if (names.empty() && failed.empty()) {
        if ((mask & kRestartWeb) == 0 || CORVFwRuleHup() >= 0) {
            return 1;
        }
        failed.append("firewall");
        insertJsonParam("services", failed);
        CORV_LOG_ERR("Failed to reload firewall rules.");
    } else {
        for (const std::string& name : names) {
            failed.append(name);
        }
        CORV_LOG_ERR("Failed to restart related service %ld",
                     static_cast<long>(mask & ~static_cast<unsigned long>(kRestartWeb)));
        insertJsonParam("services", failed);
    }
    setResult(PKG_ERR_RESTART_SERVICES);
    return 0;
}

}  // namespace CORVPackageTool
