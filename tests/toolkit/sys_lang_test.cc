// Language codes checked against Debian's iso-codes list, which is kept
// independently of ours; genre names and the string wrapper.
#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include <cstring>
#include <fstream>
#include <map>
#include <string>

#include "sys_lang.h"

namespace {

const char* kIsoCodes = "/usr/share/iso-codes/json/iso_639-2.json";

TEST(LanguageCodes, EveryIso639_1CodeMapsToItsBibliographicCode) {
    std::ifstream f(kIsoCodes);
    if (!f) GTEST_SKIP() << kIsoCodes << " missing (Debian package iso-codes)";
    const nlohmann::json doc = nlohmann::json::parse(f);
    std::map<std::string, std::string> expected;
    for (const auto& e : doc.at("639-2")) {
        if (!e.contains("alpha_2")) continue;
        expected[e.at("alpha_2").get<std::string>()] =
            e.value("bibliographic", e.at("alpha_3").get<std::string>());
    }
    ASSERT_EQ(expected.size(), 184u) << "the independent list changed shape";
    for (const auto& [two, three] : expected) {
        const char* got = sys_alpha2_to_alpha3(two.c_str());
        ASSERT_NE(got, nullptr) << two;
        EXPECT_EQ(std::string(got), three) << two;
    }
}

TEST(LanguageCodes, ComparesExactlyTheFirstTwoBytes) {
    struct Case {
        const char* code;
        const char* expected;  // nullptr: not found
    };
    const Case cases[] = {
        {"en", "eng"}, {"de", "ger"}, {"zh", "chi"}, {"nb", "nob"}, {"bh", "bih"},
        {"ab", "abk"}, {"zu", "zul"}, {"en-US", "eng"}, {"es-419", "spa"},
        {"EN", nullptr}, {"En", nullptr}, {"xx", nullptr}, {"qq", nullptr}, {"", nullptr},
        {"e", nullptr},
    };
    for (const Case& c : cases) {
        const char* got = sys_alpha2_to_alpha3(c.code);
        if (!c.expected) {
            EXPECT_EQ(got, nullptr) << c.code;
        } else {
            ASSERT_NE(got, nullptr) << c.code;
            EXPECT_STREQ(got, c.expected) << c.code;
        }
    }
    // The code need not be NUL-terminated.
    const char unterminated[2] = {'f', 'r'};
    EXPECT_STREQ(sys_alpha2_to_alpha3(unterminated), "fre");
}

TEST(Genres, IndexLimitsAndNames) {
    EXPECT_STREQ(sys_index_to_genre(0), "Blues");
    EXPECT_STREQ(sys_index_to_genre(17), "Rock");
    EXPECT_STREQ(sys_index_to_genre(80), "Folk");
    EXPECT_STREQ(sys_index_to_genre(147), "Synthpop");
    EXPECT_STREQ(sys_index_to_genre(148), "");
    EXPECT_EQ(sys_index_to_genre(149), nullptr);
    EXPECT_EQ(sys_index_to_genre(-1), nullptr);
    EXPECT_EQ(sys_index_to_genre(INT32_MIN), nullptr);
    for (int i = 0; i < 148; ++i) EXPECT_GT(std::strlen(sys_index_to_genre(i)), 0u) << i;
}

TEST(StringInfo, WrapsWithoutCopyingAndCountsTheTerminator) {
    hova_data_info_st info{123, reinterpret_cast<unsigned char*>(&info)};
    sys_set_info_from_string(&info, nullptr);
    EXPECT_EQ(info.length, 0);
    EXPECT_EQ(info.payload, nullptr);
    char abc[] = "abc";
    sys_set_info_from_string(&info, abc);
    EXPECT_EQ(info.length, 4);
    EXPECT_EQ(info.payload, reinterpret_cast<unsigned char*>(abc));
    char empty[] = "";
    sys_set_info_from_string(&info, empty);
    EXPECT_EQ(info.length, 1);
}

}  // namespace
