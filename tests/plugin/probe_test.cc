// The probe recognises ASF by the header object GUID, at the start or behind
// an ID3v2 tag on a seekable input, and nothing else.
#include <gtest/gtest.h>

#include <cstring>
#include <vector>

#include "asf_api.h"
#include "asf_guid.h"
#include "raw_input.h"
#include "test_env.h"

namespace {

const uint8_t kHeaderGuid[16] = {0x30, 0x26, 0xB2, 0x75, 0x8E, 0x66, 0xCF, 0x11,
                                 0xA6, 0xD9, 0x00, 0xAA, 0x00, 0x62, 0xCE, 0x6C};

std::vector<uint8_t> with_guid(size_t total) {
    std::vector<uint8_t> v(total, 0);
    std::memcpy(v.data(), kHeaderGuid, std::min<size_t>(16, total));
    return v;
}

// An ID3v2 tag whose size bytes 6..9 are `size`, padded, then the GUID.
std::vector<uint8_t> id3_then_guid(const uint8_t size[4], size_t tag_total) {
    std::vector<uint8_t> v(tag_total + 64, 0);
    std::memcpy(v.data(), "ID3\x03\x00\x00", 6);
    std::memcpy(v.data() + 6, size, 4);
    std::memcpy(v.data() + tag_total, kHeaderGuid, 16);
    return v;
}

TEST(Probe, AnswersFromTheBytesAtTheStart) {
    struct Case {
        const char* name;
        std::vector<uint8_t> bytes;
        int len;
        int expected;
    };
    std::vector<uint8_t> last_byte_differs = with_guid(64);
    last_byte_differs[15] ^= 0x01;
    std::vector<uint8_t> reversed = with_guid(64);
    std::reverse(reversed.begin(), reversed.begin() + 4);  // 75 B2 26 30
    const Case cases[] = {
        {"guid at 0", with_guid(64), 64, 1},
        {"exactly 16 bytes", with_guid(16), 16, 1},
        {"15 bytes of it", with_guid(16), 15, 0},
        {"empty", with_guid(16), 0, 0},
        {"last byte differs", last_byte_differs, 64, 0},
        {"byte-reversed start", reversed, 64, 0},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(asf_probe(c.bytes.data(), c.len, nullptr, HOVA_PROBE_NORMAL), c.expected)
            << c.name;
    }
}

TEST(Probe, FindsTheHeaderBehindAnId3TagOnlyOnASeekableInput) {
    const uint8_t size[4] = {0x00, 0x00, 0x02, 0x03};  // 259 -> tag occupies 269 bytes
    const std::vector<uint8_t> file = id3_then_guid(size, 269);

    auto seekable = host::RawInput::from_memory(file);
    seekable->io()->seek(seekable->io(), 0, CB_SEEK_SET);
    EXPECT_EQ(asf_probe(file.data(), 64, seekable->io(), HOVA_PROBE_NORMAL), 1);
    EXPECT_EQ(seekable->position(), 0u) << "the input is put back at its start";

    host::InputOptions not_seekable;
    not_seekable.seekable = false;
    auto stream = host::RawInput::from_memory(file, not_seekable);
    EXPECT_EQ(asf_probe(file.data(), 64, stream->io(), HOVA_PROBE_NORMAL), 0);
    EXPECT_EQ(stream->counters().seeks, 0u);

    EXPECT_EQ(asf_probe(file.data(), 64, nullptr, HOVA_PROBE_NORMAL), 0) << "no raw input";

    // The syncsafe size ignores the top bit of each byte.
    const uint8_t high_bits[4] = {0x80, 0x80, 0x82, 0x83};
    const std::vector<uint8_t> masked = id3_then_guid(high_bits, 269);
    auto in = host::RawInput::from_memory(masked);
    EXPECT_EQ(asf_probe(masked.data(), 64, in->io(), HOVA_PROBE_NORMAL), 1);
}

TEST(Probe, Id3PathFailsCleanlyOnShortOrRefusingInput) {
    const uint8_t size[4] = {0x00, 0x00, 0x02, 0x03};
    std::vector<uint8_t> file = id3_then_guid(size, 269);

    file.resize(269 + 15);  // GUID cut short
    auto short_in = host::RawInput::from_memory(file);
    EXPECT_EQ(asf_probe(file.data(), 64, short_in->io(), HOVA_PROBE_NORMAL), 0);
    EXPECT_EQ(short_in->position(), 0u);

    const std::vector<uint8_t> whole = id3_then_guid(size, 269);
    auto refusing = host::RawInput::from_memory(whole);
    refusing->faults().refuse_seek = true;
    EXPECT_EQ(asf_probe(whole.data(), 64, refusing->io(), HOVA_PROBE_NORMAL), 0);

    // Another object behind the tag is not ASF.
    std::vector<uint8_t> other = whole;
    other[269] ^= 0xFF;
    auto other_in = host::RawInput::from_memory(other);
    EXPECT_EQ(asf_probe(other.data(), 64, other_in->io(), HOVA_PROBE_NORMAL), 0);
}

TEST(Guid, ComparesTheStoredBytes) {
    EXPECT_EQ(std::memcmp(&asf_header_object, kHeaderGuid, 16), 0);
    guid_st g = asf_header_object;
    EXPECT_EQ(sys_is_equal_guid(&g, &asf_header_object), 1);
    g.data4[7] ^= 1;
    EXPECT_EQ(sys_is_equal_guid(&g, &asf_header_object), 0);
    // Objects that share all but data1 are distinct.
    EXPECT_EQ(sys_is_equal_guid(&asf_header_object, &asf_content_desc_object), 0);
    EXPECT_EQ(sys_is_equal_guid(&asf_stream_prop_object, &asf_stream_prop_object2), 0);
    // Spot-check stored forms against their text forms' byte order.
    const uint8_t file_prop[16] = {0xA1, 0xDC, 0xAB, 0x8C, 0x47, 0xA9, 0xCF, 0x11,
                                   0x8E, 0xE4, 0x00, 0xC0, 0x0C, 0x20, 0x53, 0x65};
    EXPECT_EQ(std::memcmp(&asf_file_prop_object, file_prop, 16), 0);
    const uint8_t eac3[16] = {0xAF, 0x87, 0xFB, 0xA7, 0x02, 0x2D, 0xFB, 0x42,
                              0xA4, 0xD4, 0x05, 0xCD, 0x93, 0x84, 0x3B, 0xDD};
    EXPECT_EQ(std::memcmp(&eac3_guid, eac3, 16), 0);
}

}  // namespace
