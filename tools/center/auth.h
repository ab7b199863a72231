// Who may use the Package Center: local users that Linux-PAM lets in and that belong to
// the group "administrators"; and the sessions they get by logging in, each with the
// token that every state-changing request must carry.
#pragma once

#include <chrono>
#include <map>
#include <mutex>
#include <string>

namespace center {

// Asks PAM (service `service`, e.g. "corv-center") whether `password` is right for
// `user` and the account may be used now. Never logs the password.
bool pamAuthenticate(const std::string& service, const std::string& user,
                     const std::string& password);

// Whether `user` is in the group "administrators", as primary or supplementary member.
bool isAdministrator(const std::string& user);

// An unguessable token: 32 random bytes in hexadecimal. Empty when the random source fails.
std::string randomToken();

struct Session {
    std::string user;
    std::string csrf;
    std::chrono::steady_clock::time_point lastUse;
};

// The sessions of one server. A session ends after `idle` without a request, or on logout.
class SessionTable {
  public:
    explicit SessionTable(std::chrono::seconds idle) : idle_(idle) {}
    // A new session of `user`; its id goes into the cookie. Empty on failure.
    std::string open(const std::string& user);
    // The live session of `id` into `out`, its idle time restarted. False when unknown or
    // expired (then it is dropped).
    bool find(const std::string& id, Session& out);
    void close(const std::string& id);

  private:
    std::chrono::seconds idle_;
    std::mutex mutex_;
    std::map<std::string, Session> sessions_;
};

// Compares two tokens in time that does not depend on where they differ.
bool sameToken(const std::string& a, const std::string& b);

}  // namespace center
