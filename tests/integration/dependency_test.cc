// Dependency queries on real registries: conflicts, missing and stopped dependencies,
// dependents, and the orders of stopping and starting.
#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "corvpkg/corvpkg.h"
#include "support/files.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;
using testutil::installFixture;
using testutil::TestPackage;
using Strings = std::vector<std::string>;

namespace {

TestPackage pkg(const std::string& name, const std::string& deps = "",
                const std::string& version = "1.0-0001") {
    TestPackage p(name, version);
    p.info["displayname"] = "Display " + name;
    if (!deps.empty()) {
        p.info["install_dep_packages"] = deps;
    }
    p.scripts["start-stop-status"] = testutil::statusScript(0);
    return p;
}

}  // namespace

TEST(Dependencies, StopOrderFollowsActiveDependents) {
    ASSERT_TRUE(testutil::installRunning(pkg("A", "B")));
    ASSERT_TRUE(testutil::installRunning(pkg("B")));
    PackageManager pm;
    Strings order;
    ASSERT_TRUE(pm.getDependencyOrder("B", order, false));
    EXPECT_EQ(order, (Strings{"A", "B"}));

    // A stopped dependent is no vertex: only B needs stopping.
    testutil::removeAll("/var/packages/A/enabled");
    order.clear();
    ASSERT_TRUE(pm.getDependencyOrder("B", order, false));
    EXPECT_EQ(order, Strings{"B"});
    // With the enabled flags as the measure, the same.
    order.clear();
    ASSERT_TRUE(pm.getDependencyOrder("B", order, true));
    EXPECT_EQ(order, Strings{"B"});

    // A package that PMSCheckPackage rejects: true, nothing to do.
    order.clear();
    EXPECT_TRUE(pm.getDependencyOrder("absent", order, false));
    EXPECT_TRUE(order.empty());
    EXPECT_FALSE(pm.getDependencyOrder(nullptr, order, false));
}

TEST(Dependencies, ChainAndDiamondOrders) {
    installFixture(pkg("app", "lib:web"), true);
    installFixture(pkg("web", "lib"), true);
    installFixture(pkg("lib"), true);
    installFixture(pkg("other"), true);
    PackageManager pm;
    Strings order;
    ASSERT_TRUE(pm.getDependencyOrder(order));
    ASSERT_EQ(order.size(), 4u);
    auto pos = [&](const char* n) {
        return std::find(order.begin(), order.end(), n) - order.begin();
    };
    EXPECT_LT(pos("app"), pos("web"));
    EXPECT_LT(pos("web"), pos("lib"));

    order.clear();
    ASSERT_TRUE(pm.getDependencyOrder("lib", order, true));
    EXPECT_EQ(order, (Strings{"app", "web", "lib"}));

    Json::Value list;
    EXPECT_FALSE(pm.getDepPkgListStop(order, "lib", "enu", list));
    ASSERT_EQ(list.size(), 2u);
    EXPECT_EQ(list[0]["id"].asString(), "app");
    EXPECT_EQ(list[0]["name"].asString(), "Display app");
}

TEST(Dependencies, CyclesAmongInstalledAndWithACandidate) {
    installFixture(pkg("A", "B"));
    installFixture(pkg("B"));
    PackageManager pm;
    PackageInfo candidate;
    candidate.package = "B";
    candidate.version = "2.0";
    candidate.dep_packages.pushDepPkg("A", "0", PKG_COMPOP_NONE);
    EXPECT_TRUE(pm.hasCycle(candidate)) << "B 2.0 needs A, which needs B";
    candidate.dep_packages.clear();
    EXPECT_FALSE(pm.hasCycle(candidate));

    testutil::writeFile("/var/packages/B/INFO", testutil::infoOf(pkg("B", "A")));
    Strings order;
    EXPECT_FALSE(pm.getDependencyOrder(order));
    // The candidate's vertex takes B's edges, and it needs nothing: the old cycle does not
    // pass through it.
    EXPECT_FALSE(pm.hasCycle(candidate));
}

