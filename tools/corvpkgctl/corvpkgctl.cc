// corvpkgctl: what a package's init job runs to start, stop, set up and tear down the
// package. It gets the package name as its argument; its exit status is the job step's,
// so a failure here makes the job's start fail.
//
//   corvpkgctl start <name>     extra environment, TIMING_STARTUP resources, script start
//   corvpkgctl stop <name>      script stop, TIMING_HALT resources
//   corvpkgctl setup <name>     TIMING_STARTUP resources only
//   corvpkgctl teardown <name>  TIMING_HALT resources only
//   corvpkgctl swap-on          nothing to do on this platform
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <fstream>
#include <memory>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/privilege.h"
#include "corvpkg/resource.h"
#include "corvpkg/service.h"

using namespace CORVPackageTool;

namespace {

struct FreeDeleter {
    void operator()(char* p) const { free(p); }
};
using CString = std::unique_ptr<char, FreeDeleter>;

struct Context {
    std::string name;
    PackageInfo info;
    PKG_INSTALLATION_TYPE type = PKG_START;
    CString language;
    CString user;
};

// The worker messages go where the caller of the job looks for them after a failed start.
void LeaveWorkerMessage(const char* phase, const std::string& name,
                        const CORV::PkgUtils::WorkerResp& resp) {
    std::ofstream out("/tmp/workermsg-" + std::string(phase) + "-" + name, std::ios::trunc);
    out << toString(resp.GetErrJsonArray()) << "\n";
}

bool SetUp(Context& ctx) {
    CORV::PkgUtils::WorkerResp resp;
    if (!Resource::Acquire(Resource::TIMING_STARTUP, ctx.info, ctx.type, resp, nullptr, "")) {
        LeaveWorkerMessage("acquire", ctx.name, resp);
        return false;
    }
    return true;
}

bool TearDown(Context& ctx) {
    CORV::PkgUtils::WorkerResp resp;
    if (!Resource::Release(Resource::TIMING_HALT, ctx.info, ctx.type, resp, nullptr, "")) {
        LeaveWorkerMessage("release", ctx.name, resp);
        return false;
    }
    return true;
}

int RunScript(Context& ctx, const char* action) {
    const std::string script = "/var/packages/" + ctx.name + "/scripts/start-stop-status";
    CORVUtils::ProcessRunner runner(script, {action});
    PMSPrepareScriptEnv(ctx.info, runner, ctx.language.get(), nullptr, ctx.type, nullptr, nullptr,
                        nullptr, ctx.user.get());
    if (!Privilege::SetIdentity(runner, ctx.name, action, "")) {
        CORV_LOG_ERR("Failed to set identity for %s [0x%04X %s:%d]", ctx.name.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return 1;
    }
    return PMSRunAndWriteScriptLog(ctx.info, ctx.type, runner, 1);
}

int Usage() {
    fprintf(stderr, "usage: corvpkgctl start|stop|setup|teardown <name> | swap-on\n");
    return 2;
}

}  // namespace

int main(int argc, char** argv) {
    if (argc < 2) {
        return Usage();
    }
    const std::string command = argv[1];
    if (command == "swap-on") {
        return 0;
    }
    if (argc != 3 || argv[2][0] == '\0') {
        return Usage();
    }
    Context ctx;
    ctx.name = argv[2];
    const bool starting = command == "start" || command == "setup";
    if (!starting && command != "stop" && command != "teardown") {
        return Usage();
    }
    ctx.type = starting ? PKG_START : PKG_STOP;
    if (!PMSLoadPKGInfoFile("/var/packages/" + ctx.name, ctx.info, nullptr, PKG_INFO_MASK_ALL)) {
        fprintf(stderr, "corvpkgctl: %s is not installed\n", ctx.name.c_str());
        return 1;
    }
    // The caller's context, handed over by whoever drove the job; a plain boot has none.
    PKG_INSTALLATION_TYPE handed = static_cast<PKG_INSTALLATION_TYPE>(0);
    char* language = nullptr;
    char* user = nullptr;
    if (Service::LoadExtraEnv(ctx.name, &handed, &language, &user)) {
        ctx.language.reset(language);
        ctx.user.reset(user);
        if (handed != 0) {
            ctx.type = handed;
        }
    }

    int status = 0;
    if (command == "start") {
        if (!SetUp(ctx)) {
            status = 1;
        } else {
            status = RunScript(ctx, "start");
        }
    } else if (command == "stop") {
        status = RunScript(ctx, "stop");
        if (!TearDown(ctx) && status == 0) {
            status = 1;
        }
    } else if (command == "setup") {
        status = SetUp(ctx) ? 0 : 1;
    } else {
        status = TearDown(ctx) ? 0 : 1;
    }
    CleanAllEnv();
    return status == 0 ? 0 : 1;
}
