// The environment of package scripts.
#include <stdio.h>
#include <stdlib.h>

#include <string>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/privilege.h"
#include "lifecycle/lifecycle_private.h"

namespace CORVPackageTool {

namespace {

constexpr size_t kLanguageSize = 256;

// The names of the last `extra` object, so that the next run can take them away again.
Json::Value& extraEnvMemo() {
    static Json::Value memo(Json::objectValue);
    return memo;
}

std::string systemLanguage(const char* language) {
    if (language != nullptr) {
        return language;
    }
    char buf[kLanguageSize] = "";
    if (VLIBCFileGetKeyValue(VLIBC_INFO_PATH, "language", buf, sizeof(buf), 0) < 1) {
        CORV_LOG_ERR("Not find language in %s", VLIBC_INFO_PATH);
        return "";
    }
    return buf;
}

// Where a variable goes: the runner of one script, or this process.
class EnvSink {
  public:
    explicit EnvSink(CORVUtils::ProcessRunner* runner) : runner_(runner) {}
    void set(const char* name, const std::string& value) {
        if (runner_) {
            runner_->addEnv(name, value);
        } else {
            setenv(name, value.c_str(), 1);
        }
    }
    void unset(const char* name) { unsetenv(name); }
    void setOrUnset(const char* name, const char* value) {
        if (value) {
            set(name, value);
        } else {
            unset(name);
        }
    }

  private:
    CORVUtils::ProcessRunner* runner_;
};

// The variables that a script and an outside caller share: language, OS, target, port,
// package file.
void prepareCommon(EnvSink& env, const PackageInfo& info, const char* language, const char* volume,
                   const char* cpkFile) {
    env.set("CORVPKG_NOS_LANGUAGE", systemLanguage(language));
    env.set("CORVPKG_NOS_VERSION_MAJOR", std::to_string(static_cast<unsigned>(PKG_OS_MAJOR)));
    env.set("CORVPKG_NOS_VERSION_MINOR", std::to_string(static_cast<unsigned>(PKG_OS_MINOR)));
    env.set("CORVPKG_NOS_VERSION_BUILD", std::to_string(static_cast<unsigned>(PKG_OS_BUILD)));
    env.set("CORVPKG_NOS_ARCH", PMSGetSystemArchString());

    std::string target = PMSReadLink("/var/packages/" + info.package + "/target");
    if (target.empty()) {
        env.unset("CORVPKG_PKGDEST");
    } else {
        env.set("CORVPKG_PKGDEST", target);
    }
    if (volume != nullptr) {
        env.set("CORVPKG_PKGDEST_VOL", volume);
    } else if (!target.empty()) {
        env.set("CORVPKG_PKGDEST_VOL", target.substr(0, target.find('/', 1)));
    } else {
        env.unset("CORVPKG_PKGDEST_VOL");
    }
    if (info.adminport != 0) {
        env.set("CORVPKG_PKGPORT", std::to_string(info.adminport));
    } else {
        env.unset("CORVPKG_PKGPORT");
    }
    env.setOrUnset("CORVPKG_TEMP_CPKFILE", cpkFile);
}

void unsetMemo() {
    Json::Value& memo = extraEnvMemo();
    if (memo.isObject()) {
        for (const std::string& name : memo.getMemberNames()) {
            unsetenv(name.c_str());
        }
    }
    memo = Json::Value(Json::objectValue);
}

}  // namespace

void PMSPrepareScriptEnv(const PackageInfo& info, CORVUtils::ProcessRunner& runner,
                         const char* language, const std::string* logFile,
                         PKG_INSTALLATION_TYPE type, const Json::Value* extra, const char* volume,
                         const char* cpkFile, const char* userName) {
    EnvSink env(&runner);
    env.set("CORVPKG_PKGNAME", info.package);
    env.set("CORVPKG_PKGVER", info.version);
    if (type == PKG_INSTALL || type == PKG_UPGRADE) {
        env.set("CORVPKG_PKG_PROGRESS_PATH", PMSGetProgressPath(info.package));
    } else {
        env.unset("CORVPKG_PKG_PROGRESS_PATH");
    }
    env.setOrUnset("CORVPKG_PKG_STATUS", PMSStatusWord(type));
    if (type == PKG_UPGRADE) {
        env.set("CORVPKG_TEMP_UPGRADE_FOLDER", Privilege::GetTmpFolderPath(info.package, volume));
    } else {
        env.unset("CORVPKG_TEMP_UPGRADE_FOLDER");
    }
    // The language, versions, architecture, target and port; the user name and the message
    // file are for scripts only.
    prepareCommon(env, info, language, volume, cpkFile);
    env.setOrUnset("CORVPKG_USERNAME", userName);
    env.setOrUnset("CORVPKG_TEMP_LOGFILE", logFile ? logFile->c_str() : nullptr);
    // The previous run's extra variables go first, whatever this run brings.
    unsetMemo();
    if (extra == nullptr) {
        return;
    }
    if (extra->isObject()) {
        for (const std::string& name : extra->getMemberNames()) {
            const Json::Value& value = (*extra)[name];
            env.set(name.c_str(), value.isConvertibleTo(Json::stringValue) ? value.asString() : "");
        }
    }
    extraEnvMemo() = *extra;
}

void PMSPrepareEnv(const PackageInfo& info, const char* language, const char* volume,
                   const char* cpkFile) {
    EnvSink env(nullptr);
    env.set("CORVPKG_PKGNAME", info.package);
    env.set("CORVPKG_PKGVER", info.version);
    prepareCommon(env, info, language, volume, cpkFile);
}

void CleanAllEnv() {
    static const char* const kNames[] = {
        "CORVPKG_BOOT_STATUS",
        "CORVPKG_NOS_ARCH",
        "CORVPKG_NOS_LANGUAGE",
        "CORVPKG_NOS_VERSION_BUILD",
        "CORVPKG_NOS_VERSION_MAJOR",
        "CORVPKG_NOS_VERSION_MINOR",
        "CORVPKG_OLD_PKGVER",
        "CORVPKG_PKG_STATUS",
        "CORVPKG_PKGDEST",
        "CORVPKG_PKGDEST_VOL",
        "CORVPKG_PKGINST_TEMP_DIR",
        "CORVPKG_PKGNAME",
        "CORVPKG_PKGPORT",
        "CORVPKG_PKGVER",
        "CORVPKG_TEMP_LOGFILE",
        "CORVPKG_TEMP_CPKFILE",
        "CORVPKG_TEMP_UPGRADE_FOLDER",
        "CORVPKG_USERNAME",
        "CORVPKG_PKG_PROGRESS_PATH",
    };
    for (const char* name : kNames) {
        unsetenv(name);
    }
    unsetMemo();
}

}  // namespace CORVPackageTool

namespace CORVPackageTool {

const char* PMSStatusWord(int type) {
    switch (type) {
        case PKG_INSTALL:
            return "INSTALL";
        case PKG_UPGRADE:
            return "UPGRADE";
        case PKG_UNINSTALL:
            return "UNINSTALL";
        case PKG_START:
            return "START";
        case PKG_STOP:
            return "STOP";
        default:
            return nullptr;
    }
}

}  // namespace CORVPackageTool
