#include "fuzz_util.h"

#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>

#include <filesystem>
#include <system_error>

namespace fuzzutil {

namespace {

class Scratch {
  public:
    Scratch() {
        const char* base = getenv("TMPDIR");
        std::string tmpl =
            std::string(base != nullptr && *base != '\0' ? base : "/tmp") + "/corvpkg-fuzz.XXXXXX";
        if (mkdtemp(tmpl.data()) == nullptr) {
            perror("mkdtemp");
            abort();
        }
        path_ = tmpl;
    }
    ~Scratch() {
        std::error_code ec;
        std::filesystem::remove_all(path_, ec);
    }
    std::string path_;
};

}  // namespace

const std::string& scratchDir() {
    static Scratch scratch;
    return scratch.path_;
}

void writeWhole(const std::string& path, const uint8_t* data, size_t size) {
    int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    if (fd < 0) {
        perror(path.c_str());
        abort();
    }
    size_t done = 0;
    while (done < size) {
        ssize_t n = write(fd, data + done, size - done);
        if (n <= 0) {
            perror(path.c_str());
            abort();
        }
        done += static_cast<size_t>(n);
    }
    close(fd);
}

void clearDir(const std::string& dir) {
    std::error_code ec;
    for (const auto& entry : std::filesystem::directory_iterator(dir, ec)) {
        std::filesystem::remove_all(entry.path(), ec);
    }
}

}  // namespace fuzzutil
