// Plug-in workers for real: the test plug-in opened with dlopen, its workers made by its
// Init and destroyed by its Free, and the catalogue reading provider files under
// /usr/local/share/corvpkg.
#include <stdlib.h>

#include <gtest/gtest.h>

#include <memory>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/resource.h"
#include "corvpkg/worker.h"
#include "resource/resource_private.h"
#include "support/files.h"
#include "support/noop_worker.h"

using namespace CORVPackageTool;
using namespace CORVPackageTool::Resource;
using CORV::PkgUtils::ActionInfo;
using CORV::PkgUtils::IWorker;
using CORV::PkgUtils::WorkerResp;

namespace {

const char kPlugin[] = CORVPKG_TEST_PLUGIN_PATH;
const char kPluginWithoutFree[] = CORVPKG_TEST_PLUGIN_NOFREE_PATH;
const char kCallLog[] = "/tmp/plugin-calls";

Json::Value entry(const std::string& id, const std::string& interval,
                  const std::string& path = kPlugin, int major = 1, int minor = 0) {
    Json::Value e(Json::objectValue);
    e["id"] = id;
    e["interval"] = interval;
    e["major"] = major;
    e["minor"] = minor;
    e["path"] = path;
    return e;
}

// Writes each provider's file and the list of providers, in the given order.
void registerProviders(const std::vector<std::pair<std::string, std::vector<Json::Value>>>& all) {
    Json::Value global(Json::objectValue);
    global["providers"] = Json::Value(Json::arrayValue);
    for (const auto& [provider, entries] : all) {
        Json::Value conf(Json::objectValue);
        conf["workers"] = Json::Value(Json::arrayValue);
        for (const Json::Value& e : entries) {
            conf["workers"].append(e);
        }
        testutil::writeFile(std::string(kProviderDir) + "/" + provider, toString(conf));
        global["providers"].append(provider);
    }
    testutil::writeFile(std::string(kProviderDir) + "/global", toString(global));
}

std::string calls() {
    if (!testutil::exists(kCallLog)) {
        return "";
    }
    std::istringstream in(testutil::readFile(kCallLog));
    std::string out;
    for (std::string line; std::getline(in, line);) {
        out += (out.empty() ? "" : ", ") + line;
    }
    return out;
}

// The workers of a list. The library's own ("NOS") come first; they are left out unless
// `withBuiltins`, so that a test of plug-ins does not change with the library's table.
std::string describe(const std::vector<std::shared_ptr<WorkerProxy>>& list,
                     bool withBuiltins = false) {
    std::string out;
    for (const auto& proxy : list) {
        if (!withBuiltins && proxy->GetProvider() == "NOS") {
            continue;
        }
        char interval[16];
        snprintf(interval, sizeof(interval), "%02X", proxy->GetInterval());
        out += (out.empty() ? "" : " ") + proxy->GetResourceID() + "/" + interval + "/" +
               proxy->GetProvider();
    }
    return out;
}

class PluginWorker : public ::testing::Test {
  protected:
    void SetUp() override {
        setenv("CORV_TEST_PLUGIN_LOG", kCallLog, 1);
        unsetenv("CORV_TEST_PLUGIN_INIT_NULL");
        unsetenv("CORV_TEST_PLUGIN_UPDATABLE");
    }
};

IWorker* makeBuiltinPort() {
    return testutil::makeNoopWorker();
}

}  // namespace

TEST_F(PluginWorker, WorkersComeFromInitAndAreDestroyedByFree) {
    DSOBackend backend(kPlugin);
    ASSERT_TRUE(backend.IsReady()) << kPlugin;
    {
        std::shared_ptr<IWorker> first = backend.CreateWorker();
        std::shared_ptr<IWorker> second = backend.CreateWorker();
        ASSERT_TRUE(first && second);
        ActionInfo action;
        action.SetPkgName("demo");
        Json::Value request;
        ASSERT_TRUE(
            fromString(R"({"tag":"t","message":"pkgmgr:bad","fail":["acquire"]})", request));
        Json::Value own(Json::objectValue);
        WorkerResp resp;
        EXPECT_EQ(first->Acquire(action, request, own, resp), 1);
        EXPECT_EQ(toString(resp.GetErrJsonArray()),
                  R"([{"key":"bad","params":["t"],"sec":"pkgmgr"}])");
        EXPECT_EQ(own["seen"]["pkg"].asString(), "demo");
        EXPECT_FALSE(first->IsUpdatable());
        first.reset();
        EXPECT_EQ(calls(), "init 1, init 2, acquire t, free 1, destroy 1");
    }
    EXPECT_EQ(calls(), "init 1, init 2, acquire t, free 1, destroy 1, free 2, destroy 2");
}

TEST_F(PluginWorker, APluginWithoutFreeIsNotReadyAndMakesNothing) {
    VLIBCErrSet(0);
    DSOBackend backend(kPluginWithoutFree);
    EXPECT_FALSE(backend.IsReady());
    EXPECT_EQ(VLIBCErrGet(), 0x2000);
    EXPECT_FALSE(backend.CreateWorker());
    EXPECT_EQ(calls(), "") << "Init is never called";
}

TEST_F(PluginWorker, AnInitThatGivesNullMakesAnEmptyPointer) {
    setenv("CORV_TEST_PLUGIN_INIT_NULL", "1", 1);
    DSOBackend backend(kPlugin);
    ASSERT_TRUE(backend.IsReady());
    EXPECT_FALSE(backend.CreateWorker());
    EXPECT_EQ(calls(), "init null");
}

