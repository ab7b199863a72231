// Volumes are the machine's real mount points named /volume<N>.
#include "corv/volume.h"
#include "corv/handles.h"

#include <ctype.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <string>
#include <vector>

#include "corv/vlibc.h"

namespace {

// "/volume<digits>" exactly, and its number.
bool isVolumeName(const std::string& path, long* number) {
    static const char kPrefix[] = "/volume";
    const size_t n = sizeof(kPrefix) - 1;
    if (path.compare(0, n, kPrefix) != 0 || path.size() == n) {
        return false;
    }
    for (size_t i = n; i < path.size(); ++i) {
        if (!isdigit(static_cast<unsigned char>(path[i]))) {
            return false;
        }
    }
    if (number) {
        *number = strtol(path.c_str() + n, nullptr, 10);
    }
    return true;
}

struct MountEntry {
    long number;
    std::string path;
    bool readOnly;
};

// Mount points as the kernel lists them; the last mount of a path is the visible one.
std::vector<MountEntry> volumeMounts() {
    std::vector<MountEntry> found;
    CORVUniqueFile f{fopen("/proc/self/mounts", "re")};
    if (!f) {
        return found;
    }
    char line[8192];
    while (fgets(line, sizeof(line), f.get()) != nullptr) {
        char device[4096], mountPoint[4096], type[256], options[2048];
        if (sscanf(line, "%4095s %4095s %255s %2047s", device, mountPoint, type, options) != 4) {
            continue;
        }
        long number = 0;
        if (!isVolumeName(mountPoint, &number)) {
            continue;
        }
        bool readOnly = strncmp(options, "ro", 2) == 0 && (options[2] == ',' || options[2] == 0);
        found.erase(std::remove_if(found.begin(), found.end(),
                                   [&](const MountEntry& e) { return e.path == mountPoint; }),
                    found.end());
        found.push_back({number, mountPoint, readOnly});
    }
    std::sort(found.begin(), found.end(),
              [](const MountEntry& a, const MountEntry& b) { return a.number < b.number; });
    return found;
}

void fillInfo(const MountEntry& mount, CORVMOUNTVOLINFO* info) {
    memset(info, 0, sizeof(*info));
    // A small-box model has no internal disks: what it mounts are external drives.
    info->kind = VLIBCIsDockette() ? CORV_VOL_KIND_USB : CORV_VOL_KIND_INTERNAL;
    snprintf(info->szMountPath, sizeof(info->szMountPath), "%s", mount.path.c_str());
    info->readOnly = mount.readOnly ? 1 : 0;
    struct statvfs st {};
    if (statvfs(mount.path.c_str(), &st) == 0) {
        info->freeBytes = static_cast<unsigned long long>(st.f_bavail) * st.f_frsize;
        bool writable = (st.f_flag & ST_RDONLY) == 0 && access(mount.path.c_str(), W_OK) == 0;
        info->ready = (!mount.readOnly && writable) ? 1 : 0;
    }
}

}  // namespace

int CORVMountVolInfoGet(const char* volume, CORVMOUNTVOLINFO* info) {
    if (volume == nullptr || info == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::string wanted(volume);
    while (wanted.size() > 1 && wanted.back() == '/') {
        wanted.pop_back();
    }
    for (const MountEntry& mount : volumeMounts()) {
        if (mount.path == wanted) {
            fillInfo(mount, info);
            return 0;
        }
    }
    VLIBCErrSet(ERR_KEY_NOT_FOUND);
    return -1;
}

CORVMOUNTVOLINFO* CORVMountVolAllEnum(const char*, int kinds, void*) {
    CORVMOUNTVOLINFO* head = nullptr;
    CORVMOUNTVOLINFO** tail = &head;
    for (const MountEntry& mount : volumeMounts()) {
        auto* info = static_cast<CORVMOUNTVOLINFO*>(calloc(1, sizeof(CORVMOUNTVOLINFO)));
        if (info == nullptr) {
            VLIBCErrSet(ERR_OUT_OF_MEMORY);
            CORVMountVolInfoFree(head);
            return nullptr;
        }
        fillInfo(mount, info);
        if ((info->kind & kinds) == 0) {
            free(info);
            continue;
        }
        *tail = info;
        tail = &info->next;
    }
    return head;
}

void CORVMountVolInfoFree(CORVMOUNTVOLINFO* list) {
    while (list != nullptr) {
        CORVMOUNTVOLINFO* next = list->next;
        free(list);
        list = next;
    }
}

int VolumeAvailGet(unsigned long long size, CORVMOUNTVOLINFO* info, int* flags, int) {
    if (info == nullptr || flags == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    *flags = 0;
    memset(info, 0, sizeof(*info));
    std::vector<MountEntry> mounts = volumeMounts();
    bool first = true;
    for (const MountEntry& mount : mounts) {
        CORVMOUNTVOLINFO candidate;
        fillInfo(mount, &candidate);
        *flags |= CORV_VOL_AVAIL_EXISTS;
        if (first) {
            *info = candidate;
            first = false;
        }
        if (!candidate.ready) {
            continue;
        }
        if (candidate.freeBytes >= size) {
            *info = candidate;
            return 1;
        }
        *flags |= CORV_VOL_AVAIL_TOO_SMALL;
        *info = candidate;
    }
    return 0;
}

int CORVShareTmpPathGet(const char* volumePath, char* buffer, int size) {
    if (volumePath == nullptr || buffer == nullptr || size <= 0 || volumePath[0] != '/') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    int n = snprintf(buffer, static_cast<size_t>(size), "%s/@tmp", volumePath);
    if (n < 0 || n >= size) {
        VLIBCErrSet(ERR_BUF_TOO_SMALL);
        return -1;
    }
    return 0;
}

int VolumePathParseEx(const char* path, char* buffer) {
    if (path == nullptr || buffer == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::string text(path);
    size_t end = text.find('/', 1);
    std::string volume = text.substr(0, end);
    if (!isVolumeName(volume, nullptr) || volume.size() >= 4096) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    snprintf(buffer, 4096, "%s", volume.c_str());
    return 0;
}

int FSInfoGet(const char* volume, CORVFSINFO** info) {
    if (volume == nullptr || info == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    *info = nullptr;
    CORVMOUNTVOLINFO vol;
    if (CORVMountVolInfoGet(volume, &vol) < 0) {
        return 0;
    }
    auto* fs = static_cast<CORVFSINFO*>(calloc(1, sizeof(CORVFSINFO)));
    if (fs == nullptr) {
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return -1;
    }
    snprintf(fs->szMountPath, sizeof(fs->szMountPath), "%s", vol.szMountPath);
    fs->state = vol.readOnly ? CORV_FS_STATE_CRASHED : 0;
    fs->freeBytes = vol.freeBytes;
    *info = fs;
    return 1;
}

void FSInfoFree(CORVFSINFO* info) {
    free(info);
}
