#include "auth.h"

#include <grp.h>
#include <openssl/rand.h>
#include <pwd.h>
#include <security/pam_appl.h>
#include <stdlib.h>
#include <string.h>

#include <vector>

namespace center {

namespace {

const char kAdministrators[] = "administrators";

// PAM asks through this: every prompt that hides its echo gets the password, the others
// the user name; messages are dropped.
int conversation(int count, const struct pam_message** messages, struct pam_response** replies,
                 void* data) {
    const auto* credentials = static_cast<const std::pair<std::string, std::string>*>(data);
    auto* out = static_cast<struct pam_response*>(calloc(count, sizeof(struct pam_response)));
    if (out == nullptr) {
        return PAM_BUF_ERR;
    }
    for (int i = 0; i < count; ++i) {
        const int style = messages[i]->msg_style;
        if (style == PAM_PROMPT_ECHO_OFF) {
            out[i].resp = strdup(credentials->second.c_str());
        } else if (style == PAM_PROMPT_ECHO_ON) {
            out[i].resp = strdup(credentials->first.c_str());
        }
    }
    *replies = out;
    return PAM_SUCCESS;
}

}  // namespace

bool pamAuthenticate(const std::string& service, const std::string& user,
                     const std::string& password) {
    if (user.empty() || password.empty()) {
        return false;
    }
    std::pair<std::string, std::string> credentials(user, password);
    struct pam_conv conv = {conversation, &credentials};
    pam_handle_t* handle = nullptr;
    if (pam_start(service.c_str(), user.c_str(), &conv, &handle) != PAM_SUCCESS) {
        return false;
    }
    int status = pam_authenticate(handle, PAM_DISALLOW_NULL_AUTHTOK);
    if (status == PAM_SUCCESS) {
        status = pam_acct_mgmt(handle, PAM_DISALLOW_NULL_AUTHTOK);
    }
    pam_end(handle, status);
    return status == PAM_SUCCESS;
}

bool isAdministrator(const std::string& user) {
    struct group* admins = getgrnam(kAdministrators);
    struct passwd* account = getpwnam(user.c_str());
    if (admins == nullptr || account == nullptr) {
        return false;
    }
    const gid_t wanted = admins->gr_gid;
    int count = 64;
    std::vector<gid_t> groups(count);
    if (getgrouplist(user.c_str(), account->pw_gid, groups.data(), &count) < 0) {
        groups.resize(count);
        if (getgrouplist(user.c_str(), account->pw_gid, groups.data(), &count) < 0) {
            return false;
        }
    }
    groups.resize(count);
    for (gid_t gid : groups) {
        if (gid == wanted) {
            return true;
        }
    }
    return false;
}

std::string randomToken() {
    unsigned char bytes[32];
    if (RAND_bytes(bytes, sizeof bytes) != 1) {
        return "";
    }
    static const char kHex[] = "0123456789abcdef";
    std::string token;
    for (unsigned char byte : bytes) {
        token += kHex[byte >> 4];
        token += kHex[byte & 15];
    }
    return token;
}

bool sameToken(const std::string& a, const std::string& b) {
    if (a.size() != b.size() || a.empty()) {
        return false;
    }
    unsigned char diff = 0;
    for (size_t i = 0; i < a.size(); ++i) {
        diff |= static_cast<unsigned char>(a[i] ^ b[i]);
    }
    return diff == 0;
}

std::string SessionTable::open(const std::string& user) {
    Session session{user, randomToken(), std::chrono::steady_clock::now()};
    std::string id = randomToken();
    if (id.empty() || session.csrf.empty()) {
        return "";
    }
    std::lock_guard<std::mutex> hold(mutex_);
    sessions_[id] = session;
    return id;
}

bool SessionTable::find(const std::string& id, Session& out) {
    std::lock_guard<std::mutex> hold(mutex_);
    auto it = sessions_.find(id);
    if (it == sessions_.end()) {
        return false;
    }
    const auto now = std::chrono::steady_clock::now();
    if (now - it->second.lastUse > idle_) {
        sessions_.erase(it);
        return false;
    }
    it->second.lastUse = now;
    out = it->second;
    return true;
}

void SessionTable::close(const std::string& id) {
    std::lock_guard<std::mutex> hold(mutex_);
    sessions_.erase(id);
}

}  // namespace center
