// Text hashes: keys to values, enumerated in byte order of the keys.
#include <new>

#include "corv/log.h"
#include "corv/vlibc.h"

PVLIBSZHASH VLIBCSzHashAlloc(int) {
    // An ordered map has no use for a capacity hint.
    auto* hash = new (std::nothrow) VLIBSZHASH;
    if (hash == nullptr) {
        CORV_LOG_ERR("Failed to allocate a hash");
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
    }
    return hash;
}

void VLIBCSzHashFree(PVLIBSZHASH hash) {
    delete hash;
}

int VLIBCSzHashSetValue(PVLIBSZHASH* hash, const char* key, const char* value) {
    if (hash == nullptr || *hash == nullptr || key == nullptr || value == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    try {
        (*hash)->values[key] = value;
    } catch (const std::bad_alloc&) {
        CORV_LOG_ERR("Failed to set hash key %s", key);
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return -1;
    }
    return 0;
}

const char* VLIBCSzHashGetValue(PVLIBSZHASH hash, const char* key) {
    if (hash == nullptr || key == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return nullptr;
    }
    // A missing key is an answer, not a failure: the slot keeps the caller's last error.
    auto it = hash->values.find(key);
    return it == hash->values.end() ? nullptr : it->second.c_str();
}

int VLIBCSzHashRemoveKey(PVLIBSZHASH hash, const char* key) {
    if (hash == nullptr || key == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (hash->values.erase(key) == 0) {
        VLIBCErrSet(ERR_KEY_NOT_FOUND);
        return -1;
    }
    return 0;
}

int VLIBCSzHashEnumKey(PVLIBSZHASH hash, PVLIBSZLIST* keys) {
    if (hash == nullptr || keys == nullptr || *keys == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    for (const auto& entry : hash->values) {
        if (VLIBCSzListPush(keys, entry.first.c_str()) != 0) {
            return -1;
        }
    }
    return static_cast<int>(hash->values.size());
}

int VLIBCSzHashCount(PVLIBSZHASH hash) {
    if (hash == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    return static_cast<int>(hash->values.size());
}

void VLIBCHashRemoveAll(PVLIBSZHASH hash) {
    if (hash != nullptr) {
        hash->values.clear();
    }
}
