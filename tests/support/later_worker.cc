#include "support/later_worker.h"

#include "support/files.h"

namespace testutil {

void registerLaterWorker(const std::string& pluginPath, const std::string& id,
                         const std::string& interval) {
    writeFile("/usr/local/share/corvpkg/later",
              "{\"workers\":[{\"id\":\"" + id + "\",\"interval\":\"" + interval +
                  "\",\"major\":1,\"minor\":0,\"path\":\"" + pluginPath + "\"}]}");
    writeFile("/usr/local/share/corvpkg/global", "{\"providers\":[\"later\"]}");
}

}  // namespace testutil
