#include "server.h"

#include <stdio.h>
#include <stdlib.h>

#include <fstream>
#include <sstream>

#include "corvpkg/json_util.h"
#include "routes.h"

namespace center {

namespace {

const char kCookie[] = "corv_center_session";

// The page's files: a fixed list, so no request names a path on the disk.
struct PageFile {
    const char* path;
    const char* file;
    const char* type;
};
const PageFile kPageFiles[] = {{"/", "index.html", "text/html; charset=utf-8"},
                               {"/index.html", "index.html", "text/html; charset=utf-8"},
                               {"/app.js", "app.js", "application/javascript"},
                               {"/style.css", "style.css", "text/css"}};

std::string cookieValue(const httplib::Request& request, const std::string& name) {
    const std::string header = request.get_header_value("Cookie");
    size_t at = 0;
    while (at < header.size()) {
        size_t end = header.find(';', at);
        std::string part =
            header.substr(at, end == std::string::npos ? std::string::npos : end - at);
        part.erase(0, part.find_first_not_of(' '));
        if (part.compare(0, name.size() + 1, name + "=") == 0) {
            return part.substr(name.size() + 1);
        }
        if (end == std::string::npos) {
            break;
        }
        at = end + 1;
    }
    return "";
}

void securityHeaders(httplib::Response& response) {
    response.set_header("Content-Security-Policy",
                        "default-src 'self'; img-src 'self' data: http: https:; "
                        "frame-ancestors 'none'");
    response.set_header("X-Frame-Options", "DENY");
    response.set_header("X-Content-Type-Options", "nosniff");
    response.set_header("Referrer-Policy", "no-referrer");
    response.set_header("Cache-Control", "no-store");
}

// The login check in front of every route. Returns Handled when it answered already.
httplib::Server::HandlerResponse gate(Center& center, const httplib::Request& request,
                                      httplib::Response& response) {
    securityHeaders(response);
    if (request.path.compare(0, 5, "/api/") != 0 ||
        (request.path == "/api/login" && request.method == "POST")) {
        return httplib::Server::HandlerResponse::Unhandled;
    }
    Session session;
    if (!center.sessions.find(cookieValue(request, kCookie), session)) {
        sendError(response, 401, "login", "log in first");
        return httplib::Server::HandlerResponse::Handled;
    }
    if (request.method != "GET" && request.method != "HEAD" &&
        !sameToken(request.get_header_value("X-CSRF-Token"), session.csrf)) {
        sendError(response, 403, "csrf", "the request lacks this session's token");
        return httplib::Server::HandlerResponse::Handled;
    }
    // Handlers find the session through this header, which no client can set: the gate
    // replaces whatever came in.
    auto& mutableRequest = const_cast<httplib::Request&>(request);
    mutableRequest.headers.erase("X-Center-User");
    mutableRequest.headers.erase("X-Center-Csrf");
    mutableRequest.headers.emplace("X-Center-User", session.user);
    mutableRequest.headers.emplace("X-Center-Csrf", session.csrf);
    return httplib::Server::HandlerResponse::Unhandled;
}

void addPageRoutes(httplib::Server& server, Center& center) {
    for (const PageFile& page : kPageFiles) {
        const std::string path = center.options.www + "/" + page.file;
        const std::string type = page.type;
        server.Get(page.path, [path, type](const httplib::Request&, httplib::Response& response) {
            std::ifstream in(path, std::ios::binary);
            if (!in) {
                response.status = 404;
                return;
            }
            std::stringstream body;
            body << in.rdbuf();
            response.set_content(body.str(), type.c_str());
        });
    }
}

void addSessionRoutes(httplib::Server& server, Center& center) {
    server.Post(
        "/api/login", [&center](const httplib::Request& request, httplib::Response& response) {
            Json::Value body;
            if (!jsonBody(request, response, body)) {
                return;
            }
            const std::string user = body["user"].asString();
            if (!pamAuthenticate(center.options.pamService, user, body["password"].asString())) {
                sendError(response, 401, "credentials", "wrong user name or password");
                return;
            }
            if (!isAdministrator(user)) {
                sendError(response, 403, "not_admin",
                          user + " is not in the group administrators, who manage packages");
                return;
            }
            const std::string id = center.sessions.open(user);
            Session session;
            if (id.empty() || !center.sessions.find(id, session)) {
                sendError(response, 500, "session", "no session could be made");
                return;
            }
            response.set_header("Set-Cookie", std::string(kCookie) + "=" + id +
                                                  "; Path=/; HttpOnly; SameSite=Strict");
            Json::Value out(Json::objectValue);
            out["user"] = user;
            out["csrf"] = session.csrf;
            sendJson(response, out);
        });
    server.Get("/api/session", [](const httplib::Request& request, httplib::Response& response) {
        Json::Value out(Json::objectValue);
        out["user"] = request.get_header_value("X-Center-User");
        out["csrf"] = request.get_header_value("X-Center-Csrf");
        sendJson(response, out);
    });
    server.Post(
        "/api/logout", [&center](const httplib::Request& request, httplib::Response& response) {
            center.sessions.close(cookieValue(request, kCookie));
            response.set_header("Set-Cookie", std::string(kCookie) + "=; Path=/; Max-Age=0");
            sendJson(response, Json::Value(Json::objectValue));
        });
}

bool splitListen(const std::string& listen, std::string& host, int& port) {
    size_t colon = listen.rfind(':');
    if (colon == std::string::npos || colon == 0) {
        return false;
    }
    host = listen.substr(0, colon);
    char* end = nullptr;
    long value = strtol(listen.c_str() + colon + 1, &end, 10);
    if (*end != '\0' || end == listen.c_str() + colon + 1 || value < 0 || value > 65535) {
        return false;
    }
    port = static_cast<int>(value);
    return true;
}

}  // namespace

Session sessionOf(const httplib::Request& request) {
    Session session;
    session.user = request.get_header_value("X-Center-User");
    session.csrf = request.get_header_value("X-Center-Csrf");
    return session;
}

void sendJson(httplib::Response& response, const Json::Value& body, int status) {
    response.status = status;
    response.set_content(CORVPackageTool::toString(body), "application/json");
}

void sendError(httplib::Response& response, int status, const std::string& error,
               const std::string& message) {
    Json::Value body(Json::objectValue);
    body["error"] = error;
    body["message"] = message;
    sendJson(response, body, status);
}

bool jsonBody(const httplib::Request& request, httplib::Response& response, Json::Value& out) {
    if (!CORVPackageTool::fromString(request.body, out) || !out.isObject()) {
        sendError(response, 400, "bad_request", "the request body is not a JSON object");
        return false;
    }
    return true;
}

int serveCenter(const CenterOptions& options) {
    std::string host;
    int port = 0;
    if (!splitListen(options.listen, host, port)) {
        fprintf(stderr, "corv-center: --listen takes ADDR:PORT, not %s\n", options.listen.c_str());
        return 2;
    }
    Center center{options, SessionTable(std::chrono::minutes(options.sessionMinutes)),
                  TaskTable(options.state, options.program)};
    if (!center.tasks.ready()) {
        fprintf(stderr, "corv-center: cannot use %s for tasks\n", options.state.c_str());
        return 2;
    }
    httplib::Server server;
    server.set_payload_max_length(options.maxUpload);
    server.set_pre_routing_handler(
        [&center](const httplib::Request& request, httplib::Response& response) {
            return gate(center, request, response);
        });
    addPageRoutes(server, center);
    addSessionRoutes(server, center);
    addPackageRoutes(server, center);
    addTaskRoutes(server, center);
    const int bound =
        port == 0 ? server.bind_to_any_port(host) : (server.bind_to_port(host, port) ? port : -1);
    if (bound < 0) {
        fprintf(stderr, "corv-center: cannot listen on %s\n", options.listen.c_str());
        return 2;
    }
    printf("listening on http://%s:%d\n", host.c_str(), bound);
    fflush(stdout);
    return server.listen_after_bind() ? 0 : 2;
}

}  // namespace center
