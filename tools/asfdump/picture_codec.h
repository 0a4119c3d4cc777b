// libavcodec behind the thumb command: a video decoder built from the
// configuration record the plug-in delivers, conversion (and scaling) of a
// decoded picture to RGB, and PNG files.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

#include "picture.h"

namespace asfdump {

class VideoDecoder {
public:
    // `record` is the stream's configuration record: the 32-bit codec code,
    // then the codec data (the decoder's extradata). Null, with the reason in
    // `error`, when libavcodec has no decoder for the codec.
    static std::unique_ptr<VideoDecoder> create(const uint8_t* record, size_t size, int width,
                                                int height, std::string* error);
    ~VideoDecoder();
    VideoDecoder(const VideoDecoder&) = delete;
    VideoDecoder& operator=(const VideoDecoder&) = delete;

    // One delivered frame with its time. A frame the decoder rejects (a
    // picture whose reference is missing) is passed over: false.
    bool send(const uint8_t* bytes, size_t size, int64_t pts);
    // No more frames: the pictures the decoder still holds come out.
    void send_end();
    // The next decoded picture, in display order; false when none is ready.
    // Its time is that of the frame whose decoding brought it out (the
    // frame's own time unless the decoder holds pictures back for
    // reordering); AV_NOPTS_VALUE (INT64_MIN) for pictures drained at the end.
    bool receive(int64_t* pts, bool* key);
    // Back to the state after create (after send_end, to decode again).
    void reset();
    // The picture last received, as RGB; `width` > 0 scales it to that width
    // keeping its shape.
    Image rgb(int width) const;

private:
    struct Impl;
    explicit VideoDecoder(std::unique_ptr<Impl> impl);
    std::unique_ptr<Impl> impl_;
};

// Writes `image` as a PNG file; false with the reason in `error`.
bool write_png(const Image& image, const std::string& path, std::string* error);

// Silences libavcodec's log unless `verbose` (its notes on damaged or
// reference-less pictures are expected after a seek).
void set_codec_log(bool verbose);

}  // namespace asfdump
