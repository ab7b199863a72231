// The worker catalogue with a table of its own and a provider directory of its own:
// selection by phase, table order, the collector's rules, and how provider files and
// worker entries are judged before any shared object is opened.
#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/worker.h"
#include "resource/resource_private.h"
#include "support/files.h"
#include "support/noop_worker.h"
#include "support/temp_dir.h"

using namespace CORVPackageTool::Resource;
using CORV::PkgUtils::ActionInfo;
using CORV::PkgUtils::IWorker;
using CORV::PkgUtils::WorkerResp;

namespace {

IWorker* makeNoop() {
    return testutil::makeNoopWorker();
}

// Shaped like the real table: several rows for one id, spans of every kind, plus rows that
// must be skipped.
const BuiltinWorker kTable[] = {
    {"svc", 0x0012, makeNoop},   {"desc", 0x0048, makeNoop},
    {"desc", 0x0048, makeNoop},  {"", 0x00FF, makeNoop},  // no id: skipped
    {"share", 0x0021, makeNoop},                          // recorder
    {"share", 0x0028, makeNoop}, {"share", 0x0022, makeNoop},
    {"broken", 0x00FF, nullptr},  // no factory: skipped
    {"port", 0x0022, makeNoop},  {nullptr, 0, nullptr},
};

std::string describe(const std::vector<std::shared_ptr<WorkerProxy>>& list) {
    std::string out;
    for (const auto& proxy : list) {
        char interval[16];
        snprintf(interval, sizeof(interval), "%02X", proxy->GetInterval());
        out += (out.empty() ? "" : " ") + proxy->GetResourceID() + "/" + interval + "/" +
               proxy->GetProvider();
    }
    return out;
}

WorkerProxy* proxyOf(const std::string& id, const std::string& provider) {
    WorkerProxy* proxy = new WorkerProxy(nullptr);
    proxy->SetResourceID(id);
    proxy->SetProvider(provider);
    return proxy;
}

class LogLines {
  public:
    LogLines() {
        CORVLogSetSink([this](int, const std::string& line) { lines.push_back(line); });
    }
    ~LogLines() { CORVLogSetSink(nullptr); }
    bool has(const std::string& text) const {
        for (const std::string& line : lines) {
            if (line.find(text) != std::string::npos) {
                return true;
            }
        }
        return false;
    }
    std::vector<std::string> lines;
};

}  // namespace

TEST(Collector, BuiltinsKeepTheirIdsAndLaterPluginsTakeThePlaceOfEarlierOnes) {
    struct Step {
        bool builtin;
        const char* id;
        const char* provider;
        bool accepted;
        int error;
    };
    const Step kSteps[] = {
        {true, "a", "NOS", true, 0}, {true, "a", "NOS", true, 0},
        {true, "b", "NOS", true, 0}, {false, "a", "p1", false, 0x2100},
        {false, "x", "p1", true, 0}, {false, "y", "p1", true, 0},
        {false, "x", "p2", true, 0}, {false, "b", "p2", false, 0x2100},
        {false, "y", "p3", true, 0}, {false, "z", "p3", true, 0},
    };
    std::vector<std::shared_ptr<WorkerProxy>> list;
    list.emplace_back(proxyOf("stale", "old"));
    Collector collector(list);
    EXPECT_TRUE(list.empty()) << "the collector starts from an empty list";
    int n = 0;
    for (const Step& s : kSteps) {
        WorkerProxy* proxy = proxyOf(s.id, s.provider);
        VLIBCErrSet(0);
        bool accepted =
            s.builtin ? collector.AddBuiltinWorker(proxy) : collector.AddPluginWorker(proxy);
        EXPECT_EQ(accepted, s.accepted) << "step " << n << ": " << s.id << " of " << s.provider;
        if (!accepted) {
            EXPECT_EQ(VLIBCErrGet(), s.error) << "step " << n;
            delete proxy;
        }
        ++n;
    }
    EXPECT_EQ(describe(list), "a/00/NOS a/00/NOS b/00/NOS x/00/p2 y/00/p3 z/00/p3");

    VLIBCErrSet(0);
    EXPECT_FALSE(collector.AddBuiltinWorker(nullptr));
    EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);
    VLIBCErrSet(0);
    EXPECT_FALSE(collector.AddPluginWorker(nullptr));
    EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);
}

TEST(Collector, AnIdOfASecondBuiltinRowIsStillTaken) {
    std::vector<std::shared_ptr<WorkerProxy>> list;
    Collector collector(list);
    ASSERT_TRUE(collector.AddBuiltinWorker(proxyOf("first", "NOS")));
    ASSERT_TRUE(collector.AddBuiltinWorker(proxyOf("second", "NOS")));
    std::unique_ptr<WorkerProxy> plugin(proxyOf("second", "p"));
    EXPECT_FALSE(collector.AddPluginWorker(plugin.get()));
    EXPECT_EQ(VLIBCErrGet(), 0x2100);
}

