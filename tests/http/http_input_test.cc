// The reference host's HTTP input against a real web server (lighttpd on
// loopback, serving the corpus): every corpus file played by URL gives the
// events it gives from the file in every buffering mode, also after a seek; a
// seek costs the requests it is documented to cost; a server without range
// support plays in one pass and refuses seeks; a connection cut halfway ends
// the stream without a hang; a missing file or a refused connection says so.
#include <arpa/inet.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <thread>

#include "../corpus/corpus_play.h"
#include "local_web_server.h"

namespace {

using namespace host;
using corpus::base_name;

// One server for the whole suite; null without libcurl, lighttpd or corpus.
LocalWebServer* web_server() {
    static std::string why;
#ifdef PLIMO_HAVE_CURL
    static auto server = testenv::corpus_files().empty()
                             ? nullptr
                             : LocalWebServer::start(testenv::corpus_dir(), &why);
#else
    static std::unique_ptr<LocalWebServer> server;
#endif
    return server.get();
}
#define REQUIRE_WEB_SERVER(s)       \
    LocalWebServer* s = web_server(); \
    if (!s) GTEST_SKIP() << "no HTTP input, lighttpd or corpus"

// Seeks backward to *t and plays up to the first media frame after it.
int seek_to_frame(corpus::Player& p, int64_t* t) {
    const int rc = p.seek(HOVA_SEEK_BACKWARD, t);
    const size_t from = p.cb().events().size();
    for (int c = 0; !p.framed_since(from) && c < 1000 && p.step() != HOVA_EndOfStream; ++c) {
    }
    return rc;
}

struct Played {
    int rc = -1, seek_rc = -1;
    int64_t found = 0;
    std::vector<std::string> events;
    size_t blocks = 0;
    uint64_t requests = 0;
    std::string failure;
};

// Opens, optionally seeks to `seek_us` after the configuration records, plays
// to the end or `max` calls and closes.
Played play(std::unique_ptr<RawInput> input, int64_t seek_us = -1, uint64_t max = 2000000) {
    Played out;
    if (!input) return out;
    const HttpSource* http = input->http();
    corpus::Player p(std::move(input));
    if (p.rc == HOVA_OK && seek_us >= 0) {
        p.step();
        out.seek_rc = seek_to_frame(p, &(out.found = seek_us));
    }
    p.play(max);
    out.rc = p.rc;
    out.events = p.trace();
    p.s.close();
    out.blocks = p.s.blocks_outstanding();
    if (http) out.requests = http->stats().requests, out.failure = http->failure();
    return out;
}

std::unique_ptr<RawInput> by_url(const std::string& url, Buffering b) {
    std::string why;
    auto input = RawInput::from_url(url, with_buffering(b), &why);
    EXPECT_TRUE(input) << url << ": " << why;
    return input;
}

// With the flags the network input has (streaming, size known), so that the
// plug-in takes the same decisions; `seekable` as the server allows.
std::unique_ptr<RawInput> by_file(const std::string& path, Buffering b, bool seekable = true) {
    InputOptions in = with_buffering(b);
    in.streaming = true;
    in.seekable = seekable;
    return RawInput::from_file(path, in);
}

TEST(HttpInput, EveryCorpusFileByUrlGivesTheFileEventsInEveryModeAlsoAfterASeek) {
    REQUIRE_WEB_SERVER(server);
    for (const std::string& path : testenv::corpus_files()) {
        corpus::Player whole(by_file(path, Buffering::Cache));
        whole.play();
        int64_t last_pts = 0;
        for (const HostEvent& e : whole.cb().events())
            if (e.kind == EventKind::Commit && !e.packet_type) last_pts = std::max(last_pts, e.pts);
        const std::string url = server->url(base_name(path));
        for (Buffering b : kBufferings) {
            SCOPED_TRACE(base_name(path) + " " + buffering_name(b));
            auto input = by_url(url, b);
            if (!input) continue;
            EXPECT_EQ(input->io()->streaming, 1);
            EXPECT_EQ(input->io()->seekable, 1);
            EXPECT_EQ(input->io()->input_size, input->size());
            const Played net = play(std::move(input)), local = play(by_file(path, b));
            EXPECT_EQ(net.rc, local.rc);
            EXPECT_EQ(net.events, local.events);
            EXPECT_EQ(net.blocks, 0u);
            EXPECT_EQ(net.failure, "");
            EXPECT_LE(net.requests, 3u) << "the first, at most a jump to the index and one back";
            if (whole.rc != HOVA_OK || last_pts <= 0) continue;
            const Played sn = play(by_url(url, b), last_pts / 2, 200),
                         sl = play(by_file(path, b), last_pts / 2, 200);
            EXPECT_EQ(sn.seek_rc, sl.seek_rc);
            EXPECT_EQ(sn.found, sl.found);
            EXPECT_EQ(sn.events, sl.events);
            EXPECT_EQ(sn.blocks, 0u);
            EXPECT_EQ(sn.failure, "");
        }
        whole.expect_clean_close();
    }
}

// The input alone: a read where the open transfer is, or within what it keeps
// behind or reads through to, costs nothing; a read anywhere else costs one
// request; the bytes are the file's.
TEST(HttpInput, AReadAwayFromTheTransferCostsOneRequest) {
    REQUIRE_WEB_SERVER(server);
    REQUIRE_CORPUS_FILE(path, "moon-elephants-dream-first-minute.wmv");
    const std::vector<uint8_t> file = testenv::read_file_or_empty(path);
    auto input = by_url(server->url(base_name(path)), Buffering::Cache);
    ASSERT_TRUE(input);
    ASSERT_EQ(input->size(), file.size());
    cb_io_st* io = input->io();
    const HttpOptions opt;
    const int64_t size = static_cast<int64_t>(file.size()), rt = opt.read_through,
                  far = 301000 + static_cast<int64_t>(opt.window) + 16384 + rt + 1;
    const struct {
        int64_t to;  // where to seek first, -1: read on
        size_t len;
        uint64_t requests;
    } steps[] = {{-1, 4096, 0},   {0, 4096, 0},  // the open's request; a peek and back
                 {-1, 100000, 0}, {100000 - static_cast<int64_t>(opt.history) / 2, 1000, 0},
                 {101000 + rt / 2, 1000, 0},  // a short skip reads through
                 {size / 2, 200000, 1}, {100, 1000, 1}, {size - 100, 100, 1}, {-1, 100, 0},
                 {300000, 1000, 1}, {far, 1000, 1}};  // past what waits ahead and the gap
    for (const auto& st : steps) {
        SCOPED_TRACE(testing::Message() << "to " << st.to);
        if (st.to >= 0) {
            ASSERT_EQ(io->seek(io, st.to, CB_SEEK_SET), st.to);
        }
        const uint64_t pos = input->position(), before = input->http()->stats().requests;
        std::vector<uint8_t> got(st.len);
        got.resize(io->read(io, got.data(), got.size()));
        EXPECT_EQ(got.size(), std::min<uint64_t>(st.len, file.size() - pos));
        EXPECT_TRUE(std::equal(got.begin(), got.end(), file.begin() + static_cast<long>(pos)));
        EXPECT_EQ(input->http()->stats().requests - before, st.requests);
    }
    EXPECT_EQ(input->http()->failure(), "");
}

// A seek whose index walk meets only entries an earlier seek probed costs at
// most one request, the jump to its packet, up to its first video frame.
TEST(HttpInput, SeekOverKnownIndexEntriesCostsOneRequestInEveryMode) {
    REQUIRE_WEB_SERVER(server);
    REQUIRE_CORPUS_FILE(path, "moon-elephants-dream-first-minute.wmv");
    for (Buffering b : kBufferings) {
        SCOPED_TRACE(buffering_name(b));
        auto input = by_url(server->url(base_name(path)), b);
        ASSERT_TRUE(input);
        const HttpSource* http = input->http();
        corpus::Player p(std::move(input));
        ASSERT_EQ(p.rc, HOVA_OK);
        p.step();
        int64_t answers[3] = {40000000, 10000000, 40000000};
        uint64_t cost = 0;
        for (int64_t& target : answers) {
            const uint64_t before = http->stats().requests;
            ASSERT_EQ(seek_to_frame(p, &target), HOVA_OK);
            cost = http->stats().requests - before;
        }
        EXPECT_EQ(answers[2], answers[0]);
        // Unbuffered, exactly the jump; the buffered modes may still hold the packet.
        EXPECT_TRUE(b == Buffering::None ? cost == 1u : cost <= 1u) << cost << " requests";
        p.expect_clean_close();
    }
}

TEST(HttpInput, ServerWithoutRangesPlaysInOnePassAndRefusesSeeks) {
    REQUIRE_WEB_SERVER(server);
    REQUIRE_CORPUS_FILE(path, "moon-elephants-dream-first-minute.wmv");
    const std::string url = server->url(base_name(path), false);
    for (Buffering b : kBufferings) {
        SCOPED_TRACE(buffering_name(b));
        auto input = by_url(url, b);
        if (!input) continue;
        EXPECT_FALSE(input->http()->ranges());
        EXPECT_EQ(input->io()->seekable, 0);
        const Played net = play(std::move(input)), seek = play(by_url(url, b), 20000000, 50);
        EXPECT_EQ(net.events, play(by_file(path, b, false)).events);
        EXPECT_NE(seek.seek_rc, HOVA_OK);
        for (const Played* p : {&net, &seek}) {
            EXPECT_EQ(p->requests, 1u);
            EXPECT_EQ(p->blocks, 0u);
        }
    }
}

// Answers one request on loopback like a server without ranges, but sends
// only the first half of the file before it closes the connection.
struct CuttingServer {
    explicit CuttingServer(const std::vector<uint8_t>& file) {
        sockaddr_in a{};
        a.sin_family = AF_INET;
        a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t len = sizeof a;
        if (fd < 0 || ::bind(fd, reinterpret_cast<sockaddr*>(&a), len) != 0 ||
            ::listen(fd, 1) != 0 || ::getsockname(fd, reinterpret_cast<sockaddr*>(&a), &len) != 0)
            return;
        url = "http://127.0.0.1:" + std::to_string(ntohs(a.sin_port)) + "/file.wmv";
        std::string out = "HTTP/1.1 200 OK\r\nContent-Length: " + std::to_string(file.size()) +
                          "\r\n\r\n" + std::string(file.begin(), file.begin() + file.size() / 2);
        thread = std::thread([this, out] {
            pollfd p{fd, POLLIN, 0};
            const int c = ::poll(&p, 1, 10000) == 1 ? ::accept(fd, nullptr, nullptr) : -1;
            const timeval tv{2, 0};
            char request[4096];
            if (c < 0 || ::setsockopt(c, SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof tv) != 0 ||
                ::recv(c, request, sizeof request, 0) <= 0)
                return;
            for (ssize_t at = 0, k = 0; at < ssize_t(out.size()) && k >= 0; at += k)
                k = ::send(c, out.data() + at, out.size() - size_t(at), MSG_NOSIGNAL);
            ::close(c);
        });
    }
    ~CuttingServer() {
        if (thread.joinable()) thread.join();
        ::close(fd);
    }
    int fd = ::socket(AF_INET, SOCK_STREAM, 0);
    std::string url;
    std::thread thread;
};

TEST(HttpInput, ConnectionCutHalfwayEndsTheStreamInEveryMode) {
#ifndef PLIMO_HAVE_CURL
    GTEST_SKIP() << "no HTTP input";
#endif
    REQUIRE_CORPUS_FILE(path, "moon-elephants-dream-first-minute.wmv");
    const std::vector<uint8_t> file = testenv::read_file_or_empty(path);
    const Played whole = play(by_file(path, Buffering::Cache, false));
    for (Buffering b : kBufferings) {
        SCOPED_TRACE(buffering_name(b));
        CuttingServer server(file);
        ASSERT_FALSE(server.url.empty());
        const auto t0 = std::chrono::steady_clock::now();
        const Played cut = play(by_url(server.url, b));
        EXPECT_LT(std::chrono::steady_clock::now() - t0, std::chrono::seconds(20));
        ASSERT_EQ(cut.rc, HOVA_OK);
        EXPECT_NE(cut.events.back().find("last 8 "), std::string::npos) << "the end of the stream";
        EXPECT_EQ(cut.blocks, 0u);
        EXPECT_NE(cut.failure.find("connection cut at byte"), std::string::npos) << cut.failure;
        // Before the cut, what the file gives; only the end differs: the
        // objects pending at the cut and the notices.
        ASSERT_LT(cut.events.size(), whole.events.size());
        const auto same = std::mismatch(cut.events.begin(), cut.events.end(), whole.events.begin());
        EXPECT_GE(same.first - cut.events.begin() + 5, cut.events.end() - cut.events.begin());
        EXPECT_GT(same.first - cut.events.begin(), 10);
    }
}

TEST(HttpInput, AMissingFileOrARefusedConnectionSaysSo) {
    REQUIRE_WEB_SERVER(server);
    const std::pair<std::string, const char*> cases[] = {
        {server->url("no-such-file.wmv"), "HTTP status 404"},
        {"http://127.0.0.1:1/x.wmv", "onnect"}};
    for (const auto& [url, says] : cases) {
        std::string why;
        EXPECT_FALSE(RawInput::from_url(url, {}, &why));
        EXPECT_NE(why.find(says), std::string::npos) << why;
    }
}

}  // namespace
