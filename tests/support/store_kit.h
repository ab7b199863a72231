// A real corv-store on loopback for the store client's tests: started on a free port over
// a store directory, stopped (by its process id) when the object goes away.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <string>
#include <vector>

namespace testutil {

class StoreServer {
  public:
    // Serves `dir` (made when missing) with the extra `args` ("--check-token", "--tls" ...).
    // `dir`/requests.log is its request log.
    explicit StoreServer(const std::string& dir, const std::vector<std::string>& args = {});
    ~StoreServer();
    StoreServer(const StoreServer&) = delete;
    StoreServer& operator=(const StoreServer&) = delete;

    bool running() const { return !base_.empty(); }
    // "http://127.0.0.1:<port>" (https with --tls).
    const std::string& base() const { return base_; }
    // Writes DIR/catalogue.json with these entries.
    void setPackages(const Json::Value& entries);
    // The JSON of `text` (a fault file's rules written inline in a test).
    static Json::Value rulesFromText(const std::string& text);
    // Writes the fault file (an array of rules).
    void setFaults(const Json::Value& rules);
    // The request log so far, one object per request.
    std::vector<Json::Value> requests() const;
    // Copies the package file `cpk` into the store and indexes the store's files with
    // "corv-store index" (the catalogue then has their link, size and md5). False when the
    // index fails.
    bool publish(const std::string& cpk);

  private:
    std::string dir_;
    std::string base_;
    pid_t pid_ = -1;
};

// A store entry of `name` and `version` with a dependency list in the JSON form (may be null).
Json::Value storeEntry(const std::string& name, const std::string& version,
                       const Json::Value& deps = Json::Value());

// Sets key="value" in /etc.defaults/corvinfo.conf (the maker store's address, the account).
void setDefaultsKey(const std::string& key, const std::string& value);

}  // namespace testutil
