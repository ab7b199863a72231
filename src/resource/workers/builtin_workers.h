// Factories of the workers compiled into the library, for the rows of g_BuiltinWorkers.
#pragma once

#include "corv/pkgutils.h"

namespace CORVPackageTool {
namespace Resource {

CORV::PkgUtils::IWorker* NewServiceCfg();
CORV::PkgUtils::IWorker* NewCrontabJob();
CORV::PkgUtils::IWorker* NewCorvCrond();
CORV::PkgUtils::IWorker* NewPgsqlDB();
CORV::PkgUtils::IWorker* NewWebConfig();
CORV::PkgUtils::IWorker* NewWebConfigUserData();
CORV::PkgUtils::IWorker* NewCspRule();
CORV::PkgUtils::IWorker* NewCertConfig();
CORV::PkgUtils::IWorker* NewWebAPIDesc();
CORV::PkgUtils::IWorker* NewWebAPIDescDaemon();
CORV::PkgUtils::IWorker* NewPAMConfig();
CORV::PkgUtils::IWorker* NewSyslogConfig();
CORV::PkgUtils::IWorker* NewSysnotify();
CORV::PkgUtils::IWorker* NewSDKPlugin();
CORV::PkgUtils::IWorker* NewDataShareRecorder();
CORV::PkgUtils::IWorker* NewDataShare();
CORV::PkgUtils::IWorker* NewPortConfig();
CORV::PkgUtils::IWorker* NewWorkerPlugin();
CORV::PkgUtils::IWorker* NewUsrLocalLinker();
CORV::PkgUtils::IWorker* NewIndexDB();
CORV::PkgUtils::IWorker* NewUserDataCollector();
CORV::PkgUtils::IWorker* NewPowerOffConfig();
CORV::PkgUtils::IWorker* NewFeasibilityConfig();
CORV::PkgUtils::IWorker* NewBackupBackend();
CORV::PkgUtils::IWorker* NewMediaIndex();
CORV::PkgUtils::IWorker* NewMediaIndexInfo();
CORV::PkgUtils::IWorker* NewSelfCheck();

}  // namespace Resource
}  // namespace CORVPackageTool
