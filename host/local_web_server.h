// A real web server (Debian's lighttpd) on 127.0.0.1 and a free port,
// serving one folder, for the tests and benchmarks of the HTTP input. The
// folder is served at "/" with range requests and at "/norange/" without.
// The server lives as long as the object (and dies with the process that
// started it); its configuration and logs go to a private temporary folder.
#pragma once

#include <sys/types.h>

#include <memory>
#include <string>
#include <vector>

namespace host {

class LocalWebServer {
public:
    // Null with the reason when lighttpd is not installed or does not start.
    static std::unique_ptr<LocalWebServer> start(const std::string& root, std::string* why);
    ~LocalWebServer();
    LocalWebServer(const LocalWebServer&) = delete;
    LocalWebServer& operator=(const LocalWebServer&) = delete;

    int port() const { return port_; }
    // http://127.0.0.1:PORT/name (or /norange/name).
    std::string url(const std::string& name, bool ranges = true) const;
    // Stops the server and returns its access log, one line per request:
    // "<request line> <status> <body bytes sent>" (the log is complete only
    // once the server has stopped).
    std::vector<std::string> stop();

private:
    LocalWebServer() = default;
    pid_t pid_ = -1;
    int port_ = 0;
    std::string dir_;
};

// Path of the lighttpd executable, or "" when it is not installed.
std::string find_lighttpd();

}  // namespace host
