// corv-codesign: the package signature tool of the reference platform. The package engine
// runs it by path and reads nothing but its exit status (see exit_status.h).
#include <stdio.h>

#include <exception>
#include <string>
#include <vector>

#include "exit_status.h"
#include "file_io.h"
#include "gpg.h"
#include "key_file.h"
#include "key_store.h"
#include "manifest.h"
#include "sign.h"
#include "tar_reader.h"
#include "verify.h"

using namespace codesign;

namespace {

const char kUsageText[] =
    "usage: corv-codesign --verify <absolute path of a .cpk>\n"
    "       corv-codesign --sign <key> <.cpk path>\n"
    "       corv-codesign --addserver <key file> <feed URL>\n"
    "       corv-codesign --delserver <feed URL>\n"
    "       corv-codesign --add-maker <key file>\n"
    "       corv-codesign --list\n"
    "       corv-codesign --manifest <.cpk path>\n"
    "--verify exits with 0 maker's key, 1 known publisher, 2 unknown key, 3 no signature,\n"
    "4 expired or revoked key, 5 bad signature, 6 or more when the tool failed.\n";

int usage(const std::string& problem) {
    fprintf(stderr, "corv-codesign: %s\n%s", problem.c_str(), kUsageText);
    return kUsage;
}

int verify(const std::string& path) {
    if (path.empty() || path[0] != '/') {
        return usage("--verify wants an absolute path, not \"" + path + "\"");
    }
    const Verdict verdict = verifyPackage(path);
    printf("%s: %s\n", path.c_str(), verdict.detail.c_str());
    if (verdict.status == kBadSignature) {
        fprintf(stderr, "corv-codesign: %s: bad signature: %s\n", path.c_str(),
                verdict.detail.c_str());
    }
    return verdict.status;
}

int list() {
    KeyStore store(KeyStore::kRead);
    for (const auto& [kind, home] :
         {std::pair<const char*, std::string>{"maker", store.makerHome()},
          {"publisher", store.publishersHome()}}) {
        if (!isDirectory(home)) {
            continue;
        }
        Context ctx = newContext(home);
        for (const Key& key : listKeys(ctx.get(), "", false)) {
            printf("%s %s %s\n", kind, primaryFingerprint(key.get()).c_str(),
                   firstUserId(key.get()).c_str());
        }
    }
    for (const FeedRecord& feed : store.feeds()) {
        for (const std::string& fpr : feed.fingerprints) {
            printf("feed %s %s\n", feed.url.c_str(), fpr.c_str());
        }
    }
    return 0;
}

int run(const std::vector<std::string>& args) {
    const std::string command = args.empty() ? "" : args[0];
    const size_t operands = args.empty() ? 0 : args.size() - 1;
    if (command == "--help" || command == "-h") {
        fputs(kUsageText, stdout);
        return 0;
    }
    if (command == "--verify" && operands == 1) {
        return verify(args[1]);
    }
    if (command == "--sign" && operands == 2) {
        const std::string fpr = signPackage(args[1], args[2]);
        printf("%s: signed with key %s\n", args[2].c_str(), fpr.c_str());
        return 0;
    }
    if (command == "--addserver" && operands == 2) {
        const std::vector<std::string> blocks = readKeyFile(args[1]);
        KeyStore store(KeyStore::kWrite);
        for (const std::string& fpr : store.setFeedKeys(args[2], blocks)) {
            printf("feed %s: trusting key %s\n", args[2].c_str(), fpr.c_str());
        }
        return 0;
    }
    if (command == "--delserver" && operands == 1) {
        KeyStore store(KeyStore::kWrite);
        if (!store.removeFeed(args[1])) {
            printf("feed %s: no keys were stored\n", args[1].c_str());
        }
        return 0;
    }
    if (command == "--add-maker" && operands == 1) {
        const std::vector<std::string> blocks = readKeyFile(args[1]);
        KeyStore store(KeyStore::kWrite);
        for (const std::string& fpr : store.addMakerKeys(blocks)) {
            printf("maker key %s installed\n", fpr.c_str());
        }
        return 0;
    }
    if (command == "--manifest" && operands == 1) {
        UniqueFd fd = openRegularFile(args[1]);
        TarReader reader(fd.get(), args[1]);
        fputs(scanArchive(reader).manifest.c_str(), stdout);
        return 0;
    }
    if (command == "--list" && operands == 0) {
        return list();
    }
    return usage(command.empty() ? "no command" : "bad command line");
}

}  // namespace

int main(int argc, char** argv) {
    try {
        return run(std::vector<std::string>(argv + 1, argv + argc));
    } catch (const Failure& e) {
        fprintf(stderr, "corv-codesign: %s\n", e.what());
    } catch (const std::exception& e) {
        fprintf(stderr, "corv-codesign: unexpected error: %s\n", e.what());
    }
    return kFailure;
}
