#include "support/store_kit.h"

#include <signal.h>
#include <stdio.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <sstream>

#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "support/files.h"

// Only the sandboxed tests, which start servers, know where the build put corv-store.
#ifndef CORV_STORE_PATH
#define CORV_STORE_PATH "/usr/local/bin/corv-store"
#endif

namespace testutil {

StoreServer::StoreServer(const std::string& dir, const std::vector<std::string>& args) : dir_(dir) {
    CORVFSMkdirP(dir.c_str(), nullptr, 1, -1, -1, 0755);
    if (!exists(dir + "/catalogue.json")) {
        setPackages(Json::Value(Json::arrayValue));
    }
    int out[2];
    if (pipe(out) != 0) {
        return;
    }
    std::vector<std::string> argv = {
        CORV_STORE_PATH, "serve", dir, "--listen", "127.0.0.1:0", "--log", dir + "/requests.log"};
    argv.insert(argv.end(), args.begin(), args.end());
    pid_ = fork();
    if (pid_ == 0) {
        dup2(out[1], 1);
        close(out[0]);
        close(out[1]);
        std::vector<char*> raw;
        for (std::string& arg : argv) {
            raw.push_back(arg.data());
        }
        raw.push_back(nullptr);
        execv(raw[0], raw.data());
        _exit(127);
    }
    close(out[1]);
    // The first line names the address: "listening on http://127.0.0.1:<port>".
    std::string line;
    char c;
    while (read(out[0], &c, 1) == 1 && c != '\n') {
        line += c;
    }
    close(out[0]);
    const std::string prefix = "listening on ";
    if (line.rfind(prefix, 0) == 0) {
        base_ = line.substr(prefix.size());
    }
}

StoreServer::~StoreServer() {
    if (pid_ > 0) {
        kill(pid_, SIGTERM);
        waitpid(pid_, nullptr, 0);
    }
}

void StoreServer::setPackages(const Json::Value& entries) {
    Json::Value catalogue(Json::objectValue);
    catalogue["packages"] = entries;
    CORVPackageTool::toFile(catalogue, dir_ + "/catalogue.json");
}

Json::Value StoreServer::rulesFromText(const std::string& text) {
    Json::Value rules;
    CORVPackageTool::fromString(text, rules);
    return rules;
}

void StoreServer::setFaults(const Json::Value& rules) {
    CORVPackageTool::toFile(rules, dir_ + "/faults.json");
}

std::vector<Json::Value> StoreServer::requests() const {
    std::vector<Json::Value> lines;
    std::ifstream in(dir_ + "/requests.log");
    std::string line;
    while (std::getline(in, line)) {
        Json::Value value;
        if (CORVPackageTool::fromString(line, value)) {
            lines.push_back(value);
        }
    }
    return lines;
}

bool StoreServer::publish(const std::string& cpk) {
    const std::string name = cpk.substr(cpk.rfind('/') + 1);
    return VLIBCExec("/bin/cp", "-f", cpk.c_str(), (dir_ + "/" + name).c_str(), nullptr) == 0 &&
           VLIBCExecl(CORV_STORE_PATH, VLIBC_EXEC_NULL_STDOUT | VLIBC_EXEC_WAIT, "index",
                      dir_.c_str(), nullptr) == 0;
}

Json::Value storeEntry(const std::string& name, const std::string& version,
                       const Json::Value& deps) {
    Json::Value entry(Json::objectValue);
    entry["package"] = name;
    entry["version"] = version;
    entry["dname"] = name + " (display)";
    entry["link"] = name + "-" + version + ".cpk";
    entry["size"] = 10;
    if (!deps.isNull()) {
        entry["conf_deppkgs"] = deps;
    }
    return entry;
}

void setDefaultsKey(const std::string& key, const std::string& value) {
    VLIBCFileSetKeyValue(VLIBC_INFO_DEFAULTS_PATH, key.c_str(), value.c_str(), nullptr);
}

}  // namespace testutil
