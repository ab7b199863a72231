// A plain HTTP/1.0 client for the loopback interface, for tests of what the system web
// server and package daemons answer.
#pragma once

#include <functional>
#include <map>
#include <string>

namespace testutil {

struct HttpReply {
    int status = 0;                              // 0 when nothing answered
    std::map<std::string, std::string> headers;  // names in lower case
    std::string body;
};

// GET http://127.0.0.1:<port><path>, waiting 5 seconds at most.
HttpReply httpGet(int port, const std::string& path);

// Asks again every 50 ms until `done` holds for the reply or `seconds` have passed (a web
// server reload takes effect a moment after it is asked for); the last reply.
HttpReply httpGetUntil(int port, const std::string& path,
                       const std::function<bool(const HttpReply&)>& done, int seconds = 5);

}  // namespace testutil
