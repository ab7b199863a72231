#include "catalogue.h"

#include <sys/stat.h>

#include <utility>

#include "corvpkg/json_util.h"

namespace store {

Catalogue::Catalogue(std::string dir) : path_(std::move(dir) + "/" + kCatalogueFile) {}

void Catalogue::reloadIfChanged(std::string& error) {
    struct stat st {};
    if (stat(path_.c_str(), &st) != 0) {
        packages_ = Json::Value(Json::arrayValue);
        loadedSize_ = -1;
        error = "no " + path_ + " (run corv-store index first)";
        return;
    }
    // A rewrite by `index` renames a new file into place, so time and size tell a change.
    if (st.st_size == loadedSize_ && st.st_mtim.tv_sec == loadedTime_.tv_sec &&
        st.st_mtim.tv_nsec == loadedTime_.tv_nsec) {
        return;
    }
    Json::Value root;
    if (!CORVPackageTool::fromFile(path_, root) || !root.isObject() ||
        !root["packages"].isArray()) {
        packages_ = Json::Value(Json::arrayValue);
        loadedSize_ = -1;
        error = path_ + " is not a catalogue ({\"packages\": [...]})";
        return;
    }
    packages_ = root["packages"];
    loadedTime_ = st.st_mtim;
    loadedSize_ = st.st_size;
}

std::string absoluteLink(const std::string& base, const std::string& link) {
    if (link.find("://") != std::string::npos) {
        return link;
    }
    return base + (!link.empty() && link[0] == '/' ? "" : "/") + link;
}

Json::Value Catalogue::packages(const std::string& base, std::string& error) {
    std::lock_guard<std::mutex> hold(mutex_);
    reloadIfChanged(error);
    Json::Value out = packages_;
    for (Json::Value& entry : out) {
        if (!entry.isObject()) {
            continue;
        }
        if (entry.isMember("link") && entry["link"].isString()) {
            entry["link"] = absoluteLink(base, entry["link"].asString());
        }
        if (entry.isMember("thumbnail") && entry["thumbnail"].isArray()) {
            for (Json::Value& url : entry["thumbnail"]) {
                if (url.isString()) {
                    url = absoluteLink(base, url.asString());
                }
            }
        }
    }
    return out;
}

}  // namespace store
