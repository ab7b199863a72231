// libcurl, loaded when the store is first talked to. Most processes that use this library
// install, start or remove packages and never reach a store; linking libcurl, with the two
// dozen libraries it needs, made each of them (the command line, the job tool) load it all
// at start, about 2 ms a process.
#pragma once

#include <curl/curl.h>

namespace CORVPackageTool {

// The libcurl functions the store client uses, named without their "curl_" prefix.
struct CurlApi {
    CURLcode (*global_init)(long flags);
    void (*global_cleanup)();
    CURL* (*easy_init)();
    void (*easy_cleanup)(CURL* curl);
    CURLcode (*easy_setopt)(CURL* curl, CURLoption option, ...);
    CURLcode (*easy_perform)(CURL* curl);
    CURLcode (*easy_getinfo)(CURL* curl, CURLINFO info, ...);
    const char* (*easy_strerror)(CURLcode code);
    char* (*easy_escape)(CURL* curl, const char* text, int length);
    void (*free)(void* pointer);
};

// The functions of libcurl. When it cannot be loaded (logged once), functions that fail
// as libcurl fails: no handle, CURLE_FAILED_INIT, and a text that says why.
const CurlApi& PMSCurl();

}  // namespace CORVPackageTool
