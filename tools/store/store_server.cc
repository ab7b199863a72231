#include "store_server.h"

#include <stdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <fstream>
#include <memory>
#include <sstream>
#include <thread>
#include <vector>

#include <httplib.h>

#include "catalogue.h"
#include "corvpkg/json_util.h"
#include "fault.h"
#include "request_log.h"
#include "token.h"

namespace store {

namespace {

const char kJson[] = "application/json";

struct Reply {
    int status = 200;
    std::string body;
    std::string contentType = kJson;
    std::string file;  // a file served as it stands, read as it is sent
};

Reply jsonReply(const Json::Value& value, int status = 200) {
    Reply reply;
    reply.status = status;
    reply.body = CORVPackageTool::toString(value);
    return reply;
}

Reply refusal(const char* sec, const char* key, int status = 200) {
    Json::Value value(Json::objectValue);
    value["success"] = false;
    value["sec"] = sec;
    value["key"] = key;
    return jsonReply(value, status);
}

bool readWholeFile(const std::string& path, std::string& content) {
    struct stat st {};
    if (stat(path.c_str(), &st) != 0 || !S_ISREG(st.st_mode)) {
        return false;
    }
    std::ifstream in(path, std::ios::binary);
    std::ostringstream text;
    text << in.rdbuf();
    content = text.str();
    return static_cast<bool>(in) || in.eof();
}

std::string contentTypeOf(const std::string& path) {
    auto endsWith = [&path](const char* suffix) {
        std::string s(suffix);
        return path.size() >= s.size() && path.compare(path.size() - s.size(), s.size(), s) == 0;
    };
    if (endsWith(".png"))
        return "image/png";
    if (endsWith(".jpg"))
        return "image/jpeg";
    if (endsWith(".json"))
        return kJson;
    return "application/octet-stream";
}

// Sends `body` in pieces and stops, stalls or ends as the fault says. Returning false
// makes the server close the connection.
bool providePiece(const std::string& body, const Fault& fault, size_t offset, size_t length,
                  httplib::DataSink& sink) {
    const long long stop = fault.cutAfter >= 0 ? fault.cutAfter : fault.stallAfter;
    if (stop >= 0 && offset >= static_cast<size_t>(stop)) {
        if (fault.cutAfter < 0) {
            std::this_thread::sleep_for(std::chrono::seconds(fault.stallSeconds));
        }
        return false;
    }
    size_t count = std::min<size_t>(length, 16384);
    if (stop >= 0) {
        count = std::min<size_t>(count, static_cast<size_t>(stop) - offset);
    }
    return sink.write(body.data() + offset, count);
}

// A package file of tens of megabytes goes out in large reads, never whole in memory.
void streamFile(const std::string& path, const std::string& type, httplib::Response& res) {
    struct stat st {};
    auto file = std::shared_ptr<FILE>(fopen(path.c_str(), "rb"), [](FILE* f) {
        if (f != nullptr) {
            fclose(f);
        }
    });
    if (!file || fstat(fileno(file.get()), &st) != 0) {
        res.status = 404;
        res.set_content("not found\n", "text/plain");
        return;
    }
    res.set_content_provider(
        static_cast<size_t>(st.st_size), type,
        [file](size_t offset, size_t length, httplib::DataSink& sink) {
            std::vector<char> block(std::min<size_t>(length, 1 << 20));
            const ssize_t got =
                pread(fileno(file.get()), block.data(), block.size(), static_cast<off_t>(offset));
            return got > 0 && sink.write(block.data(), static_cast<size_t>(got));
        });
}

void deliver(const Fault& fault, Reply reply, httplib::Response& res) {
    if (fault.delayMs > 0) {
        std::this_thread::sleep_for(std::chrono::milliseconds(fault.delayMs));
    }
    if (!fault.redirect.empty()) {
        res.set_redirect(fault.redirect, fault.status != 0 ? fault.status : 302);
        return;
    }
    res.status = fault.status != 0 ? fault.status : reply.status;
    const std::string type = fault.contentType.empty() ? reply.contentType : fault.contentType;
    const bool cutShort = fault.chunked || fault.stallAfter >= 0 || fault.cutAfter >= 0;
    if (!reply.file.empty() && !fault.replaceBody && !cutShort) {
        streamFile(reply.file, type, res);
        return;
    }
    if (!reply.file.empty() && !fault.replaceBody) {
        readWholeFile(reply.file, reply.body);
    }
    auto body = std::make_shared<std::string>(fault.replaceBody ? fault.body : reply.body);
    if (fault.chunked) {
        res.set_chunked_content_provider(
            type, [body, fault](size_t offset, httplib::DataSink& sink) {
                if (offset >= body->size()) {
                    sink.done();
                    return true;
                }
                return providePiece(*body, fault, offset, body->size() - offset, sink);
            });
    } else if (fault.stallAfter >= 0 || fault.cutAfter >= 0) {
        res.set_content_provider(
            body->size(), type,
            [body, fault](size_t offset, size_t length, httplib::DataSink& sink) {
                return providePiece(*body, fault, offset, length, sink);
            });
    } else {
        res.set_content(*body, type);
    }
}

class Store {
  public:
    explicit Store(const ServeOptions& options)
        : options_(options),
          catalogue_(options.dir),
          faults_(options.faultFile.empty() ? options.dir + "/faults.json" : options.faultFile),
          log_(options.logFile) {}

