#include "raw_input.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>

namespace host {

const char* buffering_name(Buffering b) {
    switch (b) {
        case Buffering::Cache: return "cache";
        case Buffering::None: return "none";
        case Buffering::Ring: return "ring";
        case Buffering::Thread: return "thread";
    }
    return "?";
}

InputOptions with_buffering(Buffering b, InputOptions base) {
    base.disable_cache = b == Buffering::None;
    base.rbuf_mode = (b == Buffering::Ring || b == Buffering::Thread) ? CBIO_APPLY_RBUF : CBIO_NO_RBUF;
    base.use_thread = b == Buffering::Thread;
    return base;
}

RawInput::RawInput() {
    holder_.owner = this;
    io_.read = &RawInput::op_read;
    io_.seek = &RawInput::op_seek;
    io_.tell = &RawInput::op_tell;
    io_.open_done = &RawInput::op_open_done;
    io_.seek_time = &RawInput::op_seek_time;
    io_.discontinuity = &RawInput::op_discontinuity;
}

RawInput::~RawInput() {
    if (fd_ >= 0) ::close(fd_);
}

RawInput* RawInput::of(cb_io_st* io) {
    // io is the first member of a standard-layout Holder.
    return reinterpret_cast<Holder*>(io)->owner;
}

std::unique_ptr<RawInput> RawInput::from_memory(std::vector<uint8_t> bytes,
                                                const InputOptions& opts) {
    std::unique_ptr<RawInput> in(new RawInput());
    in->owned_ = std::move(bytes);
    in->data_ = in->owned_.data();
    in->size_ = in->owned_.size();
    in->apply(opts);
    return in;
}

std::unique_ptr<RawInput> RawInput::borrow_memory(const uint8_t* data, size_t size,
                                                  const InputOptions& opts) {
    std::unique_ptr<RawInput> in(new RawInput());
    in->data_ = data;
    in->size_ = size;
    in->apply(opts);
    return in;
}

std::unique_ptr<RawInput> RawInput::from_file(const std::string& path, const InputOptions& opts) {
    int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) return nullptr;
    struct stat st {};
    if (::fstat(fd, &st) != 0 || !S_ISREG(st.st_mode)) {
        ::close(fd);
        return nullptr;
    }
    std::unique_ptr<RawInput> in(new RawInput());
    in->fd_ = fd;
    in->size_ = static_cast<uint64_t>(st.st_size);
    in->apply(opts);
    return in;
}

std::unique_ptr<RawInput> RawInput::from_url(const std::string& url, const InputOptions& opts,
                                             std::string* error, const HttpOptions& http) {
    auto source = HttpSource::open(url, error, http);
    if (!source) return nullptr;
    std::unique_ptr<RawInput> in(new RawInput());
    in->size_ = source->size() == UINT64_MAX ? 0 : source->size();
    in->http_ = std::move(source);
    in->apply(opts);
    return in;
}

void RawInput::set_seek_time_available(bool on) {
    io_.seek_time = on ? &RawInput::op_seek_time : nullptr;
}

void RawInput::apply(const InputOptions& o) {
    io_.block_size = o.block_size;
    io_.seekable = o.seekable ? 1 : 0;
    io_.streaming = o.streaming ? 1 : 0;
    io_.use_thread = o.use_thread ? 1 : 0;
    io_.rbuf_mode = o.rbuf_mode;
    io_.disable_cache = o.disable_cache ? 1 : 0;
    io_.detect_discontinuity = o.detect_discontinuity;
    io_.input_size = o.streaming ? size_ : 0;
    if (http_) {
        // What the framework sets for network input.
        io_.streaming = 1;
        io_.input_size = size_;
        io_.seekable = o.seekable && http_->ranges() ? 1 : 0;
    }
}

uint64_t RawInput::end_now() const {
    uint64_t end = std::min<uint64_t>(size_, faults_.end_after);
    return std::min(end, visible_);
}

