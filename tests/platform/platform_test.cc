// UTF-16LE to UTF-8: each unit encoded on its own, a terminator appended when
// the range has none, the measured size always equal to what is written.
#include <gtest/gtest.h>

#include <vector>

#include "plimo_string.h"

using Bytes = std::vector<uint8_t>;

Bytes units(std::initializer_list<uint16_t> us) {
    Bytes b;
    for (uint16_t u : us) b.insert(b.end(), {uint8_t(u & 0xFF), uint8_t(u >> 8)});
    return b;
}

TEST(Utf16ToUtf8, MeasuresAndConvertsEachUnitWithinTheRange) {
    const std::pair<Bytes, Bytes> cases[] = {
        {units({0x41, 0xE9, 0x20AC, 0}), {0x41, 0xC3, 0xA9, 0xE2, 0x82, 0xAC, 0x00}},
        {units({0xD83D, 0xDE00}), {0xED, 0xA0, 0xBD, 0xED, 0xB8, 0x80, 0x00}},  // no pairing
        {units({0x80, 0x7FF, 0}), {0xC2, 0x80, 0xDF, 0xBF, 0x00}},
        {units({0x7F, 0x800, 0xFFFF}), {0x7F, 0xE0, 0xA0, 0x80, 0xEF, 0xBF, 0xBF, 0x00}},
        {units({0x41, 0, 0x42}), {0x41, 0x00, 0x42, 0x00}},  // an inner zero is kept
        {{0x41, 0x00, 0x42}, {0x41, 0x00}}, {{0x41}, {0x00}}};  // an odd byte is no unit
    for (const auto& [in, out] : cases) {
        const uint8_t *b = in.data(), *e = b + in.size();
        ASSERT_EQ(calculate_UTF16_to_UTF8_size(b, e), int(out.size()));
        Bytes target(out.size() + 4, 0xEE), want = out;
        convert_UTF16_to_UTF8(b, e, target.data());
        want.resize(out.size() + 4, 0xEE);
        EXPECT_EQ(target, want) << "nothing past the measured size";
    }
    const Bytes a0_more = {0x41, 0, 0, 0, 0x42, 0}, zero_first = units({0, 0x41});
    const uint8_t *t = a0_more.data() + 4, *z = zero_first.data();
    EXPECT_EQ(std::vector<int>({get_UTF16_byte_length(a0_more.data(), t + 2), get_UTF16_byte_length(z, z + 4),
                                get_UTF16_byte_length(t, t + 1), get_UTF16_byte_length(t + 2, t),
                                get_UTF16_byte_length(t, t + 2), get_UTF16_byte_length(z + 1, z + 4)}),
              std::vector<int>({4, 2, 1, 0, 2, 3}));
    uint8_t out[8] = {0x55};  // an empty or inverted range, no target: nothing measured or written
    EXPECT_EQ(calculate_UTF16_to_UTF8_size(t, t), 0);
    convert_UTF16_to_UTF8(t, t + 2, nullptr);
    convert_UTF16_to_UTF8(t + 2, t, out);
    EXPECT_EQ(out[0], 0x55) << "nothing written for an inverted range";
}
