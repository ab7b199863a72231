// The catalogue of a store directory: what `corv-store index` writes and `serve` offers.
//
// DIR/catalogue.json is {"packages": [entry, ...]}. An entry carries the store fields a
// client reads (package, version, dname, desc, maintainer, maintainer_url, distributor,
// distributor_url, silent_install, silent_upgrade, silent_uninstall, beta, depsers,
// conf_deppkgs, conf_conxpkgs, size, md5, link, thumbnail). `link` and each `thumbnail`
// may be relative to the store directory ("hello-1.0.cpk", "icons/hello.png"); the server
// makes them absolute against the address the client used, so one catalogue serves on any
// address. Absolute links ("http://...") are served as they stand.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <mutex>
#include <string>

namespace store {

constexpr char kCatalogueFile[] = "catalogue.json";

class Catalogue {
  public:
    explicit Catalogue(std::string dir);

    // The entries, with relative links made absolute against `base` ("http://host:port").
    // Reloads the file first when it changed. An unreadable or malformed catalogue gives an
    // empty array and sets `error`.
    Json::Value packages(const std::string& base, std::string& error);

  private:
    void reloadIfChanged(std::string& error);

    std::string path_;
    std::mutex mutex_;
    Json::Value packages_{Json::arrayValue};
    struct timespec loadedTime_ {};
    off_t loadedSize_ = -1;
};

// `link` made absolute against `base` unless it already names a scheme.
std::string absoluteLink(const std::string& base, const std::string& link);

}  // namespace store
