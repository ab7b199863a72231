// Orchestration of a phase over an unpacked package in a temporary directory, with
// in-process scripted workers in a table of the test's own.
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <set>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/resource.h"
#include "resource/resource_private.h"
#include "support/files.h"
#include "support/temp_dir.h"

using namespace CORVPackageTool;
using namespace CORVPackageTool::Resource;
using CORV::PkgUtils::ActionInfo;
using CORV::PkgUtils::IWorker;
using CORV::PkgUtils::WorkerResp;

namespace {

std::vector<std::string> g_trace;
std::set<std::string> g_fail;  // "<op> <row>"

// Records every call, does what the script says, and notes in own what it saw.
class TraceWorker : public IWorker {
  public:
    explicit TraceWorker(std::string row) : row_(std::move(row)) {}
    ~TraceWorker() override { g_trace.push_back("destroy " + row_); }

    int Acquire(const ActionInfo& action, const Json::Value& request, Json::Value& own,
                WorkerResp& resp) override {
        g_trace.push_back("acquire " + row_);
        Json::Value seen(Json::objectValue);
        seen["pkg"] = action.GetPkgName();
        seen["user"] = action.GetPkgUserName();
        seen["type"] = action.GetActionType();
        seen["root"] = action.GetRootDir();
        seen["request"] = request;
        own["seen"] = seen;
        if (g_fail.count("acquire " + row_)) {
            resp.SetI18NErrMsg("test:acquire_failed", row_.c_str(), nullptr);
            return 1;
        }
        own["acquired_by"].append(row_);
        return 0;
    }
    int Rollback(const ActionInfo&, const Json::Value&, Json::Value& own, WorkerResp&) override {
        g_trace.push_back("rollback " + row_);
        own["rolled_back_by"].append(row_);
        return g_fail.count("rollback " + row_) ? 1 : 0;
    }
    int Release(const ActionInfo&, const Json::Value& request, Json::Value& own,
                WorkerResp&) override {
        g_trace.push_back("release " + row_ + (request.isNull() ? " (null request)" : ""));
        if (g_fail.count("release " + row_)) {
            return 1;
        }
        own["released_by"].append(row_);
        return 0;
    }

  private:
    std::string row_;
};

template <char Row>
IWorker* make() {
    return new TraceWorker(std::string(1, Row));
}
IWorker* makeNothing() {
    return nullptr;
}

// Rows a, b, c over preinst to preuninst; p, q, r over postinst to postuninst; "n" can't
// make a worker; "s" has two rows over enable to disable.
const BuiltinWorker kTable[] = {
    {"a", 0x0011, make<'a'>}, {"b", 0x0011, make<'b'>}, {"n", 0x0011, makeNothing},
    {"c", 0x0011, make<'c'>}, {"p", 0x0022, make<'p'>}, {"q", 0x0022, make<'q'>},
    {"r", 0x0022, make<'r'>}, {"s", 0x0044, make<'s'>}, {"s", 0x0044, make<'t'>},
    {nullptr, 0, nullptr},
};

class ResourceOrchestration : public ::testing::Test {
  protected:
    void SetUp() override {
        g_trace.clear();
        g_fail.clear();
        dir = tmp.path() + "/pkginstall";
        source = {kTable, tmp.path() + "/no-providers"};
        info.package = "demo";
        CORVLogSetSink([this](int, const std::string& line) { log.push_back(line); });
    }
    void TearDown() override { CORVLogSetSink(nullptr); }

    void request(const std::string& text) { testutil::writeFile(dir + "/conf/resource", text); }
    void ownFile(const std::string& text) { testutil::writeFile(dir + "/conf/resource.own", text); }
    Json::Value own() {
        Json::Value value;
        EXPECT_TRUE(fromFile(dir + "/conf/resource.own", value));
        return value;
    }
    bool acquire(TIMING timing, const Json::Value* variables = nullptr,
                 PKG_INSTALLATION_TYPE type = PKG_INSTALL) {
        return AcquireWith(source, timing, info, type, resp, variables, dir);
    }
    bool release(TIMING timing, PKG_INSTALLATION_TYPE type = PKG_UNINSTALL) {
        return ReleaseWith(source, timing, info, type, resp, nullptr, dir);
    }
    bool logged(const std::string& text) const {
        for (const std::string& line : log) {
            if (line.find(text) != std::string::npos) {
                return true;
            }
        }
        return false;
    }
    static std::string trace() {
        std::string out;
        for (const std::string& step : g_trace) {
            out += (out.empty() ? "" : ", ") + step;
        }
        return out;
    }
    // The calls of an Acquire, whose workers all live to its end: the calls in order, then
    // how many workers were destroyed after the last call ("destroyed 2"), or "destroyed
    // early" when one went before.
    static std::string acquireTrace() {
        std::string out;
        int destroyed = 0;
        for (const std::string& step : g_trace) {
            if (step.rfind("destroy ", 0) == 0) {
                ++destroyed;
                continue;
            }
            if (destroyed != 0) {
                return "destroyed early";
            }
            out += step + ", ";
        }
        return out + "destroyed " + std::to_string(destroyed);
    }

