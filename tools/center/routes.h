// The API routes of the Package Center (server.h), registered on a cpp-httplib server.
#pragma once

#include <httplib.h>
#include <json/json.h>

#include <string>

#include "auth.h"
#include "server.h"
#include "tasks.h"

namespace center {

struct Center {
    CenterOptions options;
    SessionTable sessions;
    TaskTable tasks;
};

// The session of a request that passed the login check (set by the pre-routing check).
Session sessionOf(const httplib::Request& request);

void sendJson(httplib::Response& response, const Json::Value& body, int status = 200);
void sendError(httplib::Response& response, int status, const std::string& error,
               const std::string& message);
// The request body as a JSON object; false (and a 400 sent) otherwise.
bool jsonBody(const httplib::Request& request, httplib::Response& response, Json::Value& out);

void addPackageRoutes(httplib::Server& server, Center& center);
void addTaskRoutes(httplib::Server& server, Center& center);

}  // namespace center
