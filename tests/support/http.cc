#include "support/http.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <sstream>

namespace testutil {

namespace {

std::string exchange(int port, const std::string& request) {
    const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) {
        return "";
    }
    timeval timeout{5, 0};
    setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
    sockaddr_in addr{};
    addr.sin_family = AF_INET;
    addr.sin_port = htons(static_cast<uint16_t>(port));
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    std::string reply;
    if (connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) == 0 &&
        write(fd, request.data(), request.size()) == static_cast<ssize_t>(request.size())) {
        char buffer[4096];
        for (ssize_t n; (n = read(fd, buffer, sizeof buffer)) > 0;) {
            reply.append(buffer, static_cast<size_t>(n));
        }
    }
    close(fd);
    return reply;
}

}  // namespace

HttpReply httpGet(int port, const std::string& path) {
    const std::string raw = exchange(port, "GET " + path + " HTTP/1.0\r\nHost: localhost\r\n\r\n");
    HttpReply reply;
    const size_t end = raw.find("\r\n\r\n");
    if (raw.rfind("HTTP/", 0) != 0 || end == std::string::npos) {
        return reply;
    }
    std::istringstream head(raw.substr(0, end));
    std::string line;
    std::getline(head, line);
    reply.status = atoi(line.substr(line.find(' ') + 1).c_str());
    while (std::getline(head, line)) {
        const size_t colon = line.find(':');
        if (colon == std::string::npos) {
            continue;
        }
        std::string name = line.substr(0, colon);
        std::transform(name.begin(), name.end(), name.begin(), ::tolower);
        std::string value = line.substr(colon + 1);
        value.erase(0, value.find_first_not_of(' '));
        if (!value.empty() && value.back() == '\r') {
            value.pop_back();
        }
        reply.headers[name] = value;
    }
    reply.body = raw.substr(end + 4);
    return reply;
}

HttpReply httpGetUntil(int port, const std::string& path,
                       const std::function<bool(const HttpReply&)>& done, int seconds) {
    HttpReply reply;
    for (int i = 0; i < seconds * 20; ++i) {
        reply = httpGet(port, path);
        if (done(reply)) {
            break;
        }
        usleep(50000);
    }
    return reply;
}

}  // namespace testutil
