// The reference host's HTTP input against a real web server (lighttpd on
// loopback, serving the corpus): every corpus file played by URL gives the
// events it gives from the file in every buffering mode, also after a seek; a
// seek costs one request; a server without range support plays in one pass and
// refuses seeks; a connection cut halfway ends the stream without a hang; and
// asfdump takes a URL where it takes a file.
#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <fstream>
#include <thread>

#include "../corpus/corpus_play.h"
#include "local_web_server.h"

namespace {

using corpus::base_name;
using host::kBufferings;
using host::with_buffering;

// One server for the whole suite.
host::LocalWebServer* web_server(std::string* why) {
    static std::unique_ptr<host::LocalWebServer> server;
    static std::string reason;
    static bool tried = false;
    if (!tried) {
        tried = true;
#ifndef PLIMO_HAVE_CURL
        reason = "the host is built without HTTP input (libcurl missing)";
        return nullptr;
#endif
        if (testenv::corpus_files().empty())
            reason = "no corpus in " + testenv::corpus_dir();
        else
            server = host::LocalWebServer::start(testenv::corpus_dir(), &reason);
    }
    *why = reason;
    return server.get();
}

#define REQUIRE_WEB_SERVER(var)                         \
    std::string var##_why;                              \
    host::LocalWebServer* var = web_server(&var##_why); \
    if (!var) GTEST_SKIP() << var##_why

struct Played {
    int rc, seek_rc = -1;
    int64_t found = 0;
    std::vector<std::string> events;
    size_t blocks;
    uint64_t requests = 0;
    std::string failure;
};

// Opens, optionally seeks backward to `seek_us` (after the configuration
// records, then up to the first frame) and plays to the end or `max` calls.
Played play(std::unique_ptr<host::RawInput> input, int64_t seek_us = -1, uint64_t max = 2000000) {
    Played out;
    const host::HttpSource* http = input->http();
    corpus::Player p(std::move(input));
    if (p.rc == HOVA_OK && seek_us >= 0) {
        p.step();
        out.found = seek_us;
        out.seek_rc = p.seek(HOVA_SEEK_BACKWARD, &out.found);
        const size_t from = p.cb().events().size();
        while (!p.framed_since(from) && p.calls < 1000 && p.step() != HOVA_EndOfStream) {
        }
    }
    p.play(max);
    out.rc = p.rc;
    out.events = p.trace();
    p.s.close();
    out.blocks = p.s.blocks_outstanding();
    if (http) out.requests = http->stats().requests, out.failure = http->failure();
    return out;
}

std::unique_ptr<host::RawInput> by_url(const std::string& url, host::InputOptions in) {
    std::string why;
    auto input = host::RawInput::from_url(url, in, &why);
    EXPECT_TRUE(input) << url << ": " << why;
    return input;
}

// The same raw input flags as the network input has: streaming with the size
// known, so that the plug-in takes the same decisions.
std::unique_ptr<host::RawInput> by_file(const std::string& path, host::InputOptions in) {
    in.streaming = true;
    return host::RawInput::from_file(path, in);
}

TEST(HttpInput, EveryCorpusFileByUrlGivesTheFileEventsInEveryMode) {
    REQUIRE_WEB_SERVER(server);
    for (const std::string& path : testenv::corpus_files()) {
        const Played whole = play(by_file(path, with_buffering(host::Buffering::Cache)));
        int64_t last_pts = 0;  // of the last media frame
        for (const std::string& e : whole.events) {
            long long call, kind, type, pt, size, pts;
            if (std::sscanf(e.c_str(), "%lld %lld %lld %lld %lld %lld", &call, &kind, &type,
                            &pt, &size, &pts) == 6 &&
                kind == 0 && pt == 0)
                last_pts = std::max<int64_t>(last_pts, pts);
        }
        for (host::Buffering b : kBufferings) {
            SCOPED_TRACE(base_name(path) + " " + host::buffering_name(b));
            auto input = by_url(server->url(base_name(path)), with_buffering(b));
            if (!input) continue;
            EXPECT_EQ(input->io()->streaming, 1);
            EXPECT_EQ(input->io()->seekable, 1);
            EXPECT_EQ(input->io()->input_size, input->size());
            const Played net = play(std::move(input)),
                         local = play(by_file(path, with_buffering(b)));
            EXPECT_EQ(net.rc, local.rc);
            EXPECT_EQ(net.events, local.events);
            EXPECT_EQ(net.blocks, 0u);
            EXPECT_EQ(net.failure, "");
            EXPECT_LE(net.requests, 3u) << "the first, at most a jump to the index and one back";
            if (whole.rc != HOVA_OK || last_pts <= 0) continue;
            // A seek halfway lands where it lands from the file, with the same frames after it.
            const Played sn =
                play(by_url(server->url(base_name(path)), with_buffering(b)), last_pts / 2, 200);
            const Played sl = play(by_file(path, with_buffering(b)), last_pts / 2, 200);
            EXPECT_EQ(sn.seek_rc, sl.seek_rc);
            EXPECT_EQ(sn.found, sl.found);
            EXPECT_EQ(sn.events, sl.events);
            EXPECT_EQ(sn.blocks, 0u);
            EXPECT_EQ(sn.failure, "");
        }
    }
}

// The input alone: a read where the open transfer is costs nothing, a read
// anywhere else costs exactly one request, and the bytes are the file's.
TEST(HttpInput, SeekCostsOneRequest) {
    REQUIRE_WEB_SERVER(server);
    REQUIRE_CORPUS_FILE(path, "moon-elephants-dream-first-minute.wmv");
    const std::vector<uint8_t> file = testenv::read_file_or_empty(path);
    const host::HttpOptions opt;
    auto input = by_url(server->url(base_name(path)), {});
    ASSERT_TRUE(input);
    ASSERT_EQ(input->size(), file.size());
    cb_io_st* io = input->io();
    const int64_t size = static_cast<int64_t>(file.size());
    const int64_t rt = static_cast<int64_t>(opt.read_through),
                  hist = static_cast<int64_t>(opt.history);
    const struct {
        const char* what;
        int64_t to;  // where to seek first, -1: read on
        size_t len;
        uint64_t requests;
    } steps[] = {
        {"first bytes (the open's request)", -1, 4096, 0},
        {"peek and back", 0, 4096, 0},
        {"read on", -1, 100000, 0},
        {"back within what was kept", 100000 - hist / 2, 1000, 0},
        {"short skip forward reads through", 101000 + rt / 2, 1000, 0},
        {"far forward", size / 2, 200000, 1},
        {"far back", 100, 1000, 1},
        {"the end", size - 100, 100, 1},
        {"past the end", -1, 100, 0},
        {"far forward again", 300000, 1000, 1},
        // Beyond what may wait ahead (the window and one delivery) plus the gap.
        {"forward past the read-through gap",
         301000 + static_cast<int64_t>(opt.window) + 16384 + rt + 1, 1000, 1},
    };
    for (const auto& st : steps) {
        SCOPED_TRACE(st.what);
        if (st.to >= 0) {
            ASSERT_EQ(io->seek(io, st.to, CB_SEEK_SET), st.to);
        }
        const uint64_t pos = input->position(), before = input->http()->stats().requests;
        std::vector<uint8_t> got(st.len);
        const size_t n = io->read(io, got.data(), got.size());
        ASSERT_EQ(n, static_cast<size_t>(std::min<uint64_t>(st.len, file.size() - pos)));
        EXPECT_TRUE(std::equal(got.begin(), got.begin() + static_cast<long>(n),
                               file.begin() + static_cast<long>(pos)));
        EXPECT_EQ(input->http()->stats().requests - before, st.requests);
    }
    EXPECT_EQ(input->http()->failure(), "");
}

// A seek whose index walk meets only entries an earlier seek probed costs at
// most one request, the jump to its packet, up to its first video frame.
TEST(HttpInput, SeekOverKnownIndexEntriesCostsOneRequest) {
    REQUIRE_WEB_SERVER(server);
    REQUIRE_CORPUS_FILE(path, "moon-elephants-dream-first-minute.wmv");
    for (int m = 0; m < 4; ++m) {
        SCOPED_TRACE(host::buffering_name(kBufferings[m]));
        auto input = by_url(server->url(base_name(path)), with_buffering(kBufferings[m]));
        ASSERT_TRUE(input);
        const host::HttpSource* http = input->http();
        corpus::Player p(std::move(input));
        ASSERT_EQ(p.rc, HOVA_OK);
        p.step();  // configuration records
        int64_t answers[3] = {40000000, 10000000, 40000000};
        uint64_t cost = 0;
        for (int64_t& target : answers) {
            const uint64_t before = http->stats().requests;
            ASSERT_EQ(p.seek(HOVA_SEEK_BACKWARD, &target), HOVA_OK);
            const size_t from = p.cb().events().size();
            for (int c = 0; !p.framed_since(from) && c < 1000 && p.step() != HOVA_EndOfStream;
                 ++c) {
            }
            cost = http->stats().requests - before;
        }
        EXPECT_EQ(answers[2], answers[0]);
        // Unbuffered, exactly the jump; the buffered modes may still hold the packet.
        EXPECT_TRUE(m == 1 ? cost == 1u : cost <= 1u) << cost << " requests for the third seek";
        p.expect_clean_close();
    }
}

TEST(HttpInput, ServerWithoutRangesPlaysInOnePassAndRefusesSeeks) {
    REQUIRE_WEB_SERVER(server);
    REQUIRE_CORPUS_FILE(path, "moon-elephants-dream-first-minute.wmv");
    for (host::Buffering b : kBufferings) {
        SCOPED_TRACE(host::buffering_name(b));
        auto input = by_url(server->url(base_name(path), false), with_buffering(b));
        if (!input) continue;
        EXPECT_FALSE(input->http()->ranges());
        EXPECT_EQ(input->io()->seekable, 0);
        host::InputOptions in = with_buffering(b);
        in.seekable = false;
        const Played net = play(std::move(input));
        EXPECT_EQ(net.events, play(by_file(path, in)).events);
        EXPECT_EQ(net.requests, 1u);
        EXPECT_EQ(net.blocks, 0u);
        const Played seek =
            play(by_url(server->url(base_name(path), false), with_buffering(b)), 20000000, 50);
        EXPECT_NE(seek.seek_rc, HOVA_OK);
        EXPECT_EQ(seek.requests, 1u);
        EXPECT_EQ(seek.blocks, 0u);
    }
}

// Serves one file on loopback like a range-capable server, but every
// response that starts in the first half of the file stops at its middle
// and the connection closes. Handles one connection at a time; stops with
// the object.
class CuttingServer {
public:
    explicit CuttingServer(std::vector<uint8_t> file) : file_(std::move(file)) {
        fd_ = ::socket(AF_INET, SOCK_STREAM, 0);
        sockaddr_in a{};
        a.sin_family = AF_INET;
        a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t len = sizeof a;
        if (fd_ < 0 || ::bind(fd_, reinterpret_cast<sockaddr*>(&a), sizeof a) != 0 ||
            ::listen(fd_, 8) != 0 || ::getsockname(fd_, reinterpret_cast<sockaddr*>(&a), &len) != 0)
            return;
        port_ = ntohs(a.sin_port);
        thread_ = std::thread([this] { serve(); });
    }
    ~CuttingServer() {
        stop_ = true;
        if (thread_.joinable()) thread_.join();
        if (fd_ >= 0) ::close(fd_);
    }
    std::string url() const { return "http://127.0.0.1:" + std::to_string(port_) + "/file.wmv"; }
    bool ok() const { return port_ != 0; }

private:
    void serve() {
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(60);
        for (int served = 0;
             !stop_ && served < 64 && std::chrono::steady_clock::now() < deadline;) {
            pollfd p{fd_, POLLIN, 0};
            if (::poll(&p, 1, 50) != 1) continue;
            const int c = ::accept(fd_, nullptr, nullptr);
            if (c < 0) continue;
            ++served;
            timeval tv{2, 0};
            ::setsockopt(c, SOL_SOCKET, SO_RCVTIMEO, &tv, sizeof tv);
            ::setsockopt(c, SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof tv);
            respond(c);
            ::close(c);
        }
    }
    void respond(int c) {
        std::string req;
        char buf[1024];
        while (req.find("\r\n\r\n") == std::string::npos && req.size() < 16384) {
            const ssize_t n = ::recv(c, buf, sizeof buf, 0);
            if (n <= 0) return;
            req.append(buf, static_cast<size_t>(n));
        }
        uint64_t from = 0;
        const size_t r = req.find("Range: bytes=");
        if (r != std::string::npos) from = std::strtoull(req.c_str() + r + 13, nullptr, 10);
        const uint64_t size = file_.size(), half = size / 2;
        if (from >= size) from = size;
        const uint64_t until = from < half ? half : size;
        const std::string head =
            "HTTP/1.1 206 Partial Content\r\nContent-Length: " + std::to_string(size - from) +
            "\r\nContent-Range: bytes " + std::to_string(from) + "-" + std::to_string(size - 1) +
            "/" + std::to_string(size) + "\r\nConnection: close\r\n\r\n";
        if (!send_all(c, head.data(), head.size())) return;
        send_all(c, file_.data() + from, static_cast<size_t>(until - from));
    }
    bool send_all(int c, const void* p, size_t n) {
        const auto* b = static_cast<const uint8_t*>(p);
        while (n > 0 && !stop_) {
            const ssize_t k = ::send(c, b, n, MSG_NOSIGNAL);
            if (k <= 0) return false;
            b += k;
            n -= static_cast<size_t>(k);
        }
        return n == 0;
    }

    std::vector<uint8_t> file_;
    int fd_ = -1;
    int port_ = 0;
    std::atomic<bool> stop_{false};
    std::thread thread_;
};

TEST(HttpInput, ConnectionCutHalfwayEndsTheStreamInEveryMode) {
#ifndef PLIMO_HAVE_CURL
    GTEST_SKIP() << "the host is built without HTTP input (libcurl missing)";
#endif
    REQUIRE_CORPUS_FILE(path, "moon-elephants-dream-first-minute.wmv");
    CuttingServer server(testenv::read_file_or_empty(path));
    ASSERT_TRUE(server.ok());
    const Played whole = play(by_file(path, with_buffering(host::Buffering::Cache)));
    for (host::Buffering b : kBufferings) {
        SCOPED_TRACE(host::buffering_name(b));
        const auto t0 = std::chrono::steady_clock::now();
        const Played cut = play(by_url(server.url(), with_buffering(b)));
        EXPECT_LT(std::chrono::steady_clock::now() - t0, std::chrono::seconds(20));
        ASSERT_EQ(cut.rc, HOVA_OK);
        EXPECT_NE(cut.events.back().find("last 8 "), std::string::npos) << "the end of the stream";
        EXPECT_EQ(cut.blocks, 0u);
        EXPECT_NE(cut.failure.find("connection cut at byte"), std::string::npos) << cut.failure;
        // What was delivered before the cut is what the file gives, less of it;
        // only the end differs: the objects pending at the cut and the notices.
        ASSERT_GT(cut.events.size(), 10u);
        ASSERT_LT(cut.events.size(), whole.events.size());
        const size_t same = static_cast<size_t>(
            std::mismatch(cut.events.begin(), cut.events.end(), whole.events.begin()).first -
            cut.events.begin());
        EXPECT_GE(same + 5, cut.events.size());
    }
}

TEST(HttpInput, AsfdumpTakesAUrlWhereItTakesAFile) {
    REQUIRE_WEB_SERVER(server);
    REQUIRE_CORPUS_FILE(path, "moon-timecode-long-with-audio.wmv");
    CuttingServer cutting(testenv::read_file_or_empty(path));
    const std::string err = "/tmp/plimo_http_err_" + std::to_string(::getpid());
    auto asfdump = [&](const std::string& args, std::string* out, std::string* stderr_text) {
        const int rc =
            testenv::run_command(testenv::asfdump_path() + " " + args + " 2>" + err, out);
        std::ifstream f(err);
        std::stringstream t;
        t << f.rdbuf();
        *stderr_text = t.str();
        return rc;
    };
    const std::string url = server->url(base_name(path));
    struct Case {
        std::string args;
        int status;
        std::string same_as;  // asfdump arguments over the file whose output must match ("" none)
        std::string message;  // on stderr
    };
    const Case cases[] = {
        {"frames " + url, 0, "frames '" + path + "' --streaming --buffer ring --thread",
         "asfdump: http: "},
        {"frames " + url + " --buffer none --seek 10000000", 0,
         "frames '" + path + "' --streaming --buffer none --seek 10000000", ""},
        {"info " + url, 0, "info '" + path + "' --streaming", ""},
        {"probe " + url, 0, "probe '" + path + "'", ""},
        {"frames " + server->url(base_name(path), false) + " --seek 10000000", 0, "",
         "ignores range requests"},
        {"info " + server->url("no-such-file.wmv"), 3, "", "HTTP status 404"},
        {"frames http://127.0.0.1:1/x.wmv", 3, "", "cannot read"},
        {"frames " + cutting.url(), 3, "", "connection cut at byte"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.args);
        std::string out, text, ref, ref_text;
        EXPECT_EQ(asfdump(c.args, &out, &text), c.status) << text;
        if (!c.message.empty()) {
            EXPECT_NE(text.find(c.message), std::string::npos) << text;
        }
        if (!c.same_as.empty()) {
            EXPECT_EQ(asfdump(c.same_as, &ref, &ref_text), 0) << ref_text;
            EXPECT_EQ(out, ref);
        }
        if (c.status != 0 && c.args.rfind("frames", 0) == 0 && !out.empty()) {
            EXPECT_NE(out.find("\"blocks_outstanding\":0"), std::string::npos)
                << "the cut stream closes cleanly";
        }
    }
    ::unlink(err.c_str());
}

}  // namespace