TEST(Catalogue, PhasesSelectTableRowsInTableOrder) {
    TempDir tmp;
    const CatalogueSource source = {kTable, tmp.path() + "/providers"};
    struct {
        unsigned int timing;
        const char* expected;
    } const kPhases[] = {
        {TIMING_PREINST, "share/21/NOS"},
        {TIMING_POSTINST, "svc/12/NOS share/22/NOS port/22/NOS"},
        {TIMING_ENABLE, ""},
        {TIMING_STARTUP, "desc/48/NOS desc/48/NOS share/28/NOS"},
        {TIMING_PREUNINST, "svc/12/NOS"},
        {TIMING_POSTUNINST, "share/21/NOS share/28/NOS share/22/NOS port/22/NOS"},
        {TIMING_DISABLE, "desc/48/NOS desc/48/NOS"},
        {TIMING_HALT, ""},
    };
    for (const auto& phase : kPhases) {
        std::vector<std::shared_ptr<WorkerProxy>> list;
        EXPECT_TRUE(FindRunnableWorkersIn(source, phase.timing, list)) << phase.timing;
        EXPECT_EQ(describe(list), phase.expected) << TimingWord(phase.timing);
        for (const auto& proxy : list) {
            EXPECT_TRUE(proxy->CreateInstance()) << proxy->GetResourceID();
        }
    }
}

TEST(Catalogue, AMalformedProviderListFailsButKeepsTheBuiltins) {
    TempDir tmp;
    const std::string dir = tmp.path();
    const CatalogueSource source = {kTable, dir};
    struct {
        const char* global;
        bool ok;
        int error;
    } const kGlobals[] = {
        {"not json", false, ERR_READ_FAILED},
        {"[]", false, ERR_MALFORMED},
        {R"("text")", false, ERR_MALFORMED},
        {R"({"providers":"p"})", false, ERR_MALFORMED},
        {R"({"providers":{}})", false, ERR_MALFORMED},
        {R"({})", true, 0},
        {R"({"providers":[]})", true, 0},
        {R"({"providers":[1,"",null,{}]})", true, 0},
    };
    for (const auto& g : kGlobals) {
        testutil::writeFile(dir + "/global", g.global);
        LogLines log;
        std::vector<std::shared_ptr<WorkerProxy>> list;
        VLIBCErrSet(0);
        EXPECT_EQ(FindRunnableWorkersIn(source, TIMING_POSTINST, list), g.ok) << g.global;
        EXPECT_EQ(describe(list), "svc/12/NOS share/22/NOS port/22/NOS") << g.global;
        if (!g.ok) {
            EXPECT_EQ(VLIBCErrGet(), g.error) << g.global;
            EXPECT_TRUE(log.has("Failed to enum plugin providers [0x")) << g.global;
        }
        std::vector<std::string> providers = {"stale"};
        EXPECT_EQ(EnumProviders(dir, providers), g.ok) << g.global;
        EXPECT_TRUE(providers.empty()) << g.global;
    }
}

TEST(Catalogue, ProviderNamesKeepTheirOrderAndDuplicates) {
    TempDir tmp;
    testutil::writeFile(tmp.path() + "/global", R"({"providers":["b","a",7,"b",""]})");
    std::vector<std::string> providers;
    ASSERT_TRUE(EnumProviders(tmp.path(), providers));
    EXPECT_EQ(providers, (std::vector<std::string>{"b", "a", "b"}));
}

TEST(Catalogue, BadProviderFilesAreLoggedAndSkipped) {
    TempDir tmp;
    const std::string dir = tmp.path();
    testutil::writeFile(dir + "/global",
                        R"({"providers":["missing","garbage","array","noworkers","wrongtype"]})");
    testutil::writeFile(dir + "/garbage", "{");
    testutil::writeFile(dir + "/array", "[]");
    testutil::writeFile(dir + "/noworkers", R"({"other":1})");
    testutil::writeFile(dir + "/wrongtype", R"({"workers":{}})");
    const CatalogueSource source = {kTable, dir};
    LogLines log;
    std::vector<std::shared_ptr<WorkerProxy>> list;
    EXPECT_TRUE(FindRunnableWorkersIn(source, TIMING_PREINST, list));
    EXPECT_EQ(describe(list), "share/21/NOS");
    EXPECT_TRUE(log.has("Failed to load conf of missing [0x0700"));
    EXPECT_TRUE(log.has("Failed to load conf of garbage [0x0A00"));
    for (const char* name : {"array", "noworkers", "wrongtype"}) {
        EXPECT_TRUE(log.has(dir + "/" + name + " is in wrong format, ignore it")) << name;
    }
    std::unique_ptr<WorkerProxy> none(FindRunnableWorkerIn(source, "plugin-id"));
    EXPECT_FALSE(none);
}

