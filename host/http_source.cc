#include "http_source.h"

#include <strings.h>
#include <sys/socket.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

#ifdef PLIMO_HAVE_CURL
#include <curl/curl.h>
#endif

namespace host {

bool is_http_url(const std::string& name) { return strncasecmp(name.c_str(), "http://", 7) == 0; }

#ifdef PLIMO_HAVE_CURL

namespace {

using Clock = std::chrono::steady_clock;

struct CurlGlobal {
    CurlGlobal() { curl_global_init(CURL_GLOBAL_DEFAULT); }
};

uint64_t parse_u64(const char* p, const char** end) {
    uint64_t v = 0;
    const char* s = p;
    while (*s >= '0' && *s <= '9') v = v * 10 + static_cast<uint64_t>(*s++ - '0');
    *end = s;
    return v;
}

}  // namespace

// One easy handle driven through a multi handle: reads pump it until the
// bytes they want have arrived, and the write callback pauses the transfer
// once they have, so nothing is received past the read in progress but the
// rest of one receive.
struct HttpSource::Impl {
    std::string url;
    HttpOptions opt;
    CURLM* multi = nullptr;
    CURL* easy = nullptr;
    bool attached = false;  // easy is in multi (a transfer is open or just ended)
    bool paused = false;
    bool done = false;      // the open transfer ended
    CURLcode result = CURLE_OK;
    char errbuf[CURL_ERROR_SIZE] = {};

    // The current response's headers.
    long status = 0;
    bool headers_done = false;
    bool have_range = false;
    uint64_t range_first = 0, range_total = UINT64_MAX;
    uint64_t content_length = UINT64_MAX;

    // Body bytes of the open transfer: buf[0] is the file's byte at buf_pos.
    std::vector<uint8_t> buf;
    uint64_t buf_pos = 0;
    uint64_t reader = 0;     // where the last read ended
    uint64_t want_end = 0;   // end of the read in progress: the transfer pauses there
    size_t refused = 0;      // bytes of a receive handed back with a pause (libcurl keeps them)

    bool ranges = false;
    uint64_t size = UINT64_MAX;
    std::string failure;  // the first read that came up short for a network fault
    // Why the open transfer ended early: reading on where it stopped fails
    // at once (no retry); a read elsewhere starts a new request.
    std::string broken;
    HttpStats stats;

    ~Impl() {
        if (easy) {
            if (attached) curl_multi_remove_handle(multi, easy);
            curl_easy_cleanup(easy);
        }
        if (multi) curl_multi_cleanup(multi);
    }

    uint64_t buf_end() const { return buf_pos + buf.size(); }
    bool wanted() const { return buf_end() < want_end; }

    static size_t on_header(char* p, size_t sz, size_t n, void* ud) {
        auto* s = static_cast<Impl*>(ud);
        const size_t len = sz * n;
        const std::string line(p, len);
        if (line.rfind("HTTP/", 0) == 0) {
            // A new response (after a redirect or an interim one): start over.
            const size_t sp = line.find(' ');
            s->status = sp == std::string::npos ? 0 : std::strtol(line.c_str() + sp + 1, nullptr, 10);
            s->headers_done = false;
            s->have_range = false;
            s->content_length = UINT64_MAX;
        } else if (strncasecmp(line.c_str(), "Content-Range:", 14) == 0) {
            const char* q = std::strstr(line.c_str(), "bytes");
            if (q) {
                q += 5;
                while (*q == ' ') ++q;
                const char* e = q;
                const uint64_t first = parse_u64(q, &e);
                const char* slash = std::strchr(e, '/');
                if (e != q && slash) {
                    s->have_range = true;
                    s->range_first = first;
                    const char* t = slash + 1;
                    const uint64_t total = parse_u64(t, &e);
                    s->range_total = e != t ? total : UINT64_MAX;
                }
            }
        } else if (strncasecmp(line.c_str(), "Content-Length:", 15) == 0) {
            const char* q = line.c_str() + 15;
            while (*q == ' ') ++q;
            const char* e = q;
            const uint64_t v = parse_u64(q, &e);
            if (e != q) s->content_length = v;
        } else if (line == "\r\n" || line == "\n") {
            if (s->status >= 200 && !(s->status >= 300 && s->status < 400)) s->headers_done = true;
        }
        return len;
    }

