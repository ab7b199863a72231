// Reloads of the related system daemons after package operations.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "corv/nginx_conf.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "support/files.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;

namespace {

void Fixture(const std::string& name, const std::string& words) {
    testutil::TestPackage pkg(name);
    pkg.info["startstop_restart_services"] = words;
    testutil::installFixture(pkg);
}

}  // namespace

TEST(ServiceIntegrationRestart, MaskOverPackagesLeavesOutTheLast) {
    Fixture("a", "nginx");
    Fixture("b", "samba ftp");
    Fixture("c", "cron");
    PackageManager manager;
    EXPECT_EQ(manager.findRestartServices({"a", "b", "c"}), 0x40000004ULL);
    EXPECT_EQ(manager.findRestartServices({"c", "a"}), 0x8ULL);
    EXPECT_EQ(manager.findRestartServices({"a"}), 0ULL);
    EXPECT_EQ(manager.findRestartServices({"absent", "a"}), 0ULL);
}

TEST(ServiceIntegrationRestart, NothingToReload) {
    PackageManager manager;
    EXPECT_EQ(manager.RestartServicesAction(0), 1);
    EXPECT_EQ(manager.RestartServices(static_cast<PKG_INSTALLATION_TYPE>(0), 0x8), 0);
    EXPECT_EQ(manager.RestartServicesAction(0x8), 1);
}

TEST(ServiceIntegrationRestart, WebReloadRegeneratesNginxAndHupsTheFirewall) {
    testutil::writeFile(std::string(corvw3::NginxConfManager::PackageConfDir()) + "/demo.conf",
                        "server { listen 127.0.0.1:18080; location / { return 204; } }\n");
    PackageManager manager;
    EXPECT_EQ(manager.RestartServicesAction(0x40000000), 1);
    EXPECT_NE(testutil::readFile(corvw3::NginxConfManager::GeneratedPath())
                  .find("include /usr/corv/etc/nginx/package.d/demo.conf;"),
              std::string::npos);
    EXPECT_NE(testutil::readFile("/run/corvfw/reloads").find(" reload\n"), std::string::npos);
}

TEST(ServiceIntegrationRestart, FailedNginxLeavesTheFirewallAlone) {
    testutil::writeFile(std::string(corvw3::NginxConfManager::PackageConfDir()) + "/demo.conf",
                        "this is not nginx\n");
    PackageManager manager;
    EXPECT_EQ(manager.RestartServicesAction(0x40000000), 0);
    EXPECT_EQ(manager.getResult(), PKG_ERR_RESTART_SERVICES);
    EXPECT_EQ(toString(manager.getJsonParam("services")), "[\"nginx\"]");
    EXPECT_FALSE(testutil::exists("/run/corvfw/reloads"));
    EXPECT_FALSE(testutil::exists(corvw3::NginxConfManager::GeneratedPath()));
}
