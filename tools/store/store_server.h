// `corv-store serve DIR`: the store's HTTP(S) server.
//
// Paths (GET, and POST where a client may post):
//   /api/getPackageList.php   {"success": true, "packages": [...]}: the whole catalogue, as
//                             the maker's store answers
//   /api/getPackages.php      the same form, with only the entries that the field pkg_list
//                             (JSON array of {"id", "version"}) names, in its order
//   /api/<name>.php           DIR/api/<name>.json as it stands (recommended lists), else 404
//   /feed                     a feed: {"packages": [...], "keyrings": [<key file>]}, the
//                             keyrings member only with --keyring (GET and POST)
//   /feed/array               a feed in the short form: the bare array of entries
//   anything else             the file of that path under DIR (package files, icons), with
//                             Content-Length; 404 outside DIR or for a directory
// Every request is checked against the fault file first and logged as one JSON line.
#pragma once

#include <string>

namespace store {

struct ServeOptions {
    std::string dir;
    std::string listen = "127.0.0.1:8080";  // port 0 picks a free port
    std::string certFile, keyFile;          // both set: HTTPS
    std::string keyringFile;                // served as the feed's keyrings
    std::string faultFile;                  // default DIR/faults.json
    std::string logFile;                    // default: standard output
    bool checkToken = false;                // refuse API and feed queries with a wrong token
};

// Serves until the process is killed. Prints "listening on <scheme>://<addr>:<port>" on
// standard output once the socket is bound. The exit status when it can't start: 2.
int serve(const ServeOptions& options);

}  // namespace store