    bool ready(std::string& error) {
        if (!log_.ok()) {
            error = "cannot open the log " + options_.logFile;
            return false;
        }
        if (!options_.keyringFile.empty() && !readWholeFile(options_.keyringFile, keyring_)) {
            error = "cannot read the keyring " + options_.keyringFile;
            return false;
        }
        return true;
    }

    void handle(const httplib::Request& req, httplib::Response& res) {
        const std::string query = req.target.find('?') == std::string::npos
                                      ? ""
                                      : req.target.substr(req.target.find('?') + 1);
        Fields queryFields = parseFormText(query);
        Fields formFields;
        if (req.method == "POST" &&
            req.get_header_value("Content-Type").find("x-www-form-urlencoded") !=
                std::string::npos) {
            formFields = parseFormText(req.body);
        }
        Fields all = queryFields;
        for (const auto& field : formFields) {
            all[field.first] = field.second;
        }
        const Fault fault = faults_.match(req.method, req.path);
        Reply reply = route(req, all);
        deliver(fault, reply, res);
        log_.write(req.method, req.path, queryFields, formFields,
                   req.get_header_value("User-Agent"), res.status, fault.any);
    }

  private:
    std::string baseUrl(const httplib::Request& req) const {
        const bool tls = !options_.certFile.empty();
        return std::string(tls ? "https://" : "http://") + req.get_header_value("Host");
    }

    bool tokenRefused(const Fields& fields) const {
        if (!options_.checkToken) {
            return false;
        }
        auto time = fields.find("ns_time");
        auto token = fields.find("ns_token");
        return time == fields.end() || token == fields.end() ||
               token->second != expectedToken(time->second);
    }

    Json::Value packages(const httplib::Request& req, bool& failed) {
        std::string error;
        Json::Value list = catalogue_.packages(baseUrl(req), error);
        failed = !error.empty();
        if (failed) {
            fprintf(stderr, "corv-store: %s\n", error.c_str());
        }
        return list;
    }

    Reply route(const httplib::Request& req, const Fields& fields) {
        const std::string& path = req.path;
        const bool api = path.rfind("/api/", 0) == 0;
        const bool feed = path == "/feed" || path == "/feed/array";
        if ((api || feed) && tokenRefused(fields)) {
            return refusal("pkgmgr", "pkgmgr_token_invalid");
        }
        if (api) {
            return routeApi(req, fields);
        }
        if (feed) {
            bool failed = false;
            Json::Value list = packages(req, failed);
            if (failed) {
                return refusal("common", "error_system", 500);
            }
            if (path == "/feed/array") {
                return jsonReply(list);
            }
            Json::Value out(Json::objectValue);
            out["packages"] = list;
            if (!keyring_.empty()) {
                out["keyrings"].append(keyring_);
            }
            return jsonReply(out);
        }
        return routeFile(path);
    }

