// Spread audio is put back in order before it is committed.
#include "delivery_fixture.h"
#include "test_env.h"

namespace delivery {
namespace {

Bytes chunks(std::initializer_list<int> order, size_t chunk_len) {
    Bytes out;
    for (int c : order)
        for (size_t i = 0; i < chunk_len; ++i) out.push_back(static_cast<uint8_t>(c * 16 + i));
    return out;
}

struct Spread {
    uint8_t span;
    uint16_t packet_len, chunk_len;
};

Player* spread_player(const Spread& s, const Bytes& received, std::unique_ptr<Player>* keep) {
    asfb::PacketFile f;
    f.video = false;
    f.spread = {s.span, s.packet_len, s.chunk_len};
    const uint32_t size = static_cast<uint32_t>(received.size());
    f.packets = {asfb::packet({asfb::media(1, 1, 0, size, 100, received),
                               asfb::media(1, 2, 0, 4, 200, {1, 2, 3, 4})},
                              std::max<uint32_t>(2048, size + 200))};
    f.packet_size = std::max<uint32_t>(2048, size + 200);
    *keep = std::make_unique<Player>(asfb::build_packet_file(f));
    return keep->get();
}

TEST(Spread, ChunksAreWrittenBackColumnByColumn) {
    struct Row {
        Spread s;
        Bytes received, committed;
    };
    const Row rows[] = {
        {{2, 4, 2}, chunks({0, 1, 2, 3}, 2), chunks({0, 2, 1, 3}, 2)},
        {{3, 4, 2}, chunks({0, 1, 2, 3, 4, 5}, 2), chunks({0, 3, 1, 4, 2, 5}, 2)},
        {{1, 4, 2}, chunks({0, 1, 2, 3}, 2), chunks({0, 1, 2, 3}, 2)},  // off
        {{0, 4, 2}, chunks({0, 1, 2, 3}, 2), chunks({0, 1, 2, 3}, 2)},  // off
    };
    for (const Row& r : rows) {
        SCOPED_TRACE(testing::Message() << "span " << int(r.s.span));
        std::unique_ptr<Player> keep;
        Player& pl = *spread_player(r.s, r.received, &keep);
        pl.open_or_fail();
        ASSERT_EQ(pl.ctx()->a_spread_span, r.s.span);
        ASSERT_EQ(pl.step(), HOVA_OK);
        const auto frames = pl.frames(HOVA_STREAM_AUDIO);
        ASSERT_EQ(frames.size(), 1u);
        EXPECT_EQ(frames[0].size, static_cast<int>(r.committed.size()));
        EXPECT_EQ(frames[0].crc32, crc(r.committed));
        pl.expect_clean_close();
    }
}

TEST(Spread, LargeObjectsComeBackAsEncoded) {
    const Spread s{5, 1000, 100};
    const Bytes original = asfb::pattern(5000, 42);
    std::unique_ptr<Player> keep;
    Player& pl = *spread_player(s, asfb::spread_scramble(original, s.span, s.packet_len, s.chunk_len), &keep);
    pl.open_or_fail();
    ASSERT_EQ(pl.step(), HOVA_OK);
    ASSERT_EQ(pl.frames(HOVA_STREAM_AUDIO).size(), 1u);
    EXPECT_EQ(pl.frames(HOVA_STREAM_AUDIO)[0].crc32, crc(original));
    pl.expect_clean_close();
}

TEST(Spread, MismatchedSizeOrRefusedMemoryCommitsTheObjectAsReceived) {
    const Spread s{3, 4, 2};
    for (bool refuse : {false, true}) {
        SCOPED_TRACE(refuse);
        const Bytes received = refuse ? chunks({0, 1, 2, 3, 4, 5}, 2) : asfb::pattern(11, 3);
        std::unique_ptr<Player> keep;
        Player& pl = *spread_player(s, received, &keep);
        testenv::LogCapture log;
        pl.open_or_fail();
        pl.host.refuse_stream_realloc = refuse;
        ASSERT_EQ(pl.step(), HOVA_OK);
        ASSERT_EQ(pl.frames(HOVA_STREAM_AUDIO).size(), 1u);
        EXPECT_EQ(pl.frames(HOVA_STREAM_AUDIO)[0].crc32, crc(received));
        const char* msg = refuse ? "realloc for audio spread fails"
                                 : "object size 11 does not match spread len 3 x 4";
        EXPECT_TRUE(log.contains(msg)) << msg;
        pl.expect_clean_close();
    }
}

}  // namespace
}  // namespace delivery