    TempDir tmp;
    std::string dir;
    CatalogueSource source;
    PackageInfo info;
    WorkerResp resp;
    std::vector<std::string> log;
};

}  // namespace

TEST_F(ResourceOrchestration, AFailingRollbackDoesNotStopTheWalk) {
    request(R"({"a":{},"b":{},"c":{}})");
    g_fail = {"acquire c", "rollback b"};
    EXPECT_FALSE(acquire(TIMING_PREINST));
    EXPECT_EQ(acquireTrace(),
              "acquire a, acquire b, acquire c, rollback c, rollback b, rollback a, destroyed 3");
    EXPECT_TRUE(logged("Rollback b for demo when 0x0001 (fail)"));
}

TEST_F(ResourceOrchestration, SeveralRowsOfOneIdShareTheSection) {
    request(R"({"s":{"v":1}})");
    ASSERT_TRUE(acquire(TIMING_ENABLE, nullptr, PKG_START));
    EXPECT_EQ(acquireTrace(), "acquire s, acquire t, destroyed 2");
    EXPECT_EQ(toString(own()["s"]["acquired_by"]), R"(["s","t"])");
    EXPECT_TRUE(logged("Acquire s for demo when 0x0008 (done)"));
    g_trace.clear();
    ASSERT_TRUE(release(TIMING_DISABLE, PKG_STOP));
    EXPECT_EQ(trace(), "release t, destroy t, release s, destroy s");
}

TEST_F(ResourceOrchestration, WithoutRequestFileNothingRunsAndNoOwnFileIsMade) {
    EXPECT_TRUE(acquire(TIMING_PREINST));
    EXPECT_EQ(trace(), "");
    EXPECT_FALSE(testutil::exists(dir + "/conf/resource.own"));
}

TEST_F(ResourceOrchestration, WithoutMatchingWorkerTheOwnFileStillHoldsWhatWasRead) {
    request(R"({"unknown":{}})");
    ownFile(R"({"old":{"x":1}})");
    EXPECT_TRUE(acquire(TIMING_PREINST));
    EXPECT_EQ(trace(), "");
    EXPECT_EQ(toString(own()), R"({"old":{"x":1}})");
}

TEST_F(ResourceOrchestration, SectionsThatAreNoObjectsArePassedOver) {
    request(R"({"a":[],"b":"text","c":{},"n":{}})");
    EXPECT_TRUE(acquire(TIMING_PREINST));
    EXPECT_EQ(acquireTrace(), "acquire c, destroyed 1");
    EXPECT_TRUE(logged("Failed to create worker for n, ignore it"));
    EXPECT_EQ(toString(own()["n"]), "null") << "no worker, no entry";
}

TEST_F(ResourceOrchestration, VariablesAreSubstitutedBeforeTheWorkersSeeTheRequest) {
    request(R"({"a":{"path":"{{dir}}/x","flag":"{{on}}","gone":"{{nobody}}"},"b":"{{x}}"})");
    Json::Value variables;
    ASSERT_TRUE(fromString(R"({"dir":"/volume1/d","on":true})", variables));
    ASSERT_TRUE(acquire(TIMING_PREINST, &variables));
    EXPECT_EQ(toString(own()["a"]["seen"]["request"]), R"({"flag":true,"path":"/volume1/d/x"})");
    // Without variables the unresolved placeholders still go.
    g_trace.clear();
    ASSERT_TRUE(acquire(TIMING_PREINST));
    EXPECT_EQ(toString(own()["a"]["seen"]["request"]), "{}");
}

TEST_F(ResourceOrchestration, TheWorkersAreToldAboutTheAction) {
    request(R"({"a":{}})");
    testutil::writeFile(dir + "/conf/privilege", R"({"username":"demouser"})");
    ASSERT_TRUE(acquire(TIMING_PREINST, nullptr, PKG_UPGRADE));
    EXPECT_EQ(toString(own()["a"]["seen"]["pkg"]), R"("demo")");
    EXPECT_EQ(toString(own()["a"]["seen"]["user"]), R"("demouser")");
    EXPECT_EQ(toString(own()["a"]["seen"]["type"]), "2");
    EXPECT_EQ(own()["a"]["seen"]["root"].asString(), dir + "/package");
    EXPECT_TRUE(logged("Acquire a for demo when 0x0002 (done)"));
}

