// The appliance's core library, as the reference platform provides it on plain Linux.
//
// Conventions of every function here:
// - A failure returns a negative number (or null) and leaves its cause in the calling
//   thread's error slot (VLIBCErrSetEx), read with VLIBCErrGet/VLIBCErrorGetFile/Line.
// - Nothing throws. Paths are plain NUL-terminated strings.
// - Lists and hashes are owned by the caller that allocated them and released with the
//   matching Free; a function that takes `PVLIBSZLIST*` may grow the list in place.
#pragma once

#include <stdio.h>
#include <sys/types.h>

#include <map>
#include <string>
#include <vector>

// ---------------------------------------------------------------------------------------
// Error codes of the platform's error slot.
enum {
    ERR_BUF_TOO_SMALL = 0x0100,
    ERR_OUT_OF_MEMORY = 0x0200,
    ERR_KEY_NOT_FOUND = 0x0600,
    ERR_NO_SUCH_FILE = 0x0700,
    ERR_OPEN_FAILED = 0x0900,
    ERR_READ_FAILED = 0x0A00,
    ERR_WRITE_FAILED = 0x0B00,
    ERR_CREATE_FAILED = 0x0C00,
    ERR_BAD_PARAMETERS = 0x0D00,
    ERR_NO_SUCH_GROUP = 0x1800,
    ERR_NO_SUCH_USER = 0x1D00,
    ERR_STAT_FAILED = 0x2700,
    ERR_RENAME_FAILED = 0x2800,
    ERR_NO_SPACE = 0x2900,
    ERR_CHOWN_FAILED = 0x2A00,
    ERR_UNLINK_FAILED = 0x3900,
    ERR_COPY_FAILED = 0x3B00,
    ERR_MKDIR_FAILED = 0x3C00,
    ERR_MALFORMED = 0x4000,
    ERR_TIMEOUT = 0x4100,
    ERR_IS_DIRECTORY = 0xA200,
    ERR_OUTSIDE_PACKAGE = 0xBE00,
    ERR_NOT_APPLICABLE = 0xD900,
    ERR_NOT_SYMLINK = 0xE200,
};

// The thread's last platform error. VLIBCErrSetEx records code, source file and line;
// a later call overwrites them. Before any error, VLIBCErrGet gives 0, the file "" and
// the line 0.
void VLIBCErrSetEx(int code, const char* file, int line);
int VLIBCErrGet();
const char* VLIBCErrorGetFile();
int VLIBCErrorGetLine();
#define VLIBCErrSet(code) VLIBCErrSetEx((code), __FILE__, __LINE__)

// ---------------------------------------------------------------------------------------
// String lists. Items are copies; VLIBCSzListGet of a position past the end gives null.
// The capacity given at allocation is a hint: a list grows as items are pushed.
struct VLIBSZLIST {
    std::vector<std::string> items;
};
typedef VLIBSZLIST* PVLIBSZLIST;

PVLIBSZLIST VLIBCSzListAlloc(int capacity);
void VLIBCSzListFree(PVLIBSZLIST list);
int VLIBCSzListPush(PVLIBSZLIST* list, const char* item);  // 0, or -1 (null item)
const char* VLIBCSzListGet(PVLIBSZLIST list, int index);   // null past the end
int VLIBCSzListCount(PVLIBSZLIST list);
int VLIBCSzListFind(PVLIBSZLIST list, const char* item);      // index, or -1
int VLIBCSzListCaseFind(PVLIBSZLIST list, const char* item);  // the same, ignoring case
int VLIBCSzListRemove(PVLIBSZLIST list, int index);           // 0, or -1 out of range
void VLIBCSzListRemoveAll(PVLIBSZLIST list);

// Text hashes: key to value, keys compared exactly. Setting an existing key replaces
// its value. Enumeration order is ascending byte order of the keys.
struct VLIBSZHASH {
    std::map<std::string, std::string> values;
};
typedef VLIBSZHASH* PVLIBSZHASH;

PVLIBSZHASH VLIBCSzHashAlloc(int capacity);
void VLIBCSzHashFree(PVLIBSZHASH hash);
int VLIBCSzHashSetValue(PVLIBSZHASH* hash, const char* key, const char* value);  // 0 or -1
const char* VLIBCSzHashGetValue(PVLIBSZHASH hash, const char* key);  // null when missing
int VLIBCSzHashRemoveKey(PVLIBSZHASH hash, const char* key);         // 0, or -1 when missing
int VLIBCSzHashEnumKey(PVLIBSZHASH hash, PVLIBSZLIST* keys);         // appends; count or -1
int VLIBCSzHashCount(PVLIBSZHASH hash);
void VLIBCHashRemoveAll(PVLIBSZHASH hash);

