// Volumes of the reference platform: the mount points /volume<N> of the machine.
//
// A volume is ready when it is a mounted, writable directory; a volume mounted read-only
// counts as crashed. Free bytes are what statvfs gives an unprivileged writer
// (f_bavail * f_frsize). Every volume of the reference platform is of kind
// CORV_VOL_KIND_INTERNAL, or CORV_VOL_KIND_USB on a small-box model (VLIBCIsDockette).
#pragma once

#include <sys/types.h>

enum {
    CORV_VOL_KIND_INTERNAL = 0x01,
    CORV_VOL_KIND_ISCSI = 0x02,
    CORV_VOL_KIND_USB = 0x04,
    CORV_VOL_KIND_ESATA = 0x08,
    CORV_VOL_KIND_SSD = 0x40,
};

struct CORVMOUNTVOLINFO {
    int kind;
    char szMountPath[4096];
    unsigned long long freeBytes;
    int ready;     // 1: mounted, writable
    int readOnly;  // 1: mounted read-only (a crashed volume)
    CORVMOUNTVOLINFO* next;
};

// The record of the volume mounted at `volume` ("/volume1"). 0, or -1 with
// ERR_KEY_NOT_FOUND (0x0600) when there is no such volume.
int CORVMountVolInfoGet(const char* volume, CORVMOUNTVOLINFO* info);
// A list of the volumes whose kind is in `kinds`, in volume number order; null when there
// is none or on failure. Freed with CORVMountVolInfoFree.
CORVMOUNTVOLINFO* CORVMountVolAllEnum(const char* reserved, int kinds, void* reserved2);
void CORVMountVolInfoFree(CORVMOUNTVOLINFO* list);

enum {
    CORV_VOL_AVAIL_EXISTS = 0x1,     // at least one volume exists
    CORV_VOL_AVAIL_TOO_SMALL = 0x4,  // ready volumes exist, none with `size` free
};
// Picks the first ready volume with at least `size` bytes free: 1 and `info` filled.
// 0 when there is none, with `*flags` as above and `info` the first volume found (which
// may be not ready); -1 on failure.
int VolumeAvailGet(unsigned long long size, CORVMOUNTVOLINFO* info, int* flags, int reserved);

// The temporary folder of a volume, "<volume>/@tmp". 0, or -1 (ERR_BUF_TOO_SMALL,
// ERR_BAD_PARAMETERS).
int CORVShareTmpPathGet(const char* volumePath, char* buffer, int size);
// The volume part of a path: "/volume12/@appstore/x" gives "/volume12". `buffer` must hold
// 4096 bytes. 0, or -1 with ERR_BAD_PARAMETERS when the path is on no volume.
int VolumePathParseEx(const char* path, char* buffer);

// The state of the file system behind a volume.
enum {
    CORV_FS_STATE_CRASHED = 0x2,  // mounted read-only: the volume has failed
};
struct CORVFSINFO {
    char szMountPath[4096];
    int state;  // CORV_FS_STATE_* bits
    unsigned long long freeBytes;
};
// The file system of the volume mounted at `volume`. 1 with `*info` allocated (free it with
// FSInfoFree), 0 when no volume is mounted there, -1 on failure.
int FSInfoGet(const char* volume, CORVFSINFO** info);
void FSInfoFree(CORVFSINFO* info);
