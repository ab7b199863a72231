// The directory-service state of the device: LDAP binding and Windows domain membership.
#include <errno.h>
#include <string.h>
#include <sys/stat.h>

#include <string>

#include "corv/app_priv.h"
#include "corv/log.h"
#include "corv/vlibc.h"

namespace {

constexpr int kValueSize = 4096;
constexpr const char kBlanks[] = " \t";

enum class Lookup { kFound, kMissing, kFailed };

// `key` of the directory file. kMissing when the file or the key is not there.
Lookup readKey(const char* key, std::string& value) {
    value.clear();
    struct stat st {};
    if (stat(CORV_DIRECTORY_CONF, &st) != 0 && errno == ENOENT) {
        return Lookup::kMissing;
    }
    char buffer[kValueSize] = "";
    int n = VLIBCFileGetKeyValue(CORV_DIRECTORY_CONF, key, buffer, sizeof(buffer), 0);
    if (n < 0) {
        CORV_LOG_ERR("Failed to read %s from %s [0x%04X %s:%d]", key, CORV_DIRECTORY_CONF,
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return Lookup::kFailed;
    }
    value.assign(buffer, static_cast<size_t>(n));
    return n > 0 ? Lookup::kFound : Lookup::kMissing;
}

bool isYes(const char* key) {
    std::string value;
    return readKey(key, value) == Lookup::kFound && value == "yes";
}

std::string trimmed(const std::string& text) {
    size_t begin = text.find_first_not_of(kBlanks);
    if (begin == std::string::npos) {
        return std::string();
    }
    size_t end = text.find_last_not_of(kBlanks);
    return text.substr(begin, end - begin + 1);
}

// Appends the non-empty comma-separated items of `key`; their number, or -1.
int appendItems(const char* key, PVLIBSZLIST* list) {
    std::string value;
    if (readKey(key, value) == Lookup::kFailed) {
        VLIBCErrSet(ERR_READ_FAILED);
        return -1;
    }
    int count = 0;
    size_t start = 0;
    while (start <= value.size()) {
        size_t comma = value.find(',', start);
        if (comma == std::string::npos) {
            comma = value.size();
        }
        const std::string item = trimmed(value.substr(start, comma - start));
        if (!item.empty()) {
            if (VLIBCSzListPush(list, item.c_str()) != 0) {
                return -1;
            }
            ++count;
        }
        start = comma + 1;
    }
    return count;
}

}  // namespace

int CORVLDAPIsBinded() {
    return isYes("ldap_bound") ? 1 : 0;
}

int CORVLDAPLoginSuffixGet(char* buffer, int size) {
    if (buffer == nullptr || size <= 0) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    buffer[0] = '\0';
    if (!isYes("ldap_bound")) {
        VLIBCErrSet(ERR_NOT_APPLICABLE);
        return -1;
    }
    std::string suffix;
    if (readKey("ldap_suffix", suffix) != Lookup::kFound) {
        VLIBCErrSet(ERR_KEY_NOT_FOUND);
        return -1;
    }
    if (suffix.size() >= static_cast<size_t>(size)) {
        VLIBCErrSet(ERR_BUF_TOO_SMALL);
        return -1;
    }
    memcpy(buffer, suffix.c_str(), suffix.size() + 1);
    return static_cast<int>(suffix.size());
}

int CORVWinsIsJoined() {
    return isYes("wins_joined") ? 1 : 0;
}

int CORVGroupDomainAdminListGet(PVLIBSZLIST* groups, PVLIBSZLIST* users) {
    if (groups == nullptr || *groups == nullptr || (users != nullptr && *users == nullptr)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (!isYes("wins_joined")) {
        VLIBCErrSet(ERR_NOT_APPLICABLE);
        return -1;
    }
    int count = appendItems("domain_admin_groups", groups);
    if (count < 0) {
        return -1;
    }
    if (users != nullptr && appendItems("domain_admin_users", users) < 0) {
        return -1;
    }
    return count;
}
