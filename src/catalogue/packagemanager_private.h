// The state behind a PackageManager, for the sources that implement its operations.
#pragma once

#include <json/json.h>

#include <map>
#include <string>

#include "corvpkg/packagemanager.h"
#include "corvpkg/pkginfo.h"
#include "corvpkg/pkgtypes.h"

namespace CORVPackageTool {

class PackageManagerPrivate {
  public:
    PKG_ERRCODE result = PKG_OK;
    Json::Value resultData;
    unsigned int intParam = 0;
    std::map<std::string, std::string> params;
    // The package the manager describes: what the last lifecycle operation worked on.
    PackageInfo packageInfo;
    bool checksumWhileUnpacking = false;
};

}  // namespace CORVPackageTool
