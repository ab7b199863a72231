// The routes that read the installed packages and the stores, and that start, stop or
// uninstall a package.
#include <regex>

#include "corvpkg/pkgvolume.h"
#include "queries.h"
#include "routes.h"

namespace center {

namespace {

// Package names as the engine accepts them; anything else never reaches it.
const char kNamePattern[] = "([A-Za-z0-9][A-Za-z0-9._+-]{0,63})";

// Starts a task that changes one installed package.
void startControl(Center& center, const httplib::Request& request, httplib::Response& response,
                  const std::string& name, const std::string& action) {
    Json::Value body(Json::objectValue);
    if (!request.body.empty() && !jsonBody(request, response, body)) {
        return;
    }
    if (!CORVPackageTool::PMSCheckPackage(name)) {
        sendError(response, 404, "not_installed", name + " is not installed");
        return;
    }
    const Session session = sessionOf(request);
    const std::string id = center.tasks.create(session.user);
    Json::Value task(Json::objectValue);
    task["action"] = action;
    task["package"] = name;
    task["user"] = session.user;
    task["answers"] = body["answers"].isObject() ? body["answers"] : Json::Value(Json::objectValue);
    if (id.empty() || !center.tasks.start(id, task)) {
        sendError(response, 500, "task", "the task could not be started");
        return;
    }
    Json::Value out(Json::objectValue);
    out["task"] = id;
    sendJson(response, out, 202);
}

}  // namespace

void addPackageRoutes(httplib::Server& server, Center& center) {
    server.Get("/api/packages", [](const httplib::Request&, httplib::Response& response) {
        std::lock_guard<std::mutex> hold(queryLock());
        sendJson(response, installedPackages());
    });
    server.Get(std::string("/api/packages/") + kNamePattern,
               [](const httplib::Request& request, httplib::Response& response) {
                   std::lock_guard<std::mutex> hold(queryLock());
                   Json::Value details = packageDetails(request.matches[1]);
                   if (details.isNull()) {
                       sendError(response, 404, "not_installed",
                                 std::string(request.matches[1]) + " is not installed");
                       return;
                   }
                   sendJson(response, details);
               });
    server.Post(std::string("/api/packages/") + kNamePattern + "/(start|stop|uninstall)",
                [&center](const httplib::Request& request, httplib::Response& response) {
                    startControl(center, request, response, request.matches[1], request.matches[2]);
                });
    server.Get("/api/store", [](const httplib::Request& request, httplib::Response& response) {
        std::lock_guard<std::mutex> hold(queryLock());
        sendJson(response, storePackages(request.get_param_value("refresh") == "1"));
    });
    server.Get("/api/updates", [](const httplib::Request& request, httplib::Response& response) {
        std::lock_guard<std::mutex> hold(queryLock());
        sendJson(response, availableUpdates(request.get_param_value("refresh") == "1"));
    });
}

}  // namespace center