TEST_F(PluginWorker, PhaseListsTakePluginsInOrderWithTheLaterProviderInTheEarlierPlace) {
    registerProviders({
        {"p1", {entry("x", "0x0012"), entry("y", "0x0022")}},
        {"p2", {entry("z", "0x0012"), entry("x", "0x0044"), entry("x", "0x0012")}},
    });
    std::vector<std::shared_ptr<WorkerProxy>> list;
    ASSERT_TRUE(FindRunnableWorkers(TIMING_POSTINST, list));
    EXPECT_EQ(describe(list), "x/12/p2 y/22/p1 z/12/p2");
    ASSERT_FALSE(list.empty());
    EXPECT_EQ(list.front()->GetProvider(), "NOS") << "the library's own workers run first";
    ASSERT_TRUE(FindRunnableWorkers(TIMING_DISABLE, list));
    EXPECT_EQ(describe(list), "x/44/p2");
    ASSERT_TRUE(FindRunnableWorkers(TIMING_PREINST, list));
    EXPECT_EQ(describe(list), "");
    EXPECT_EQ(calls(), "") << "listing makes no worker";
}

TEST_F(PluginWorker, OnlyInterfaceVersionOneZeroAndUsableObjectsLoad) {
    registerProviders({
        {"p",
         {entry("major2", "0x0012", kPlugin, 2, 0), entry("minor1", "0x0012", kPlugin, 1, 1),
          entry("missing", "0x0012", "/nonexistent/plugin.so"),
          entry("nofree", "0x0012", kPluginWithoutFree), entry("good", "0x0012"),
          entry("", "0x0012"), Json::Value("not an entry")}},
    });
    std::vector<std::shared_ptr<WorkerProxy>> list;
    ASSERT_TRUE(FindRunnableWorkers(TIMING_POSTINST, list));
    EXPECT_EQ(describe(list), "good/12/p");
    ASSERT_FALSE(list.empty());
    EXPECT_EQ(list.back()->GetResourceID(), "good");
    EXPECT_TRUE(list.back()->CreateInstance());
}

TEST_F(PluginWorker, OneWorkerForAnIdIsTheLatestRegistrationInAnyPhase) {
    registerProviders({
        {"p1", {entry("x", "0x0012"), entry("w", "0x0088")}},
        {"p2", {entry("x", "0x0044"), entry("x", "0x0021"), entry("y", "0x0012")}},
        {"p3", {entry("v", "0x0012")}},
    });
    struct {
        const char* id;
        const char* expected;  // "" for none
    } const kIds[] = {
        {"x", "x/21/p2"}, {"w", "w/88/p1"}, {"y", "y/12/p2"}, {"v", "v/12/p3"}, {"u", ""},
    };
    for (const auto& c : kIds) {
        std::vector<std::shared_ptr<WorkerProxy>> one;
        WorkerProxy* proxy = FindRunnableWorker(c.id);
        if (proxy != nullptr) {
            one.emplace_back(proxy);
        }
        EXPECT_EQ(describe(one), c.expected) << c.id;
    }
}

TEST_F(PluginWorker, AStaleProviderAndABrokenOneCostOnlyThemselves) {
    registerProviders({
        {"gone", {}},
        {"good", {entry("a", "0x0012")}},
    });
    // The provider released its workers: its file stays, without "workers".
    testutil::writeFile(std::string(kProviderDir) + "/gone", "{}");
    testutil::writeFile(std::string(kProviderDir) + "/global",
                        R"({"providers":["gone","broken","good","unlisted-file-missing"]})");
    testutil::writeFile(std::string(kProviderDir) + "/broken", "{\"workers\":[");
    std::vector<std::shared_ptr<WorkerProxy>> list;
    ASSERT_TRUE(FindRunnableWorkers(TIMING_POSTINST, list));
    EXPECT_EQ(describe(list), "a/12/good");
    std::unique_ptr<WorkerProxy> one(FindRunnableWorker("a"));
    ASSERT_TRUE(one);
    EXPECT_EQ(one->GetProvider(), "good");
}

TEST_F(PluginWorker, ABuiltinIdIsNeverTakenOverWhileItsRowIsInTheList) {
    const BuiltinWorker table[] = {
        {"port", 0x0022, makeBuiltinPort},
        {nullptr, 0, nullptr},
    };
    const CatalogueSource source = {table, kProviderDir};
    registerProviders({
        {"p", {entry("port", "0x0022"), entry("port", "0x0044"), entry("other", "0x0066")}},
    });
    struct {
        unsigned int timing;
        const char* expected;
    } const kPhases[] = {
        {TIMING_POSTINST, "port/22/NOS other/66/p"},
        {TIMING_POSTUNINST, "port/22/NOS other/66/p"},
        // Without the table's row in the list the id is free for the plug-in.
        {TIMING_ENABLE, "port/44/p other/66/p"},
        {TIMING_DISABLE, "port/44/p other/66/p"},
        {TIMING_PREINST, ""},
    };
    for (const auto& phase : kPhases) {
        std::vector<std::shared_ptr<WorkerProxy>> list;
        ASSERT_TRUE(FindRunnableWorkersIn(source, phase.timing, list));
        EXPECT_EQ(describe(list, true), phase.expected) << TimingWord(phase.timing);
    }
    std::unique_ptr<WorkerProxy> one(FindRunnableWorkerIn(source, "port"));
    ASSERT_TRUE(one);
    EXPECT_EQ(one->GetProvider(), "NOS");
    EXPECT_EQ(one->GetInterval(), 0x22u);
}
