// The query protocol of the store client: the fields of a request, the request token,
// one entry of a list, and the hand-over of a feed's keys to the signature tool.
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>
#include <unistd.h>

#include <memory>

#include "common/md5.h"
#include "corv/codesign.h"
#include "corv/log.h"
#include "corv/nsinfo.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgcurltool.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgtool.h"
#include "store/json_value.h"
#include "store/pkgserver_private.h"

namespace CORVPackageTool {

namespace {

// The text of a device-specific key that would go in front of the time; none is set.
const char kTokenKey[] = "";

struct HashOwner {
    PVLIBSZHASH hash;
    ~HashOwner() { VLIBCSzHashFree(hash); }
};

bool setField(PVLIBSZHASH* fields, const char* key, const std::string& value) {
    if (VLIBCSzHashSetValue(fields, key, value.c_str()) < 0) {
        CORV_LOG_ERR("Fail to set key (%s)[0x%04X %s:%d]", key, VLIBCErrGet(), VLIBCErrorGetFile(),
                     VLIBCErrorGetLine());
        return false;
    }
    return true;
}

// ns_time and ns_token; a failure leaves the token out and only logs.
void addTokenFields(PVLIBSZHASH* fields) {
    const std::string nsTime = std::to_string(static_cast<unsigned long>(time(nullptr)));
    if (!setField(fields, "ns_time", nsTime)) {
        return;
    }
    std::string token;
    if (!PMSGenerateNsToken(nsTime, token)) {
        CORV_LOG_ERR("CORVNstokenGenerateToken Failed, err=[0x%04X %s:%d]", VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return;
    }
    if (VLIBCSzHashSetValue(fields, "ns_token", token.c_str()) < 0) {
        CORV_LOG_ERR("Fail to set key (%s)[0x%04X %s:%d]", "ns_time", VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
    }
}

}  // namespace

bool PMSReadConfValue(const char* file, const std::string& key, std::string& value) {
    char buffer[4096] = {0};
    if (file == nullptr || VLIBCFileGetKeyValue(file, key.c_str(), buffer, sizeof buffer, 0) <= 0) {
        CORV_LOG_ERR("Failed to get value of [%s] from [%s]", key.c_str(),
                     file == nullptr ? "(null)" : file);
        return false;
    }
    value = buffer;
    return true;
}

bool PMSMd5Hex(const char* text, char* out, int outSize) {
    if (text == nullptr || out == nullptr || outSize < 33) {
        return false;
    }
    Md5 md5;
    md5.restart();
    md5.update(text, strlen(text));
    const std::string hex = md5.hexDigest();
    if (hex.size() != 32) {
        return false;
    }
    memcpy(out, hex.c_str(), 33);
    return true;
}

bool PMSGenerateNsToken(const std::string& nsTime, std::string& token) {
    const std::string seed = std::string(kTokenKey) + nsTime;
    char digest[33] = {0};
    if (!PMSMd5Hex(seed.c_str(), digest, sizeof digest)) {
        CORV_LOG_ERR("Failed to get md5 string from \"%s\".", seed.c_str());
        return false;
    }
    const char first = digest[0];
    const int rounds = 1 + (first <= '9' ? first - '0' : first - 'a' + 10);
    std::string work = seed.substr(0, 4095);
    for (int round = 0; round < rounds; ++round) {
        char inner[33] = {0};
        char outer[33] = {0};
        // A failed digest is logged and the rounds go on, so that one bad round does not
        // cost the whole request its token.
        if (!PMSMd5Hex(work.c_str(), inner, sizeof inner)) {
            CORV_LOG_ERR("Failed to get md5 string from \"%s\".", work.c_str());
        }
        const std::string chained = (work + inner).substr(0, 4128);
        if (!PMSMd5Hex(chained.c_str(), outer, sizeof outer)) {
            CORV_LOG_ERR("Failed to get md5 string from \"%s\".", chained.c_str());
        }
        work = outer;
    }
    token = work.substr(0, 32);
    return token.size() == 32;
}

bool PMSAddCommonQueryFields(VLIBSZHASH** fields) {
    if (fields == nullptr || *fields == nullptr) {
        return false;
    }
    std::string timezone, unique, account;
    if (!PMSReadConfValue(VLIBC_INFO_PATH, "timezone", timezone) ||
        !PMSReadConfValue(VLIBC_INFO_DEFAULTS_PATH, "unique", unique)) {
        return false;
    }
    const std::string arch = PMSGetSystemArchString();
    if (arch.empty()) {
        CORV_LOG_ERR("Failed to get arch");
        return false;
    }
    if (!setField(fields, "timezone", timezone) || !setField(fields, "unique", unique) ||
        !setField(fields, "arch", arch) ||
        !setField(fields, "major", std::to_string(PKG_QUERY_MAJOR)) ||
        !setField(fields, "minor", std::to_string(PKG_QUERY_MINOR)) ||
        !setField(fields, "build", std::to_string(PKG_QUERY_BUILD))) {
        return false;
    }
    // Only a device with a store account proves itself with a token.
    char value[4096] = {0};
    if (VLIBCFileGetKeyValue(VLIBC_INFO_DEFAULTS_PATH, "corvpkg_server", value, sizeof value, 0) >
        0) {
        addTokenFields(fields);
    }
    return true;
}

bool CORVPackageServer::PMSQueryPkgServer(std::string language, std::string& reply, const char* url,
                                          bool post, const Json::Value& extra) {
    HashOwner fields{VLIBCSzHashAlloc(0x400)};
    if (fields.hash == nullptr) {
        CORV_LOG_ERR("Out of memory!!");
        return false;
    }
    std::string channel;
    if (!setField(&fields.hash, "language", language)) {
        return false;
    }
    if (!PMSReadConfValue(VLIBC_INFO_PATH, "package_update_channel", channel)) {
        PMSSetLastStoreFailure("no package_update_channel is set in " VLIBC_INFO_PATH);
        return false;
    }
    if (!setField(&fields.hash, "package_update_channel", channel)) {
        return false;
    }
    if (extra.isObject()) {
        for (const std::string& name : extra.getMemberNames()) {
            if (!setField(&fields.hash, name.c_str(), toString(extra[name]))) {
                return false;
            }
        }
    }
    if (!PMSAddCommonQueryFields(&fields.hash)) {
        PMSSetLastStoreFailure("the device's timezone, unique or arch setting is missing");
        return false;
    }
    char target[4096] = {0};
    if (url == nullptr) {
        char base[CORV_NSINFO_STORE_BUFFER] = {0};
        if (CORVMYNSServerConfigGet(base) < 0) {
            CORV_LOG_ERR("Failed to get package_server in %s.", VLIBC_INFO_DEFAULTS_PATH);
            PMSSetLastStoreFailure(
                "no maker store is set (package_server in " VLIBC_INFO_DEFAULTS_PATH ")");
            return false;
        }
        snprintf(target, sizeof target, "%s/api/getPackageList.php", base);
        post = false;
    } else {
        snprintf(target, sizeof target, "%s", url);
    }
    reply.clear();
    return PMSDownloadSendRequest(target, post, reply, fields.hash);
}

bool CORVPackageServer::GetPackageInfoFromServer(const std::string& packageName, Json::Value& entry,
                                                 bool makerStore, const std::string& language) {
    Json::Value list;
    bool ok = makerStore ? PMSQueryCorvPkgServer(false, language.c_str(), list)
                         : PMSQueryOtherPkgServer(false, language.c_str(), list);
    if (!ok) {
        return false;
    }
    if (list.isObject() && list.isMember("packages")) {
        list = Json::Value(list["packages"]);
    }
    if (!list.isArray()) {
        return false;
    }
    for (const Json::Value& item : list) {
        if (hasText(item, "package") && item["package"].asString() == packageName) {
            entry = item;
            return true;
        }
    }
    return false;
}

namespace {

// Runs the signature tool with `args` after its own command; its output is kept from ours.
void runCodesign(std::initializer_list<std::string> args) {
    const char* const* command = CORVCodesignCommand();
    CORVUtils::ProcessRunner tool(command[0]);
    for (const char* const* part = command + 1; *part != nullptr; ++part) {
        tool.addArguments(*part);
    }
    for (const std::string& arg : args) {
        tool.addArguments(arg);
    }
    int status = tool.run(true, true);
    if (status != 0) {
        CORV_LOG_ERR("%s: %d %s", tool.toString().c_str(), status,
                     tool.getCapturedOutputErr().c_str());
    }
}

}  // namespace

bool CORVPackageServer::PMSUpdatePkgServerKey(const std::string& feed, Json::Value keyrings) {
    if (keyrings.isNull() || !keyrings.isArray() || keyrings.empty()) {
        runCodesign({"--delserver", feed});
        return true;
    }
    char path[] = "/tmp/keyringXXXXXX";
    int fd = mkstemp(path);
    if (fd < 0) {
        CORV_LOG_ERR("mkstemp failed [%s]", path);
        return false;
    }
    close(fd);
    if (!toFile(keyrings, path)) {
        CORV_LOG_ERR("Failed to save keyrings");
        unlink(path);
        return false;
    }
    runCodesign({"--addserver", path, feed});
    unlink(path);
    return true;
}

}  // namespace CORVPackageTool
