// A package downloaded from a store by the command line: under its task record, with a
// progress bar on a terminal, the folder and the record removed again when it goes.
#pragma once

#include <memory>
#include <string>

#include "corvpkg/pkginfo.h"

namespace NOS {
class Task;
}

namespace cli {

class StoreDownload {
  public:
    StoreDownload() = default;
    ~StoreDownload();
    StoreDownload(const StoreDownload&) = delete;
    StoreDownload& operator=(const StoreDownload&) = delete;

    // Downloads the store entry `entry` (link, size, md5). False with `error` in words:
    // another download or install of the package is under way, the transfer failed, the
    // checksum or the file is bad, or it was canceled.
    bool fetch(const CORVPackageTool::PackageInfo& entry, const std::string& language,
               std::string& error);
    const std::string& path() const { return path_; }
    // Whether it ended because of "corvpkg cancel" (SIGTERM, the record removed).
    bool canceled() const { return canceled_; }

  private:
    std::unique_ptr<NOS::Task> task_;
    std::string folder_;
    std::string path_;
    bool canceled_ = false;
};

// The store entry of `name`: the maker store's, else the feeds'. `source` is "maker" or
// the feed's URL. False with `error` in words.
bool findStoreEntry(const std::string& name, const std::string& language,
                    CORVPackageTool::PackageInfo& entry, std::string& source, std::string& error);

}  // namespace cli
