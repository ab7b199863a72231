// Who a package's scripts and programs run as, from its conf/privilege. A package
// without the file runs everything as root. Failures leave their cause in the platform's
// error slot: 0x0D00 bad parameter or invalid identity, 0x0A00 unreadable file, 0xD900 no
// privilege file, 0x4000 malformed entry.
#pragma once

#include <json/json.h>

#include <string>

#include "corv/process_runner.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {

// The package's user: `username` of its privilege file, or the package name.
CORVPKG_API std::string PMSGetPkgUserName(const std::string& name);

namespace Privilege {

enum IdentityKind {
    IDENTITY_INVALID = 0,
    IDENTITY_PACKAGE = 1,  // the package's user and its group
    IDENTITY_SYSTEM = 2,   // the package's user with the system group
    IDENTITY_ROOT = 3,     // the runner is left as it is
};

// Visits the elements of one array of a privilege file. walk() answers 0 (failed: stop,
// false), 1 (done: stop, true) or 2 (go on).
class CORVPKG_API IWalker {
  public:
    virtual ~IWalker();
    virtual int walk(const Json::Value& entry) = 0;
};

// Finds the identity of one control-script action in "ctrl-script".
class CORVPKG_API CtrlScriptWalker : public IWalker {
  public:
    explicit CtrlScriptWalker(std::string action);
    ~CtrlScriptWalker() override;
    int walk(const Json::Value& entry) override;

    std::string action;
    int identity = IDENTITY_INVALID;
};

// The owner a package's "executable" and "tool" entries give to files under `topDir`
// (the unpacked payload): `uid`/`gid` are those of the package's user and group.
class CORVPKG_API ReviseWalker : public IWalker {
  public:
    ReviseWalker(const std::string& topDir, unsigned uid, unsigned gid);
    ~ReviseWalker() override;
    const std::string& GetTopDir() const { return topDir; }
    unsigned GetPkgUid() const { return uid; }
    unsigned GetPkgGid() const { return gid; }

  protected:
    std::string topDir;
    unsigned uid;
    unsigned gid;
};

// {"relpath", "run-as"}: the program's owner by identity (system: the package's user
// with group id 1; root: 0:0).
class CORVPKG_API ExeWalker : public ReviseWalker {
  public:
    ExeWalker(const std::string& topDir, unsigned uid, unsigned gid);
    ~ExeWalker() override;
    int walk(const Json::Value& entry) override;
};

// {"relpath", "user", "group", "permission"}: owner ("root" or "package" each) and a mode
// of exactly four octal digits.
class CORVPKG_API ToolWalker : public ReviseWalker {
  public:
    ToolWalker(const std::string& topDir, unsigned uid, unsigned gid);
    ~ToolWalker() override;
    int walk(const Json::Value& entry) override;
};

// Takes the set-user-id and set-group-id bits off the regular file `path`; other bits,
// the sticky bit among them, stay. False with 0x0700 (missing), 0x0900 (cannot open),
// 0x2700 (stat), 0xD900 (not a regular file) or 0x2A00 (chmod).
CORVPKG_API bool ClearSetUGidBit(const std::string& path);

// Makes the package unpacked at `dir` safe and owned as its conf/privilege says, before
// any of its scripts runs: clears set-id bits of the scripts, creates the package's user
// and group, chowns the payload to the default identity and applies the "executable" and
// "tool" overrides. Without a privilege file only the scripts are cleaned. False (logged,
// error slot set) on the first failure; what was already changed stays changed.
CORVPKG_API bool ReviseFileAttr(const std::string& name, const std::string& dir);

// <dir>/conf/privilege when it exists (else 0xD900 and false); GetConfPath for an
// installed package.
CORVPKG_API bool GetConfPathFrom(const std::string& dir, std::string& path);
CORVPKG_API bool GetConfPath(const std::string& name, std::string& path);
CORVPKG_API int TranslateIdentity(const std::string& text);
// The identity of defaults.run-as; IDENTITY_PACKAGE when the file does not say.
CORVPKG_API int GetDefaultIdentity(const Json::Value& conf);
// The package's user from <dir> (or the registry when `dir` is empty); "" when the name is
// empty, there is no privilege file, or it cannot be parsed.
CORVPKG_API std::string GetUserName(const std::string& name, const std::string& dir);
// Sets the identity that `action` of package `name` runs as on `runner`. True when done
// or when the package has no privilege file; false when the file is unreadable or names
// an invalid identity for this action.
CORVPKG_API bool SetIdentity(CORVUtils::ProcessRunner& runner, const std::string& name,
                             const std::string& action, const std::string& dir);
// "<volume>/@tmp/corvpkg.tmp/<name>", the folder that carries data across an upgrade;
// `volume` null: the volume of the installed package. "" when there is no usable volume.
CORVPKG_API std::string GetTmpFolderPath(const std::string& name, const char* volume);
// Makes that folder, mode 0700, owned by the package's user (root without privilege file).
CORVPKG_API bool CreateTmpFolder(const std::string& name, const std::string& path);
// Calls `walker` on each object of the array conf[key]. A missing key, or a conf that is
// no object, is nothing to walk: true. An empty key: 0x0D00, false.
CORVPKG_API bool TraversePrivilege(const Json::Value& conf, const std::string& key,
                                   IWalker& walker);

}  // namespace Privilege
}  // namespace CORVPackageTool
