// The thread's last platform error.
#include <string.h>

#include "corv/vlibc.h"

namespace {

// The file name is copied: a caller may hand over a buffer that does not outlive the call.
struct ErrorSlot {
    int code = 0;
    int line = 0;
    char file[256] = "";
};

thread_local ErrorSlot t_slot;

}  // namespace

void VLIBCErrSetEx(int code, const char* file, int line) {
    t_slot.code = code;
    t_slot.line = line;
    if (file == nullptr) {
        t_slot.file[0] = '\0';
        return;
    }
    // Keep the tail of an over-long path: the base name is what locates the failure.
    size_t len = strlen(file);
    if (len >= sizeof(t_slot.file)) {
        file += len - (sizeof(t_slot.file) - 1);
    }
    strncpy(t_slot.file, file, sizeof(t_slot.file) - 1);
    t_slot.file[sizeof(t_slot.file) - 1] = '\0';
}

int VLIBCErrGet() {
    return t_slot.code;
}

const char* VLIBCErrorGetFile() {
    return t_slot.file;
}

int VLIBCErrorGetLine() {
    return t_slot.line;
}
