// A temporary directory removed with everything in it when the object goes away.
#pragma once

#include <stdlib.h>

#include <filesystem>
#include <string>
#include <system_error>

class TempDir {
  public:
    TempDir() {
        char tmpl[] = "/tmp/corvpkg-test.XXXXXX";
        const char* made = mkdtemp(tmpl);
        path_ = made ? made : "";
    }
    ~TempDir() {
        std::error_code ec;  // a leftover temporary directory is harmless
        if (!path_.empty())
            std::filesystem::remove_all(path_, ec);
    }
    TempDir(const TempDir&) = delete;
    TempDir& operator=(const TempDir&) = delete;
    const std::string& path() const { return path_; }

  private:
    std::string path_;
};
