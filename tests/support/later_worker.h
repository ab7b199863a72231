// A worker that runs after every built-in one: the scripted test plug-in
// (tests/plugin/test_worker_plugin.cc) registered by the provider "later" for one
// resource id. A package whose request has {"<id>": {"fail": ["acquire"]}} sees its
// earlier workers rolled back, as after any failing worker later in the table.
#pragma once

#include <string>

namespace testutil {

// `interval` as a manifest writes it ("0x0048"). `pluginPath` is the plug-in's shared
// object (the integration tests know it as CORVPKG_TEST_PLUGIN_PATH).
void registerLaterWorker(const std::string& pluginPath, const std::string& id,
                         const std::string& interval);

}  // namespace testutil
