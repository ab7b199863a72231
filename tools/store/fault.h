// The fault file: rules that make the server misbehave on purpose, read on every request
// so that a test can change them while the server runs.
//
// The file is a JSON array of rules (or {"rules": [...]}). A rule applies to a request when
// its "path" equals the request's path (a "path" ending in "*" is a prefix) and, if given,
// its "method" equals the request's. The first rule that applies wins. Members:
//   "times": N            only the first N requests that it applies to (counted per rule
//                         text, so an edited rule counts afresh); without it, every one
//   "status": N           the HTTP status of the reply
//   "body": "text"        the reply body instead of the real one ("" for an empty body)
//   "fill": N             a body of N bytes of "x" instead of the real one (huge replies)
//   "content_type": "t"   the Content-Type instead of the real one
//   "delay_ms": N         wait before answering
//   "stall_after": N      send N bytes of the body, then send nothing more for
//                         "stall_seconds" (default 600) and close the connection
//   "cut_after": N        send N bytes of the body, then close the connection
//   "chunked": true       send the body in chunks, without Content-Length
//   "redirect": "url"     answer with a redirect to this URL or path ("status" defaults
//                         to 302)
// A file that is missing is no fault; one that does not parse is reported on standard
// error once per change and ignored.
#pragma once

#include <json/json.h>

#include <map>
#include <mutex>
#include <string>

namespace store {

struct Fault {
    bool any = false;
    int status = 0;  // 0: the real status
    bool replaceBody = false;
    std::string body;
    std::string contentType;  // empty: the real type
    int delayMs = 0;
    long long stallAfter = -1;
    int stallSeconds = 600;
    long long cutAfter = -1;
    bool chunked = false;
    std::string redirect;
};

class FaultFile {
  public:
    explicit FaultFile(std::string path);
    // The fault for this request, counted against its rule's "times".
    Fault match(const std::string& method, const std::string& path);

  private:
    Json::Value readRules();

    std::string path_;
    std::mutex mutex_;
    std::map<std::string, long long> used_;
    std::string lastBadText_;
};

}  // namespace store
