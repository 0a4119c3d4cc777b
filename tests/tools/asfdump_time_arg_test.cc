// Times on asfdump's command line: every form it takes, the forms it refuses,
// and the h:mm:ss.mmm the summary and stats print.
#include <gtest/gtest.h>

// The parser is part of the asfdump program, not of a library the tests link:
// compiled into this suite once (the summary test uses it too).
#include "../../tools/asfdump/time_arg.cc"

namespace {

TEST(AsfdumpTimeArg, ParsesEveryFormAndRefusesTheRest) {
    const std::pair<const char*, int64_t> valid[] = {
        {"0", 0}, {"2000000", 2000000}, {"-1500000", -1500000}, {"30s", 30000000}, {"2.5s", 2500000},
        {"500ms", 500000}, {"250us", 250}, {"1m", 60000000}, {"1h2m", 3720000000}, {"1h2m3.5s", 3723500000},
        {"2m500ms", 120500000}, {".5s", 500000}, {"-2s", -2000000}, {"1:02.5", 62500000}, {"0:59", 59000000},
        {"1:02:03", 3723000000}, {"1:02:03.25", 3723250000}, {"100:00", 6000000000}, {"0.0000004s", 0},
        {"9223372036854775807", INT64_MAX},
    };
    for (const auto& [text, want] : valid) {
        int64_t us = 7;
        EXPECT_TRUE(asfdump::parse_time_us(text, &us)) << text;
        EXPECT_EQ(us, want) << text;
    }
    const char* invalid[] = {"", "-", "s", "30x", "0x10s", "1.5.2s", "1m1h", "2s1m", "1s1s", "1ms2s", "1:60",
                             "1:2:3:4", "1.5:00", "1::2", ":30", "1:", "30 s", " 30s", "1e3s", "nan", "inf",
                             "3000000000h", "9223372036854775808", "--5", "+5"};
    for (const char* text : invalid) {
        int64_t us = 7;
        EXPECT_FALSE(asfdump::parse_time_us(text, &us)) << text;
        EXPECT_EQ(us, 7) << text << " left untouched";
    }
    EXPECT_FALSE(asfdump::parse_time_us(nullptr, nullptr));
}

TEST(AsfdumpTimeArg, FormatsForPeople) {
    const std::pair<int64_t, const char*> cases[] = {
        {0, "0:00:00.000"}, {499, "0:00:00.000"}, {500, "0:00:00.001"}, {60092000, "0:01:00.092"},
        {3723500000, "1:02:03.500"}, {359999999500, "100:00:00.000"}, {-1500000, "-0:00:01.500"}, {-400, "0:00:00.000"},
        {INT64_MIN, "-2562047788:00:54.776"},
    };
    for (const auto& [us, want] : cases) EXPECT_EQ(asfdump::format_time_us(us), want) << us;
    for (int64_t us : {int64_t(0), int64_t(1000), int64_t(62500000), int64_t(3723250000)}) {
        int64_t back = -1;
        EXPECT_TRUE(asfdump::parse_time_us(asfdump::format_time_us(us).c_str(), &back));
        EXPECT_EQ(back, us) << "h:mm:ss.mmm reads back";
    }
}

}  // namespace
