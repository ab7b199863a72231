// An owner of a platform string list, for the platform's own sources.
#pragma once

#include "corv/vlibc.h"

namespace corvplat {

class SzListHolder {
  public:
    explicit SzListHolder(int capacity) : list_(VLIBCSzListAlloc(capacity)) {}
    ~SzListHolder() { VLIBCSzListFree(list_); }
    SzListHolder(const SzListHolder&) = delete;
    SzListHolder& operator=(const SzListHolder&) = delete;

    explicit operator bool() const { return list_ != nullptr; }
    PVLIBSZLIST get() const { return list_; }
    // For the calls that may replace the list while growing it.
    PVLIBSZLIST* addr() { return &list_; }

  private:
    PVLIBSZLIST list_;
};

}  // namespace corvplat
