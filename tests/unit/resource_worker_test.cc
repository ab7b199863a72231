// The worker contract: what a worker is told and answers, the defaults of the interface,
// and the backends that make workers (plug-ins that load are tested in the sandbox, with
// the test plug-in).
#include <gtest/gtest.h>

#include <memory>
#include <set>
#include <sstream>
#include <string>

#include "corv/pkgutils.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/worker.h"
#include "support/files.h"
#include "support/noop_worker.h"
#include "support/temp_dir.h"

using namespace CORVPackageTool::Resource;
using CORV::PkgUtils::ActionInfo;
using CORV::PkgUtils::IWorker;
using CORV::PkgUtils::WorkerResp;
using CORVPackageTool::toString;

namespace {

// A worker that overrides only what it must, and counts the live instances.
int g_alive = 0;

// Counts its instances, so that tests see who destroys the workers.
class MinimalWorker : public testutil::NoopWorker {
  public:
    MinimalWorker() { ++g_alive; }
    ~MinimalWorker() override { --g_alive; }
};

IWorker* makeMinimal() {
    return new MinimalWorker();
}
IWorker* makeNothing() {
    return nullptr;
}

}  // namespace

TEST(WorkerResp, MessagesKeepOrderSectionKeyAndArguments) {
    WorkerResp resp;
    EXPECT_EQ(toString(resp.GetErrJsonArray()), "[]");
    resp.SetI18NErrMsg("pkgmgr:share_is_encrypted", "music", nullptr);
    resp.SetI18NErrMsg("nosection", nullptr);
    resp.SetI18NErrMsg("", "ignored", nullptr);
    resp.SetI18NErrMsg("a:b:c", "1", "two", "", nullptr);
    EXPECT_EQ(toString(resp.GetErrJsonArray()),
              R"([{"key":"share_is_encrypted","params":["music"],"sec":"pkgmgr"},)"
              R"({"key":"nosection","params":[],"sec":""},)"
              R"({"key":"b:c","params":["1","two",""],"sec":"a"}])");
}

TEST(WorkerResp, EnvironmentReachesTheScriptInOrderWithTheLastValue) {
    WorkerResp resp;
    EXPECT_TRUE(resp.SetEnv("CORVPKG_SHARE", "first"));
    EXPECT_TRUE(resp.SetEnv("_OTHER1", "x y"));
    EXPECT_TRUE(resp.SetEnv("CORVPKG_SHARE", "second"));
    const char* kBad[] = {"", "1ABC", "A-B", "A=B", "A B"};
    for (const char* bad : kBad) {
        VLIBCErrSet(0);
        EXPECT_FALSE(resp.SetEnv(bad, "v")) << "'" << bad << "'";
        EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS) << "'" << bad << "'";
    }
    CORVUtils::ProcessRunner runner("/usr/bin/env");
    resp.DumpEnv(runner);
    ASSERT_EQ(runner.run(true, true), 0);
    std::set<std::string> lines;
    std::istringstream out(runner.getCapturedOutput());
    for (std::string line; std::getline(out, line);) {
        lines.insert(line);
    }
    EXPECT_TRUE(lines.count("CORVPKG_SHARE=second")) << runner.getCapturedOutput();
    EXPECT_TRUE(lines.count("_OTHER1=x y")) << runner.getCapturedOutput();
    EXPECT_FALSE(lines.count("CORVPKG_SHARE=first"));
    EXPECT_EQ(runner.getCapturedOutput().find("1ABC="), std::string::npos);
}

TEST(IWorker, DefaultsAreNotUpdatableAndUpdateFails) {
    MinimalWorker worker;
    ActionInfo action;
    Json::Value request(Json::objectValue);
    Json::Value own(Json::objectValue);
    WorkerResp resp;
    EXPECT_FALSE(worker.IsUpdatable());
    EXPECT_FALSE(worker.Update(action, request, own, resp));
    EXPECT_EQ(toString(own), "{}");
}

TEST(BuiltinBackend, MakesWorkersWithItsFactoryAndDeletesThem) {
    BuiltinBackend backend(&makeMinimal);
    ASSERT_TRUE(backend.IsReady());
    {
        std::shared_ptr<IWorker> worker = backend.CreateWorker();
        ASSERT_TRUE(worker);
        EXPECT_NE(dynamic_cast<MinimalWorker*>(worker.get()), nullptr);
        EXPECT_EQ(g_alive, 1);
    }
    EXPECT_EQ(g_alive, 0);
}

TEST(BuiltinBackend, NullFactoryIsNotReadyAndNullWorkerIsEmpty) {
    BuiltinBackend none(nullptr);
    EXPECT_FALSE(none.IsReady());
    EXPECT_FALSE(none.CreateWorker());
    BuiltinBackend nothing(&makeNothing);
    EXPECT_TRUE(nothing.IsReady());
    EXPECT_FALSE(nothing.CreateWorker());
}

TEST(DSOBackend, UnusableObjectsAreNotReadyWithTheirCause) {
    TempDir tmp;
    testutil::writeFile(tmp.path() + "/text.so", "not an ELF object\n");
    struct {
        std::string path;
        int error;
    } const kCases[] = {
        {"", ERR_BAD_PARAMETERS},
        {tmp.path() + "/missing.so", ERR_OPEN_FAILED},
        {tmp.path() + "/text.so", ERR_OPEN_FAILED},
        {tmp.path(), ERR_OPEN_FAILED},
        // A real shared object that exports neither symbol.
        {"libm.so.6", 0x2000},
    };
    for (const auto& c : kCases) {
        VLIBCErrSet(0);
        DSOBackend backend(c.path);
        EXPECT_FALSE(backend.IsReady()) << "'" << c.path << "'";
        EXPECT_EQ(VLIBCErrGet(), c.error) << "'" << c.path << "'";
        EXPECT_FALSE(backend.CreateWorker()) << "'" << c.path << "'";
        EXPECT_EQ(backend.GetPath(), c.path);
    }
}