// Splits `text` at any character of `separators` and appends the pieces to `*list`.
// VLIBCStrTok drops empty pieces (runs of separators count as one, and an empty text
// gives no piece); VLIBCStrSep keeps them, so "a,,b" gives "a", "", "b".
// Both return the number of pieces appended, or -1.
int VLIBCStrTok(const char* text, const char* separators, PVLIBSZLIST* list);
int VLIBCStrSep(const char* text, const char* separators, PVLIBSZLIST* list);

// Appends `text` to the malloc'ed, NUL-terminated `*buffer` whose allocated size is
// `*capacity`, reallocating both as needed. A null `*buffer` is allocated. 0, or -1.
int VLIBCStrCat(char** buffer, int* capacity, const char* text);

// Quotes `text` for a POSIX shell: the result, written into `out` (size `size`), is one
// single-quoted word. -1 (ERR_BUF_TOO_SMALL) when it does not fit.
int VLIBCEncShParam(const char* text, char* out, int size);

// ---------------------------------------------------------------------------------------
// Key-value files ("INFO" form).
//
// Format: one `key=value` per line. Blanks around the key and the value are dropped; a
// value wrapped in double quotes loses the two quotes (no escapes inside). Lines whose
// first non-blank character is '#', blank lines and lines without the separator are
// passed over. Of duplicate keys the LAST one counts, as when the file is sourced by a
// shell. Lines end at '\n'; a '\r' before it is dropped; a NUL byte ends the line's text.
// Files larger than VLIBC_KV_MAX_FILE are refused (ERR_READ_FAILED): nothing legitimate
// is that large, and the readers load the whole file at once.
//
// Section files add lines `[name]`; keys before the first section belong to none and are
// not visible through the section calls. A section that appears twice is one section.
enum { VLIBC_KV_MAX_FILE = 16 * 1024 * 1024 };

// The value of `key` into `buffer` (cut to `size` - 1 bytes). Returns the length written,
// 0 when the key is missing, -1 when the file cannot be read.
int VLIBCFileGetKeyValue(const char* path, const char* key, char* buffer, int size,
                         int flags);
// Reads every key named in `keys` that the file has into `*hash` (existing entries of the
// hash stay unless the file has the key). Returns the number of keys found, or -1.
int VLIBCFileGetKeys(const char* path, PVLIBSZLIST keys, PVLIBSZHASH* hash,
                     const char* separator);
// Writes `key` with `value`, formatted by `format` ("%s=\"%s\"\n" when null), in place of
// the key's lines, or appended when the key is new. The file is created when missing and
// replaced through a temporary file and rename. 0, or -1.
int VLIBCFileSetKeyValue(const char* path, const char* key, const char* value,
                         const char* format);
// Removes every line of `key`. 0 (also when the key was absent), or -1.
int VLIBCFileRemoveKey(const char* path, const char* key);
// All key/value pairs of a file into `*hash`. Count, or -1.
int VLIBCFileGetPair(const char* path, PVLIBSZHASH* hash);
// Writes all pairs of `hash` as `key="value"` lines, replacing the file. 0, or -1.
int VLIBCFileSetPair(const char* path, PVLIBSZHASH hash, int flags);
// Appends one line (a newline is added when `text` lacks one). 0, or -1.
int VLIBCFileAddLine(const char* path, int flags, const char* text, int reserved);

// Section names in file order, appended to `*list`. Count, or -1.
int VLIBCFileEnumSection(const char* path, PVLIBSZLIST* list);
// The keys of one section into `*hash`. Number of fields, or -1 (also for a missing section).
int VLIBCFileGetSection(const char* path, const char* section, PVLIBSZHASH* hash);

// The system configuration /etc/corvinfo.conf.
#define VLIBC_INFO_PATH "/etc/corvinfo.conf"
#define VLIBC_INFO_DEFAULTS_PATH "/etc.defaults/corvinfo.conf"
int VLIBCINFOSetKeyValue(const char* key, const char* value);  // 0, or -1
int VLIBCINFORemoveKey(const char* key);                       // 0, or -1

// ---------------------------------------------------------------------------------------
// Files and directories.
int VLIBCFileExist(const char* path);     // 1 when `path` exists and is not a directory
int VLIBCFileCheckDir(const char* path);  // 1 when `path` is a directory (links followed)
// Names in `dir` ending in `suffix` (all when null or empty), sorted, appended to `*list`.
// Count, or -1.
int VLIBCFileEnumDir(const char* dir, const char* suffix, PVLIBSZLIST* list, int flags);
// read(2) that retries on EINTR. Bytes read, or -1.
ssize_t VLIBCRead(int fd, void* buffer, size_t size);