TEST(Catalogue, WorkerEntriesAreJudgedBeforeTheObjectIsOpened) {
    // Entries that pass every check reach dlopen, which fails on the missing object
    // (0x0900); the others are refused with their own code first.
    struct {
        const char* entry;
        unsigned int mask;
        const char* wanted;
        const char* provider;
        int error;
    } const kEntries[] = {
        {R"({"id":"x","interval":"0x0012","major":1,"minor":0,"path":"/nonexistent.so"})", 0x02,
         nullptr, "p", ERR_OPEN_FAILED},
        {R"({"id":"x","interval":"0x0012","major":1,"minor":0,"path":"/nonexistent.so"})", 0x02,
         nullptr, "", ERR_BAD_PARAMETERS},
        {R"([])", 0x02, nullptr, "p", ERR_MALFORMED},
        {R"({"interval":"0x0012","major":1,"minor":0,"path":"/n.so"})", 0x02, nullptr, "p",
         ERR_MALFORMED},
        {R"({"id":"x","interval":18,"major":1,"minor":0,"path":"/n.so"})", 0x02, nullptr, "p",
         ERR_MALFORMED},
        {R"({"id":"x","interval":"0x0012","major":"1","minor":0,"path":"/n.so"})", 0x02, nullptr,
         "p", ERR_MALFORMED},
        {R"({"id":"x","interval":"0x0012","major":1,"minor":0.5,"path":"/n.so"})", 0x02, nullptr,
         "p", ERR_MALFORMED},
        {R"({"id":"x","interval":"0x0012","major":1,"minor":0})", 0x02, nullptr, "p",
         ERR_MALFORMED},
        {R"({"id":"","interval":"0x0012","major":1,"minor":0,"path":"/n.so"})", 0x02, nullptr, "p",
         ERR_MALFORMED},
        {R"({"id":"x","interval":"0x0012","major":1,"minor":0,"path":"/n.so"})", 0x04, nullptr, "p",
         ERR_NOT_APPLICABLE},
        {R"({"id":"x","interval":"zz","major":1,"minor":0,"path":"/n.so"})", 0xFFFF, nullptr, "p",
         ERR_NOT_APPLICABLE},
        {R"({"id":"x","interval":"0x0012","major":2,"minor":0,"path":"/n.so"})", 0x02, nullptr, "p",
         ERR_NOT_APPLICABLE},
        {R"({"id":"x","interval":"0x0012","major":1,"minor":1,"path":"/n.so"})", 0x02, nullptr, "p",
         ERR_NOT_APPLICABLE},
        {R"({"id":"x","interval":"0x0012","major":0,"minor":0,"path":"/n.so"})", 0x02, nullptr, "p",
         ERR_NOT_APPLICABLE},
        {R"({"id":"x","interval":"0x0012","major":1,"minor":-1,"path":"/n.so"})", 0x02, nullptr,
         "p", ERR_OPEN_FAILED},
        {R"({"id":"x","interval":"12","major":1,"minor":0,"path":"/n.so"})", 0x10, nullptr, "p",
         ERR_OPEN_FAILED},
        {R"({"id":"x","interval":"0x0012","major":1,"minor":0,"path":""})", 0x02, nullptr, "p",
         ERR_BAD_PARAMETERS},
        // Another id than the wanted one: passed over without an error of its own.
        {R"({"id":"x","interval":"0x0012","major":1,"minor":0,"path":"/n.so"})", 0xFFFF, "y", "p",
         0x7777},
        {R"({"id":"y","interval":"0x0012","major":1,"minor":0,"path":"/n.so"})", 0xFFFF, "y", "p",
         ERR_OPEN_FAILED},
    };
    for (const auto& e : kEntries) {
        Json::Value entry;
        ASSERT_TRUE(CORVPackageTool::fromString(e.entry, entry)) << e.entry;
        VLIBCErrSet(0x7777);
        std::unique_ptr<WorkerProxy> proxy(LoadPluginWorker(e.mask, e.wanted, e.provider, entry));
        EXPECT_FALSE(proxy) << e.entry;
        EXPECT_EQ(VLIBCErrGet(), e.error)
            << e.entry << " mask " << std::hex << e.mask << " provider '" << e.provider << "'";
    }
}

TEST(Catalogue, OneWorkerForAnIdIsTheFirstTableRow) {
    TempDir tmp;
    const CatalogueSource source = {kTable, tmp.path()};
    struct {
        const char* id;
        unsigned int interval;  // 0: no worker
    } const kIds[] = {
        {"share", 0x21}, {"desc", 0x48}, {"port", 0x22},
        {"svc", 0x12},   {"broken", 0},  {"unknown", 0},
    };
    for (const auto& c : kIds) {
        std::unique_ptr<WorkerProxy> proxy(FindRunnableWorkerIn(source, c.id));
        if (c.interval == 0) {
            EXPECT_FALSE(proxy) << c.id;
            continue;
        }
        ASSERT_TRUE(proxy) << c.id;
        EXPECT_EQ(proxy->GetResourceID(), c.id);
        EXPECT_EQ(proxy->GetInterval(), c.interval) << c.id;
        EXPECT_EQ(proxy->GetProvider(), "NOS");
    }
    VLIBCErrSet(0);
    EXPECT_EQ(FindRunnableWorkerIn(source, ""), nullptr);
    EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);

    testutil::writeFile(tmp.path() + "/global", "[");
    LogLines log;
    EXPECT_EQ(FindRunnableWorkerIn(source, "unknown"), nullptr);
    EXPECT_TRUE(log.has("Failed to enum plugin providers [0x0A00"));
}