    static size_t on_body(char* p, size_t sz, size_t n, void* ud) {
        auto* s = static_cast<Impl*>(ud);
        const size_t len = sz * n;
        // The read in progress has its bytes: hold the transfer. curl keeps
        // this receive and hands it again when the transfer is resumed.
        if (!s->wanted()) {
            s->paused = true;
            s->refused = len;
            return CURL_WRITEFUNC_PAUSE;
        }
        s->refused = 0;
        s->buf.insert(s->buf.end(), p, p + len);
        s->stats.bytes_received += len;
        return len;
    }

    static int on_socket(void* ud, curl_socket_t fd, curlsocktype) {
        const int size = static_cast<Impl*>(ud)->opt.socket_buffer;
        if (size > 0) setsockopt(fd, SOL_SOCKET, SO_RCVBUF, &size, sizeof size);
        return CURL_SOCKOPT_OK;
    }

    bool setup() {
        multi = curl_multi_init();
        easy = curl_easy_init();
        if (!multi || !easy) return false;
        curl_easy_setopt(easy, CURLOPT_URL, url.c_str());
        curl_easy_setopt(easy, CURLOPT_NOSIGNAL, 1L);
        curl_easy_setopt(easy, CURLOPT_FAILONERROR, 1L);
        curl_easy_setopt(easy, CURLOPT_FOLLOWLOCATION, 1L);
        curl_easy_setopt(easy, CURLOPT_MAXREDIRS, 5L);
        curl_easy_setopt(easy, CURLOPT_PROTOCOLS_STR, "http");
        curl_easy_setopt(easy, CURLOPT_REDIR_PROTOCOLS_STR, "http");
        curl_easy_setopt(easy, CURLOPT_CONNECTTIMEOUT_MS, opt.connect_timeout_ms);
        curl_easy_setopt(easy, CURLOPT_ERRORBUFFER, errbuf);
        curl_easy_setopt(easy, CURLOPT_HEADERFUNCTION, &Impl::on_header);
        curl_easy_setopt(easy, CURLOPT_HEADERDATA, this);
        curl_easy_setopt(easy, CURLOPT_WRITEFUNCTION, &Impl::on_body);
        curl_easy_setopt(easy, CURLOPT_WRITEDATA, this);
        curl_easy_setopt(easy, CURLOPT_SOCKOPTFUNCTION, &Impl::on_socket);
        curl_easy_setopt(easy, CURLOPT_SOCKOPTDATA, this);
        curl_easy_setopt(easy, CURLOPT_BUFFERSIZE, opt.receive_chunk);
        return true;
    }

    // Drops the open transfer (the connection goes with it when it was not
    // finished) and asks for the file from `pos` on.
    void start(uint64_t pos) {
        // PLIMO_HTTP_TRACE=1: one line per request on stderr, to see where
        // the reader jumps.
        if (std::getenv("PLIMO_HTTP_TRACE"))
            std::fprintf(stderr, "http: request from byte %llu (held %llu-%llu)\n", static_cast<unsigned long long>(pos),
                         static_cast<unsigned long long>(buf_pos), static_cast<unsigned long long>(buf_end()));
        drop_transfer();
        paused = false;
        done = false;
        result = CURLE_OK;
        errbuf[0] = '\0';
        status = 0;
        headers_done = false;
        have_range = false;
        content_length = UINT64_MAX;
        broken.clear();
        buf.clear();
        buf_pos = pos;
        reader = pos;
        const std::string range = std::to_string(pos) + "-";
        curl_easy_setopt(easy, CURLOPT_RANGE, range.c_str());
        if (curl_multi_add_handle(multi, easy) != CURLM_OK) {
            done = true;
            result = CURLE_FAILED_INIT;
            return;
        }
        attached = true;
        stats.requests++;
    }

