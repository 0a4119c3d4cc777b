#include "session.h"

namespace host {

namespace {

size_t context_bytes(const hova_dmx_func_st* dmx, const SessionOptions& o) {
    return static_cast<size_t>(o.context_size > 0 ? o.context_size : dmx->min_context_size);
}

}  // namespace

Session::Session(const hova_dmx_func_st* dmx, std::unique_ptr<RawInput> input,
                 const SessionOptions& opts)
    : dmx_(dmx), input_(std::move(input)), opts_(opts),
      buffer_(context_bytes(dmx, opts), opts.misalign) {}

std::unique_ptr<Session> Session::from_file(const hova_dmx_func_st* dmx, const std::string& path,
                                            const SessionOptions& opts) {
    auto in = RawInput::from_file(path, opts.input);
    if (!in) return nullptr;
    return std::make_unique<Session>(dmx, std::move(in), opts);
}

std::unique_ptr<Session> Session::from_bytes(const hova_dmx_func_st* dmx,
                                             std::vector<uint8_t> bytes,
                                             const SessionOptions& opts) {
    return std::make_unique<Session>(dmx, RawInput::from_memory(std::move(bytes), opts.input),
                                     opts);
}

Session::~Session() { close(); }

int Session::open() {
    if (open_) return HOVA_OK;
    const int rc = dmx_->open_file(&ctx_, input_->io(), buffer_.data(), buffer_.size(),
                                   opts_.ring_size, callbacks_.table());
    open_ = rc == HOVA_OK;
    return rc;
}

int Session::close() {
    if (!open_) return HOVA_OK;
    open_ = false;
    return dmx_->close_file(ctx_);
}

const char* errno_name(int code) {
    switch (code) {
        case HOVA_OK: return "HOVA_OK";
        case HOVA_NoInputSignal: return "HOVA_NoInputSignal";
        case HOVA_TryAgain: return "HOVA_TryAgain";
        case HOVA_InvalidParam: return "HOVA_InvalidParam";
        case HOVA_NotEnoughMemory: return "HOVA_NotEnoughMemory";
        case HOVA_OpenFailed: return "HOVA_OpenFailed";
        case HOVA_SeekFailed: return "HOVA_SeekFailed";
        case HOVA_ProgramChanged: return "HOVA_ProgramChanged";
        case HOVA_EndOfStream: return "HOVA_EndOfStream";
        case HOVA_AVFrameEmpty: return "HOVA_AVFrameEmpty";
        case HOVA_AllocatorDisabled: return "HOVA_AllocatorDisabled";
        default: return "unknown";
    }
}

}  // namespace host
