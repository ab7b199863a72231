#include "support/codesign_kit.h"

#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>

#include <sstream>

#include "corv/process_runner.h"
#include "support/files.h"

#ifndef CORV_CODESIGN_PATH
#define CORV_CODESIGN_PATH ""  // test programs that do not sign
#endif

namespace testutil {

const char kCodesignTool[] = "/usr/corv/bin/corv-codesign";
const char kSignatureMember[] = "corv-signature.asc";

namespace {

RunResult runWith(const std::string& program, const std::vector<std::string>& args,
                  const std::string& gnupgHome) {
    CORVUtils::ProcessRunner runner(program, args);
    if (!gnupgHome.empty()) {
        runner.addEnv("GNUPGHOME", gnupgHome);
    }
    runner.setTimeout(60);
    RunResult result;
    result.status = runner.run(true, true);
    result.out = runner.getCapturedOutput();
    result.err = runner.getCapturedOutputErr();
    return result;
}

[[noreturn]] void setupFailed(const std::string& what, const RunResult& result) {
    fprintf(stderr, "test setup: %s failed (%d): %s%s\n", what.c_str(), result.status,
            result.out.c_str(), result.err.c_str());
    abort();
}

// The first fingerprint that gpg lists in colon format.
std::string firstFingerprint(const std::string& colons) {
    std::istringstream in(colons);
    std::string line;
    while (std::getline(in, line)) {
        if (line.compare(0, 4, "fpr:") == 0) {
            // The fingerprint is the tenth field.
            std::istringstream fields(line);
            std::string field;
            for (int i = 0; i < 10 && std::getline(fields, field, ':'); ++i) {
            }
            return field;
        }
    }
    return "";
}

}  // namespace

bool installCodesignTool() {
    if (exists(kCodesignTool)) {
        return true;
    }
    const std::string built = CORV_CODESIGN_PATH;
    if (built.empty() || !exists(built)) {
        return false;
    }
    writeFile(kCodesignTool, readFile(built));
    return chmod(kCodesignTool, 0755) == 0;
}

SigningKey::SigningKey(const std::string& name, bool expired) : email_(name + "@example.test") {
    chmod(home().c_str(), 0700);
    std::vector<std::string> args = {"--batch", "--pinentry-mode", "loopback", "--passphrase", ""};
    if (expired) {
        args.insert(args.end(), {"--faked-system-time", "20200101T000000"});
    }
    args.insert(args.end(), {"--quick-gen-key", name + " <" + email_ + ">", "ed25519", "sign",
                             expired ? "1d" : "never"});
    const RunResult made = gpg(args);
    if (made.status != 0) {
        setupFailed("gpg --quick-gen-key", made);
    }
    if (expired) {
        // Every later gpg in this home, the tool's signing included, lives on that day.
        writeFile(home() + "/gpg.conf", "faked-system-time 20200101T060000\n");
    }
    const RunResult listed = gpg({"--with-colons", "--list-keys", email_});
    fingerprint_ = firstFingerprint(listed.out);
    if (fingerprint_.empty()) {
        setupFailed("gpg --list-keys", listed);
    }
}

SigningKey::~SigningKey() {
    runWith("/usr/bin/gpgconf", {"--homedir", home(), "--kill", "gpg-agent"}, "");
}

RunResult SigningKey::gpg(const std::vector<std::string>& args) const {
    std::vector<std::string> all = {"--homedir", home()};
    all.insert(all.end(), args.begin(), args.end());
    return runWith("/usr/bin/gpg", all, "");
}

std::string SigningKey::publicKey(bool armor) const {
    std::vector<std::string> args = {"--batch"};
    if (armor) {
        args.push_back("--armor");
    }
    args.insert(args.end(), {"--export", fingerprint_});
    const RunResult exported = gpg(args);
    if (exported.status != 0 || exported.out.empty()) {
        setupFailed("gpg --export", exported);
    }
    return exported.out;
}

std::string SigningKey::exportPublicKey(const std::string& path, bool armor) const {
    writeFile(path, publicKey(armor));
    return path;
}

bool SigningKey::revoke() {
    // GnuPG keeps a certificate for each key it makes, its armor line disarmed by a ':'.
    std::string cert = readFile(home() + "/openpgp-revocs.d/" + fingerprint_ + ".rev");
    const size_t mark = cert.find(":-----BEGIN");
    if (mark == std::string::npos) {
        return false;
    }
    cert.erase(mark, 1);
    const std::string path = home() + "/revocation.asc";
    writeFile(path, cert);
    return gpg({"--batch", "--import", path}).status == 0;
}

RunResult codesign(const std::vector<std::string>& args, const std::string& gnupgHome) {
    return runWith(kCodesignTool, args, gnupgHome);
}

int signCpk(const SigningKey& key, const std::string& cpk) {
    return codesign({"--sign", key.fingerprint(), cpk}, key.home()).status;
}

int verifyCpk(const std::string& cpk) {
    return codesign({"--verify", cpk}).status;
}

bool trustAsMaker(const SigningKey& key) {
    const std::string file = key.exportPublicKey(key.home() + "/maker-key.asc");
    return codesign({"--add-maker", file}).status == 0;
}

bool trustForFeed(const std::vector<const SigningKey*>& keys, const std::string& feedUrl) {
    std::string json = "[";
    for (const SigningKey* key : keys) {
        json += json.size() > 1 ? "," : "";
        json += "\"";
        for (char c : key->publicKey()) {
            if (c == '\n') {
                json += "\\n";
            } else if (c == '"' || c == '\\') {
                json += std::string("\\") + c;
            } else {
                json += c;
            }
        }
        json += "\"";
    }
    json += "]\n";
    TempDir dir;
    writeFile(dir.path() + "/keyrings", json);
    return codesign({"--addserver", dir.path() + "/keyrings", feedUrl}).status == 0;
}

std::vector<std::pair<std::string, std::string>> cpkMembers(const std::string& name) {
    TempDir dir;
    writeFile(dir.path() + "/payload/bin/" + name, "#!/bin/sh\necho " + name + "\n");
    const RunResult packed = runWith(
        "/bin/tar", {"czf", dir.path() + "/package.tgz", "-C", dir.path() + "/payload", "."}, "");
    if (packed.status != 0) {
        setupFailed("tar czf package.tgz", packed);
    }
    return {{"INFO", "package=\"" + name + "\"\nversion=\"1.0-0001\"\n"},
            {"package.tgz", readFile(dir.path() + "/package.tgz")}};
}

std::string makeCpk(const std::string& path,
                    const std::vector<std::pair<std::string, std::string>>& members,
                    const std::string& format) {
    TempDir dir;
    std::vector<std::string> args = {"cf", path, "--format=" + format, "-C", dir.path()};
    for (const auto& [name, content] : members) {
        writeFile(dir.path() + "/" + name, content);
        args.push_back(name);
    }
    const RunResult packed = runWith("/bin/tar", args, "");
    if (packed.status != 0) {
        setupFailed("tar cf " + path, packed);
    }
    return path;
}

std::vector<std::string> tarMembers(const std::string& path) {
    std::vector<std::string> names;
    std::istringstream in(runWith("/bin/tar", {"tf", path}, "").out);
    std::string line;
    while (std::getline(in, line)) {
        names.push_back(line);
    }
    return names;
}

std::string tarMember(const std::string& path, const std::string& member) {
    return runWith("/bin/tar", {"xOf", path, member}, "").out;
}

}  // namespace testutil