    // Moves the transfer on, waiting up to `wait_ms` for the socket. False
    // when the transfer has ended.
    bool pump(int wait_ms) {
        if (!attached || done) return false;
        if (paused && wanted()) {
            paused = false;
            curl_easy_pause(easy, CURLPAUSE_CONT);
        }
        int running = 0;
        curl_multi_perform(multi, &running);
        int left = 0;
        while (CURLMsg* m = curl_multi_info_read(multi, &left)) {
            if (m->msg == CURLMSG_DONE && m->easy_handle == easy) {
                done = true;
                result = m->data.result;
                // The bytes that came stay readable; the input fails past them.
                if (result != CURLE_OK && headers_done)
                    broken = "connection cut at byte " + std::to_string(buf_end()) +
                             (size != UINT64_MAX ? " of " + std::to_string(size) : std::string()) + " (" +
                             curl_message() + ")";
            }
        }
        if (done) return false;
        if (!paused) curl_multi_poll(multi, nullptr, 0, wait_ms, nullptr);
        return true;
    }

    std::string curl_message() const {
        if (result == CURLE_HTTP_RETURNED_ERROR) {
            long code = 0;
            curl_easy_getinfo(easy, CURLINFO_RESPONSE_CODE, &code);
            return "HTTP status " + std::to_string(code);
        }
        std::string m = curl_easy_strerror(result);
        if (errbuf[0]) m += std::string(": ") + errbuf;
        return m;
    }

    // Pumps until the headers of the open transfer are in. Empty when the
    // response can be read, else why not.
    std::string await_headers() {
        const auto t0 = Clock::now();
        while (!headers_done && pump(50)) {
            if (Clock::now() - t0 > std::chrono::milliseconds(opt.stall_timeout_ms))
                return "no answer from the server";
        }
        stats.wait_us += static_cast<uint64_t>(
            std::chrono::duration_cast<std::chrono::microseconds>(Clock::now() - t0).count());
        if (!headers_done || (done && result != CURLE_OK && buf.empty())) return curl_message();
        return "";
    }

    // What curl still kept of a refused receive came over the network all
    // the same: it counts when the transfer goes.
    void drop_transfer() {
        if (attached) curl_multi_remove_handle(multi, easy);
        attached = false;
        stats.bytes_received += refused;
        refused = 0;
    }

    void fail(const std::string& why) {
        if (failure.empty()) failure = why;
        broken = why;
        drop_transfer();
        done = true;
    }

    // Bytes no longer needed behind the reader are dropped now and then
    // (in one move of at least `history` bytes, so the cost stays linear).
    void trim() {
        if (reader < buf_pos) return;
        const uint64_t behind = reader - buf_pos;
        if (behind <= 2 * opt.history) return;
        const size_t drop = static_cast<size_t>(std::min<uint64_t>(behind - opt.history, buf.size()));
        buf.erase(buf.begin(), buf.begin() + static_cast<std::ptrdiff_t>(drop));
        buf_pos += drop;
    }

    bool in_hand(uint64_t pos) const { return pos >= buf_pos && pos < buf_end(); }
    bool ahead_within_reach(uint64_t pos) const {
        return attached && !done && pos >= buf_end() && pos - buf_end() <= opt.read_through;
    }

    // Waits for the open transfer to deliver `pos`. False when it ended
    // before (cut, stalled or at the end).
    bool wait_for(uint64_t pos) {
        const auto t0 = Clock::now();
        auto last = t0;
        uint64_t seen = buf_end();
        bool ok = true;
        while (buf_end() <= pos) {
            if (!pump(100)) {
                ok = buf_end() > pos;
                if (!ok && !broken.empty()) fail(broken);
                break;
            }
            const auto now = Clock::now();
            if (buf_end() != seen) {
                seen = buf_end();
                last = now;
            } else if (now - last > std::chrono::milliseconds(opt.stall_timeout_ms)) {
                fail("no data from the server for " + std::to_string(opt.stall_timeout_ms / 1000) + " s at byte " +
                     std::to_string(buf_end()));
                ok = false;
                break;
            }
        }
        stats.wait_us += static_cast<uint64_t>(
            std::chrono::duration_cast<std::chrono::microseconds>(Clock::now() - t0).count());
        return ok;
    }

