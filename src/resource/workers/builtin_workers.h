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

}  // namespace Resource
}  // namespace CORVPackageTool
