#include "local_web_server.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <thread>

namespace host {

namespace {

// A port the kernel considers free right now (the server binds it a moment
// later; a clash makes start() try another).
int free_port() {
    const int fd = ::socket(AF_INET, SOCK_STREAM, 0);
    if (fd < 0) return 0;
    sockaddr_in a{};
    a.sin_family = AF_INET;
    a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t len = sizeof a;
    int port = 0;
    if (::bind(fd, reinterpret_cast<sockaddr*>(&a), sizeof a) == 0 &&
        ::getsockname(fd, reinterpret_cast<sockaddr*>(&a), &len) == 0)
        port = ntohs(a.sin_port);
    ::close(fd);
    return port;
}

bool accepts(int port) {
    const int fd = ::socket(AF_INET, SOCK_STREAM, 0);
    if (fd < 0) return false;
    sockaddr_in a{};
    a.sin_family = AF_INET;
    a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    a.sin_port = htons(static_cast<uint16_t>(port));
    const bool ok = ::connect(fd, reinterpret_cast<sockaddr*>(&a), sizeof a) == 0;
    ::close(fd);
    return ok;
}

}  // namespace

std::string find_lighttpd() {
    for (const char* p : {"/usr/sbin/lighttpd", "/usr/bin/lighttpd", "/usr/local/sbin/lighttpd"})
        if (::access(p, X_OK) == 0) return p;
    return "";
}

std::unique_ptr<LocalWebServer> LocalWebServer::start(const std::string& root, std::string* why) {
    const std::string exe = find_lighttpd();
    if (exe.empty()) {
        *why = "lighttpd is not installed (scripts/install-deps installs it)";
        return nullptr;
    }
    char tmpl[] = "/tmp/plimo_www_XXXXXX";
    if (!::mkdtemp(tmpl)) {
        *why = "cannot make a temporary folder";
        return nullptr;
    }
    std::unique_ptr<LocalWebServer> s(new LocalWebServer());
    s->dir_ = tmpl;
    for (int attempt = 0; attempt < 3; ++attempt) {
        const int port = free_port();
        const std::string conf = s->dir_ + "/lighttpd.conf";
        std::ofstream(conf) << "server.document-root = \"" << root << "\"\n"
                            << "server.bind = \"127.0.0.1\"\n"
                            << "server.port = " << port << "\n"
                            << "server.errorlog = \"" << s->dir_ << "/error.log\"\n"
                            << "server.modules = (\"mod_alias\", \"mod_accesslog\")\n"
                            << "accesslog.filename = \"" << s->dir_ << "/access.log\"\n"
                            << "accesslog.format = \"%r %>s %b\"\n"
                            << "mimetype.assign = (\"\" => \"application/octet-stream\")\n"
                            << "alias.url = (\"/norange/\" => \"" << root << "/\")\n"
                            << "$HTTP[\"url\"] =~ \"^/norange/\" { server.range-requests = \"disable\" }\n";
        const pid_t pid = ::fork();
        if (pid < 0) break;
        if (pid == 0) {
            // The server goes when the process that started it goes.
            ::prctl(PR_SET_PDEATHSIG, SIGTERM);
            execl(exe.c_str(), exe.c_str(), "-D", "-f", conf.c_str(), static_cast<char*>(nullptr));
            _exit(127);
        }
        s->pid_ = pid;
        s->port_ = port;
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(5);
        while (std::chrono::steady_clock::now() < deadline) {
            if (accepts(port)) return s;
            int status = 0;
            if (::waitpid(pid, &status, WNOHANG) == pid) {
                s->pid_ = -1;
                break;
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        if (s->pid_ > 0) s->stop();
    }
    std::ifstream log(s->dir_ + "/error.log");
    std::stringstream text;
    text << log.rdbuf();
    *why = "lighttpd did not start: " + text.str();
    return nullptr;
}

std::string LocalWebServer::url(const std::string& name, bool ranges) const {
    return "http://127.0.0.1:" + std::to_string(port_) + (ranges ? "/" : "/norange/") + name;
}

std::vector<std::string> LocalWebServer::stop() {
    if (pid_ > 0) {
        ::kill(pid_, SIGTERM);
        int status = 0;
        ::waitpid(pid_, &status, 0);
        pid_ = -1;
    }
    std::vector<std::string> lines;
    std::ifstream log(dir_ + "/access.log");
    for (std::string line; std::getline(log, line);) lines.push_back(line);
    return lines;
}

LocalWebServer::~LocalWebServer() {
    stop();
    std::error_code ignored;
    if (!dir_.empty()) std::filesystem::remove_all(dir_, ignored);
}

}  // namespace host
