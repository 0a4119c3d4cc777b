// UTF-16LE to UTF-8: each unit encoded on its own, a terminator appended when
// the range has none, and the measured size always equal to what is written.
#include <gtest/gtest.h>

#include <vector>

#include "plimo_string.h"
#include "test_env.h"

namespace {

std::vector<uint8_t> units(std::initializer_list<uint16_t> us) {
    std::vector<uint8_t> b;
    for (uint16_t u : us) {
        b.push_back(static_cast<uint8_t>(u & 0xFF));
        b.push_back(static_cast<uint8_t>(u >> 8));
    }
    return b;
}

TEST(Utf16ToUtf8, WorkedExamplesMeasureAndConvert) {
    struct Case {
        const char* name;
        std::vector<uint8_t> in;
        std::vector<uint8_t> out;
    };
    const Case cases[] = {
        {"ascii, latin-1, euro, terminator", units({0x0041, 0x00E9, 0x20AC, 0x0000}),
         {0x41, 0xC3, 0xA9, 0xE2, 0x82, 0xAC, 0x00}},
        {"no terminator", units({0x0041, 0x0042}), {0x41, 0x42, 0x00}},
        {"devanagari", units({0x0915}), {0xE0, 0xA4, 0x95, 0x00}},
        {"surrogate pair stays two sequences", units({0xD83D, 0xDE00}),
         {0xED, 0xA0, 0xBD, 0xED, 0xB8, 0x80, 0x00}},
        {"two-byte edges", units({0x0080, 0x07FF, 0x0000}), {0xC2, 0x80, 0xDF, 0xBF, 0x00}},
        {"one/three-byte edges", units({0x007F, 0x0800, 0xFFFF}),
         {0x7F, 0xE0, 0xA0, 0x80, 0xEF, 0xBF, 0xBF, 0x00}},
        {"inner zero kept, conversion goes on", units({0x0041, 0x0000, 0x0042}),
         {0x41, 0x00, 0x42, 0x00}},
    };
    for (const Case& c : cases) {
        const uint8_t* b = c.in.data();
        const uint8_t* e = b + c.in.size();
        ASSERT_EQ(calculate_UTF16_to_UTF8_size(b, e), static_cast<int>(c.out.size())) << c.name;
        std::vector<uint8_t> target(c.out.size() + 4, 0xEE);
        convert_UTF16_to_UTF8(b, e, target.data());
        EXPECT_EQ(std::vector<uint8_t>(target.begin(), target.begin() + c.out.size()), c.out)
            << c.name;
        EXPECT_EQ(target[c.out.size()], 0xEE) << c.name << ": wrote past the measured size";
    }
}

TEST(Utf16ToUtf8, ByteLengthStopsAtTheFirstZeroUnit) {
    const std::vector<uint8_t> a0_more = {0x41, 0x00, 0x00, 0x00, 0x42, 0x00, 0x43, 0x00};
    EXPECT_EQ(get_UTF16_byte_length(a0_more.data(), a0_more.data() + a0_more.size()), 4);
    const std::vector<uint8_t> three = {0x41, 0x00, 0x42};
    EXPECT_EQ(get_UTF16_byte_length(three.data(), three.data() + 3), 3);
    EXPECT_EQ(get_UTF16_byte_length(three.data(), three.data() + 1), 1);
    EXPECT_EQ(get_UTF16_byte_length(three.data(), three.data()), 0);
    EXPECT_EQ(get_UTF16_byte_length(three.data() + 2, three.data()), 0);
    const std::vector<uint8_t> no_zero = units({0x41, 0x42, 0x43});
    EXPECT_EQ(get_UTF16_byte_length(no_zero.data(), no_zero.data() + 6), 6);
    const std::vector<uint8_t> zero_first = units({0x0000, 0x41});
    EXPECT_EQ(get_UTF16_byte_length(zero_first.data(), zero_first.data() + 4), 2);
}

TEST(Utf16ToUtf8, OddTrailingByteIsNotReadPastTheRange) {
    // The odd byte is dropped: only whole units are converted.
    std::vector<uint8_t> in = {0x41, 0x00, 0x42};
    ASSERT_EQ(calculate_UTF16_to_UTF8_size(in.data(), in.data() + 3), 2);
    uint8_t out[2];
    convert_UTF16_to_UTF8(in.data(), in.data() + 3, out);
    EXPECT_EQ(out[0], 0x41);
    EXPECT_EQ(out[1], 0x00);
    // A single byte holds no unit: an empty string.
    EXPECT_EQ(calculate_UTF16_to_UTF8_size(in.data(), in.data() + 1), 1);
}

// The log switch itself is checked in log_test.cc.
TEST(Utf16ToUtf8, InvalidInputIsLoggedAndWritesNothing) {
    const std::vector<uint8_t> in = units({0x41, 0x00});
    uint8_t out[8] = {0x55};
    testenv::LogCapture log;
    EXPECT_EQ(calculate_UTF16_to_UTF8_size(in.data(), in.data()), 0);
    convert_UTF16_to_UTF8(in.data(), in.data() + 4, nullptr);
    convert_UTF16_to_UTF8(in.data() + 4, in.data(), out);
    EXPECT_EQ(out[0], 0x55) << "nothing written for an inverted range";
    ASSERT_EQ(log.lines().size(), 3u);
    EXPECT_EQ(log.lines()[0].text, "calculate UTF16 to UTF8 error : invalid input\n");
    EXPECT_EQ(log.lines()[1].text, "convert UTF16 to UTF8 error : target is NULL or invalid input\n");
}

}  // namespace
