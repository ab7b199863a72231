// "pgsql-db": the package's own role and databases in the system's PostgreSQL server,
// made and dropped with the server's command-line tools as the superuser "postgres".
#include <stdio.h>
#include <string.h>

#include <new>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kPsql[] = "/usr/bin/psql";
const char kCreateUser[] = "/usr/bin/createuser";
const char kCreateDb[] = "/usr/bin/createdb";
const char kDropDb[] = "/usr/bin/dropdb";
const char kDropUser[] = "/usr/bin/dropuser";
const char kCorvPsql[] = "/usr/corv/bin/corvpsql";

const char kCreateUserKey[] = "create-user";
const char kGrantUserKey[] = "grant-user";
const char kGroupKey[] = "group";
const char kCreateDbFlagKey[] = "createdb";
const char kCreateDatabaseKey[] = "create-database";
const char kDropDbKey[] = "drop-db-uninst";
const char kDropUserKey[] = "drop-user-uninst";
const char kDbNameKey[] = "db-name";
const char kDbOwnerKey[] = "db-owner";
const char kDbEncodingKey[] = "db-encoding";
const char kDbCollisionKey[] = "db-collision";
const char kDbLangCKey[] = "db-enable-lang-c";
const char kDbCreatedKey[] = "db-created";

const int kQuietWait =
    VLIBC_EXEC_NULL_STDOUT | VLIBC_EXEC_NULL_STDERR | VLIBC_EXEC_WAIT | VLIBC_EXEC_NULL_STDIN;
const size_t kSqlBuffer = 1024;

enum _tag_pgsql_type_ { PGSQL_TYPE_USER = 0, PGSQL_TYPE_DATABASE = 1 };

// Names go into SQL between quotes and onto the command lines of the tools, so only
// plain identifiers pass: no quote can close the literal, no leading '-' can turn into an
// option, and PostgreSQL keeps them as they are (63 bytes at most).
bool IsPlainPgName(const std::string& name) {
    if (name.empty() || name.size() > 63 || name[0] == '-') {
        return false;
    }
    for (char c : name) {
        const bool plain = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
                           (c >= '0' && c <= '9') || c == '_' || c == '-' || c == '.';
        if (!plain) {
            return false;
        }
    }
    return true;
}

bool RefuseName(const char* what, const std::string& name) {
    CORV_LOG_ERR("Refused PostgreSQL %s name [%s]", what, name.c_str());
    VLIBCErrSet(ERR_MALFORMED);
    return false;
}

// The first line that a query printed, without its newline; `ok` false when psql could
// not be started.
std::string QueryLastLine(const char* sql, bool& ok) {
    FILE* out = VLIBCPopen(kPsql, "r", "-U", "postgres", "-tAc", sql, nullptr);
    ok = out != nullptr;
    if (!ok) {
        VLIBCErrSet(ERR_OPEN_FAILED);
        return std::string();
    }
    std::string last;
    char line[kSqlBuffer];
    while (fgets(line, sizeof(line), out) != nullptr) {
        last = line;
    }
    VLIBCPclose(out);
    if (!last.empty() && last.back() == '\n') {
        last.pop_back();
    }
    return last;
}

class PgsqlDB : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override;
    // Databases hold the user's data: a failed install keeps what it found or made.
    int Rollback(const CORV::PkgUtils::ActionInfo&, const Json::Value&, Json::Value&,
                 CORV::PkgUtils::WorkerResp&) override {
        return 0;
    }
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override;
    bool IsUpdatable() override { return true; }

    bool ExecPgSQLCmd(const std::string& option, const std::string& command);
    bool isTypeExist(const std::string& name, _tag_pgsql_type_ type);
    bool ComparePgSQLDatabaseOwner(const std::string& db, const std::string& owner);
    bool CreatePgSQLUser(const std::string& user);
    bool GrantPgSQLUser(const std::string& user, const Json::Value& grantObject);
    bool CreatePgSQLDBPure(const std::string& owner, const Json::Value& databaseObject);
    bool DropPgSQLDBPure(const std::string& name);
    bool CreatePgSQLDB(const std::string& user, const Json::Value& databaseObject);

  private:
    bool EnsureDatabases(const Json::Value& databases, Json::Value& own, const std::string& user);
    bool DropDatabases(const Json::Value& own, const std::string& user);
};

bool PgsqlDB::ExecPgSQLCmd(const std::string& option, const std::string& command) {
    return VLIBCExecl(kPsql, kQuietWait, "-U", "postgres", option.c_str(), command.c_str(),
                      nullptr) == 0;
}