size_t RawInput::read_at(uint64_t pos, void* dst, size_t len) {
    if (http_) return http_->read(pos, dst, len);
    if (fd_ >= 0) {
        size_t done = 0;
        while (done < len) {
            ssize_t n = ::pread(fd_, static_cast<uint8_t*>(dst) + done, len - done,
                                static_cast<off_t>(pos + done));
            if (n <= 0) break;
            done += static_cast<size_t>(n);
        }
        return done;
    }
    std::memcpy(dst, data_ + pos, len);
    return len;
}

size_t RawInput::peek(void* dst, size_t len) {
    const uint64_t end = end_now();
    if (pos_ >= end) return 0;
    const size_t n = static_cast<size_t>(std::min<uint64_t>(len, end - pos_));
    return read_at(pos_, dst, n);
}

size_t RawInput::op_read(cb_io_st* io, void* dst, size_t len) {
    RawInput* in = of(io);
    if (in->faults_.before_read) in->faults_.before_read(in->pos_, len);
    in->counters_.reads++;
    if (in->faults_.read_delay_us) ::usleep(in->faults_.read_delay_us);
    if (in->faults_.visible_start != UINT64_MAX && in->visible_ == UINT64_MAX)
        in->visible_ = in->faults_.visible_start;
    if (in->faults_.fail_reads_after >= 0 &&
        in->counters_.reads > static_cast<uint64_t>(in->faults_.fail_reads_after))
        return 0;
    const uint64_t end = in->end_now();
    size_t n = 0;
    if (in->pos_ < end) {
        n = static_cast<size_t>(std::min<uint64_t>({len, end - in->pos_, in->faults_.max_read}));
        n = in->read_at(in->pos_, dst, n);
    }
    in->pos_ += n;
    in->counters_.bytes_read += n;
    if (in->faults_.grow_per_read && in->visible_ != UINT64_MAX)
        in->visible_ = std::min<uint64_t>(in->size_, in->visible_ + in->faults_.grow_per_read);
    return n;
}

cb_off_t RawInput::op_seek(cb_io_st* io, cb_off_t off, int whence) {
    RawInput* in = of(io);
    if (in->faults_.refuse_seek) return -1;
    if (in->faults_.fail_seeks_after >= 0 &&
        in->counters_.seeks >= static_cast<uint64_t>(in->faults_.fail_seeks_after))
        return -1;
    cb_off_t base = 0;
    switch (whence) {
        case CB_SEEK_SET: base = 0; break;
        case CB_SEEK_CUR: base = static_cast<cb_off_t>(in->pos_); break;
        case CB_SEEK_END: base = static_cast<cb_off_t>(in->size_); break;
        default: return -1;
    }
    const cb_off_t target = base + off;
    if (target < 0) return -1;
    // Without range support only what the open transfer serves is reachable.
    if (in->http_ && static_cast<uint64_t>(target) != in->pos_ &&
        !in->http_->reachable(static_cast<uint64_t>(target)))
        return -1;
    in->counters_.seeks++;
    in->pos_ = static_cast<uint64_t>(target);
    return target;
}

cb_off_t RawInput::op_tell(cb_io_st* io) {
    RawInput* in = of(io);
    in->counters_.tells++;
    return static_cast<cb_off_t>(in->pos_);
}

int RawInput::op_open_done(cb_io_st* io, int, int, uint32_t c) {
    RawInput* in = of(io);
    in->counters_.open_done_calls++;
    in->counters_.open_done_args.push_back(c);
    return in->open_done_result;
}

int RawInput::op_seek_time(cb_io_st* io, int time) {
    RawInput* in = of(io);
    in->counters_.seek_time_calls++;
    in->counters_.seek_times.push_back(time);
    if (in->time_to_position) {
        const int64_t to = in->time_to_position(time);
        if (to >= 0) in->pos_ = static_cast<uint64_t>(to);
    }
    return in->seek_time_result;
}

void RawInput::op_discontinuity(cb_io_st* io, cb_off_t pos) {
    of(io)->counters_.discontinuities.push_back(pos);
}

}  // namespace host
