// Splitting, growing and shell-quoting of C strings.
#include <stdlib.h>
#include <string.h>

#include <climits>
#include <string>

#include "corv/log.h"
#include "corv/vlibc.h"

namespace {

// Appends the pieces of `text` between characters of `separators`; `keepEmpty` decides
// whether the empty pieces between adjacent separators (and at the ends) count.
int split(const char* text, const char* separators, PVLIBSZLIST* list, bool keepEmpty) {
    if (text == nullptr || separators == nullptr || list == nullptr || *list == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    int count = 0;
    const char* start = text;
    for (;;) {
        size_t len = strcspn(start, separators);
        if (keepEmpty || len > 0) {
            std::string piece(start, len);
            if (VLIBCSzListPush(list, piece.c_str()) != 0) {
                return -1;
            }
            ++count;
        }
        if (start[len] == '\0') {
            break;
        }
        start += len + 1;
    }
    return count;
}

}  // namespace

int VLIBCStrTok(const char* text, const char* separators, PVLIBSZLIST* list) {
    return split(text, separators, list, false);
}

int VLIBCStrSep(const char* text, const char* separators, PVLIBSZLIST* list) {
    return split(text, separators, list, true);
}

int VLIBCStrCat(char** buffer, int* capacity, const char* text) {
    if (buffer == nullptr || capacity == nullptr || text == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (*buffer == nullptr) {
        *capacity = 0;
    }
    const size_t have = *buffer ? strnlen(*buffer, static_cast<size_t>(*capacity)) : 0;
    if (*buffer != nullptr && have >= static_cast<size_t>(*capacity)) {
        // No terminator inside the stated capacity: appending would run past it.
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    const size_t add = strlen(text);
    const size_t need = have + add + 1;
    if (need > static_cast<size_t>(INT_MAX)) {
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return -1;
    }
    if (*buffer == nullptr || need > static_cast<size_t>(*capacity)) {
        // Doubling keeps a long run of small appends linear.
        size_t grown = static_cast<size_t>(*capacity) * 2;
        if (grown < need) {
            grown = need;
        }
        if (grown > static_cast<size_t>(INT_MAX)) {
            grown = need;
        }
        char* bigger = static_cast<char*>(realloc(*buffer, grown));
        if (bigger == nullptr) {
            CORV_LOG_ERR("Failed to grow a buffer to %zu bytes", grown);
            VLIBCErrSet(ERR_OUT_OF_MEMORY);
            return -1;
        }
        if (*buffer == nullptr) {
            bigger[0] = '\0';
        }
        *buffer = bigger;
        *capacity = static_cast<int>(grown);
    }
    memcpy(*buffer + have, text, add + 1);
    return 0;
}

int VLIBCEncShParam(const char* text, char* out, int size) {
    if (text == nullptr || out == nullptr || size <= 0) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    // Inside single quotes a shell takes every byte literally, except the quote itself,
    // which has to close the word, be escaped, and open it again.
    std::string quoted = "'";
    for (const char* p = text; *p != '\0'; ++p) {
        if (*p == '\'') {
            quoted += "'\\''";
        } else {
            quoted += *p;
        }
    }
    quoted += '\'';
    if (quoted.size() >= static_cast<size_t>(size)) {
        VLIBCErrSet(ERR_BUF_TOO_SMALL);
        return -1;
    }
    memcpy(out, quoted.c_str(), quoted.size() + 1);
    return 0;
}
