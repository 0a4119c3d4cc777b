// The reference host's HTTP input against a real web server (lighttpd on
// loopback, serving the corpus): every corpus file played by URL gives the
// events it gives from the file in every buffering mode, also after a seek; a
// seek costs the requests it is documented to cost; a server without range
// support plays in one pass and refuses seeks; a connection cut halfway ends
// the stream without a hang; asfdump takes a URL where it takes a file.
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

#ifndef PLIMO_HAVE_CURL
#define PLIMO_HAVE_CURL 0
#endif

// One server for the whole suite; null without libcurl, lighttpd or corpus.
LocalWebServer* web_server() {
    static std::string why;
    static auto server = !PLIMO_HAVE_CURL || testenv::corpus_files().empty()
                             ? nullptr
                             : LocalWebServer::start(testenv::corpus_dir(), &why);
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
    int seek_rc = -1;
    std::vector<std::string> events;  // after the open's answer and where the seek went
    uint64_t requests = 0, bytes = 0;
    uint64_t read = 0;  // what the plug-in read from the input
    std::string failure;
};

// Opens, optionally seeks to `seek_us` after the configuration records, plays
// to the end or `max` calls and closes with no block held.
Played play(std::unique_ptr<RawInput> input, int64_t seek_us = -1, uint64_t max = 2000000) {
    Played out;
    if (!input) return out;
    corpus::Player p(std::move(input));
    const HttpSource* http = p.s.input().http();
    std::string head = "open " + std::to_string(p.rc);
    if (p.rc == HOVA_OK && seek_us >= 0) {
        p.step();
        out.seek_rc = seek_to_frame(p, &seek_us);
        head += " seek to " + std::to_string(seek_us);
    }
    p.play(max);
    out.events = p.trace();
    out.events.insert(out.events.begin(), head);
    p.s.close();
    EXPECT_EQ(p.s.blocks_outstanding(), 0u);
    if (http) out.requests = http->stats().requests, out.bytes = http->stats().bytes_received;
    out.read = p.s.input().counters().bytes_read;
    if (http) out.failure = http->failure();
    return out;
}

// A URL; or a file with the flags the network input has (streaming, size
// known), so that the plug-in takes the same decisions.
std::unique_ptr<RawInput> input(const std::string& where, Buffering b, bool seekable = true) {
    InputOptions in = with_buffering(b);
    in.streaming = true;
    in.seekable = seekable;
    if (!is_http_url(where)) return RawInput::from_file(where, in);
    std::string why;
    auto url = RawInput::from_url(where, in, &why);
    EXPECT_TRUE(url) << where << ": " << why;
    return url;
}

TEST(HttpInput, EveryCorpusFileByUrlGivesTheFileEventsInEveryModeAlsoAfterASeek) {
    REQUIRE_WEB_SERVER(server);
    for (const std::string& path : testenv::corpus_files()) {
        corpus::Player whole(input(path, Buffering::Cache));
        whole.play();
        int64_t last_pts = 0;
        for (const HostEvent& e : whole.cb().events())
            if (e.kind == EventKind::Commit && !e.packet_type) last_pts = std::max(last_pts, e.pts);
        const std::string url = server->url(base_name(path));
        for (Buffering b : kBufferings) {
            SCOPED_TRACE(base_name(path) + " " + buffering_name(b));
            const Played net = play(input(url, b)), local = play(input(path, b));
            EXPECT_EQ(net.events, local.events);
            EXPECT_EQ(net.failure, "");
            EXPECT_LE(net.requests, 3u) << "the first, at most a jump to the index and one back";
            EXPECT_LE(net.bytes * 4, testenv::read_file_or_empty(path).size() * 5) << "each byte about once";
            // Each transfer receives at most one receive past what was read
            // from it, and may hold one back when it is dropped.
            const uint64_t chunk = static_cast<uint64_t>(HttpOptions{}.receive_chunk);
            EXPECT_LE(net.bytes, net.read + net.requests * 2 * chunk);
            if (whole.rc != HOVA_OK || last_pts <= 0) continue;
            const Played sn = play(input(url, b), last_pts / 2, 200),
                         sl = play(input(path, b), last_pts / 2, 200);
            EXPECT_EQ(sn.seek_rc, sl.seek_rc);
            EXPECT_EQ(sn.events, sl.events);
            EXPECT_EQ(sn.failure, "");
        }
        whole.expect_clean_close();
    }
}