TEST_F(ResourceOrchestration, FilesThatCantBeUsedFailBothCalls) {
    struct {
        const char* request;  // null: no request file
        const char* own;      // null: no own-file
        const char* variables;
        bool acquired;
        bool released;
        int error;  // of the failing calls
    } const kCases[] = {
        {"{", nullptr, nullptr, false, false, ERR_READ_FAILED},
        {"[]", R"({"a":{}})", nullptr, false, false, ERR_MALFORMED},
        {R"({"a":{}})", "nope", nullptr, false, false, ERR_READ_FAILED},
        {R"({"a":{}})", R"("text")", nullptr, false, false, ERR_MALFORMED},
        {R"({"a":{}})", R"({"a":{}})", "[]", false, false, ERR_BAD_PARAMETERS},
        {R"({"a":{}})", R"({"a":{}})", "1", false, false, ERR_BAD_PARAMETERS},
        {nullptr, R"({"a":{}})", "[]", true, false, ERR_BAD_PARAMETERS},
        {R"({"a":{}})", nullptr, "[]", false, false, ERR_BAD_PARAMETERS},
    };
    for (const auto& c : kCases) {
        testutil::removeAll(dir);
        if (c.request) {
            request(c.request);
        }
        if (c.own) {
            ownFile(c.own);
        }
        Json::Value variables;
        if (c.variables) {
            ASSERT_TRUE(fromString(c.variables, variables));
        }
        const Json::Value* vars = c.variables ? &variables : nullptr;
        const std::string what = std::string("request ") + (c.request ? c.request : "(none)") +
                                 ", own " + (c.own ? c.own : "(none)") + ", variables " +
                                 (c.variables ? c.variables : "(none)");
        g_trace.clear();
        VLIBCErrSet(0);
        EXPECT_EQ(AcquireWith(source, TIMING_PREINST, info, PKG_INSTALL, resp, vars, dir),
                  c.acquired)
            << what;
        if (!c.acquired) {
            EXPECT_EQ(VLIBCErrGet(), c.error) << what;
        }
        VLIBCErrSet(0);
        EXPECT_EQ(ReleaseWith(source, TIMING_PREUNINST, info, PKG_UNINSTALL, resp, vars, dir),
                  c.released)
            << what;
        if (!c.released) {
            EXPECT_EQ(VLIBCErrGet(), c.error) << what;
        }
        if (!c.acquired && !c.released) {
            EXPECT_EQ(trace(), "") << what;
        }
    }
}

TEST_F(ResourceOrchestration, AnOwnFileThatCantBeWrittenFailsTheCall) {
    request(R"({"a":{}})");
    ASSERT_EQ(mkdir((dir + "/conf/resource.own").c_str(), 0755), 0);
    EXPECT_FALSE(acquire(TIMING_PREINST));
    EXPECT_EQ(acquireTrace(), "acquire a, destroyed 1") << "the workers ran";
    EXPECT_EQ(VLIBCErrGet(), ERR_WRITE_FAILED);
}

TEST_F(ResourceOrchestration, ReleaseRunsInReverseForWhatOwnHolds) {
    request(R"({"a":{},"b":{},"c":{}})");
    ownFile(R"({"a":{},"c":{"kept":true},"zz":{}})");
    EXPECT_TRUE(release(TIMING_PREUNINST));
    EXPECT_EQ(trace(), "release c, destroy c, release a, destroy a");
    Json::Value recorded = own();
    EXPECT_EQ(toString(recorded["c"]), R"({"kept":true,"released_by":["c"]})");
    EXPECT_TRUE(recorded.isMember("zz")) << "the ids stay in the file";
    EXPECT_FALSE(recorded.isMember("b")) << "what wasn't acquired isn't released";
    EXPECT_TRUE(logged("Release c for demo when 0x0004 (done)"));
}

TEST_F(ResourceOrchestration, ReleaseWithoutOwnFileDoesNothingAndWithoutRequestGoesOn) {
    request(R"({"a":{}})");
    EXPECT_TRUE(release(TIMING_PREUNINST));
    EXPECT_EQ(trace(), "");
    EXPECT_FALSE(testutil::exists(dir + "/conf/resource.own"));

    testutil::removeAll(dir);
    ownFile(R"({"a":{}})");
    EXPECT_TRUE(release(TIMING_PREUNINST));
    EXPECT_EQ(trace(), "release a (null request), destroy a");
}

TEST_F(ResourceOrchestration, AnUnreadableProviderListFailsThePhaseBeforeAnyWorkerRuns) {
    request(R"({"a":{}})");
    ownFile(R"({"a":{}})");
    testutil::writeFile(source.providerDir + "/global", "{");
    EXPECT_FALSE(acquire(TIMING_PREINST));
    EXPECT_FALSE(release(TIMING_PREUNINST));
    EXPECT_EQ(trace(), "");
    EXPECT_TRUE(logged("Failed to find runnable workers [0x0A00"));
}
