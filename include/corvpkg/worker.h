// How resource workers come into being and which of them run in a phase.
//
// A worker (CORV::PkgUtils::IWorker, see corv/pkgutils.h) is made by a backend: a factory
// compiled into the library (BuiltinBackend) or a plug-in shared object that another
// package provides (DSOBackend). A WorkerProxy describes one runnable worker - its
// resource id, its span, who provides it - without making it. The catalogue
// (FindRunnableWorkers, FindRunnableWorker) builds proxies from g_BuiltinWorkers and from
// the plug-in providers registered under /usr/local/share/corvpkg/.
//
// Ownership: a proxy owns its backend; a DSOBackend keeps its shared object open. Workers
// made by a proxy do not keep the backend alive, so whoever holds both must let go of the
// workers before the proxies.
//
// Nothing here throws. Failures leave their cause in the platform's error slot.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "corv/pkgutils.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {
namespace Resource {

// A phase of a package's life. The low nibble holds the phases in which resources are
// acquired, the high nibble those in which they are released.
enum TIMING : unsigned int {
    TIMING_PREINST = 0x01,
    TIMING_POSTINST = 0x02,
    TIMING_ENABLE = 0x04,
    TIMING_STARTUP = 0x08,
    TIMING_PREUNINST = 0x10,
    TIMING_POSTUNINST = 0x20,
    TIMING_DISABLE = 0x40,
    TIMING_HALT = 0x80,
};

// The span over which a worker holds its resource: one acquire bit ORed with one release
// bit (0x0012: acquired at postinst, released at preuninst). A worker runs in phase T
// exactly when T & interval is not 0.
typedef unsigned int INTERVAL;

// The phase's word as plug-in manifests spell it ("preinst" ... "halt"); "" for a value
// that is not a single phase bit.
CORVPKG_API const char* TimingWord(unsigned int timing);

// A maker of workers.
class CORVPKG_API IBackend {
  public:
    virtual ~IBackend();
    // Whether CreateWorker can give a worker.
    virtual bool IsReady() const = 0;
    // A new worker, or an empty pointer when none can be made.
    virtual std::shared_ptr<CORV::PkgUtils::IWorker> CreateWorker() const = 0;
};

// A worker factory compiled into the library: it allocates without throwing and gives
// the new worker or null.
typedef CORV::PkgUtils::IWorker* (*WorkerFactory)();

class BuiltinBackendPrivate;
class CORVPKG_API BuiltinBackend : public IBackend {
  public:
    // Never fails; a null factory makes a backend that is not ready.
    explicit BuiltinBackend(WorkerFactory factory);
    ~BuiltinBackend() override;
    bool IsReady() const override;
    // The factory's worker, deleted with the ordinary deleter.
    std::shared_ptr<CORV::PkgUtils::IWorker> CreateWorker() const override;

  private:
    std::shared_ptr<BuiltinBackendPrivate> d;
};

// A plug-in: a shared object exporting "CORVPkgUtilsPluginWorkerInit" (IWorker* (*)())
// and "CORVPkgUtilsPluginWorkerFree" (destroys what Init gave).
class DSOBackendPrivate;
class CORVPKG_API DSOBackend : public IBackend {
  public:
    // Opens `path` and looks both symbols up. Never fails outwardly: when something is
    // wrong the backend is not ready and the cause is in the error slot (0x0D00 empty
    // path, 0x0900 the object cannot be opened, 0x2000 a symbol is missing). The object
    // stays open while the backend lives.
    explicit DSOBackend(const std::string& path);
    ~DSOBackend() override;
    bool IsReady() const override;
    // Init's worker, destroyed by the plug-in's Free function, never by delete.
    std::shared_ptr<CORV::PkgUtils::IWorker> CreateWorker() const override;
    const std::string& GetPath() const;

  private:
    std::shared_ptr<DSOBackendPrivate> d;
};

// One runnable worker, described without making it.
class WorkerProxyPrivate;
class CORVPKG_API WorkerProxy {
  public:
    // Takes ownership of `backend` (which may be null: such a proxy makes no worker). A
    // new proxy has an empty id, interval 0 and provider "NOS".
    explicit WorkerProxy(IBackend* backend);
    ~WorkerProxy();
    WorkerProxy(const WorkerProxy&) = delete;
    WorkerProxy& operator=(const WorkerProxy&) = delete;

    const std::string& GetResourceID() const;
    void SetResourceID(const std::string& id);
    INTERVAL GetInterval() const;
    void SetInterval(INTERVAL interval);
    // "NOS" for what is compiled into the system, else the providing package's name.
    const std::string& GetProvider() const;
    void SetProvider(const std::string& provider);

    // A new worker from the backend; an empty pointer when none could be made.
    std::shared_ptr<CORV::PkgUtils::IWorker> CreateInstance() const;

  private:
    std::unique_ptr<WorkerProxyPrivate> d;
};

// One row of the table of built-in workers.
struct BuiltinWorker {
    const char* id;
    unsigned int interval;
    WorkerFactory factory;
};

// The built-in workers in running order (acquire in table order, release in reverse),
// ended by a row with a null id. Fixed at load.
CORVPKG_API extern const BuiltinWorker g_BuiltinWorkers[];

// Where plug-in providers are registered: "global" lists the providing packages, and a
// file named after each package lists its workers.
constexpr const char kProviderDir[] = "/usr/local/share/corvpkg";

// Builds a list of proxies: built-in rows first, then plug-ins, where a plug-in can't take
// an id that a built-in row of the list has, and a later plug-in of an id takes the place
// of the earlier one.
class CORVPKG_API Collector {
  public:
    // Empties `target`, which must outlive the collector.
    explicit Collector(std::vector<std::shared_ptr<WorkerProxy>>& target);
    // On true the list owns the proxy; on false (null proxy: 0x0D00) the caller keeps it.
    bool AddBuiltinWorker(WorkerProxy* proxy);
    // On true the list owns the proxy; on false the caller keeps it: null (0x0D00), or an
    // id that a built-in row of the list serves (0x2100).
    bool AddPluginWorker(WorkerProxy* proxy);

  private:
    std::vector<std::shared_ptr<WorkerProxy>>& target;
    unsigned int builtinCount;
    std::map<std::string, unsigned int> indexById;
};

// All workers that run in phase `timing`, in running order, in `out`. False when the
// provider list can't be read (logged); `out` then holds the built-ins alone. A bad
// provider file or worker entry costs only itself.
CORVPKG_API bool FindRunnableWorkers(TIMING timing, std::vector<std::shared_ptr<WorkerProxy>>& out);
// The one worker that serves `id`, whatever the phase: the first built-in row of the id,
// else the latest registered plug-in. The caller owns the result; null when there is none
// (0x0D00 for an empty id).
CORVPKG_API WorkerProxy* FindRunnableWorker(const std::string& id);

}  // namespace Resource
}  // namespace CORVPackageTool