// A seek whose index walk meets only entries an earlier seek probed costs at
// most one request, the jump to its packet, up to its first video frame.
TEST(HttpInput, SeekOverKnownIndexEntriesCostsOneRequestInEveryMode) {
    REQUIRE_WEB_SERVER(server);
    REQUIRE_CORPUS_FILE(path, "moon-elephants-dream-first-minute.wmv");
    for (Buffering b : kBufferings) {
        SCOPED_TRACE(buffering_name(b));
        corpus::Player p(input(server->url(base_name(path)), b));
        ASSERT_EQ(p.rc, HOVA_OK);
        const HttpSource* http = p.s.input().http();
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

// The input alone: the file's bytes in one request, and a read at the end
// answers nothing without asking the server.
TEST(HttpInput, ReadsTheFileInOneRequestAndNothingPastItsEnd) {
    REQUIRE_WEB_SERVER(server);
    REQUIRE_CORPUS_FILE(path, "moon-timecode-short.wmv");
    std::string why;
    auto src = HttpSource::open(server->url(base_name(path)), &why);
    ASSERT_TRUE(src) << why;
    const std::vector<uint8_t> file = testenv::read_file_or_empty(path);
    std::vector<uint8_t> got(file.size() + 1);
    EXPECT_EQ(src->read(0, got.data(), got.size()), file.size());
    EXPECT_TRUE(std::equal(file.begin(), file.end(), got.begin()));
    EXPECT_EQ(src->read(file.size(), got.data(), 1), 0u);
    EXPECT_EQ(src->stats().requests, 1u);
    EXPECT_EQ(src->failure(), "");
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
            char request[4096];
            if (c < 0 || ::recv(c, request, sizeof request, 0) <= 0) return;
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

// A server without ranges: the file in one pass, seeks refused; and one that
// cuts the connection halfway: the stream ends there, with no hang.
TEST(HttpInput, ServerWithoutRangesPlaysInOnePassRefusesSeeksAndEndsAtACut) {
    REQUIRE_WEB_SERVER(server);
    REQUIRE_CORPUS_FILE(path, "moon-elephants-dream-first-minute.wmv");
    const std::string url = server->url(base_name(path), false);
    for (Buffering b : kBufferings) {
        SCOPED_TRACE(buffering_name(b));
        CuttingServer cutting(testenv::read_file_or_empty(path));
        ASSERT_FALSE(cutting.url.empty());
        const auto t0 = std::chrono::steady_clock::now();
        const Played cut = play(input(cutting.url, b));
        EXPECT_LT(std::chrono::steady_clock::now() - t0, std::chrono::seconds(20));
        const Played whole = play(input(path, b, false)), net = play(input(url, b)),
                     seek = play(input(url, b), 20000000, 50);
        EXPECT_EQ(net.events, whole.events);
        EXPECT_NE(seek.seek_rc, HOVA_OK);
        for (const Played* p : {&cut, &net, &seek}) EXPECT_EQ(p->requests, 1u);
        EXPECT_NE(cut.failure.find("connection cut at byte"), std::string::npos) << cut.failure;
        EXPECT_EQ(cut.events.back().rfind("last 8 ", 0), 0u) << "the end of the stream";
        // Before the cut, what the file gives; only the end differs: the
        // objects pending at the cut and the notices.
        ASSERT_LT(cut.events.size(), whole.events.size());
        const auto same = std::mismatch(cut.events.begin(), cut.events.end(), whole.events.begin());
        EXPECT_GE(same.first - cut.events.begin() + 5, cut.events.end() - cut.events.begin());
        EXPECT_GT(same.first - cut.events.begin(), 10);
    }
}

// asfdump takes a URL where it takes a file: the same output as the file read
// the way the framework reads network input; HTTP failures give exit status 3
// and a clear message, and a cut stream still closes with no block held.
TEST(HttpInput, AsfdumpTakesAUrlWhereItTakesAFile) {
    REQUIRE_WEB_SERVER(server);
    REQUIRE_CORPUS_FILE(path, "moon-timecode-long-with-audio.wmv");
    CuttingServer cutting(testenv::read_file_or_empty(path));
    const std::string url = server->url(base_name(path)), file = " '" + path + "' --streaming";
    const std::string err = "/tmp/plimo_http_err_" + std::to_string(::getpid());
    auto asfdump = [&](const std::string& args, std::string* out) {
        const int rc = testenv::run_command(testenv::asfdump_path() + " " + args + " 2>" + err, out);
        const auto text = testenv::read_file_or_empty(err);
        return std::make_pair(rc, std::string(text.begin(), text.end()));
    };
    const struct {
        std::string args;
        int status;
        std::string same_as;  // arguments over the file whose output must match ("" none)
        const char* says;     // on stderr
    } cases[] = {
        {"frames " + url, 0, "frames" + file + " --buffer ring --thread", ""},
        {"frames " + url + " --buffer none --seek 10000000", 0,
         "frames" + file + " --buffer none --seek 10000000", ""},
        {"info " + url, 0, "info" + file, ""},
        {"frames " + server->url(base_name(path), false) + " --seek 10000000", 4, "",
         "ignores range requests"},  // the seek is refused: the play runs, status 4
        {"info " + server->url("no-such-file.wmv"), 3, "", "HTTP status 404"},
        {"frames http://127.0.0.1:1/x.wmv", 3, "", "cannot read"},
        {"frames " + cutting.url, 3, "", "connection cut at byte"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.args);
        std::string out, ref;
        const auto [rc, text] = asfdump(c.args, &out);
        EXPECT_EQ(rc, c.status) << text;
        EXPECT_NE(text.find(c.says), std::string::npos) << text;
        if (!c.same_as.empty()) {
            EXPECT_EQ(asfdump(c.same_as, &ref).first, 0);
            EXPECT_EQ(out, ref);
        }
        if (c.status != 0 && !out.empty()) {
            EXPECT_NE(out.find("\"blocks_outstanding\":0"), std::string::npos) << out;
        }
    }
    ::unlink(err.c_str());
}

}  // namespace
