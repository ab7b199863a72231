// A worker that does nothing and succeeds, for tests of the catalogue and the proxies.
#pragma once

#include "corv/pkgutils.h"

namespace testutil {

class NoopWorker : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo&, const Json::Value&, Json::Value&,
                CORV::PkgUtils::WorkerResp&) override {
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo&, const Json::Value&, Json::Value&,
                 CORV::PkgUtils::WorkerResp&) override {
        return 0;
    }
    int Release(const CORV::PkgUtils::ActionInfo&, const Json::Value&, Json::Value&,
                CORV::PkgUtils::WorkerResp&) override {
        return 0;
    }
};

inline CORV::PkgUtils::IWorker* makeNoopWorker() {
    return new NoopWorker();
}

}  // namespace testutil
