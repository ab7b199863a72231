// CORV::PkgUtils: what the package engine and its resource workers share with the platform.
//
// Two things live here:
// - The worker interface (IWorker) and the two values that travel with every worker call
//   (ActionInfo, WorkerResp). They are part of the platform library, not of libcorvpkg,
//   because plug-in workers implement the same interface: a plug-in builds against this
//   header and links libcorvplatform and jsoncpp only, and whatever process loads it (the
//   engine, a test binary) already has libcorvplatform mapped, so both sides share one
//   definition of every type and function below.
// - The path helpers through which every path that a package names is resolved against
//   the package's root, so that no package can reach outside itself.
//
// Nothing here throws. Failures leave their cause in the platform's error slot
// (VLIBCErrGet).
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <string>
#include <utility>
#include <vector>

namespace CORVUtils {
class ProcessRunner;
}

namespace CORV {
namespace PkgUtils {

// What a worker is told about the action under way. A plain value.
class ActionInfo {
  public:
    ActionInfo();
    ~ActionInfo();

    const std::string& GetPkgName() const;
    void SetPkgName(const std::string& name);
    // The user the package's programs run as; empty when the package names none.
    const std::string& GetPkgUserName() const;
    void SetPkgUserName(const std::string& name);
    // The operation: 1 for a fresh install, 2 for an upgrade, otherwise the installation
    // type of the operation that runs the workers. 0 until set.
    unsigned int GetActionType() const;
    void SetActionType(unsigned int type);
    // Where the package's files are at this moment; workers resolve every relative path
    // of their section against it.
    const std::string& GetRootDir() const;
    void SetRootDir(const std::string& dir);

  private:
    std::string pkgName_;
    std::string pkgUserName_;
    unsigned int actionType_;
    std::string rootDir_;
};

// A worker's answer beside its status, shared by all workers of one call: messages for
// the user and environment for the package script that runs next.
//
// Messages are kept in the order recorded, each as its i18n key split into section and
// key at the first ':' ("pkgmgr:share_is_encrypted" -> sec "pkgmgr", key
// "share_is_encrypted"; a key without ':' has an empty section) and its text arguments.
// Environment variables are kept in the order first set; setting a name again replaces
// its value in place.
class WorkerResp {
  public:
    WorkerResp();
    ~WorkerResp();

    // Records one message. The arguments are texts, the list ended by a null pointer. An
    // empty key records nothing.
    void SetI18NErrMsg(const std::string& key, const char* argument, ...);
    // All recorded messages as a JSON array of objects
    // {"sec": "...", "key": "...", "params": ["...", ...]}; empty when there are none.
    Json::Value GetErrJsonArray() const;

    // Notes NAME=value for the next package script. The name must be a shell variable
    // name ([A-Za-z_][A-Za-z0-9_]*); false with error 0x0D00 otherwise.
    bool SetEnv(const std::string& name, const std::string& value);
    // Hands every noted variable to `runner` with addEnv, in the order first set.
    void DumpEnv(CORVUtils::ProcessRunner& runner) const;

  private:
    struct Message {
        std::string sec;
        std::string key;
        std::vector<std::string> params;
    };
    std::vector<Message> messages_;
    std::vector<std::pair<std::string, std::string>> env_;
};

// A resource worker. One instance serves one Acquire, Release or Update call of the
// engine and keeps nothing between calls: whatever it must remember goes into `own`.
// The int operations answer 0 when done and 1 when failed (the engine treats any value
// other than 1 as done).
//
// `request` is the worker's section of the package's conf/resource after variable
// substitution (a null value when the package no longer asks for the resource); `own` is
// its section of conf/resource.own, which the worker reads and updates to record what it
// really did, and which the engine writes back after the call.
class IWorker {
  public:
    virtual ~IWorker();
    virtual int Acquire(const ActionInfo& action, const Json::Value& request, Json::Value& own,
                        WorkerResp& resp) = 0;
    virtual int Rollback(const ActionInfo& action, const Json::Value& request, Json::Value& own,
                         WorkerResp& resp) = 0;
    virtual int Release(const ActionInfo& action, const Json::Value& request, Json::Value& own,
                        WorkerResp& resp) = 0;
    // Whether Update may be called. The default answers false.
    virtual bool IsUpdatable();
    // Changes the running resource; true when done. The default does nothing and fails.
    virtual bool Update(const ActionInfo& action, const Json::Value& request, Json::Value& own,
                        WorkerResp& resp);
};

// A plug-in worker is a shared object that exports, under unmangled names,
//   extern "C" CORV::PkgUtils::IWorker* CORVPkgUtilsPluginWorkerInit();
//       a new worker, or null;
//   extern "C" void* CORVPkgUtilsPluginWorkerFree(CORV::PkgUtils::IWorker* worker);
//       destroys a worker that Init gave (the result is not looked at),
// and is built against interface version 1.0, the one this header describes.
typedef IWorker* (*PluginWorkerInit)();
typedef void* (*PluginWorkerFree)(IWorker* worker);

// Whether `relative` names a place inside `root`: it is not empty, not absolute, has no
// ".." component, and no symbolic link on its way (inside the package) leads outside
// `root`. The path need not exist; whatever part of it exists is checked through its links.
// `root` must be an existing directory. False with error 0x0D00 (empty argument, or a root
// that is no directory), 0xBE00 (the path leaves the package) or 0x2700 (a part of the path
// cannot be examined).
bool IsLegalRelPath(const std::string& root, const std::string& relative);

// The absolute path of `relative` under `root`, when IsLegalRelPath holds and the file
// exists, followed through all its links, inside `root`. `out` is `root` joined with the
// cleaned relative path ("." components and repeated '/' dropped); it is not resolved
// further, so it keeps going through links that `root` itself contains (such as a
// package's `target`). On failure `out` is unchanged and the error is that of
// IsLegalRelPath, or 0x0700 when the file does not exist.
bool ResolveRelPath(const std::string& root, const std::string& relative, std::string& out);

// Copies `source` to `destination` with `mode`, through a temporary name beside the
// destination and one rename, so a reader never sees half a file. An existing destination
// is refused with 0x0800 unless `replace`. Other failures: 0x0D00 (empty argument), 0x0900
// (source unreadable), 0x0C00 (temporary file), 0x0B00 (write), 0x2800 (rename).
bool InstallConfigFile(const std::string& source, const std::string& destination, mode_t mode,
                       bool replace);
// InstallConfigFile of a program: the copy is executable by all (0755).
bool InstallExecutable(const std::string& source, const std::string& destination, bool replace);

// InstallConfigFile for a program: the copy gets mode 0755.
bool InstallExecutable(const std::string& source, const std::string& destination, bool replace);

}  // namespace PkgUtils
}  // namespace CORV
