// "data-share": shared folders for a package's data. DataShareRecorder notes the names at
// preinst; DataShare makes the shares and grants their users at postinst, and again at
// every startup for what could not be finished. Nothing is taken back: the shares and
// their data outlive the package.
#include <new>
#include <string>
#include <vector>

#include "corv/eventlog.h"
#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/share.h"
#include "corv/vlibc.h"
#include "corvpkg/pkgvolume.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kShares[] = "shares";
const char kName[] = "name";
const char kTarget[] = "target";
const char kCreated[] = "created";
const char kOnce[] = "once";
const char kPermission[] = "permission";
const char kSystemInstallPath[] = "/usr/local/packages";
constexpr unsigned int kEventShareCreated = 0x13700009;
constexpr int kPathSize = 4096;
constexpr int kUserNameSize = 493;
constexpr int kListCapacity = 1024;

// The section's "shares", an empty array when absent; false (0x4000) when not an array.
bool sharesOf(const Json::Value& section, Json::Value& out) {
    out = section.isObject() && section.isMember(kShares) ? section[kShares]
                                                          : Json::Value(Json::arrayValue);
    if (!out.isArray()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    return true;
}

class DataShareRecorder : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& /*action*/, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        Json::Value shares;
        if (!sharesOf(request, shares)) {
            return 1;
        }
        if (!own.isObject()) {
            own = Json::Value(Json::objectValue);
        }
        if (!own[kShares].isArray()) {
            own[kShares] = Json::Value(Json::arrayValue);
        }
        own[kShares].resize(shares.size());
        for (Json::ArrayIndex i = 0; i < shares.size(); ++i) {
            if (!shares[i].isObject() || !shares[i].isMember(kName)) {
                continue;
            }
            if (!shares[i][kName].isString()) {
                VLIBCErrSet(ERR_MALFORMED);
                return 1;
            }
            own[kShares][i][kName] = shares[i][kName];
            own[kShares][i][kCreated] = false;
        }
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo&, const Json::Value&, Json::Value&,
                 CORV::PkgUtils::WorkerResp&) override {
        return 0;
    }
    int Release(const CORV::PkgUtils::ActionInfo&, const Json::Value&, Json::Value&,
                CORV::PkgUtils::WorkerResp&) override {
        return 0;
    }
};

// The users of one permission list that exist here, by their real names.
std::vector<std::string> realUsers(const Json::Value& list) {
    std::vector<std::string> out;
    if (!list.isArray()) {
        return out;
    }
    for (const Json::Value& user : list) {
        char real[kUserNameSize];
        if (user.isString() && VLIBUserRealNameGet(user.asCString(), real, sizeof(real)) == 0) {
            out.push_back(real);
        }
    }
    return out;
}

// A comma-joined list as a string list; null when it can't be made.
PVLIBSZLIST toList(const std::string& text) {
    PVLIBSZLIST list = VLIBCSzListAlloc(kListCapacity);
    if (list != nullptr && VLIBCStrSep(text.c_str(), ",", &list) < 0) {
        VLIBCSzListFree(list);
        return nullptr;
    }
    return list;
}

std::string joinList(PVLIBSZLIST list) {
    std::string out;
    for (int i = 0; VLIBCSzListGet(list, i) != nullptr; ++i) {
        const std::string item = VLIBCSzListGet(list, i);
        if (!item.empty()) {
            out += (out.empty() ? "" : ",") + item;
        }
    }
    return out;
}

void removeUser(PVLIBSZLIST list, const std::string& user) {
    for (int at = VLIBCSzListCaseFind(list, user.c_str()); at >= 0;
         at = VLIBCSzListCaseFind(list, user.c_str())) {
        VLIBCSzListRemove(list, at);
    }
}

void addUser(PVLIBSZLIST* list, const std::string& user) {
    if (VLIBCSzListCaseFind(*list, user.c_str()) < 0) {
        VLIBCSzListPush(list, user.c_str());
    }
}

