// "worker-plugin": a package that brings workers of its own registers them as a provider,
// so that every package's conf/resource can use their resource ids. The provider files
// are those that the worker catalogue reads under /usr/local/share/corvpkg/.
#include <stdio.h>

#include <new>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "corvpkg/resource.h"
#include "corvpkg/worker.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kPlugins[] = "plugins";
const char kWorkers[] = "workers";
const char kProviders[] = "providers";

struct PhaseWord {
    const char* word;
    unsigned int bit;
};
const PhaseWord kPhaseWords[] = {
    {"preinst", 0x01},   {"postinst", 0x02},   {"enable", 0x04},  {"startup", 0x08},
    {"preuninst", 0x10}, {"postuninst", 0x20}, {"disable", 0x40}, {"halt", 0x80},
};

unsigned int phaseBit(const std::string& word) {
    for (const PhaseWord& phase : kPhaseWords) {
        if (word == phase.word) {
            return phase.bit;
        }
    }
    return 0;
}

std::string providerPath(const std::string& name) {
    return std::string(kProviderDir) + "/" + name;
}

// One manifest element as a worker entry of the catalogue; false (error set) when bad.
bool makeEntry(const std::string& root, const Json::Value& plugin, Json::Value& entry) {
    if (!plugin.isObject() || !plugin["id"].isString() || !plugin["acquire"].isString() ||
        !plugin["release"].isString() || !plugin["relpath"].isString() ||
        !plugin["api-version"].isObject() || !plugin["api-version"]["major"].isInt() ||
        !plugin["api-version"]["minor"].isInt() || plugin["id"].asString().empty()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    const unsigned int interval =
        phaseBit(plugin["acquire"].asString()) | phaseBit(plugin["release"].asString());
    if ((interval & 0x0F) == 0 || (interval & 0xF0) == 0) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    std::string path;
    if (!CORV::PkgUtils::ResolveRelPath(root, plugin["relpath"].asString(), path)) {
        return false;
    }
    char text[16];
    snprintf(text, sizeof(text), "0x%04X", interval);
    entry = Json::Value(Json::objectValue);
    entry["id"] = plugin["id"];
    entry["interval"] = text;
    entry["major"] = plugin["api-version"]["major"];
    entry["minor"] = plugin["api-version"]["minor"];
    entry["path"] = path;
    return true;
}

// A provider file as an object: a missing file or one that holds no object is an empty
// object; false only when it can't be read.
bool LoadMetadata(const std::string& path, Json::Value& out) {
    if (!ReadJsonFile(path, out)) {
        if (VLIBCErrGet() != ERR_NO_SUCH_FILE) {
            return false;
        }
        out = Json::Value(Json::objectValue);
        return true;
    }
    if (!out.isObject()) {
        out = Json::Value(Json::objectValue);
    }
    return true;
}

bool AddProvider(const std::string& pkg, const Json::Value& workers) {
    Json::Value own;
    if (!LoadMetadata(providerPath(pkg), own)) {
        return false;
    }
    own[kWorkers] = workers;
    if (!WriteJsonFile(providerPath(pkg), own)) {
        return false;
    }
    Json::Value global;
    if (!LoadMetadata(providerPath("global"), global)) {
        return false;
    }
    if (!global[kProviders].isArray()) {
        global[kProviders] = Json::Value(Json::arrayValue);
    }
    global[kProviders].append(pkg);
    return WriteJsonFile(providerPath("global"), global);
}

// Drops every mention of `pkg` from the providers list; false (error set) when the file
// is of the wrong form or can't be written.
bool removeProvider(const std::string& pkg) {
    Json::Value global;
    if (!ReadJsonFile(providerPath("global"), global)) {
        return VLIBCErrGet() == ERR_NO_SUCH_FILE;
    }
    if (!global.isObject()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    if (!global.isMember(kProviders)) {
        return true;
    }
    if (!global[kProviders].isArray()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    Json::Value kept(Json::arrayValue);
    for (const Json::Value& name : global[kProviders]) {
        if (name.isString() && name.asString() != pkg) {
            kept.append(name);
        }
    }
    global[kProviders] = kept;
    return WriteJsonFile(providerPath("global"), global);
}

class WorkerPlugin : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const Json::Value plugins = request.isObject() && request.isMember(kPlugins)
                                        ? request[kPlugins]
                                        : Json::Value(Json::arrayValue);
        if (!plugins.isArray()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        Json::Value entries(Json::arrayValue);
        for (const Json::Value& plugin : plugins) {
            Json::Value entry;
            if (!makeEntry(action.GetRootDir(), plugin, entry)) {
                CORV_LOG_ERR("Inavlid config, ignore it [0x%04X %s:%d]", VLIBCErrGet(),
                             VLIBCErrorGetFile(), VLIBCErrorGetLine());
                continue;
            }
            entries.append(entry);
        }
        if (entries.empty()) {
            return 0;
        }
        if (CORVFSMkdirP(kProviderDir, nullptr, 1, 0, 0, 0755) < 0) {
            CORV_LOG_ERR("Failed to create %s [0x%04X %s:%d]", kProviderDir, VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        return AddProvider(action.GetPkgName(), entries) ? 0 : 1;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& /*request*/,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const std::string pkg = action.GetPkgName();
        Json::Value own;
        if (!LoadMetadata(providerPath(pkg), own)) {
            CORV_LOG_ERR("Failed to load %s [0x%04X %s:%d]", providerPath(pkg).c_str(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        } else {
            own.removeMember(kWorkers);
            if (!WriteJsonFile(providerPath(pkg), own)) {
                CORV_LOG_ERR("Failed to update %s [0x%04X %s:%d]", providerPath(pkg).c_str(),
                             VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            }
        }
        if (!removeProvider(pkg)) {
            CORV_LOG_ERR("Failed to remove provider %s [0x%04X %s:%d]", pkg.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
        }
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewWorkerPlugin() {
    return new (std::nothrow) WorkerPlugin();
}

}  // namespace Resource
}  // namespace CORVPackageTool