bool PgsqlDB::isTypeExist(const std::string& name, _tag_pgsql_type_ type) {
    const char* format = nullptr;
    switch (type) {
        case PGSQL_TYPE_USER:
            format = "SELECT 1 FROM pg_roles WHERE rolname='%s'";
            break;
        case PGSQL_TYPE_DATABASE:
            format = "SELECT 1 FROM pg_database WHERE datname='%s'";
            break;
        default:
            VLIBCErrSet(ERR_BAD_PARAMETERS);
            return false;
    }
    if (!IsPlainPgName(name)) {
        return RefuseName(type == PGSQL_TYPE_USER ? "role" : "database", name);
    }
    char sql[kSqlBuffer];
    snprintf(sql, sizeof(sql), format, name.c_str());
    bool ok = false;
    const std::string answer = QueryLastLine(sql, ok);
    return ok && !answer.empty() && answer[0] == '1';
}

bool PgsqlDB::ComparePgSQLDatabaseOwner(const std::string& db, const std::string& owner) {
    if (!IsPlainPgName(db)) {
        return RefuseName("database", db);
    }
    char sql[kSqlBuffer];
    snprintf(sql, sizeof(sql),
             "SELECT pg_catalog.pg_get_userbyid(d.datdba) as \"Owner\" FROM "
             "pg_catalog.pg_database d WHERE d.datname = '%s'",
             db.c_str());
    bool ok = false;
    const std::string answer = QueryLastLine(sql, ok);
    return ok && answer == owner;
}

bool PgsqlDB::CreatePgSQLUser(const std::string& user) {
    return VLIBCExecl(kCreateUser, kQuietWait, "-U", "postgres", user.c_str(), nullptr) == 0;
}

bool PgsqlDB::GrantPgSQLUser(const std::string& user, const Json::Value& grantObject) {
    if (!isTypeExist(user, PGSQL_TYPE_USER)) {
        CORV_LOG_ERR("Postgresql user [%s] does not exist.", user.c_str());
        return false;
    }
    const Json::Value groups = grantObject.get(kGroupKey, Json::Value(Json::arrayValue));
    if (!groups.isArray()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    char sql[kSqlBuffer];
    for (const Json::Value& group : groups) {
        if (!group.isString()) {
            continue;
        }
        const std::string name = group.asString();
        if (!IsPlainPgName(name)) {
            return RefuseName("group", name);
        }
        if (!isTypeExist(name, PGSQL_TYPE_USER)) {
            continue;
        }
        snprintf(sql, sizeof(sql), "GRANT \"%s\" TO \"%s\"", name.c_str(), user.c_str());
        if (!ExecPgSQLCmd("-c", sql)) {
            CORV_LOG_ERR("GRANT [%s] TO [%s] failed", name.c_str(), user.c_str());
            return false;
        }
    }
    if (grantObject.get(kCreateDbFlagKey, false).asBool()) {
        snprintf(sql, sizeof(sql), "ALTER USER \"%s\" CREATEDB", user.c_str());
        if (!ExecPgSQLCmd("-c", sql)) {
            CORV_LOG_ERR("ALTER USER [%s] CREATEDB failed", user.c_str());
            return false;
        }
    }
    return true;
}

bool PgsqlDB::CreatePgSQLDBPure(const std::string& owner, const Json::Value& databaseObject) {
    const std::string name = databaseObject[kDbNameKey].asString();
    const bool utf8 = databaseObject[kDbEncodingKey].isString() &&
                      databaseObject[kDbEncodingKey].asString() == "UTF8";
    if (utf8) {
        return VLIBCExecl(kCreateDb, kQuietWait, "-U", "postgres", "-T", "template0", "-E", "UTF8",
                          "-O", owner.c_str(), name.c_str(), nullptr) == 0;
    }
    return VLIBCExecl(kCreateDb, kQuietWait, "-U", "postgres", "-O", owner.c_str(), name.c_str(),
                      nullptr) == 0;
}

bool PgsqlDB::DropPgSQLDBPure(const std::string& name) {
    return VLIBCExecl(kDropDb, kQuietWait, "-U", "postgres", name.c_str(), nullptr) == 0;
}

bool PgsqlDB::CreatePgSQLDB(const std::string& user, const Json::Value& databaseObject) {
    const Json::Value& ownerValue = databaseObject[kDbOwnerKey];
    const std::string owner =
        ownerValue.isString() && ownerValue.asString() == "postgres" ? "postgres" : user;
    if (CreatePgSQLDBPure(owner, databaseObject)) {
        return true;
    }
    const Json::Value& collision = databaseObject[kDbCollisionKey];
    const std::string policy = collision.isString() ? collision.asString() : std::string();
    const std::string name = databaseObject[kDbNameKey].asString();
    if (policy == "drop") {
        return DropPgSQLDBPure(name) && CreatePgSQLDBPure(user, databaseObject);
    }
    if (policy == "skip") {
        if (ComparePgSQLDatabaseOwner(name, "postgres") && owner != "postgres") {
            return VLIBCExecl(kCorvPsql, kQuietWait, "--change-own", name.c_str(), owner.c_str(),
                              nullptr) == 0;
        }
        return true;
    }
    return false;
}

bool PgsqlDB::EnsureDatabases(const Json::Value& databases, Json::Value& own,
                              const std::string& user) {
    own[kDbCreatedKey] = Json::Value(Json::arrayValue);
    for (const Json::Value& database : databases) {
        if (!database.isObject() || !database.isMember(kDbNameKey)) {
            continue;
        }
        const Json::Value& nameValue = database[kDbNameKey];
        if (!nameValue.isString() || nameValue.asString().empty()) {
            VLIBCErrSet(ERR_MALFORMED);
            return false;
        }
        const std::string name = nameValue.asString();
        if (!IsPlainPgName(name)) {
            return RefuseName("database", name);
        }
        if (!CreatePgSQLDB(user, database)) {
            CORV_LOG_ERR("Failed creating database [%s].", name.c_str());
            return false;
        }
        if (database.get(kDbLangCKey, false).asBool() &&
            VLIBCExecl(kPsql, kQuietWait, "-U", "postgres", "-d", name.c_str(), "-c",
                       "UPDATE pg_language SET lanpltrusted = true WHERE lanname = 'c'",
                       nullptr) != 0) {
            CORV_LOG_ERR("Failed enable language C for database [%s].", name.c_str());
            return false;
        }
        own[kDbCreatedKey].append(name);
    }
    return true;
}

int PgsqlDB::Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                     Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) {
    if (VLIBServicectlIsJobRunning("pgsql", 0) != 1) {
        CORV_LOG_ERR("Postgresql daemon is not running.");
        VLIBCErrSet(ERR_NOT_APPLICABLE);
        return 1;
    }
    const std::string& user = action.GetPkgUserName();
    if (!IsPlainPgName(user)) {
        RefuseName("role", user);
        return 1;
    }
    if (request.get(kCreateUserKey, false).asBool() && !isTypeExist(user, PGSQL_TYPE_USER) &&
        !CreatePgSQLUser(user)) {
        CORV_LOG_ERR("Postgresql failed creating user [%s].", user.c_str());
        return 1;
    }
    const Json::Value& grant = request[kGrantUserKey];
    if (grant.isObject() && !grant.empty()) {
        if (!isTypeExist(user, PGSQL_TYPE_USER)) {
            CORV_LOG_ERR("Postgresql user [%s] is not exist.", user.c_str());
        }
        if (!GrantPgSQLUser(user, grant)) {
            CORV_LOG_ERR("Failed granting user [%s].", user.c_str());
            return 1;
        }
    }
    const Json::Value databases = request.get(kCreateDatabaseKey, Json::Value(Json::arrayValue));
    if (!databases.isArray()) {
        VLIBCErrSet(ERR_MALFORMED);
        return 1;
    }
    return EnsureDatabases(databases, own, user) ? 0 : 1;
}

