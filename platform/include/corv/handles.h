// Owners of the C library's directory and file streams, closed on every way out of a scope.
#pragma once

#include <dirent.h>
#include <stdio.h>

#include <memory>

struct CORVDirCloser {
    void operator()(DIR* dir) const {
        if (dir != nullptr) {
            closedir(dir);
        }
    }
};
struct CORVFileCloser {
    void operator()(FILE* file) const {
        if (file != nullptr) {
            fclose(file);
        }
    }
};

using CORVUniqueDir = std::unique_ptr<DIR, CORVDirCloser>;
// A stream whose close result matters (written data) is closed with fclose(release()).
using CORVUniqueFile = std::unique_ptr<FILE, CORVFileCloser>;
