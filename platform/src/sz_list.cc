// String lists: owned copies of C strings, in push order.
#include <strings.h>

#include <new>

#include "corv/log.h"
#include "corv/vlibc.h"

namespace {

// Lists are sized by hints from callers that often ask for far more than they use;
// reserving a little keeps small lists cheap without trusting the hint.
constexpr int kMaxReserve = 64;

bool validIndex(PVLIBSZLIST list, int index) {
    return list != nullptr && index >= 0 && static_cast<size_t>(index) < list->items.size();
}

}  // namespace

PVLIBSZLIST VLIBCSzListAlloc(int capacity) {
    auto* list = new (std::nothrow) VLIBSZLIST;
    if (list == nullptr) {
        CORV_LOG_ERR("Failed to allocate a list");
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return nullptr;
    }
    try {
        list->items.reserve(capacity < kMaxReserve ? (capacity > 0 ? capacity : 0) : kMaxReserve);
    } catch (const std::bad_alloc&) {
        // The list works without the reservation.
    }
    return list;
}

void VLIBCSzListFree(PVLIBSZLIST list) {
    delete list;
}

int VLIBCSzListPush(PVLIBSZLIST* list, const char* item) {
    if (list == nullptr || *list == nullptr || item == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    try {
        (*list)->items.emplace_back(item);
    } catch (const std::bad_alloc&) {
        CORV_LOG_ERR("Failed to grow a list of %zu items", (*list)->items.size());
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return -1;
    }
    return 0;
}

const char* VLIBCSzListGet(PVLIBSZLIST list, int index) {
    if (!validIndex(list, index)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return nullptr;
    }
    return list->items[static_cast<size_t>(index)].c_str();
}

int VLIBCSzListCount(PVLIBSZLIST list) {
    if (list == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    return static_cast<int>(list->items.size());
}

int VLIBCSzListFind(PVLIBSZLIST list, const char* item) {
    if (list == nullptr || item == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    for (size_t i = 0; i < list->items.size(); ++i) {
        if (list->items[i] == item) {
            return static_cast<int>(i);
        }
    }
    return -1;
}

int VLIBCSzListCaseFind(PVLIBSZLIST list, const char* item) {
    if (list == nullptr || item == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    for (size_t i = 0; i < list->items.size(); ++i) {
        if (strcasecmp(list->items[i].c_str(), item) == 0) {
            return static_cast<int>(i);
        }
    }
    return -1;
}

int VLIBCSzListRemove(PVLIBSZLIST list, int index) {
    if (!validIndex(list, index)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    list->items.erase(list->items.begin() + index);
    return 0;
}

void VLIBCSzListRemoveAll(PVLIBSZLIST list) {
    if (list != nullptr) {
        list->items.clear();
    }
}