    size_t read(uint64_t pos, uint8_t* dst, size_t len) {
        size_t got = 0;
        want_end = pos + len;
        while (got < len) {
            const uint64_t p = pos + got;
            if (p >= size) break;
            reader = std::max(reader, p);
            if (in_hand(p)) {
                const size_t n = static_cast<size_t>(std::min<uint64_t>(len - got, buf_end() - p));
                std::memcpy(dst + got, buf.data() + (p - buf_pos), n);
                got += n;
                reader = p + n;
                trim();
                continue;
            }
            if (!broken.empty() && p == buf_end()) {
                fail(broken);
                break;
            }
            if (!ahead_within_reach(p)) {
                if (!ranges) break;  // the file cannot be reached from here
                reader = p;
                start(p);
                const std::string why = await_headers();
                if (!why.empty()) {
                    fail(why);
                    break;
                }
                if (status != 206 || !have_range || range_first != p) {
                    fail("the server did not answer the range request from byte " + std::to_string(p) +
                         " (status " + std::to_string(status) + ")");
                    break;
                }
            }
            if (!wait_for(p)) break;
        }
        if (got > 0) reader = pos + got;
        return got;
    }
};

HttpSource::HttpSource(std::unique_ptr<Impl> impl) : impl_(std::move(impl)) {}
HttpSource::~HttpSource() = default;

std::unique_ptr<HttpSource> HttpSource::open(const std::string& url, std::string* error,
                                             const HttpOptions& opts) {
    static CurlGlobal global;
    auto impl = std::make_unique<Impl>();
    impl->url = url;
    impl->opt = opts;
    if (!impl->setup()) {
        *error = "cannot set up libcurl";
        return nullptr;
    }
    impl->start(0);
    const std::string why = impl->await_headers();
    if (!why.empty()) {
        *error = why;
        return nullptr;
    }
    if (impl->status == 206 && impl->have_range && impl->range_first == 0) {
        impl->ranges = true;
        impl->size = impl->range_total;
    } else if (impl->status == 200) {
        // The server ignored the range: the whole file comes, once.
        impl->size = impl->content_length;
    } else {
        *error = "HTTP status " + std::to_string(impl->status);
        return nullptr;
    }
    return std::unique_ptr<HttpSource>(new HttpSource(std::move(impl)));
}

bool HttpSource::ranges() const { return impl_->ranges; }
uint64_t HttpSource::size() const { return impl_->size; }
bool HttpSource::reachable(uint64_t pos) const {
    return impl_->ranges || impl_->in_hand(pos) || impl_->ahead_within_reach(pos) ||
           (pos == impl_->buf_end() && impl_->done);
}
size_t HttpSource::read(uint64_t pos, void* dst, size_t len) {
    return impl_->read(pos, static_cast<uint8_t*>(dst), len);
}
HttpStats HttpSource::stats() const {
    HttpStats s = impl_->stats;
    s.bytes_received += impl_->refused;
    return s;
}
const std::string& HttpSource::failure() const { return impl_->failure; }

#else  // no libcurl

struct HttpSource::Impl {
    HttpStats stats;
    std::string failure;
};

HttpSource::HttpSource(std::unique_ptr<Impl> impl) : impl_(std::move(impl)) {}
HttpSource::~HttpSource() = default;

std::unique_ptr<HttpSource> HttpSource::open(const std::string&, std::string* error, const HttpOptions&) {
    *error = "this build has no HTTP support (libcurl was not found when it was configured)";
    return nullptr;
}
bool HttpSource::ranges() const { return false; }
uint64_t HttpSource::size() const { return 0; }
bool HttpSource::reachable(uint64_t) const { return false; }
size_t HttpSource::read(uint64_t, void*, size_t) { return 0; }
HttpStats HttpSource::stats() const { return impl_->stats; }
const std::string& HttpSource::failure() const { return impl_->failure; }

#endif

}  // namespace host
