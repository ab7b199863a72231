// The shared enumerations of the package engine: operation types, comparison operators,
// INFO key numbers, message hand-over modes and the result codes of every operation.
#pragma once

#include "corvpkg/visibility.h"

namespace CORVPackageTool {

// The enumerations below have `int` as their fixed type: callers pass any integer they
// were handed (a type 0 trigger, a status script's exit value), and without a fixed type a
// value beyond the enumerators' bit range would be undefined.

// The operation under way; single bits, so a combination has no meaning of its own.
enum PKG_INSTALLATION_TYPE : int {
    PKG_INSTALL = 0x01,
    PKG_UPGRADE = 0x02,
    PKG_UNINSTALL = 0x04,
    PKG_START = 0x08,
    PKG_STOP = 0x10,
    PKG_RESTART = 0x20,
};

// How a version relates to a bound, in comparisons and dependency entries.
enum PKG_VERSION_COMPOP : int {
    PKG_COMPOP_NONE = 0,
    PKG_COMPOP_EQ = 1,  // "="
    PKG_COMPOP_GT = 2,  // ">"
    PKG_COMPOP_LT = 3,  // "<"
    PKG_COMPOP_GE = 4,  // ">="
    PKG_COMPOP_LE = 5,  // "<="
};

// How a start or stop hands worker messages back: kept to the log, stored in the
// manager's "worker_msg" parameter, or stored together with the package's script log.
enum MSG_TYPE : int {
    MSG_TYPE_LOG = 0,
    MSG_TYPE_PARAM = 1,
    MSG_TYPE_PARAM_AND_SCRIPT_LOG = 2,
};

// Numbers of the INFO keys; the key texts are in g_MappingPKGInfoFields.
enum PKG_INFO_TYPE : int {
    PKG_INFO_PACKAGE = 0,
    PKG_INFO_VERSION = 1,
    PKG_INFO_DESCRIPTION = 2,
    PKG_INFO_DISPLAYNAME = 3,
    PKG_INFO_MAINTAINER = 4,
    PKG_INFO_DISTRIBUTOR = 5,
    PKG_INFO_ARCH = 6,
    PKG_INFO_EXCLUDE_ARCH = 7,
    PKG_INFO_MODEL = 8,
    PKG_INFO_ADMINPROTOCOL = 9,
    PKG_INFO_ADMINURL = 10,
    PKG_INFO_ADMINPORT = 11,
    PKG_INFO_FIRMWARE = 12,
    PKG_INFO_NOSUIDIR = 13,
    PKG_INFO_NOSAPPNAME = 14,
    PKG_INFO_CHECKPORT = 15,
    PKG_INFO_STARTABLE = 16,
    PKG_INFO_HELPURL = 17,
    PKG_INFO_INSTALL_REBOOT = 18,
    PKG_INFO_INSTALL_DEP_PACKAGES = 19,
    PKG_INFO_INSTALL_DEP_SERVICES = 20,
    PKG_INFO_INSTUNINST_RESTART_SERVICES = 21,
    PKG_INFO_STARTSTOP_RESTART_SERVICES = 22,
    PKG_INFO_START_DEP_SERVICES = 23,
    PKG_INFO_CHECKSUM = 24,
    PKG_INFO_PACKAGE_ICON = 0x19,
    PKG_INFO_PACKAGE_ICON_256 = 0x1a,
    PKG_INFO_REPORT_URL = 27,
    PKG_INFO_SUPPORT_CENTER = 28,
    PKG_INFO_SUPPORT_URL = 29,
    PKG_INFO_ALLOW_ALTPORT = 30,
    PKG_INFO_EXTRACTSIZE = 31,
    PKG_INFO_INSTALL_CONFLICT_PACKAGES = 32,
    PKG_INFO_DISTRIBUTOR_URL = 34,
    PKG_INFO_MAINTAINER_URL = 35,
    PKG_INFO_SILENT_INSTALL = 36,
    PKG_INFO_SILENT_UPGRADE = 37,
    PKG_INFO_SILENT_UNINSTALL = 38,
    PKG_INFO_INSTALL_TYPE = 39,
    PKG_INFO_PRECHECKSTARTSTOP = 40,
    PKG_INFO_BETA = 41,
    PKG_INFO_OS_MIN_VER = 42,
    PKG_INFO_OS_MAX_VER = 43,
    PKG_INFO_CTL_UNINSTALL = 44,
    PKG_INFO_CTL_STOP = 45,
};

// Info mask: which optional INFO keys a read loads. All ones reads everything.
constexpr unsigned long long PKG_INFO_MASK_ALL = 0xFFFFFFFFFFFFFFFFULL;

// The result of every manager operation. The small values double as exit values of a
// package's status script.
enum PKG_ERRCODE : int {
    PKG_OK = 0,
    PKG_STATUS_EXIT_1 = 1,
    PKG_STATUS_EXIT_2 = 2,
    PKG_STATUS_EXIT_3 = 3,
    PKG_ERR_BROKEN = 150,
    PKG_ERR_NOT_INSTALLED = 255,
    PKG_ERR_NO_STATUS_SCRIPT = 256,
    PKG_ERR_VOLUME_CHECK = 257,
    PKG_ERR_ARCH_MISMATCH = 258,
    PKG_ERR_BELOW_VERSION_LIMIT = 259,
    PKG_ERR_SERVICE_NOT_STARTED = 260,
    PKG_ERR_BAD_ARCHIVE = 261,
    PKG_ERR_NOT_ENABLED = 262,
    PKG_ERR_SYSTEM = 263,
    PKG_ERR_LIMIT_BLOCKED = 264,
    PKG_ERR_LIMIT_PROHIBITED = 265,
    PKG_ERR_LIMIT_OTHER = 266,
    PKG_ERR_DOWNGRADE = 267,
    PKG_ERR_DEPENDENCY = 268,
    PKG_ERR_UPGRADE_BREAKS_DEPENDENT = 269,
    PKG_ERR_ALREADY_INSTALLED = 270,
    PKG_ERR_RESTART_SERVICES = 271,
    PKG_ERR_START_FAILED = 272,
    PKG_ERR_STOP_FAILED = 273,
    PKG_ERR_DEPENDENCY_CYCLE = 274,
    PKG_ERR_LOCKED = 275,
    PKG_ERR_INSTALL_FAILED = 276,
    PKG_ERR_UPGRADE_FAILED = 277,
    PKG_ERR_REPAIR_FAILED = 278,
    PKG_ERR_NO_SPACE = 279,
    PKG_ERR_PLATFORM = 281,
    PKG_ERR_OS_VERSION = 282,
    PKG_ERR_PORT_CONFLICT = 283,
    PKG_ERR_CONFLICT_PACKAGES = 284,
    PKG_ERR_VOLUME_NOT_READY = 285,
    PKG_ERR_SERVICE_MASK = 286,
    PKG_SIGNATURE_OK = 287,
    PKG_ERR_NOT_MAKER_SIGNED = 288,
    PKG_ERR_UNKNOWN_PUBLISHER = 289,
    PKG_ERR_NO_SIGNATURE = 290,
    PKG_ERR_CERT_EXPIRED = 291,
    PKG_ERR_SIGNATURE_BAD = 292,
    PKG_ERR_SIGNATURE_SYSTEM = 293,
    PKG_ERR_ENUMERATION = 294,
    PKG_ERR_SERVER = 295,
    PKG_ERR_NO_USB_VOLUME = 296,
    PKG_ERR_NO_VOLUME = 297,
    PKG_ERR_RESOURCE_RELEASE = 299,
    PKG_ERR_PRESTART_FAILED = 300,
    PKG_ERR_PRESTOP_FAILED = 301,
    PKG_ERR_OS_TOO_NEW = 302,
    PKG_ERR_OS_TOO_OLD = 303,
    PKG_ERR_FILE_ACCESS = 304,
    PKG_ERR_BAD_ANSWERS = 305,
};

// What the closed list says about one result code, for callers that format results.
struct PKG_ERRCODE_INFO {
    int code;
    const char* name;         // "PKG_ERR_BROKEN"
    const char* meaning;      // a short English phrase for logs and the command line
    const char* checkReport;  // message key of an installability report, or null
    const char* installMsg;   // message key of an install message, or null
};

// The entry of `code`, or null for a value outside the closed list (280, 298, ...).
CORVPKG_API const PKG_ERRCODE_INFO* PMSGetErrCodeInfo(int code);

// The OS version this library serves.
constexpr int PKG_OS_MAJOR = 6;
constexpr int PKG_OS_MINOR = 1;
constexpr int PKG_OS_BUILD = 15101;

}  // namespace CORVPackageTool