    Reply routeApi(const httplib::Request& req, const Fields& fields) {
        const std::string& path = req.path;
        if (path == "/api/getPackageList.php" || path == "/api/getPackages.php") {
            bool failed = false;
            Json::Value list = packages(req, failed);
            if (failed) {
                return refusal("common", "error_system", 500);
            }
            Json::Value out(Json::objectValue);
            out["success"] = true;
            out["packages"] = path == "/api/getPackageList.php" ? list : named(list, fields);
            return jsonReply(out);
        }
        const std::string name = path.substr(5);
        std::string content;
        if (name.size() > 4 && name.compare(name.size() - 4, 4, ".php") == 0 &&
            name.find('/') == std::string::npos &&
            readWholeFile(options_.dir + "/api/" + name.substr(0, name.size() - 4) + ".json",
                          content)) {
            Reply reply;
            reply.body = content;
            return reply;
        }
        return refusal("common", "error_notfound", 404);
    }

    // The entries that pkg_list names, in its order.
    static Json::Value named(const Json::Value& list, const Fields& fields) {
        Json::Value wanted, out(Json::arrayValue);
        auto field = fields.find("pkg_list");
        if (field == fields.end() || !CORVPackageTool::fromString(field->second, wanted) ||
            !wanted.isArray()) {
            return out;
        }
        for (const Json::Value& item : wanted) {
            const std::string id = item.isObject() ? item.get("id", "").asString() : "";
            for (const Json::Value& entry : list) {
                if (entry.isObject() && entry.get("package", "").asString() == id) {
                    out.append(entry);
                    break;
                }
            }
        }
        return out;
    }

    Reply routeFile(const std::string& path) {
        Reply reply;
        struct stat st {};
        const std::string full = options_.dir + path;
        if (path.find("..") != std::string::npos || path == "/" || stat(full.c_str(), &st) != 0 ||
            !S_ISREG(st.st_mode)) {
            reply.status = 404;
            reply.body = "not found\n";
            reply.contentType = "text/plain";
            return reply;
        }
        reply.contentType = contentTypeOf(path);
        reply.file = full;
        return reply;
    }

    ServeOptions options_;
    Catalogue catalogue_;
    FaultFile faults_;
    RequestLog log_;
    std::string keyring_;
};

bool splitListen(const std::string& listen, std::string& host, int& port) {
    size_t colon = listen.rfind(':');
    if (colon == std::string::npos) {
        return false;
    }
    host = listen.substr(0, colon);
    char* end = nullptr;
    long value = strtol(listen.c_str() + colon + 1, &end, 10);
    if (host.empty() || *end != '\0' || end == listen.c_str() + colon + 1 || value < 0 ||
        value > 65535) {
        return false;
    }
    port = static_cast<int>(value);
    return true;
}

}  // namespace

int serve(const ServeOptions& options) {
    std::string host;
    int port = 0;
    if (!splitListen(options.listen, host, port)) {
        fprintf(stderr, "corv-store: --listen takes ADDR:PORT, not %s\n", options.listen.c_str());
        return 2;
    }
    Store store(options);
    std::string error;
    if (!store.ready(error)) {
        fprintf(stderr, "corv-store: %s\n", error.c_str());
        return 2;
    }
    const bool tls = !options.certFile.empty();
    std::unique_ptr<httplib::Server> server;
    if (tls) {
        server =
            std::make_unique<httplib::SSLServer>(options.certFile.c_str(), options.keyFile.c_str());
    } else {
        server = std::make_unique<httplib::Server>();
    }
    if (!server->is_valid()) {
        fprintf(stderr, "corv-store: cannot use the certificate %s with the key %s\n",
                options.certFile.c_str(), options.keyFile.c_str());
        return 2;
    }
    auto handler = [&store](const httplib::Request& req, httplib::Response& res) {
        store.handle(req, res);
    };
    server->Get(".*", handler);
    server->Post(".*", handler);
    int bound =
        port == 0 ? server->bind_to_any_port(host) : (server->bind_to_port(host, port) ? port : -1);
    if (bound < 0) {
        fprintf(stderr, "corv-store: cannot listen on %s\n", options.listen.c_str());
        return 2;
    }
    printf("listening on %s://%s:%d\n", tls ? "https" : "http", host.c_str(), bound);
    fflush(stdout);
    server->listen_after_bind();
    return 0;
}

}  // namespace store
