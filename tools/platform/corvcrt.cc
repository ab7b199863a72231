// corvcrtregister <pkg> / corvcrtunregister <pkg>: the certificate tools of the reference
// platform (one program, named by how it is called; the store is in corv/certificate.h).
//
// register: reads /usr/local/share/certificate.d/<pkg>.cfg ({"services": [...], "owner",
// "isPkg"}), records the package's services as users of the default certificate (made with
// openssl when the machine has none yet), gives each service the certificate's files in
// /usr/local/etc/certificate/<pkg>/<service>/, and runs the package's reloader
// /usr/local/libexec/certificate.d/<pkg> when there is one, so that its daemons take the
// files up. unregister: forgets the package's services and removes their files.
//
// Exit status 0 when done, 1 on failure (a line on standard error says why), 2 on a bad
// command line. A failing reloader is reported and does not undo the registration.
#include <grp.h>
#include <pwd.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <string>

#include "corv/certificate.h"
#include "corv/vlibc.h"
#include "json_store.h"

namespace {

namespace fs = std::filesystem;

const char* const kCertFiles[] = {"cert.pem", "privkey.pem", "fullchain.pem"};

bool IsSegment(const std::string& name) {
    if (name.empty() || name == "." || name == ".." || name[0] == '-') {
        return false;
    }
    for (char c : name) {
        if (!isalnum(static_cast<unsigned char>(c)) && c != '.' && c != '_' && c != '-') {
            return false;
        }
    }
    return true;
}

int Fail(const std::string& why) {
    fprintf(stderr, "corvcrt: %s\n", why.c_str());
    return 1;
}

// A self-signed certificate for the machine, the default from now on.
bool IssueDefault(std::string& dir) {
    const std::string id = "default-" + std::to_string(time(nullptr));
    dir = std::string(CORV_CERT_ARCHIVE) + "/" + id;
    if (CORVFSMkdirP(dir.c_str(), nullptr, 1, 0, 0, 0700) != 0) {
        return false;
    }
    const std::string key = dir + "/privkey.pem";
    const std::string cert = dir + "/cert.pem";
    if (VLIBCExecl("/usr/bin/openssl", 0xbb, "req", "-x509", "-newkey", "ec", "-pkeyopt",
                   "ec_paramgen_curve:prime256v1", "-nodes", "-days", "825", "-subj",
                   "/CN=localhost", "-keyout", key.c_str(), "-out", cert.c_str(), nullptr) != 0) {
        return false;
    }
    std::error_code ec;
    fs::copy_file(cert, dir + "/fullchain.pem", fs::copy_options::overwrite_existing, ec);
    FILE* out = fopen(CORV_CERT_ARCHIVE "/DEFAULT", "we");
    const bool ok = !ec && out != nullptr && fprintf(out, "%s\n", id.c_str()) > 0;
    return out != nullptr && fclose(out) == 0 && ok;
}

// The store's INFO without any entry of `pkg`.
Json::Value InfoWithout(const Json::Value& info, const std::string& pkg) {
    Json::Value out(Json::objectValue);
    if (!info.isObject()) {
        return out;
    }
    for (const std::string& id : info.getMemberNames()) {
        Json::Value kept(Json::arrayValue);
        for (const Json::Value& entry : info[id]["services"]) {
            if (!(entry.isObject() && entry["subscriber"].asString() == pkg)) {
                kept.append(entry);
            }
        }
        out[id]["services"] = kept;
    }
    return out;
}

bool Deploy(const std::string& certDir, const std::string& serviceDir, const std::string& owner) {
    uid_t uid = 0;
    gid_t gid = 0;
    if (const passwd* pw = getpwnam(owner.c_str())) {
        uid = pw->pw_uid;
        gid = pw->pw_gid;
    }
    if (CORVFSMkdirP(serviceDir.c_str(), nullptr, 1, uid, gid, 0700) != 0) {
        return false;
    }
    for (const char* file : kCertFiles) {
        const std::string target = serviceDir + "/" + file;
        std::error_code ec;
        fs::copy_file(certDir + "/" + file, target, fs::copy_options::overwrite_existing, ec);
        if (ec || chown(target.c_str(), uid, gid) != 0 || chmod(target.c_str(), 0600) != 0) {
            return false;
        }
    }
    return true;
}

int Register(const std::string& pkg) {
    Json::Value conf;
    const std::string confPath = std::string(CORV_CERT_PKG_CONF_DIR) + "/" + pkg + ".cfg";
    if (corvplat::readJsonFile(confPath, conf) != corvplat::JsonRead::kOk || !conf.isObject() ||
        !conf["services"].isArray()) {
        return Fail("no services in " + confPath);
    }
    const std::string owner = conf["owner"].isString() ? conf["owner"].asString() : "root";
    std::string certDir;
    if (CORVFSMkdirP(CORV_CERT_ARCHIVE, nullptr, 1, 0, 0, 0700) != 0 ||
        (!CORVCertDefaultDir(certDir) && !IssueDefault(certDir))) {
        return Fail("no default certificate, and none could be issued");
    }
    const std::string id = fs::path(certDir).filename();
    corvplat::FileLock lock(CORV_CERT_ARCHIVE "/.lock", 30);
    Json::Value info;
    if (!lock.ok() ||
        corvplat::readJsonFile(CORV_CERT_ARCHIVE "/INFO", info) == corvplat::JsonRead::kBad) {
        return Fail("cannot read " CORV_CERT_ARCHIVE "/INFO");
    }
    info = InfoWithout(info, pkg);
    const std::string deployRoot = std::string(CORV_CERT_PKG_DEPLOY_DIR) + "/" + pkg;
    std::error_code ec;
    fs::remove_all(deployRoot, ec);
    for (const Json::Value& service : conf["services"]) {
        if (!service.isObject() || !IsSegment(service["service"].asString())) {
            return Fail("bad service in " + confPath);
        }
        Json::Value entry = service;
        entry["subscriber"] = pkg;
        entry["owner"] = owner;
        entry["isPkg"] = true;
        info[id]["services"].append(entry);
        if (!Deploy(certDir, deployRoot + "/" + service["service"].asString(), owner)) {
            return Fail("cannot give " + service["service"].asString() + " its certificate");
        }
    }
    if (!corvplat::writeJsonFile(CORV_CERT_ARCHIVE "/INFO", info, 0600)) {
        return Fail("cannot write " CORV_CERT_ARCHIVE "/INFO");
    }
    const std::string reloader = std::string(CORV_CERT_PKG_RELOADER_DIR) + "/" + pkg;
    if (access(reloader.c_str(), X_OK) == 0 && VLIBCExec(reloader.c_str(), nullptr) != 0) {
        fprintf(stderr, "corvcrt: the reloader of %s failed\n", pkg.c_str());
    }
    return 0;
}

int Unregister(const std::string& pkg) {
    corvplat::FileLock lock(CORV_CERT_ARCHIVE "/.lock", 30);
    Json::Value info;
    const corvplat::JsonRead read = corvplat::readJsonFile(CORV_CERT_ARCHIVE "/INFO", info);
    if (!lock.ok() || read == corvplat::JsonRead::kBad) {
        return Fail("cannot read " CORV_CERT_ARCHIVE "/INFO");
    }
    if (read == corvplat::JsonRead::kOk &&
        !corvplat::writeJsonFile(CORV_CERT_ARCHIVE "/INFO", InfoWithout(info, pkg), 0600)) {
        return Fail("cannot write " CORV_CERT_ARCHIVE "/INFO");
    }
    std::error_code ec;
    fs::remove_all(std::string(CORV_CERT_PKG_DEPLOY_DIR) + "/" + pkg, ec);
    return ec ? Fail("cannot remove the certificates of " + pkg) : 0;
}

}  // namespace

int main(int argc, char** argv) {
    const std::string tool = fs::path(argv[0]).filename();
    if (argc != 2 || !IsSegment(argv[1]) ||
        (tool != "corvcrtregister" && tool != "corvcrtunregister")) {
        fprintf(stderr, "usage: corvcrtregister <package> | corvcrtunregister <package>\n");
        return 2;
    }
    umask(022);
    if (CORVFSMkdirP(CORV_CERT_ARCHIVE, nullptr, 1, 0, 0, 0700) != 0) {
        return Fail("cannot make " CORV_CERT_ARCHIVE);
    }
    return tool == "corvcrtregister" ? Register(argv[1]) : Unregister(argv[1]);
}
