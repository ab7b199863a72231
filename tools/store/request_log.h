// The request log: one JSON object per line and request, so a test can check every field
// that a client sent:
//   {"time": <seconds>, "method": "GET", "path": "/api/getPackageList.php",
//    "query": {name: value, ...}, "form": {name: value, ...}, "user_agent": "...",
//    "status": 200, "fault": false}
// "query" holds the decoded fields of the URL's query, "form" those of a form-encoded
// body; a name that comes twice keeps its last value.
#pragma once

#include <stdio.h>

#include <map>
#include <mutex>
#include <string>

namespace store {

using Fields = std::map<std::string, std::string>;

// The fields of "a=1&b=x%20y" (also "+" for a blank).
Fields parseFormText(const std::string& text);

class RequestLog {
  public:
    // Writes to `path` (appending), or to standard output when it is empty.
    explicit RequestLog(const std::string& path);
    ~RequestLog();
    bool ok() const { return out_ != nullptr; }
    void write(const std::string& method, const std::string& path, const Fields& query,
               const Fields& form, const std::string& userAgent, int status, bool fault);

  private:
    FILE* out_;
    bool own_;
    std::mutex mutex_;
};

}  // namespace store
