// A file read over HTTP as the framework reads network input: one GET with an
// open-ended range that is pulled incrementally while reads follow each other,
// and a new ranged GET when a read lands where the open transfer cannot serve
// it. Counts what the network sees: requests, body bytes received and the
// time spent waiting for the server. Built on libcurl; without it, open()
// always fails and says so.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

namespace host {

struct HttpOptions {
    // A read at most this far past what the transfer has delivered reads
    // through instead of starting a request (see docs/decisions.md).
    size_t read_through = 64 * 1024;
    // Bytes kept behind the reader, so that a peek followed by a seek back
    // (what an unbuffered reader does) does not cost a request.
    size_t history = 64 * 1024;
    // What one receive takes from the socket (libcurl's buffer). The
    // transfer pauses as soon as the read in progress has its bytes, so this
    // bounds what a read receives past its end, and what a seek that drops
    // the transfer throws away.
    long receive_chunk = 4 * 1024;
    // Receive buffer asked of the kernel (it doubles it): bounds what the
    // server has sent into the socket and a dropped transfer throws away.
    int socket_buffer = 64 * 1024;
    long connect_timeout_ms = 5000;
    // A read that sees no byte for this long gives up as if the connection
    // had been cut.
    long stall_timeout_ms = 10000;
};

struct HttpStats {
    uint64_t requests = 0;
    // Body bytes that reached us, all requests: those handed to the reader
    // and those received but dropped with their transfer.
    uint64_t bytes_received = 0;
    uint64_t wait_us = 0;         // time blocked in reads waiting for the server
};

class HttpSource {
public:
    // Sends the first request (from byte 0) and waits for its headers. Null
    // with a message in `error` for a refused connection, an HTTP error
    // status, a bad URL, or when HTTP support is not built in.
    static std::unique_ptr<HttpSource> open(const std::string& url, std::string* error,
                                            const HttpOptions& opts = {});
    ~HttpSource();
    HttpSource(const HttpSource&) = delete;
    HttpSource& operator=(const HttpSource&) = delete;

    // The server answered the first range request with a partial response.
    bool ranges() const;
    // From the response; UINT64_MAX when the server did not say.
    uint64_t size() const;
    // Whether a read at `pos` can be served: always with range support,
    // otherwise only from what the open transfer holds or will reach by
    // reading through.
    bool reachable(uint64_t pos) const;
    // Up to `len` bytes at `pos`; fewer only at the end of the file or when
    // the transfer failed (then failure() says why).
    size_t read(uint64_t pos, void* dst, size_t len);

    // Counts so far; a receive the open transfer holds back counts as received.
    HttpStats stats() const;
    // Empty while nothing went wrong; "connection cut ..." and the like after.
    const std::string& failure() const;

private:
    struct Impl;
    explicit HttpSource(std::unique_ptr<Impl> impl);
    std::unique_ptr<Impl> impl_;
};

// "http://..." (any case of the scheme).
bool is_http_url(const std::string& name);

}  // namespace host
