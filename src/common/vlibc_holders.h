// Owners of the platform's lists and hashes, so that every return path frees them.
#pragma once

#include "corv/vlibc.h"

namespace CORVPackageTool {

class SzList {
  public:
    explicit SzList(int capacity) : list_(VLIBCSzListAlloc(capacity)) {}
    ~SzList() { VLIBCSzListFree(list_); }
    SzList(const SzList&) = delete;
    SzList& operator=(const SzList&) = delete;

    explicit operator bool() const { return list_ != nullptr; }
    PVLIBSZLIST get() const { return list_; }
    // For the calls that may replace the list while growing it.
    PVLIBSZLIST* addr() { return &list_; }

  private:
    PVLIBSZLIST list_;
};

class SzHash {
  public:
    explicit SzHash(int capacity) : hash_(VLIBCSzHashAlloc(capacity)) {}
    ~SzHash() { VLIBCSzHashFree(hash_); }
    SzHash(const SzHash&) = delete;
    SzHash& operator=(const SzHash&) = delete;

    explicit operator bool() const { return hash_ != nullptr; }
    PVLIBSZHASH get() const { return hash_; }
    PVLIBSZHASH* addr() { return &hash_; }

  private:
    PVLIBSZHASH hash_;
};

}  // namespace CORVPackageTool
