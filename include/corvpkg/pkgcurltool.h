// The HTTP layer under the package store client, on libcurl. Store queries (pkgserver.h),
// package downloads and icon fetches all go through it, so that every transfer has the
// same handle settings, retry policy and reading of the status.
//
// Handle settings (PMSCurlSetupConfig), the same for every transfer:
//   user agent           the platform's VLIBNsinfoUserAgentGet("package")
//   redirects            followed, at most PKG_CURL_MAX_REDIRECTS in a row, http/https only
//   TLS                  peer and host verified against PKG_CURL_CA_BUNDLE (the system's
//                        trust store), TLS 1.0 or later
//   low speed            a transfer slower than 128 bytes/s for 60 s is a time-out
//   connect time-out     120 s
// Retry policy of PMSDownloadSendRequest and PMSDownloadFile: up to 3 attempts, 1 s apart,
// only after an unresolvable proxy or host (curl codes 5, 6) or a time-out (28). An
// unresolvable host is first tried once more within the attempt with the fallback DNS
// server PKG_CURL_FALLBACK_DNS; a libcurl built without that option (Debian's) logs the
// failed setting and counts the attempt as failed. Any other failure, and any status but
// 200, ends the transfer at once.
//
// Failures return false and log one line at priority 3, "pkgcurltool.cc:<line> ...".
// Transfers are synchronous; curl_global_init/cleanup run per call, so two transfers must
// not run on two threads of one process.
#pragma once

#include <string>

#include "corvpkg/visibility.h"

struct VLIBSZHASH;

namespace CORVPackageTool {

#define PKG_CURL_CA_BUNDLE "/etc/ssl/certs/ca-certificates.crt"
#define PKG_CURL_FALLBACK_DNS "8.8.8.8"
constexpr long PKG_CURL_LOW_SPEED_LIMIT = 128;  // bytes per second
constexpr long PKG_CURL_LOW_SPEED_TIME = 60;    // seconds
constexpr long PKG_CURL_CONNECT_TIMEOUT = 120;  // seconds
constexpr int PKG_CURL_ATTEMPTS = 3;
constexpr long PKG_CURL_MAX_REDIRECTS = 10;
// A reply body of PMSDownloadSendRequest larger than this is cut off and the request
// fails (logged "Reply of <url> is larger than ..."): no store list comes near it, and a
// hostile server must not fill the memory.
constexpr size_t PKG_CURL_REPLY_LIMIT = 32u << 20;

// Applies the settings above to the easy handle `curl` for `url`. False on a null argument
// or when a setting that matters fails (a failed low-speed setting is only logged).
CORVPKG_API bool PMSCurlSetupConfig(void* curl, const char* url);
// Sets the user agent; 0 unless the option itself failed. Without a user agent from the
// platform (logged) the request goes on without one.
CORVPKG_API int PMSCurlSetUserAgent(void* curl);
// curl_global_init, curl_easy_init and PMSCurlSetupConfig. On success `*curl` is the handle
// that the caller cleans up.
CORVPKG_API bool PMSCurlInitHandle(void** curl, const char* url);
// Appends "key=value&key=value" for the fields of `params` to the malloc'ed `*buffer`
// (whose allocated size is `*length`, grown as needed): values are URL-escaped, keys are
// taken as they stand. False (logged) for a missing value or a failed escape or append.
CORVPKG_API bool PMSCurlEncodeParams(void* curl, VLIBSZHASH* params, char** buffer, int* length);
// Encodes `params` into `*buffer` and makes the request a POST with it as body. The buffer
// stays the caller's and must outlive the transfer.
CORVPKG_API bool PMSCurlSetPostField(void* curl, VLIBSZHASH* params, char** buffer, int* length);
// `fullUrl` = `url` + "?" (or "&" when `url` has a query already) + the encoded params.
CORVPKG_API bool PMSCurlGetQueryURL(void* curl, const char* url, VLIBSZHASH* params,
                                    std::string& fullUrl);

// One request with the retry policy. `params` (may be null) go in the URL with `post`
// false, in a form-encoded body with `post` true. On success `reply` holds the body, the
// status was 200 and the body was not empty. On failure `reply` is untouched (hard
// failure: a status other than 200, an empty body, a bad certificate, a cut transfer, a
// reply over PKG_CURL_REPLY_LIMIT ...), or, after 3 attempts that could not reach the
// server, the text {"key":"commfail","sec":"common","success":false} and a line feed, so
// that a caller can tell an unreachable server from a refusal.
CORVPKG_API bool PMSDownloadSendRequest(const char* url, bool post, std::string& reply,
                                        VLIBSZHASH* params);
// Downloads `url` into `path` (rewritten from the start at each attempt) with the retry
// policy; `timeoutSeconds`, when given, limits each attempt. `contentType` and
// `effectiveUrl` (after redirects), when given, receive what the server sent. On failure
// getResult() is PKG_ERR_SYSTEM (bad argument, local failure) or PKG_ERR_SERVER (network,
// status other than 200), and a partial file stays for the caller to remove. The file is
// held under PMSLockFile while it is written, when it existed before.
CORVPKG_API bool PMSDownloadFile(const char* url, const char* path, std::string* contentType,
                                 std::string* effectiveUrl, int* timeoutSeconds);

// Opens `path` read-only and waits for a flock on it (exclusive or shared). The descriptor
// that holds the lock, or a negative value when the file can't be opened.
CORVPKG_API int PMSLockFile(const char* path, bool exclusive);
// Releases and closes; a negative descriptor is ignored.
CORVPKG_API void PMSUnlockFile(int fd);
// The text behind the last "/" of `url`, cut at its first "?"; a URL without "/" whole.
CORVPKG_API void PMSParseUrlToFileName(const char* url, std::string& name);

// What the last failed store transfer or reply of this process met, in words for people:
// "the server could not be reached (...)", "the server's certificate is not trusted (...)",
// "the server answered HTTP 500", "the reply is not JSON", ... Empty before any failure;
// a success clears it. Not synchronised, like getResult().
CORVPKG_API std::string PMSGetLastStoreFailure();

// The transport's process-wide result code: the last failure of PMSDownloadFile as a
// PKG_ERRCODE (a success does not reset it). Not synchronised.
CORVPKG_API int getResult();

}  // namespace CORVPackageTool
