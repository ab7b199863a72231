// The routes of background tasks: downloads from the stores, uploads, installs, progress
// and cancel.
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <fstream>
#include <memory>
#include <thread>

#include "corv/task.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgserver.h"
#include "queries.h"
#include "routes.h"

namespace center {

using CORVPackageTool::CORVPackageServer;

namespace {

long long sizeOf(const std::string& path) {
    struct stat st {};
    return stat(path.c_str(), &st) == 0 ? static_cast<long long>(st.st_size) : 0;
}

// The progress of the engine's download task of `name`, 0 to 1.
double downloadProgress(const std::string& name) {
    try {
        NOS::TaskMgr tasks(PKG_TASK_OWNER);
        std::unique_ptr<NOS::Task> task(tasks.getTask(PKG_DOWNLOAD_TASK_PREFIX + name));
        const double progress = task ? task->getProperty("progress").asDouble() : 0.0;
        return std::max(0.0, std::min(1.0, progress));
    } catch (const std::exception&) {
        return 0.0;
    }
}

// Removes the engine's download records that the worker `pid` holds: that stops a
// transfer at once, where SIGTERM waits for the next step, and frees the packages for the
// next download. Records of other processes are left alone.
void dropDownloadRecords(const Json::Value& plan, pid_t pid) {
    for (const Json::Value& entry : plan) {
        try {
            NOS::TaskMgr tasks(PKG_TASK_OWNER);
            std::unique_ptr<NOS::Task> task(
                tasks.getTask(PKG_DOWNLOAD_TASK_PREFIX + entry["package"].asString()));
            if (task && pid > 0 && task->getProperty("data")["pid"].asInt64() == pid) {
                task->remove();
            }
        } catch (const std::exception&) {
        }
    }
}

// 0 to 1, from the bytes downloaded or the packages installed so far.
double progressOf(const std::string& dir, const Json::Value& state) {
    const std::string now = state["state"].asString();
    if (now == "downloading") {
        long long total = 0, have = 0;
        for (const Json::Value& entry : state["plan"]) {
            const std::string name = entry["package"].asString();
            const long long size = entry["size"].asInt64();
            total += size;
            if (sizeOf(dir + "/" + name + ".cpk") > 0) {
                have += size;
            } else {
                have += static_cast<long long>(size * downloadProgress(name));
            }
        }
        return total > 0 ? std::min(1.0, static_cast<double>(have) / total) : 0.0;
    }
    if (now == "installing") {
        const double count = std::max(1u, state["files"].size());
        double step = CORVPackageTool::PMSGetProgress(state["current"].asString());
        step = step > 1.0 ? step / 100.0 : step;
        return std::min(1.0, (state["done"].size() + std::max(0.0, std::min(step, 1.0))) / count);
    }
    return now == "done" || now == "ready" ? 1.0 : 0.0;
}

// The task of the URL when it belongs to the session's user; else a 404 is sent.
bool ownTask(Center& center, const httplib::Request& request, httplib::Response& response,
             std::string& id) {
    id = request.matches[1];
    Json::Value owner;
    if (!center.tasks.exists(id) || !readJsonFile(center.tasks.dir(id) + "/owner.json", owner) ||
        owner["owner"].asString() != sessionOf(request).user) {
        sendError(response, 404, "no_task", "no such task");
        return false;
    }
    return true;
}

void sendTask(Center& center, const std::string& id, httplib::Response& response,
              int status = 200) {
    Json::Value state = center.tasks.state(id);
    state["id"] = id;
    state["progress"] = progressOf(center.tasks.dir(id), state);
    if (state["state"].asString() == "ready") {
        std::lock_guard<std::mutex> hold(queryLock());
        state["questions"] = stagedQuestions(state["files"]);
    }
    sendJson(response, state, status);
}

void storeInstall(Center& center, const httplib::Request& request, httplib::Response& response) {
    Json::Value body, plan;
    if (!jsonBody(request, response, body)) {
        return;
    }
    std::string why;
    {
        std::lock_guard<std::mutex> hold(queryLock());
        if (!body["packages"].isArray() || !storePlan(body["packages"], plan, why)) {
            sendError(response, 400, "not_in_store", why.empty() ? "name the packages" : why);
            return;
        }
    }
    // The engine's own background installs (the update check, another client) keep a task
    // record per package; a second download of the same package would race them.
    for (const Json::Value& step : plan) {
        if (CORVPackageTool::CORVPackageServer::IsInstalling(step["package"].asCString())) {
            sendError(response, 409, "installing",
                      step["package"].asString() + " is being downloaded or installed already");
            return;
        }
    }
    const Session session = sessionOf(request);
    const std::string id = center.tasks.create(session.user);
    Json::Value task(Json::objectValue);
    task["action"] = "download";
    task["package"] = body["packages"].size() == 1 ? body["packages"][0] : Json::Value("");
    task["user"] = session.user;
    task["plan"] = plan;
    if (id.empty() || !center.tasks.start(id, task)) {
        sendError(response, 500, "task", "the download could not be started");
        return;
    }
    sendTask(center, id, response, 202);
}

// An uploaded file is kept only when the engine reads it as a package file, and under
// the task's own name: the name the browser sent is never used.
void upload(Center& center, const httplib::Request& request, httplib::Response& response) {
    if (!request.has_file("file")) {
        sendError(response, 400, "no_file", "send the package file in the field \"file\"");
        return;
    }
    const httplib::MultipartFormData file = request.get_file_value("file");
    const Session session = sessionOf(request);
    const std::string id = center.tasks.create(session.user);
    if (id.empty()) {
        sendError(response, 500, "task", "no task could be made for the file");
        return;
    }
    const std::string staged = center.tasks.dir(id) + "/upload.cpk";
    {
        std::ofstream out(staged, std::ios::binary | std::ios::trunc);
        out.write(file.content.data(), static_cast<std::streamsize>(file.content.size()));
        if (!out.flush()) {
            sendError(response, 500, "upload", "the file could not be stored");
            return;
        }
    }
    std::string name, version;
    {
        std::lock_guard<std::mutex> hold(queryLock());
        if (!readPackageFile(staged, name, version)) {
            unlink(staged.c_str());
            sendError(response, 400, "not_a_package", "the file is not a package file");
            return;
        }
    }
    Json::Value state(Json::objectValue), entry(Json::objectValue);
    entry["package"] = name;
    entry["version"] = version;
    entry["file"] = staged;
    state["action"] = "upload";
    state["package"] = name;
    state["state"] = "ready";
    state["files"].append(entry);
    writeJsonFile(center.tasks.dir(id) + "/state.json", state);
    sendTask(center, id, response, 201);
}

void install(Center& center, const httplib::Request& request, httplib::Response& response) {
    std::string id;
    Json::Value body;
    if (!ownTask(center, request, response, id) || !jsonBody(request, response, body)) {
        return;
    }
    Json::Value state = center.tasks.state(id);
    if (state["state"].asString() != "ready" || center.tasks.busy(id)) {
        sendError(response, 409, "not_ready", "the task is " + state["state"].asString());
        return;
    }
    Json::Value task(Json::objectValue);
    task["action"] = "install";
    task["package"] = state["package"];
    task["user"] = sessionOf(request).user;
    task["files"] = state["files"];
    task["answers"] = body["answers"].isObject() ? body["answers"] : Json::Value(Json::objectValue);
    task["accept_unsigned"] = body["accept_unsigned"].asBool();
    if (!center.tasks.start(id, task)) {
        sendError(response, 500, "task", "the install could not be started");
        return;
    }
    sendTask(center, id, response, 202);
}

}  // namespace

void addTaskRoutes(httplib::Server& server, Center& center) {
    server.Post("/api/store/install",
                [&center](const httplib::Request& request, httplib::Response& response) {
                    storeInstall(center, request, response);
                });
    server.Post("/api/upload",
                [&center](const httplib::Request& request, httplib::Response& response) {
                    upload(center, request, response);
                });
    server.Get("/api/tasks",
               [&center](const httplib::Request& request, httplib::Response& response) {
                   sendJson(response, center.tasks.list(sessionOf(request).user));
               });
    server.Get("/api/tasks/([0-9a-f]{1,64})",
               [&center](const httplib::Request& request, httplib::Response& response) {
                   std::string id;
                   if (ownTask(center, request, response, id)) {
                       sendTask(center, id, response);
                   }
               });
    server.Post("/api/tasks/([0-9a-f]{1,64})/install",
                [&center](const httplib::Request& request, httplib::Response& response) {
                    install(center, request, response);
                });
    server.Post("/api/tasks/([0-9a-f]{1,64})/cancel",
                [&center](const httplib::Request& request, httplib::Response& response) {
                    std::string id, why;
                    if (!ownTask(center, request, response, id)) {
                        return;
                    }
                    const pid_t worker = center.tasks.workerOf(id);
                    const Json::Value plan = center.tasks.state(id)["plan"];
                    if (!center.tasks.cancel(id, why)) {
                        sendError(response, 409, "not_cancellable", why);
                        return;
                    }
                    dropDownloadRecords(plan, worker);
                    // A worker told to stop just before it wrote its download record would
                    // still fetch the whole file: its record is taken away until it is gone.
                    std::thread([&center, id, plan, worker] {
                        for (int i = 0; i < 600 && center.tasks.busy(id); ++i) {
                            std::this_thread::sleep_for(std::chrono::milliseconds(100));
                            dropDownloadRecords(plan, worker);
                        }
                    }).detach();
                    sendTask(center, id, response);
                });
}

}  // namespace center
