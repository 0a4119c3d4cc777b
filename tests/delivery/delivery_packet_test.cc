// Packet and payload headers read from an opened file: the reader stands on
// the first data packet after open.
#include "asf_packet.h"
#include "delivery_fixture.h"

namespace delivery {
namespace {

using asfb::PacketLayout;
using asfb::Payload;

struct Opened {
    explicit Opened(Bytes file) : player(std::move(file)) { player.open_or_fail(); }
    asf_demuxer_st* d() { return player.ctx(); }
    cb_buffer_st* cb() { return &player.ctx()->s.cbuffer; }
    Player player;
};

TEST(PacketHeader, ReadsTheCommonLayoutWithTwoPayloads) {
    // 82 00 00 | 11 | 5D | 10 00 | send time | duration | 82, then a payload
    // of stream 2 (key frame), object 5, offset 0, size 3000, time 5000 ms.
    const Payload first = asfb::media(2, 5, 0, 3000, 5000, asfb::pattern(1000, 1), true);
    const Payload second = asfb::media(1, 9, 0, 50, 5000, asfb::pattern(50, 2));
    const uint32_t used = 14 + 17 + 1000 + 17 + 50;
    const uint32_t packet_size = used + 16;
    const Bytes pkt = asfb::packet({first, second}, packet_size);
    Opened o(av_file({pkt}, packet_size));
    asf_packet_st p{};
    p.media_object_size = 1;
    ASSERT_EQ(read_packet_header(o.d(), &p, &p.parsed_size), HOVA_OK);
    EXPECT_EQ(p.parsed_size, 14u);
    EXPECT_EQ(p.num_payloads, 2u);
    EXPECT_EQ(p.payload_len_type, 2u);
    EXPECT_EQ(p.packet_len, packet_size);
    EXPECT_EQ(p.padding_len, 16u);
    EXPECT_EQ(p.property_flags, 0x5D);

    ASSERT_EQ(read_payload_header(o.d(), &p, &p.parsed_size), HOVA_OK);
    EXPECT_EQ(p.stream_num, 0x82);
    EXPECT_EQ(p.object_num, 5u);
    EXPECT_EQ(p.offset_into_obj, 0u);
    EXPECT_EQ(p.media_object_size, 3000u);
    EXPECT_EQ(p.presentation_time, 5000u);
    EXPECT_EQ(p.payload_len, 1000u);
    EXPECT_EQ(p.compressed_payload, 0);
    EXPECT_EQ(p.parsed_size, 31u);
    // The reader stands on the payload data.
    uint8_t b[4];
    ASSERT_EQ(o.cb()->cb_read(o.cb(), b, 4), 4);
    EXPECT_TRUE(std::equal(b, b + 4, first.data.begin()));
    o.player.expect_clean_close();
}

TEST(PacketHeader, LengthFollowsErrorCorrectionPayloadFlagsAndFieldWidths) {
    struct Row {
        bool ec;
        bool multiple;
        uint8_t packet_len_type, sequence_type, padding_len_type;
        uint32_t expected;
    };
    // 11 (error correction) or 8 (none), one more with payload flags, plus
    // the widths of the three variable fields.
    const Row rows[] = {
        {true, false, 0, 0, 0, 11},  {true, true, 0, 0, 0, 12},  {false, false, 0, 0, 0, 8},
        {false, true, 0, 0, 0, 9},   {true, false, 1, 0, 2, 14}, {true, true, 3, 2, 1, 19},
        {false, false, 2, 3, 3, 18}, {false, true, 1, 1, 1, 12}, {true, true, 3, 3, 3, 24},
    };
    for (const Row& r : rows) {
        SCOPED_TRACE(testing::Message() << "ec " << r.ec << " multiple " << r.multiple << " types "
                                        << int(r.packet_len_type) << int(r.sequence_type)
                                        << int(r.padding_len_type));
        PacketLayout l;
        l.error_correction = r.ec;
        l.multiple = r.multiple;
        l.packet_len_type = r.packet_len_type;
        l.sequence_type = r.sequence_type;
        l.padding_len_type = r.padding_len_type;
        ASSERT_EQ(asfb::packet_header_size(l), r.expected);
        const Bytes pkt = asfb::packet({asfb::media(1, 1, 0, 100, 0, asfb::pattern(100, 3))}, 512, l);
        Opened o(av_file({pkt}, 512));
        asf_packet_st p{};
        ASSERT_EQ(read_packet_header(o.d(), &p, &p.parsed_size), HOVA_OK);
        EXPECT_EQ(p.parsed_size, r.expected);
        EXPECT_EQ(p.num_payloads, 1u);
        EXPECT_EQ(p.payload_len_type, r.multiple ? 2u : 0u);
        ASSERT_EQ(read_payload_header(o.d(), &p, &p.parsed_size), HOVA_OK);
        // Single payloads get their length from what is left of the packet;
        // without a padding or packet length field that is all of it.
        const bool sized = r.multiple || r.packet_len_type || r.padding_len_type;
        const Payload probe = asfb::media(1, 1, 0, 100, 0, {});
        EXPECT_EQ(p.payload_len, sized ? 100u : 512u - r.expected - asfb::payload_header_size(l, probe));
        o.player.expect_clean_close();
    }
}

TEST(PacketHeader, ShortPacketLengthBecomesPadding) {
    struct Row {
        uint8_t packet_len_type;
        uint32_t packet_len, padding;
        uint32_t want_len, want_padding;
    };
    const Row rows[] = {
        {0, 0, 10, 1024, 10},     // absent
        {2, 0, 10, 1024, 10},     // present but 0
        {2, 1000, 10, 1024, 34},  // shorter than the file's packets
        {2, 1024, 10, 1024, 10},
        {3, 1025, 10, 1025, 10},  // longer: left for delivery to reject
    };
    for (const Row& r : rows) {
        SCOPED_TRACE(testing::Message() << "packet length " << r.packet_len);
        PacketLayout l;
        l.packet_len_type = r.packet_len_type;
        l.packet_len = r.packet_len;
        l.padding_len = r.padding;
        const Bytes pkt = asfb::packet({asfb::media(1, 1, 0, 10, 0, asfb::pattern(10, 3))}, 1024, l);
        Opened o(av_file({pkt}, 1024));
        asf_packet_st p{};
        ASSERT_EQ(read_packet_header(o.d(), &p, &p.parsed_size), HOVA_OK);
        EXPECT_EQ(p.packet_len, r.want_len);
        EXPECT_EQ(p.padding_len, r.want_padding);
        o.player.expect_clean_close();
    }
}

TEST(PayloadHeader, ReplicatedDataDecidesTimeSizeAndCompression) {
    struct Row {
        uint32_t replicated_len;
        bool compressed;
        uint32_t time;
        uint32_t object_size;
        int announced;
    };
    const Row rows[] = {
        {0, false, 0xFFFFFFFF, 777, 0}, {1, true, 4321, 777, 0},  {5, false, 0xFFFFFFFF, 777, 0},
        {8, false, 2500, 64, 1},        {12, false, 2500, 64, 1},
    };
    for (const Row& r : rows) {
        SCOPED_TRACE(testing::Message() << "replicated data " << r.replicated_len);
        const Payload sizer = asfb::media(1, 1, 0, 777, 100, asfb::pattern(20, 1));
        Payload probe;
        if (r.replicated_len == 1)
            probe = asfb::compressed(2, 3, 4321, 40, {asfb::pattern(30, 2), asfb::pattern(31, 3)});
        else if (r.replicated_len < 8)
            probe = asfb::untimed(2, 3, 0, asfb::pattern(64, 2), r.replicated_len);
        else
            probe = asfb::media(2, 3, 0, 64, 2500, asfb::pattern(64, 2), false, r.replicated_len - 8);
        const Bytes pkt = asfb::packet({sizer, probe}, 1024);
        Opened o(av_file({pkt}, 1024));
        asf_packet_st p{};
        ASSERT_EQ(read_packet_header(o.d(), &p, &p.parsed_size), HOVA_OK);
        ASSERT_EQ(read_payload_header(o.d(), &p, &p.parsed_size), HOVA_OK);
        ASSERT_EQ(p.media_object_size, 777u);
        ASSERT_NE(o.cb()->cb_seek64(o.cb(), p.payload_len, CB_SEEK_CUR), -1);
        p.parsed_size += p.payload_len;
        const uint32_t before = p.parsed_size;
        int announced = -1;
        ASSERT_EQ(asf_read_payload_header_ex(o.d(), &p, &p.parsed_size, &announced), HOVA_OK);
        EXPECT_EQ(p.compressed_payload, r.compressed ? 1 : 0);
        EXPECT_EQ(p.presentation_time, r.time);
        EXPECT_EQ(p.media_object_size, r.object_size);
        EXPECT_EQ(announced, r.announced);
        EXPECT_EQ(p.offset_into_obj, 0u);
        if (r.compressed) {
            EXPECT_EQ(p.presentation_time_delta, 40);
        }
        EXPECT_EQ(p.payload_len, probe.data.size());
        EXPECT_EQ(p.parsed_size - before, 1 + 1 + 4 + 1 + r.replicated_len + 2);
        o.player.expect_clean_close();
    }
}

TEST(PayloadHeader, AbsentFieldsReadAsZeroAndTakeNoBytes) {
    PacketLayout l;
    l.object_num_type = 0;
    l.offset_type = 0;
    const Bytes pkt = asfb::packet({asfb::media(2, 9, 0, 40, 7, asfb::pattern(40, 1))}, 256, l);
    Opened o(av_file({pkt}, 256));
    asf_packet_st p{};
    p.object_num = 55;
    p.offset_into_obj = 66;
    ASSERT_EQ(read_packet_header(o.d(), &p, &p.parsed_size), HOVA_OK);
    const uint32_t before = p.parsed_size;
    ASSERT_EQ(read_payload_header(o.d(), &p, &p.parsed_size), HOVA_OK);
    EXPECT_EQ(p.object_num, 0u);
    EXPECT_EQ(p.offset_into_obj, 0u);
    EXPECT_EQ(p.parsed_size - before, 1u + 1 + 8 + 2);
    EXPECT_EQ(p.payload_len, 40u);
    o.player.expect_clean_close();
}

TEST(FieldReader, ReadsEachWidthAndNothingOnAShortRead) {
    // The data of a single packet: 8 bytes 01 02 03 04 05 06 07 08 at the
    // reader after the packet header.
    const Payload only = asfb::media(1, 1, 0, 8, 0, {1, 2, 3, 4, 5, 6, 7, 8});
    Opened o(av_file({asfb::packet({only}, 64)}, 64));
    asf_packet_st p{};
    ASSERT_EQ(read_packet_header(o.d(), &p, &p.parsed_size), HOVA_OK);
    ASSERT_EQ(read_payload_header(o.d(), &p, &p.parsed_size), HOVA_OK);
    uint32_t v = 99;
    EXPECT_EQ(read_1_2_4_bytes(o.cb(), &v, 0), 0);
    EXPECT_EQ(v, 0u);
    EXPECT_EQ(read_1_2_4_bytes(o.cb(), &v, 1), 1);
    EXPECT_EQ(v, 0x01u);
    EXPECT_EQ(read_1_2_4_bytes(o.cb(), &v, 2), 2);
    EXPECT_EQ(v, 0x0302u);
    EXPECT_EQ(read_1_2_4_bytes(o.cb(), &v, 3), 4);
    EXPECT_EQ(v, 0x07060504u);
    // Seek to the last byte of the input: a 4-byte field cannot be read.
    ASSERT_NE(o.cb()->cb_seek64(o.cb(), -1, CB_SEEK_END), -1);
    v = 99;
    EXPECT_EQ(read_1_2_4_bytes(o.cb(), &v, 3), 0);
    EXPECT_EQ(v, 0u);
    o.player.expect_clean_close();
}

TEST(PacketHeader, EndOfInputEndsTheHeader) {
    const Bytes pkt = asfb::packet({asfb::media(1, 1, 0, 10, 0, asfb::pattern(10, 1))}, 128);
    Opened o(av_file({pkt}, 128));
    ASSERT_NE(o.cb()->cb_seek64(o.cb(), 0, CB_SEEK_END), -1);
    asf_packet_st p{};
    EXPECT_EQ(read_packet_header(o.d(), &p, &p.parsed_size), HOVA_EndOfStream);
    EXPECT_EQ(read_payload_header(o.d(), &p, &p.parsed_size), HOVA_EndOfStream);
    o.player.expect_clean_close();
}

}  // namespace
}  // namespace delivery
