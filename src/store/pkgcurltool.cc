// The HTTP layer of the store client: handle settings, parameter encoding, the retry and
// DNS fallback policy, the reading of the status.
#include "corvpkg/pkgcurltool.h"

#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/file.h>
#include <unistd.h>

#include <json/json.h>

#include "corv/log.h"
#include "corv/nsinfo.h"
#include "corv/vlibc.h"
#include "corvpkg/pkgtypes.h"
#include "store/curl_api.h"
#include "store/pkgserver_private.h"

namespace CORVPackageTool {

CURLcode PMSRetryWithFallbackDns(CURL* curl, CURLcode first) {
    if (first != CURLE_COULDNT_RESOLVE_HOST) {
        return first;
    }
    CORV_LOG_ERR("Fallback dns to %s", PKG_CURL_FALLBACK_DNS);
    CURLcode set = PMSCurl().easy_setopt(curl, CURLOPT_DNS_SERVERS, PKG_CURL_FALLBACK_DNS);
    if (set != CURLE_OK) {
        CORV_LOG_ERR("Failed to set CURLOPT_DNS_SERVERS, return value=%d, err=%s", set,
                     PMSCurl().easy_strerror(set));
        return first;
    }
    return PMSCurl().easy_perform(curl);
}

namespace {

int g_transportResult = 0;
std::string g_lastFailure;

// The words for a transfer that ended with `code`.
std::string describeCurlFailure(CURLcode code, bool overLimit) {
    const std::string detail = std::string(" (") + PMSCurl().easy_strerror(code) + ")";
    switch (code) {
        case CURLE_COULDNT_RESOLVE_PROXY:
        case CURLE_COULDNT_RESOLVE_HOST:
            return "the server's name could not be resolved" + detail;
        case CURLE_COULDNT_CONNECT:
        case CURLE_GOT_NOTHING:
            return "the server could not be reached" + detail;
        case CURLE_OPERATION_TIMEDOUT:
            return "the server did not answer in time" + detail;
        case CURLE_PEER_FAILED_VERIFICATION:
        case CURLE_SSL_CACERT_BADFILE:
            return "the server's certificate is not trusted" + detail;
        case CURLE_SSL_CONNECT_ERROR:
            return "the secure connection to the server failed" + detail;
        case CURLE_TOO_MANY_REDIRECTS:
            return "the server redirected too many times" + detail;
        case CURLE_PARTIAL_FILE:
        case CURLE_RECV_ERROR:
            return "the reply was cut off" + detail;
        case CURLE_WRITE_ERROR:
            if (overLimit) {
                return "the reply is larger than " + std::to_string(PKG_CURL_REPLY_LIMIT >> 20) +
                       " MiB and was refused";
            }
            return "the reply could not be stored" + detail;
        default:
            return "the transfer failed" + detail;
    }
}

// The reply body as it arrives; always NUL-terminated once anything arrived.
struct ReplyBuffer {
    char* data = nullptr;
    size_t length = 0;
    bool overLimit = false;
    ~ReplyBuffer() { free(data); }
};

size_t appendReply(char* bytes, size_t size, size_t count, void* context) {
    ReplyBuffer* reply = static_cast<ReplyBuffer*>(context);
    const size_t added = size * count;
    if (reply->length + added > PKG_CURL_REPLY_LIMIT) {
        reply->overLimit = true;
        return 0;
    }
    char* grown = static_cast<char*>(realloc(reply->data, reply->length + added + 1));
    if (grown == nullptr) {
        free(reply->data);
        reply->data = nullptr;
        reply->length = 0;
        return 0;
    }
    reply->data = grown;
    memcpy(reply->data + reply->length, bytes, added);
    reply->length += added;
    reply->data[reply->length] = '\0';
    return added;
}

// The easy handle of one transfer with libcurl's global state around it.
class CurlHandle {
  public:
    CurlHandle() = default;
    ~CurlHandle() {
        if (curl_ != nullptr) {
            PMSCurl().easy_cleanup(curl_);
        }
        if (global_) {
            PMSCurl().global_cleanup();
        }
    }
    CurlHandle(const CurlHandle&) = delete;
    CurlHandle& operator=(const CurlHandle&) = delete;

    bool init(const char* url) {
        void* handle = nullptr;
        global_ = true;
        bool ok = PMSCurlInitHandle(&handle, url);
        curl_ = static_cast<CURL*>(handle);
        return ok;
    }
    CURL* get() const { return curl_; }