// Creates `path` with `mode`, chowned to uid/gid when those are not -1; with `parents`
// also every missing level above it, as mkdir -p -m does: those get `mode` | 0755 and keep
// the caller's owner, so that the tree stays traversable. An existing directory is
// success. 0, or -1 with ERR_MKDIR_FAILED (ERR_NO_SPACE for ENOSPC).
int CORVFSMkdirP(const char* path, const char* reserved, int parents, int uid, int gid,
                 mode_t mode);
// Whether `name` is the platform's hidden metadata directory name ("@eaDir").
int CORVEAIsHiddenDir(const char* name);
#define CORV_EA_DIR_NAME "@eaDir"

// ---------------------------------------------------------------------------------------
// Locks.
//
// Named system locks: the value's upper bits name the lock, its low four bits are flags.
// VLIBC_LOCK_PKG (0x10000000) is the package lock, file /tmp/lock/lock_pkg.
// Flags: VLIBC_LOCK_EXCLUSIVE (0x2; else shared), VLIBC_LOCK_WAIT (0x4; wait up to
// `seconds`, else try once).
//
// The lock is a POSIX record lock held by the process: a process that holds it may take
// it again (re-entry does not count: one VLIBCFileUnlock releases it), children do not
// inherit it, and it is gone when the process ends. At time-out VLIBCFileLock returns -1
// with errno EAGAIN (and ERR_TIMEOUT in the slot); other failures keep their errno.
// The lock directory is created when missing.
enum {
    VLIBC_LOCK_PKG = 0x10000000,
    VLIBC_LOCK_EXCLUSIVE = 0x2,
    VLIBC_LOCK_WAIT = 0x4,
};
int VLIBCFileLock(int lock, int seconds);  // 0, or -1
int VLIBCFileUnlock(int lock);             // 0, or -1 when not held
const char* VLIBCLockPath(int lock);        // the file behind a lock, null when unknown

// A lock on any file, through its own descriptor (flock): shared or exclusive, waiting up
// to `seconds`. On success `*fd` holds the descriptor that VLIBCFileUnlockByFile releases
// and closes; the file is created when missing. 0, or -1 (errno EAGAIN at time-out).
int VLIBCFileLockTimeByFile(const char* path, int exclusive, int seconds, int* fd);
int VLIBCFileUnlockByFile(int fd);  // -1 is accepted and ignored

// ---------------------------------------------------------------------------------------
// Processes. Programs are run by absolute path, never through a shell.
//
// Flags of VLIBCExecl (the appliance passes 0xbb):
//   VLIBC_EXEC_NULL_STDOUT 0x01, VLIBC_EXEC_NULL_STDERR 0x02, VLIBC_EXEC_WAIT 0x08,
//   VLIBC_EXEC_NULL_STDIN 0x10. Other bits are accepted and ignored.
enum {
    VLIBC_EXEC_NULL_STDOUT = 0x01,
    VLIBC_EXEC_NULL_STDERR = 0x02,
    VLIBC_EXEC_WAIT = 0x08,
    VLIBC_EXEC_NULL_STDIN = 0x10,
};
// Runs `path` with the arguments that follow (ending with a null pointer), waits, and
// gives the exit status; a child killed by a signal gives 128 + signal; -1 when it cannot
// be started.
int VLIBCExec(const char* path, ...);
int VLIBCExecl(const char* path, int flags, ...);
// `argv` is the whole argument vector, argv[0] included, null-terminated; null runs the
// program with argv[0] = path alone. With `wait` the exit status as above; without, 0
// once started (the child is reaped by nobody: callers that do not wait detach it).
int VLIBCExecv(const char* path, const char* const* argv, int wait);
// A pipe to a program's standard output ("r") or input ("w"); a "q" in the mode ("rq")
// sends the program's standard error to /dev/null. VLIBCPclose waits and gives the exit
// status, as VLIBCExec does. Null when it cannot be started.
FILE* VLIBCPopen(const char* path, const char* mode, ...);
FILE* VLIBCPopenv(const char* path, const char* mode, const char* const* argv);
int VLIBCPclose(FILE* stream);
// fork(2) for the library's detached children. The child's pid, 0 in the child, or -1.
pid_t VLIBCProcFork();
int VLIBCProcAlive(pid_t pid);  // 1 when the process exists

// Decodes the base64 text `in` (`inLength` characters; blanks and line breaks are
// skipped, "=" ends the data) into `out`. The byte count, or -1: ERR_BAD_PARAMETERS for a
// character outside the alphabet, ERR_BUF_TOO_SMALL when `outSize` bytes do not hold it.
int VLIBCBase64Decode(const char* in, int inLength, unsigned char* out, int outSize);

// Whether the machine is a small-box model whose only volume is /volume1.
// The reference platform answers from key "dockette" ("yes") of the defaults file.
int VLIBCIsDockette();
