// The Package Center's HTTP server: the page and its JSON API.
//
// The page (GET /, /app.js, /style.css) needs no session: it is the login form too. Every
// /api/ path but POST /api/login answers 401 {"error": "login"} without the session cookie
// of a logged-in administrator; every POST also needs the session's token in the header
// X-CSRF-Token, else 403. API:
//   GET  /api/session                     {"user", "csrf"}
//   POST /api/login {"user","password"}   sets the cookie; 401 wrong user or password,
//                                         403 not in the group "administrators"
//   POST /api/logout
//   GET  /api/packages                    the installed packages
//   GET  /api/packages/<name>             one package with dependents and log
//   POST /api/packages/<name>/<action>    start, stop, uninstall ({"answers"}): a task
//   GET  /api/store[?refresh=1]           the stores' packages
//   GET  /api/updates[?refresh=1]         the store entries newer than what is installed
//   POST /api/store/install {"packages"}  downloads them (and missing dependencies): a task
//   POST /api/upload                      multipart field "file", a .cpk: a task, ready
//   GET  /api/tasks, /api/tasks/<id>      state, progress, and the questions when ready
//   POST /api/tasks/<id>/install {"answers", "accept_unsigned"}
//   POST /api/tasks/<id>/cancel
#pragma once

#include <string>

namespace center {

struct CenterOptions {
    std::string listen = "127.0.0.1:8490";
    std::string www;                             // the page's files
    std::string state = "/var/tmp/corv-center";  // task directories
    std::string pamService = "corv-center";
    std::string program;  // this program, for its workers
    unsigned long long maxUpload = 256ULL << 20;
    int sessionMinutes = 30;
};

// Serves until killed; 2 when it cannot start. Prints "listening on http://ADDR:PORT"
// once bound (port 0 picks a free one).
int serveCenter(const CenterOptions& options);

}  // namespace center