  private:
    CURL* curl_ = nullptr;
    bool global_ = false;
};

// A malloc'ed text buffer of the encoders, released on every way out.
struct TextBuffer {
    char* data = nullptr;
    int capacity = 0;
    bool allocate() {
        data = static_cast<char*>(calloc(1, 1024));
        capacity = data == nullptr ? 0 : 1024;
        return data != nullptr;
    }
    ~TextBuffer() { free(data); }
};

bool isRetryable(CURLcode code) {
    return code == CURLE_COULDNT_RESOLVE_PROXY || code == CURLE_COULDNT_RESOLVE_HOST ||
           code == CURLE_OPERATION_TIMEDOUT;
}

// One perform; an unresolvable host gets a second perform with the fallback DNS server,
// which stays set on the handle for the attempts that follow.
CURLcode performWithDnsFallback(CURL* curl) {
    CURLcode code = PMSCurl().easy_perform(curl);
    if (code != CURLE_OK) {
        CORV_LOG_ERR("Failed to curl perform, code=%d, err=%s", code,
                     PMSCurl().easy_strerror(code));
    }
    return PMSRetryWithFallbackDns(curl, code);
}

bool setTlsOptions(CURL* curl) {
    CURLcode code;
    if ((code = PMSCurl().easy_setopt(curl, CURLOPT_SSL_VERIFYPEER, 1L)) != CURLE_OK ||
        (code = PMSCurl().easy_setopt(curl, CURLOPT_SSL_VERIFYHOST, 2L)) != CURLE_OK ||
        // The bundle file goes to the directory option, as the appliance has always set
        // it; libcurl's own default bundle is the same file.
        (code = PMSCurl().easy_setopt(curl, CURLOPT_CAPATH, PKG_CURL_CA_BUNDLE)) != CURLE_OK ||
        (code = PMSCurl().easy_setopt(curl, CURLOPT_SSLVERSION, (long)CURL_SSLVERSION_TLSv1)) !=
            CURLE_OK) {
        CORV_LOG_ERR("Failed to set curl opt error:(%d)%s", code, PMSCurl().easy_strerror(code));
        return false;
    }
    return true;
}

// Bounds on redirects: without them a redirect loop would never end.
bool setRedirectOptions(CURL* curl) {
    CURLcode code = PMSCurl().easy_setopt(curl, CURLOPT_FOLLOWLOCATION, 1L);
    if (code == CURLE_OK) {
        code = PMSCurl().easy_setopt(curl, CURLOPT_MAXREDIRS, PKG_CURL_MAX_REDIRECTS);
    }
    if (code == CURLE_OK) {
        code = PMSCurl().easy_setopt(curl, CURLOPT_REDIR_PROTOCOLS_STR, "http,https");
    }
    if (code != CURLE_OK) {
        CORV_LOG_ERR("Failed to set %s, code=%d, err=%s", "CURLOPT_FOLLOWLOCATION", code,
                     PMSCurl().easy_strerror(code));
        return false;
    }
    return true;
}

}  // namespace

int getResult() {
    return g_transportResult;
}

std::string PMSGetLastStoreFailure() {
    return g_lastFailure;
}

void PMSSetLastStoreFailure(const std::string& words) {
    g_lastFailure = words;
}

int PMSCurlSetUserAgent(void* curl) {
    char agent[512] = {0};
    if (VLIBNsinfoUserAgentGet("package", agent, sizeof agent) < 0) {
        CORV_LOG_ERR("Failed to get UserAgent [0x%04X %s:%d]", VLIBCErrGet(), VLIBCErrorGetFile(),
                     VLIBCErrorGetLine());
        return 0;
    }
    CURLcode code = PMSCurl().easy_setopt(static_cast<CURL*>(curl), CURLOPT_USERAGENT, agent);
    return code == CURLE_OK ? 0 : static_cast<int>(code);
}

bool PMSCurlSetupConfig(void* handle, const char* url) {
    if (handle == nullptr || url == nullptr) {
        return false;
    }
    CURL* curl = static_cast<CURL*>(handle);
    int agent = PMSCurlSetUserAgent(curl);
    if (agent != 0) {
        CORV_LOG_ERR("Failed to set time-out, return value=%d, err=%s", agent,
                     PMSCurl().easy_strerror(static_cast<CURLcode>(agent)));
        return false;
    }
    CURLcode code = PMSCurl().easy_setopt(curl, CURLOPT_URL, url);
    if (code != CURLE_OK) {
        CORV_LOG_ERR("Failed to set url to %s, code=%d, err=%s", url, code,
                     PMSCurl().easy_strerror(code));
        return false;
    }
    if (!setRedirectOptions(curl) || !setTlsOptions(curl)) {
        return false;
    }
    // A slow store only slows the caller down, so a failed limit is no reason to stop.
    if ((code = PMSCurl().easy_setopt(curl, CURLOPT_LOW_SPEED_LIMIT, PKG_CURL_LOW_SPEED_LIMIT)) !=
            CURLE_OK ||
        (code = PMSCurl().easy_setopt(curl, CURLOPT_LOW_SPEED_TIME, PKG_CURL_LOW_SPEED_TIME)) !=
            CURLE_OK) {
        CORV_LOG_ERR("Failed to set time-out, return value=%d, err=%s", code,
                     PMSCurl().easy_strerror(code));
    }
    code = PMSCurl().easy_setopt(curl, CURLOPT_CONNECTTIMEOUT, PKG_CURL_CONNECT_TIMEOUT);
    if (code != CURLE_OK) {
        CORV_LOG_ERR("Failed to set time-out, return value=%d, err=%s", code,
                     PMSCurl().easy_strerror(code));
        return false;
    }
    return true;
}

bool PMSCurlInitHandle(void** curl, const char* url) {
    if (curl == nullptr) {
        return false;
    }
    PMSCurl().global_init(CURL_GLOBAL_ALL);
    *curl = PMSCurl().easy_init();
    if (*curl == nullptr) {
        CORV_LOG_ERR("Failed to init curl.");
        return false;
    }
    if (!PMSCurlSetupConfig(*curl, url)) {
        CORV_LOG_ERR("Failed to set curl.");
        return false;
    }
    return true;
}

bool PMSCurlEncodeParams(void* curl, VLIBSZHASH* params, char** buffer, int* length) {
    if (curl == nullptr || params == nullptr || buffer == nullptr || length == nullptr) {
        return false;
    }
    PVLIBSZLIST keys = VLIBCSzListAlloc(0x400);
    if (keys == nullptr) {
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return false;
    }
    bool ok = VLIBCSzHashEnumKey(params, &keys) >= 0;
    for (int i = 0; ok && i < VLIBCSzListCount(keys); ++i) {
        const char* key = VLIBCSzListGet(keys, i);
        if (key == nullptr) {
            continue;
        }
        const char* value = VLIBCSzHashGetValue(params, key);
        if (value == nullptr) {
            CORV_LOG_ERR("No value for hash key (%s)[0x%04X %s:%d]", key, VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            ok = false;
            break;
        }
        char* escaped = PMSCurl().easy_escape(static_cast<CURL*>(curl), value, 0);
        if (escaped == nullptr) {
            CORV_LOG_ERR("URL encoding failed: %s", value);
            ok = false;
            break;
        }
        if ((i != 0 && VLIBCStrCat(buffer, length, "&") < 0) ||
            VLIBCStrCat(buffer, length, key) < 0 || VLIBCStrCat(buffer, length, "=") < 0 ||
            VLIBCStrCat(buffer, length, escaped) < 0) {
            CORV_LOG_ERR("Fail to concat string");
            ok = false;
        }
        PMSCurl().free(escaped);
    }
    VLIBCSzListFree(keys);
    return ok;
}

bool PMSCurlSetPostField(void* curl, VLIBSZHASH* params, char** buffer, int* length) {
    if (!PMSCurlEncodeParams(curl, params, buffer, length)) {
        return false;
    }
    CURLcode code = PMSCurl().easy_setopt(static_cast<CURL*>(curl), CURLOPT_POSTFIELDS, *buffer);
    if (code == CURLE_OK) {
        code = PMSCurl().easy_setopt(static_cast<CURL*>(curl), CURLOPT_POST, 1L);
    }
    if (code != CURLE_OK) {
        CORV_LOG_ERR("Failed to set POST parameters, code=%d, err=%s", code,
                     PMSCurl().easy_strerror(code));
        return false;
    }
    return true;
}

bool PMSCurlGetQueryURL(void* curl, const char* url, VLIBSZHASH* params, std::string& fullUrl) {
    if (url == nullptr) {
        return false;
    }
    TextBuffer text;
    if (!text.allocate()) {
        CORV_LOG_ERR("Fail to allocate");
        return false;
    }
    if (!PMSCurlEncodeParams(curl, params, &text.data, &text.capacity)) {
        return false;
    }
    fullUrl = url;
    fullUrl += strchr(url, '?') == nullptr ? "?" : "&";
    fullUrl += text.data;
    return true;
}

namespace {

// Puts the fields on the handle: in a POST body, or in the URL of a GET.
bool applyParams(CURL* curl, const char* url, bool post, VLIBSZHASH* params, TextBuffer& text,
                 std::string& getUrl) {
    if (params == nullptr) {
        return true;
    }
    if (!text.allocate()) {
        CORV_LOG_ERR("Fail to allocate");
        return false;
    }
    if (post) {
        if (!PMSCurlSetPostField(curl, params, &text.data, &text.capacity)) {
            CORV_LOG_ERR("%s, Failed to CurlSetPostField", url);
            return false;
        }
        return true;
    }
    if (!PMSCurlGetQueryURL(curl, url, params, getUrl) ||
        PMSCurl().easy_setopt(curl, CURLOPT_URL, getUrl.c_str()) != CURLE_OK ||
        PMSCurl().easy_setopt(curl, CURLOPT_HTTPGET, 1L) != CURLE_OK) {
        CORV_LOG_ERR("%s, Failed to set get parameters", url);
        return false;
    }
    return true;
}

// What an exhausted retry leaves in the reply: the refusal form with "common"/"commfail".
std::string unreachableReply() {
    Json::Value value(Json::objectValue);
    value["success"] = false;
    value["sec"] = "common";
    value["key"] = "commfail";
    return Json::FastWriter().write(value);
}

}  // namespace

bool PMSDownloadSendRequest(const char* url, bool post, std::string& reply, VLIBSZHASH* params) {
    if (url == nullptr) {
        return false;
    }
    CurlHandle handle;
    if (!handle.init(url)) {
        return false;
    }
    CURL* curl = handle.get();
    TextBuffer text;
    std::string getUrl;
    if (!applyParams(curl, url, post, params, text, getUrl)) {
        return false;
    }
    ReplyBuffer body;
    CURLcode code = CURLE_OK;
    for (int attempt = 0; attempt < PKG_CURL_ATTEMPTS; ++attempt) {
        PMSCurl().easy_setopt(curl, CURLOPT_WRITEFUNCTION, appendReply);
        PMSCurl().easy_setopt(curl, CURLOPT_WRITEDATA, &body);
        code = performWithDnsFallback(curl);
        if (!isRetryable(code)) {
            break;
        }
        sleep(1);
    }
    if (body.overLimit) {
        CORV_LOG_ERR("Reply of %s is larger than %zu bytes; cut off", url, PKG_CURL_REPLY_LIMIT);
    }
    if (code != CURLE_OK) {
        CORV_LOG_ERR("Failed to download %s, code=%d, err=%s", url, code,
                     PMSCurl().easy_strerror(code));
        g_lastFailure = describeCurlFailure(code, body.overLimit);
        if (isRetryable(code)) {
            reply = unreachableReply();
        }
        return false;
    }
    long status = 0;
    code = PMSCurl().easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &status);
    if (code != CURLE_OK) {
        CORV_LOG_ERR("%s, Failed to curl_easy_getinfo, code=%d, err=%s", url, code,
                     PMSCurl().easy_strerror(code));
        return false;
    }
    if (status != 200) {
        CORV_LOG_ERR("%s, Failed to request packages, httpResponseCode=%ld", url, status);
        g_lastFailure = "the server answered HTTP " + std::to_string(status);
        return false;
    }
    if (body.data == nullptr || body.length == 0) {
        g_lastFailure = "the server sent an empty reply";
        return false;
    }
    reply.assign(body.data);
    g_lastFailure.clear();
    return true;
}

namespace {

// Reads what the caller asked for after a good transfer. False sets PKG_ERR_SYSTEM.
bool readTransferInfo(CURL* curl, const char* url, std::string* contentType,
                      std::string* effectiveUrl) {
    char* text = nullptr;
    CURLcode code;
    if (contentType != nullptr) {
        if ((code = PMSCurl().easy_getinfo(curl, CURLINFO_CONTENT_TYPE, &text)) != CURLE_OK) {
            g_transportResult = PKG_ERR_SYSTEM;
            CORV_LOG_ERR("%s, err in CURLINFO_CONTENT_TYPE, code=%d, err=%s", url, code,
                         PMSCurl().easy_strerror(code));
            return false;
        }
        if (text != nullptr) {
            *contentType = text;
        }
    }
    if (effectiveUrl != nullptr) {
        text = nullptr;
        if ((code = PMSCurl().easy_getinfo(curl, CURLINFO_EFFECTIVE_URL, &text)) != CURLE_OK) {
            g_transportResult = PKG_ERR_SYSTEM;
            CORV_LOG_ERR("%s, err in CURLINFO_EFFECTIVE_URL, code=%d, err=%s", url, code,
                         PMSCurl().easy_strerror(code));
            return false;
        }
        if (text != nullptr) {
            *effectiveUrl = text;
        }
    }
    return true;
}

// The attempts of a file download. CURLE_OK, or the code that ended them; -1 when the
// file could not be opened.
int downloadAttempts(CURL* curl, const char* path) {
    CURLcode code = CURLE_OK;
    for (int attempt = 0; attempt < PKG_CURL_ATTEMPTS; ++attempt) {
        FILE* file = fopen(path, "we");
        if (file == nullptr) {
            CORV_LOG_ERR("faile to open %s, %m", path);
            return -1;
        }
        PMSCurl().easy_setopt(curl, CURLOPT_WRITEDATA, file);
        code = performWithDnsFallback(curl);
        fclose(file);
        if (!isRetryable(code)) {
            break;
        }
        sleep(1);
    }
    return code;
}

}  // namespace

bool PMSDownloadFile(const char* url, const char* path, std::string* contentType,
                     std::string* effectiveUrl, int* timeoutSeconds) {
    CurlHandle handle;
    if (url == nullptr || path == nullptr || !handle.init(url)) {
        g_transportResult = PKG_ERR_SYSTEM;
        return false;
    }
    CURL* curl = handle.get();
    if (timeoutSeconds != nullptr) {
        CURLcode set =
            PMSCurl().easy_setopt(curl, CURLOPT_TIMEOUT, static_cast<long>(*timeoutSeconds));
        if (set != CURLE_OK) {
            CORV_LOG_ERR("Failed to set time-out, return value=%d, err=%s", set,
                         PMSCurl().easy_strerror(set));
        }
    }
    // The file often does not exist yet; then nothing is locked and the download goes on.
    const int lock = PMSLockFile(path, true);
    int code = downloadAttempts(curl, path);
    bool ok = code == CURLE_OK;
    if (!ok) {
        g_transportResult = PKG_ERR_SERVER;
        CORV_LOG_ERR("Failed to download %s, code=%d, err=%s", url, code,
                     code < 0 ? "cannot open the file" : PMSCurl().easy_strerror((CURLcode)code));
        g_lastFailure = code < 0 ? std::string("cannot write ") + path
                                 : describeCurlFailure((CURLcode)code, false);
    }
    long status = 0;
    if (ok && (PMSCurl().easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &status) != CURLE_OK ||
               status != 200)) {
        g_transportResult = PKG_ERR_SERVER;
        CORV_LOG_ERR("%s, Failed to request packages, httpResponseCode=%ld", url, status);
        g_lastFailure = "the server answered HTTP " + std::to_string(status);
        ok = false;
    }
    if (ok) {
        ok = readTransferInfo(curl, url, contentType, effectiveUrl);
    }
    if (ok) {
        g_lastFailure.clear();
    }
    PMSUnlockFile(lock);
    return ok;
}

int PMSLockFile(const char* path, bool exclusive) {
    if (path == nullptr) {
        return -1;
    }
    int fd = open(path, O_RDONLY | O_CLOEXEC);
    if (fd >= 0) {
        flock(fd, exclusive ? LOCK_EX : LOCK_SH);
    }
    return fd;
}

void PMSUnlockFile(int fd) {
    if (fd < 0) {
        return;
    }
    flock(fd, LOCK_UN);
    close(fd);
}

void PMSParseUrlToFileName(const char* url, std::string& name) {
    if (url == nullptr) {
        name.clear();
        return;
    }
    const char* slash = strrchr(url, '/');
    if (slash == nullptr) {
        name = url;
        return;
    }
    name = slash + 1;
    size_t query = name.find('?');
    if (query != std::string::npos) {
        name.erase(query);
    }
}

}  // namespace CORVPackageTool