bool PgsqlDB::DropDatabases(const Json::Value& own, const std::string& user) {
    const Json::Value& created = own[kDbCreatedKey];
    bool ok = true;
    if (created.isArray()) {
        for (const Json::Value& entry : created) {
            if (!entry.isString()) {
                continue;
            }
            const std::string name = entry.asString();
            if (isTypeExist(name, PGSQL_TYPE_DATABASE) && !DropPgSQLDBPure(name)) {
                CORV_LOG_ERR("Drop PgsqlDB [%s] failed", name.c_str());
                ok = false;
            }
        }
    }
    if (isTypeExist(user, PGSQL_TYPE_USER) &&
        VLIBCExecl(kCorvPsql, kQuietWait, "--drop-all-db", user.c_str(), nullptr) != 0) {
        CORV_LOG_ERR("Failed dropping databases owned by [%s].", user.c_str());
        ok = false;
    }
    return ok;
}

int PgsqlDB::Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                     Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) {
    // An upgrade keeps the data; the new version's Acquire meets it and its collision
    // policy decides.
    if (action.GetActionType() == 2) {
        return 0;
    }
    const std::string& user = action.GetPkgUserName();
    if (!request.isObject()) {
        return 0;
    }
    if (request.get(kDropDbKey, false).asBool() && !DropDatabases(own, user)) {
        return 1;
    }
    if (request.get(kDropUserKey, false).asBool() && isTypeExist(user, PGSQL_TYPE_USER) &&
        VLIBCExecl(kDropUser, kQuietWait, "-U", "postgres", user.c_str(), nullptr) != 0) {
        CORV_LOG_ERR("Failed dropping user [%s].", user.c_str());
        return 1;
    }
    return 0;
}

}  // namespace

CORV::PkgUtils::IWorker* NewPgsqlDB() {
    return new (std::nothrow) PgsqlDB();
}

}  // namespace Resource
}  // namespace CORVPackageTool
