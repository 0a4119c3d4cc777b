// The toolkit's host services: the configuration record, the one-shot frame,
// and the plain wrappers passing the host's context and answers through.
#include <gtest/gtest.h>

#include <cstring>
#include <vector>

#include "callbacks.h"
#include "sys_output.h"

namespace {

struct Fixture {
    host::HostCallbacks host;
    sys_demuxer_st d{};
    Fixture() {
        d.callback = *host.table();
        host.keep_bytes = true;
    }
};

TEST(StreamConfig, RecordIsCodecTypeThenConfigAtTimeZeroAsPacketTypeOne) {
    struct Case {
        const char* name;
        hova_stream_type_et type;
        int codec;
        std::vector<uint8_t> config;
    };
    const Case cases[] = {
        {"no config", HOVA_STREAM_AUDIO, CLIP_AUDIO_TYPE_WMA2, {}},
        {"with config", HOVA_STREAM_VIDEO, CLIP_VIDEO_TYPE_WVC1, {0x0F, 0xCB, 0x01, 0x02, 0x03}},
        {"negative codec", HOVA_STREAM_AUDIO, CLIP_AUDIO_TYPE_ERROR, {0xAA}},
    };
    for (const Case& c : cases) {
        Fixture f;
        std::vector<uint8_t> config = c.config;
        sys_stream_st s{};
        s.stream_type = c.type;
        s.codec_type = c.codec;
        s.config = config.empty() ? nullptr : config.data();
        s.config_len = static_cast<uint32_t>(config.size());
        ASSERT_EQ(sys_stream_send_config(&f.d, &s), HOVA_OK) << c.name;
        EXPECT_EQ(s.config_sent, 0) << "the caller marks the record sent";
        ASSERT_EQ(f.host.events().size(), 1u);
        const host::HostEvent& e = f.host.events()[0];
        EXPECT_EQ(e.type, c.type);
        EXPECT_EQ(e.packet_type, 1);
        EXPECT_EQ(e.pts, 0);
        EXPECT_EQ(e.duration, 0);
        std::vector<uint8_t> expected(4);
        const int32_t codec = c.codec;
        std::memcpy(expected.data(), &codec, 4);  // host-native (little-endian) order
        expected.insert(expected.end(), c.config.begin(), c.config.end());
        EXPECT_EQ(e.bytes, expected) << c.name;
        EXPECT_EQ(f.host.protocol_errors(), 0u);
    }
}

TEST(StreamConfig, RefusedAllocationIsNotEnoughMemoryAndCommitsNothing) {
    Fixture f;
    f.host.refuse_stream_alloc = true;
    sys_stream_st s{};
    s.stream_type = HOVA_STREAM_AUDIO;
    EXPECT_EQ(sys_stream_send_config(&f.d, &s), HOVA_NotEnoughMemory);
    EXPECT_EQ(sys_stream_commit_secure_handle(&f.d, HOVA_STREAM_VIDEO, 3, "abc", 5, 0),
              HOVA_NotEnoughMemory);
    EXPECT_TRUE(f.host.events().empty());
}

TEST(StreamCommitSecureHandle, CopiesAndCommitsEvenAnEmptyFrame) {
    Fixture f;
    const uint8_t bytes[] = {1, 2, 3, 4, 5};
    ASSERT_EQ(sys_stream_commit_secure_handle(&f.d, HOVA_STREAM_VIDEO, 5, bytes, 4242, 0), HOVA_OK);
    ASSERT_EQ(sys_stream_commit_secure_handle(&f.d, HOVA_STREAM_AUDIO, 0, nullptr, -1, 7), HOVA_OK);
    ASSERT_EQ(f.host.events().size(), 2u);
    EXPECT_EQ(f.host.events()[0].bytes, std::vector<uint8_t>(bytes, bytes + 5));
    EXPECT_EQ(f.host.events()[0].pts, 4242);
    EXPECT_EQ(f.host.events()[1].size, 0);
    EXPECT_EQ(f.host.events()[1].pts, -1);
    EXPECT_EQ(f.host.events()[1].packet_type, 7) << "the caller's packet type passes through";
}

TEST(HostWrappers, PassTheContextAndTheHostsAnswers) {
    Fixture f;
    void* p = sys_malloc(&f.d, 100);
    ASSERT_NE(p, nullptr);
    EXPECT_EQ(f.host.outstanding_blocks(), 1u);
    p = sys_realloc(&f.d, p, 200);
    ASSERT_NE(p, nullptr);
    EXPECT_EQ(f.host.outstanding_bytes(), 200u);
    sys_freep(&f.d, &p);
    EXPECT_EQ(p, nullptr) << "freep leaves the caller's pointer null";
    EXPECT_EQ(f.host.outstanding_blocks(), 0u);

    f.host.fail_malloc_at(1);
    EXPECT_EQ(sys_malloc(&f.d, 8), nullptr);

    void* frame = nullptr;
    ASSERT_EQ(sys_stream_alloc(&f.d, HOVA_STREAM_AUDIO, &frame, 10), 0);
    std::memset(frame, 0x5A, 10);
    ASSERT_EQ(sys_stream_realloc(&f.d, HOVA_STREAM_AUDIO, &frame, 20), 0);
    EXPECT_EQ(static_cast<uint8_t*>(frame)[9], 0x5A) << "realloc keeps the content";
    EXPECT_EQ(sys_stream_discard(&f.d, HOVA_STREAM_AUDIO), 0);
    EXPECT_EQ(sys_stream_check_rbuf_size(&f.d, HOVA_STREAM_AUDIO), 0);
    f.host.notify_result = 9;
    EXPECT_EQ(sys_notify(&f.d, HOVA_STREAM_VIDEO, HOVA_EVENT_EOS), 9);
    ASSERT_EQ(f.host.events().size(), 2u);
    EXPECT_EQ(f.host.events()[1].kind, host::EventKind::Notify);
    EXPECT_EQ(f.host.events()[1].type, HOVA_STREAM_VIDEO);
    EXPECT_EQ(f.host.protocol_errors(), 0u);
}

}  // namespace
