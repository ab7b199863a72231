// Loads libcurl on first use; see curl_api.h.
#include "store/curl_api.h"

#include <dlfcn.h>

#include "corv/log.h"

namespace CORVPackageTool {

namespace {

constexpr const char* kLibcurl = "libcurl.so.4";

CURLcode failedGlobalInit(long) {
    return CURLE_FAILED_INIT;
}
void noGlobalCleanup() {}
CURL* noEasyInit() {
    return nullptr;
}
void noEasyCleanup(CURL*) {}
CURLcode failedSetopt(CURL*, CURLoption, ...) {
    return CURLE_FAILED_INIT;
}
CURLcode failedPerform(CURL*) {
    return CURLE_FAILED_INIT;
}
CURLcode failedGetinfo(CURL*, CURLINFO, ...) {
    return CURLE_FAILED_INIT;
}
const char* unavailableText(CURLcode) {
    return "libcurl could not be loaded";
}
char* noEscape(CURL*, const char*, int) {
    return nullptr;
}
void noFree(void*) {}

constexpr CurlApi kUnavailable = {failedGlobalInit, noGlobalCleanup, noEasyInit,    noEasyCleanup,
                                  failedSetopt,     failedPerform,   failedGetinfo, unavailableText,
                                  noEscape,         noFree};

template <typename Function>
bool find(void* library, const char* name, Function& function) {
    function = reinterpret_cast<Function>(dlsym(library, name));
    return function != nullptr;
}

CurlApi load() {
    // Never closed: libcurl's global state lives as long as the process.
    void* library = dlopen(kLibcurl, RTLD_NOW | RTLD_LOCAL);
    if (library == nullptr) {
        CORV_LOG_ERR("Failed to load %s: %s", kLibcurl, dlerror());
        return kUnavailable;
    }
    CurlApi api{};
    if (find(library, "curl_global_init", api.global_init) &&
        find(library, "curl_global_cleanup", api.global_cleanup) &&
        find(library, "curl_easy_init", api.easy_init) &&
        find(library, "curl_easy_cleanup", api.easy_cleanup) &&
        find(library, "curl_easy_setopt", api.easy_setopt) &&
        find(library, "curl_easy_perform", api.easy_perform) &&
        find(library, "curl_easy_getinfo", api.easy_getinfo) &&
        find(library, "curl_easy_strerror", api.easy_strerror) &&
        find(library, "curl_easy_escape", api.easy_escape) &&
        find(library, "curl_free", api.free)) {
        return api;
    }
    CORV_LOG_ERR("Failed to find the functions of %s: %s", kLibcurl, dlerror());
    return kUnavailable;
}

}  // namespace

const CurlApi& PMSCurl() {
    static const CurlApi api = load();
    return api;
}

}  // namespace CORVPackageTool
