// corv-store: publishes a directory of package files as a package store.
#include <signal.h>
#include <stdio.h>
#include <string.h>

#include <string>
#include <vector>

#include "cpk_index.h"
#include "store_server.h"

namespace {

const char kUsage[] =
    "usage: corv-store index DIR\n"
    "       corv-store serve DIR [--listen ADDR:PORT] [--tls CERT KEY] [--keyring FILE]\n"
    "                            [--faults FILE] [--log FILE] [--check-token]\n"
    "       corv-store --help\n"
    "\n"
    "A package store over a directory of .cpk files.\n"
    "\n"
    "index DIR   reads the INFO (and conf/PKG_DEPS, conf/PKG_CONX, icons) of every *.cpk in\n"
    "            DIR and writes the catalogue DIR/catalogue.json: one store entry per\n"
    "            package (the highest version of each), with its size, MD5 and link;\n"
    "            icons go to DIR/icons/. Run it again after adding or removing files.\n"
    "serve DIR   serves the catalogue over HTTP, or HTTPS with --tls:\n"
    "              /api/getPackageList.php  the maker store's list of everything\n"
    "              /api/getPackages.php     the entries that the field pkg_list names\n"
    "              /api/<name>.php          DIR/api/<name>.json (recommended lists)\n"
    "              /feed                    a feed: {\"packages\": [...], \"keyrings\": [...]}\n"
    "              /feed/array              a feed as the bare array of entries\n"
    "              /<file>                  package files and icons, with Content-Length\n"
    "            Feeds answer GET and POST. A client adds http://ADDR:PORT/feed as a feed,\n"
    "            or uses http://ADDR:PORT as its maker store.\n"
    "  --listen ADDR:PORT  where to listen (default 127.0.0.1:8080; port 0 picks a free\n"
    "                      one). The first line on standard output is\n"
    "                      \"listening on <scheme>://ADDR:PORT\".\n"
    "  --tls CERT KEY      HTTPS with this certificate chain and private key (PEM)\n"
    "  --keyring FILE      the feed's signing keys (armored OpenPGP public keys), sent\n"
    "                      as its \"keyrings\"\n"
    "  --faults FILE       the fault file (default DIR/faults.json), read on every\n"
    "                      request: rules that give a path another status, an empty or\n"
    "                      other body, a delay, a stall or cut after N bytes, a chunked\n"
    "                      reply, another content type or a redirect, optionally only\n"
    "                      the first N times. Format in tools/store/README.md.\n"
    "  --log FILE          append the request log there (default standard output): one\n"
    "                      JSON line per request with method, path, query and form\n"
    "                      fields, user agent, status and whether a fault applied\n"
    "  --check-token       refuse API and feed queries whose ns_time/ns_token pair is\n"
    "                      missing or wrong, with {\"success\": false, \"sec\": \"pkgmgr\",\n"
    "                      \"key\": \"pkgmgr_token_invalid\"}\n"
    "Exit status: index 0, 1 when files were skipped, 2 when nothing could be written;\n"
    "serve runs until killed, 2 when it cannot start.\n";

int usageError(const std::string& message) {
    fprintf(stderr, "corv-store: %s\n\n%s", message.c_str(), kUsage);
    return 2;
}

int runServe(const std::vector<std::string>& args) {
    store::ServeOptions options;
    for (size_t i = 1; i < args.size(); ++i) {
        const std::string& arg = args[i];
        auto value = [&](std::string& into) {
            if (i + 1 >= args.size()) {
                return false;
            }
            into = args[++i];
            return true;
        };
        bool ok = true;
        if (arg == "--listen") {
            ok = value(options.listen);
        } else if (arg == "--tls") {
            ok = value(options.certFile) && value(options.keyFile);
        } else if (arg == "--keyring") {
            ok = value(options.keyringFile);
        } else if (arg == "--faults") {
            ok = value(options.faultFile);
        } else if (arg == "--log") {
            ok = value(options.logFile);
        } else if (arg == "--check-token") {
            options.checkToken = true;
        } else if (arg.rfind("--", 0) == 0) {
            return usageError("unknown option " + arg);
        } else if (options.dir.empty()) {
            options.dir = arg;
        } else {
            return usageError("unexpected argument " + arg);
        }
        if (!ok) {
            return usageError(arg + " lacks its value");
        }
    }
    if (options.dir.empty()) {
        return usageError("serve needs the store directory");
    }
    return store::serve(options);
}

}  // namespace

int main(int argc, char** argv) {
    std::vector<std::string> args(argv + 1, argv + argc);
    if (args.empty()) {
        return usageError("a command is needed");
    }
    if (args[0] == "--help" || args[0] == "-h" || args[0] == "help") {
        fputs(kUsage, stdout);
        return 0;
    }
    // A client that hangs up mid-reply must not end the server.
    signal(SIGPIPE, SIG_IGN);
    if (args[0] == "index") {
        if (args.size() != 2) {
            return usageError("index takes exactly one directory");
        }
        return store::indexDirectory(args[1]);
    }
    if (args[0] == "serve") {
        return runServe(args);
    }
    return usageError("unknown command " + args[0]);
}