class ShareLists {
  public:
    ShareLists() = default;
    ~ShareLists() {
        for (PVLIBSZLIST list : lists_) {
            VLIBCSzListFree(list);
        }
    }
    ShareLists(const ShareLists&) = delete;
    ShareLists& operator=(const ShareLists&) = delete;
    bool load(PCORVSHARE share) {
        std::string texts[3];
        if (VLIBSharePrivListGet(share, &texts[0], &texts[1], &texts[2]) != 0) {
            return false;
        }
        for (int i = 0; i < 3; ++i) {
            lists_[i] = toList(texts[i]);
            if (lists_[i] == nullptr) {
                return false;
            }
        }
        return true;
    }
    PVLIBSZLIST* none() { return &lists_[0]; }
    PVLIBSZLIST* rw() { return &lists_[1]; }
    PVLIBSZLIST* ro() { return &lists_[2]; }

  private:
    PVLIBSZLIST lists_[3] = {nullptr, nullptr, nullptr};
};

// Grants the lists; a failure here is logged and the share still counts as ready.
void updatePermission(PCORVSHARE share, const std::string& target,
                      const std::vector<std::string>& rw, const std::vector<std::string>& ro) {
    int winShare = 0;
    int skipSmb = 0;
    VLIBShareIsWinShareGet(share, &winShare);
    VLIBShareIsSkipSmbPermGet(share, &skipSmb);
    if (winShare) {
        for (const auto& [users, level] : {std::make_pair(&rw, 2), std::make_pair(&ro, 1)}) {
            for (const std::string& user : *users) {
                if (CORVShareSetAcl(share, 1, user.c_str(), level) != 0) {
                    CORV_LOG_ERR("Failed to set ACL of %s for %s [0x%04X %s:%d]", target.c_str(),
                                 user.c_str(), VLIBCErrGet(), VLIBCErrorGetFile(),
                                 VLIBCErrorGetLine());
                }
            }
        }
        if (skipSmb) {
            return;
        }
    }
    ShareLists lists;
    if (!lists.load(share)) {
        CORV_LOG_ERR("Failed to convert list of %s [0x%04X %s:%d]", target.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return;
    }
    for (const auto* users : {&rw, &ro}) {
        for (const std::string& user : *users) {
            removeUser(*lists.none(), user);
        }
    }
    for (const std::string& user : rw) {
        addUser(lists.rw(), user);
        removeUser(*lists.ro(), user);
    }
    for (const std::string& user : ro) {
        removeUser(*lists.rw(), user);
        addUser(lists.ro(), user);
    }
    if (VLIBSharePrivListSet(share, joinList(*lists.none()).c_str(), joinList(*lists.rw()).c_str(),
                             joinList(*lists.ro()).c_str()) != 0 ||
        CORVShareUpdate(share) != 0) {
        CORV_LOG_ERR("Failed to update permission of %s [0x%04X %s:%d]", target.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
    }
}

// Makes the share on the package's volume (or the one the platform picks).
bool createShare(const std::string& target, const std::string& pkg) {
    std::string volume;
    if (!PMSGetPackageVol(pkg, volume) || volume == kSystemInstallPath) {
        char decided[kPathSize] = "";
        if (CORVVolumeServiceVolumeDecide(target.c_str(), decided, sizeof(decided)) < 1) {
            CORV_LOG_ERR("Failed to create %s [0x%04X %s:%d]", target.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return false;
        }
        volume = decided;
    }
    char base[kPathSize] = "";
    if (CORVShareBinPathGet(volume.c_str(), base, sizeof(base)) != 0) {
        CORV_LOG_ERR("Failed to create %s [0x%04X %s:%d]", target.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    char path[kPathSize];
    snprintf(path, sizeof(path), "%s/%s", base, target.c_str());
    if (CORVShareDefaultShareCreate(target.c_str(), path, 0) == 0) {
        CORVLogSet1(2, 1, kEventShareCreated, target.c_str(), pkg.c_str(), "", "");
    } else if (VLIBCErrGet() != ERR_SHARE_EXISTS) {
        CORV_LOG_ERR("Failed to create %s [0x%04X %s:%d]", target.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    return true;
}

bool ensureShare(const std::string& target, const std::string& pkg,
                 const std::vector<std::string>& rw, const std::vector<std::string>& ro,
                 CORV::PkgUtils::WorkerResp& resp) {
    if (target.empty() || pkg.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    PCORVSHARE share = nullptr;
    if (CORVShareGet(target.c_str(), &share) == 0) {
        if (!VLIBShareIsAccessible(target.c_str())) {
            int encrypted = 0;
            if (VLIBShareIsEncryptedGet(share, &encrypted) == 0 && encrypted) {
                resp.SetI18NErrMsg("pkgmgr:share_is_encrypted", target.c_str(), nullptr);
            }
            CORV_LOG_ERR("%s is not accessible", target.c_str());
            CORVShareFree(share);
            return false;
        }
    } else if (VLIBCErrGet() == ERR_SHARE_NOT_FOUND) {
        if (!createShare(target, pkg)) {
            return false;
        }
        if (CORVShareGet(target.c_str(), &share) != 0) {
            CORV_LOG_ERR("Failed to get %s [0x%04X %s:%d]", target.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return false;
        }
    } else {
        CORV_LOG_ERR("Failed to check existence of %s [0x%04X %s:%d]", target.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    if (!rw.empty() || !ro.empty()) {
        updatePermission(share, target, rw, ro);
    }
    CORVShareFree(share);
    return true;
}

class DataShare : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        Json::Value shares;
        if (!sharesOf(request, shares)) {
            return 1;
        }
        if (!own.isObject() || !own[kShares].isArray()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        Json::Value& recorded = own[kShares];
        for (Json::ArrayIndex i = 0; i < shares.size(); ++i) {
            if (i >= recorded.size()) {
                CORV_LOG_ERR("Invalid index %zd for %s", static_cast<size_t>(i),
                             action.GetPkgName().c_str());
                break;
            }
            if (!recorded[i].isObject()) {
                recorded[i] = Json::Value(Json::objectValue);
            }
            const Json::Value& wanted = shares[i].isObject() ? shares[i] : Json::Value();
            const bool once = wanted[kOnce].isBool() && wanted[kOnce].asBool();
            // Read through a const view: reading must not add null members to the record.
            const Json::Value& seen = recorded[i];
            const bool created =
                seen.isMember(kCreated) && seen[kCreated].isBool() && seen[kCreated].asBool();
            if (seen.isMember(kName) && seen[kName].isString()) {
                recorded[i][kTarget] = recorded[i][kName];
                recorded[i].removeMember(kName);
            } else if (once && created) {
                continue;
            }
            if (!seen.isMember(kTarget) || !seen[kTarget].isString()) {
                VLIBCErrSet(ERR_MALFORMED);
                return 1;
            }
            const std::string target = recorded[i][kTarget].asString();
            if (target.empty()) {
                VLIBCErrSet(ERR_SHARE_EMPTY_TARGET);
                return 1;
            }
            const Json::Value& permission = wanted[kPermission];
            if (!ensureShare(target, action.GetPkgName(), realUsers(permission["rw"]),
                             realUsers(permission["ro"]), resp)) {
                return 1;
            }
            recorded[i][kCreated] = true;
        }
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo&, const Json::Value&, Json::Value&,
                 CORV::PkgUtils::WorkerResp&) override {
        return 0;
    }
    int Release(const CORV::PkgUtils::ActionInfo&, const Json::Value&, Json::Value&,
                CORV::PkgUtils::WorkerResp&) override {
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewDataShareRecorder() {
    return new (std::nothrow) DataShareRecorder();
}

CORV::PkgUtils::IWorker* NewDataShare() {
    return new (std::nothrow) DataShare();
}

}  // namespace Resource
}  // namespace CORVPackageTool