TEST(Dependencies, ConflictsBothWaysNamedOnce) {
    TestPackage old = pkg("old");
    old.info["install_conflict_packages"] = "new";
    installFixture(old);
    TestPackage self = pkg("new", "", "1.0");
    self.info["install_conflict_packages"] = "new<2.0";
    installFixture(self);
    PackageManager pm;
    std::string names;
    DepPkgVector conflicts;
    conflicts.pushDepPkg("old", "0", PKG_COMPOP_NONE);
    EXPECT_TRUE(pm.arePackagesConflict(PackageBasicInfo("new", "2.0"), conflicts, names, "enu"));
    EXPECT_EQ(names, "Display old") << "found both ways, named once";

    DepPkgVector none;
    EXPECT_TRUE(pm.arePackagesConflict(PackageBasicInfo("new", "2.0"), none, names, "enu"));
    EXPECT_EQ(names, "Display old") << "old refuses new of any version";
    testutil::writeFile("/var/packages/old/INFO", testutil::infoOf(pkg("old")));
    EXPECT_FALSE(pm.arePackagesConflict(PackageBasicInfo("new", "1.5"), none, names, "enu"))
        << "an installed new 1.0 that refuses new<2.0 does not conflict with its upgrade";
    EXPECT_EQ(names, "");
}

TEST(Dependencies, InstalledAndStarted) {
    ASSERT_TRUE(testutil::installRunning(pkg("running", "", "2.0")));
    installFixture(pkg("stopped"));
    TestPackage noScript("noscript");
    installFixture(noScript);
    PackageManager pm;
    DepPkgVector deps;
    deps.pushDepPkg("running", "1.0", PKG_COMPOP_GE);
    deps.pushDepPkg("noscript", "0", PKG_COMPOP_NONE);
    Json::Value missing;
    std::string notStarted = "x";
    EXPECT_TRUE(pm.arePackagesInstallAndStart(deps, missing, notStarted, "enu"));
    EXPECT_EQ(notStarted, "");

    deps.pushDepPkg("stopped", "0", PKG_COMPOP_NONE);
    deps.pushDepPkg("running", "3.0", PKG_COMPOP_GE);
    deps.pushDepPkg("absent", "1", PKG_COMPOP_GE);
    deps.pushDepPkg("absent", "2", PKG_COMPOP_LE);
    EXPECT_FALSE(pm.arePackagesInstallAndStart(deps, missing, notStarted, "enu"));
    EXPECT_EQ(notStarted, "Display stopped");
    EXPECT_EQ(toString(missing), R"({"absent":{"<=":"2",">=":"1"},"running":{">=":"3.0"}})");
}

TEST(Dependencies, Dependents) {
    ASSERT_TRUE(testutil::installRunning(pkg("A", "B>=9")));
    installFixture(pkg("C", "B"));
    installFixture(pkg("B"));
    PackageManager pm;
    std::string names;
    EXPECT_FALSE(pm.arePackagesDepended("B", "enu", names));
    EXPECT_NE(names.find("Display A"), std::string::npos) << "the bound plays no part";
    EXPECT_NE(names.find("Display C"), std::string::npos);
    Strings list;
    EXPECT_FALSE(pm.arePackagesDepended("B", "enu", list));
    EXPECT_EQ(list.size(), 2u);
    EXPECT_TRUE(pm.arePackagesDepended("A", "enu", names));

    EXPECT_FALSE(pm.areDependentPackageStop("B", "enu", names));
    EXPECT_EQ(names, "Display A") << "C is stopped";
}

TEST(Dependencies, AncestryWithinGivenRecords) {
    std::vector<PackageInfo> pkgs(4);
    pkgs[0].package = "app";
    pkgs[0].dep_packages.pushDepPkg("lib", "0", PKG_COMPOP_NONE);
    pkgs[0].dep_packages.pushDepPkg("ghost", "0", PKG_COMPOP_NONE);
    pkgs[1].package = "lib";
    pkgs[1].dep_packages.pushDepPkg("base", "0", PKG_COMPOP_NONE);
    pkgs[2].package = "base";
    pkgs[3].package = "unrelated";
    PackageManager pm;
    Strings order;
    ASSERT_TRUE(pm.getAncestryDependencyOrder("app", pkgs, order));
    EXPECT_EQ(order, (Strings{"app", "lib", "base"}));
    ASSERT_EQ(pkgs.size(), 3u);
    EXPECT_EQ(pkgs[2].package, "base");

    Strings untouched{"x"};
    std::vector<PackageInfo> none;
    EXPECT_TRUE(pm.getAncestryDependencyOrder("app", none, untouched));
    EXPECT_EQ(untouched, Strings{"x"});
}

TEST(Dependencies, JoinJsonArray) {
    Json::Value a(Json::arrayValue);
    a.append("x");
    a.append("y");
    std::string out = "keep";
    EXPECT_TRUE(joinJsonArray(a, ", ", out));
    EXPECT_EQ(out, "x, y");
    out = "keep";
    EXPECT_FALSE(joinJsonArray(Json::Value("x"), ", ", out));
    EXPECT_EQ(out, "keep");
}
