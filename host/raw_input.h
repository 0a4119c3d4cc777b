// The host's raw input (cb_io_s) over a file or a block of memory, with every
// flag settable and the faults a real input shows: early end, short reads,
// refusing seeks, slow reads and data that arrives while it is read.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "cb_io.h"
#include "http_source.h"

namespace host {

struct InputOptions {
    int block_size = 32768;
    bool seekable = true;
    bool streaming = false;        // also sets input_size to the data size
    bool use_thread = false;
    uint8_t rbuf_mode = CBIO_NO_RBUF;
    bool disable_cache = false;
    int detect_discontinuity = 0;
    int ring_size = 1048576;       // what the host passes to open_file
};

// The four bufferings a host chooses between for the plug-in's reader: the
// file cache, none, the ring filled on the caller's thread, and the ring
// filled by the streaming thread.
enum class Buffering { Cache, None, Ring, Thread };
inline constexpr Buffering kBufferings[] = {Buffering::Cache, Buffering::None, Buffering::Ring,
                                            Buffering::Thread};
// "cache", "none", "ring", "thread".
const char* buffering_name(Buffering b);
// `base` with the flags that choose `b`.
InputOptions with_buffering(Buffering b, InputOptions base = {});

struct InputFaults {
    uint64_t end_after = UINT64_MAX;   // the input ends after this many bytes
    size_t max_read = SIZE_MAX;        // no read returns more than this
    bool refuse_seek = false;          // every seek fails with -1
    int64_t fail_seeks_after = -1;     // seeks fail once this many have succeeded (-1: never)
    int64_t fail_reads_after = -1;     // reads return 0 once this many have returned data
    unsigned read_delay_us = 0;        // each read sleeps this long first
    // Network-like arrival: only `visible_start` bytes exist at first and every
    // read call makes `grow_per_read` more visible. 0 disables growth.
    uint64_t visible_start = UINT64_MAX;
    uint64_t grow_per_read = 0;
    // Called at the start of every read with the position and the length
    // asked; may block (a stalling input) or yield to shuffle thread timing.
    std::function<void(uint64_t pos, size_t len)> before_read;
};

struct InputCounters {
    uint64_t reads = 0;
    uint64_t seeks = 0;
    uint64_t tells = 0;
    uint64_t bytes_read = 0;
    uint64_t seek_time_calls = 0;
    uint64_t open_done_calls = 0;
    std::vector<cb_off_t> discontinuities;
    std::vector<int> seek_times;
    std::vector<uint32_t> open_done_args;  // third argument of each open_done
};

class RawInput {
public:
    // Over a copy of `bytes` (or over bytes the caller keeps alive, with borrow).
    static std::unique_ptr<RawInput> from_memory(std::vector<uint8_t> bytes,
                                                 const InputOptions& opts = {});
    static std::unique_ptr<RawInput> borrow_memory(const uint8_t* data, size_t size,
                                                   const InputOptions& opts = {});
    // Over a file read with pread; null when it cannot be opened.
    static std::unique_ptr<RawInput> from_file(const std::string& path,
                                               const InputOptions& opts = {});
    // Over an http:// URL (see HttpSource): `streaming` is always set, with
    // input_size from the response, and `seekable` only when the server takes
    // range requests. Null with the reason in `error` when it cannot be opened.
    static std::unique_ptr<RawInput> from_url(const std::string& url, const InputOptions& opts,
                                              std::string* error, const HttpOptions& http = {});
    ~RawInput();
    RawInput(const RawInput&) = delete;
    RawInput& operator=(const RawInput&) = delete;

    cb_io_st* io() { return &holder_.io; }
    uint64_t size() const { return size_; }
    uint64_t position() const { return pos_; }
    InputFaults& faults() { return faults_; }
    InputCounters& counters() { return counters_; }
    void apply(const InputOptions& opts);
    // Up to `len` bytes at the current position, which does not move
    // (respects the faults that end the input early).
    size_t peek(void* dst, size_t len);

    // Host-side answers for the optional operations.
    int seek_time_result = 0;
    // When set, seek_time moves the input to the position it returns for the
    // time (in ms; -1 for a flush), as a host's own time seek would; a
    // negative answer leaves the input where it is.
    std::function<int64_t(int time_ms)> time_to_position;
    int open_done_result = 0;
    // Without it the io's seek_time slot is null, as some hosts leave it.
    void set_seek_time_available(bool on);

    // The network side of an input made by from_url; null otherwise.
    const HttpSource* http() const { return http_.get(); }

    // Recovers the object from the io pointer the plug-in hands back.
    static RawInput* of(cb_io_st* io);

private:
    RawInput();
    size_t read_at(uint64_t pos, void* dst, size_t len);
    uint64_t end_now() const;

    static size_t op_read(cb_io_st* io, void* dst, size_t len);
    static cb_off_t op_seek(cb_io_st* io, cb_off_t off, int whence);
    static cb_off_t op_tell(cb_io_st* io);
    static int op_open_done(cb_io_st* io, int a, int b, uint32_t c);
    static int op_seek_time(cb_io_st* io, int time);
    static void op_discontinuity(cb_io_st* io, cb_off_t pos);

    // The io handed to the plug-in, with the way back to its owner.
    struct Holder {
        cb_io_st io;
        RawInput* owner;
    };
    Holder holder_{};
    cb_io_st& io_ = holder_.io;
    std::vector<uint8_t> owned_;
    const uint8_t* data_ = nullptr;
    int fd_ = -1;
    std::unique_ptr<HttpSource> http_;
    uint64_t size_ = 0;
    uint64_t pos_ = 0;
    uint64_t visible_ = UINT64_MAX;
    InputFaults faults_;
    InputCounters counters_;
};

}  // namespace host
