// Reserved accounts, group records and the creation of package accounts, over the
// system's account databases and Debian's shadow tools.
#include <grp.h>
#include <stdlib.h>
#include <string.h>

#include <string>
#include <vector>

#include "account_db.h"
#include "corv/log.h"
#include "corv/user.h"
#include "corv/vlibc.h"

namespace {

constexpr const char* kUserAdd = "/usr/sbin/useradd";
constexpr const char* kGroupAdd = "/usr/sbin/groupadd";
constexpr const char* kGpasswd = "/usr/bin/gpasswd";
constexpr const char* kNoLogin = "/usr/sbin/nologin";
// The tools' own complaints stay on standard error: they say why an account could not be
// made better than an exit status.
constexpr int kQuiet = VLIBC_EXEC_WAIT | VLIBC_EXEC_NULL_STDIN | VLIBC_EXEC_NULL_STDOUT;

// Below this, ids are Debian's static allocations (base-passwd).
constexpr unsigned kFirstDynamicId = 100;
constexpr unsigned kNobodyId = 65534;

const char* const kReservedUsers[] = {"root", "admin", "guest", "nobody"};
const char* const kReservedGroups[] = {"root",         "administrators", "users",
                                       "CorvelGuests", "system",         "nogroup"};

template <size_t N>
bool named(const char* name, const char* const (&list)[N]) {
    if (name == nullptr) {
        return false;
    }
    for (const char* entry : list) {
        if (strcmp(name, entry) == 0) {
            return true;
        }
    }
    return false;
}

}  // namespace

bool CORVUserIsReserved(const char* user, uid_t uid) {
    return uid < kFirstDynamicId || uid == kNobodyId || named(user, kReservedUsers);
}

bool CORVGroupIsReserved(const char* group, gid_t gid) {
    return gid < kFirstDynamicId || gid == kNobodyId || named(group, kReservedGroups);
}

int CORVGroupGet(const char* name, PCORVGROUP* out) {
    if (out == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    *out = nullptr;
    if (name == nullptr || name[0] == '\0') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    corvplat::GroupEntry entry;
    int found = corvplat::lookUpGroup(name, entry);
    if (found < 0) {
        return -1;
    }
    if (found == 0) {
        VLIBCErrSet(ERR_NO_SUCH_GROUP);
        return -1;
    }
    unsigned count = 0;
    while (entry.gr.gr_mem != nullptr && entry.gr.gr_mem[count] != nullptr) {
        ++count;
    }
    PCORVGROUP group = static_cast<PCORVGROUP>(calloc(1, sizeof(CORVGROUP)));
    if (group == nullptr) {
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return -1;
    }
    group->gid = entry.gr.gr_gid;
    group->name = strdup(entry.gr.gr_name);
    group->ppszMember = static_cast<char**>(calloc(count + 1, sizeof(char*)));
    bool ok = group->name != nullptr && group->ppszMember != nullptr;
    for (unsigned i = 0; ok && i < count; ++i) {
        group->ppszMember[i] = strdup(entry.gr.gr_mem[i]);
        ok = group->ppszMember[i] != nullptr;
        group->nMember = i + 1;
    }
    if (!ok) {
        CORVGroupFree(group);
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return -1;
    }
    *out = group;
    return 0;
}

void CORVGroupFree(PCORVGROUP group) {
    if (group == nullptr) {
        return;
    }
    if (group->ppszMember != nullptr) {
        for (unsigned i = 0; i < group->nMember; ++i) {
            free(group->ppszMember[i]);
        }
        free(group->ppszMember);
    }
    free(group->name);
    free(group);
}

int CORVLocalAccountGroupSet(const char* name, const PCORVGROUP group) {
    if (name == nullptr || name[0] == '\0' || group == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (CORVGroupGetGID(name, nullptr) < 0) {
        return -1;
    }
    std::string members;
    for (unsigned i = 0; i < group->nMember; ++i) {
        if (group->ppszMember[i] == nullptr) {
            continue;
        }
        if (!members.empty()) {
            members += ',';
        }
        members += group->ppszMember[i];
    }
    // gpasswd -M replaces the whole member list in /etc/group and /etc/gshadow at once.
    int status = VLIBCExecl(kGpasswd, kQuiet, "-M", members.c_str(), name, nullptr);
    if (status != 0) {
        CORV_LOG_ERR("%s -M %s %s exited with %d", kGpasswd, members.c_str(), name, status);
        VLIBCErrSet(ERR_WRITE_FAILED);
        return -1;
    }
    return 0;
}

int CORVLocalAccountUserPrepareForPkg(const char* user, const char* group, const char* home) {
    if (user == nullptr || user[0] == '\0' || group == nullptr || group[0] == '\0' ||
        home == nullptr || home[0] != '/') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (CORVGroupGetGID(group, nullptr) < 0) {
        int status = VLIBCExecl(kGroupAdd, kQuiet, "--system", group, nullptr);
        if (status != 0) {
            CORV_LOG_ERR("%s --system %s exited with %d", kGroupAdd, group, status);
            VLIBCErrSet(ERR_CREATE_FAILED);
            return -1;
        }
    }
    if (CORVUserGetUGID(user, nullptr, nullptr) < 0) {
        int status = VLIBCExecl(kUserAdd, kQuiet, "--system", "--no-create-home", "--home-dir",
                                home, "--shell", kNoLogin, "--gid", group, user, nullptr);
        if (status != 0) {
            CORV_LOG_ERR("%s --system %s exited with %d", kUserAdd, user, status);
            VLIBCErrSet(ERR_CREATE_FAILED);
            return -1;
        }
    }
    return 0;
}
