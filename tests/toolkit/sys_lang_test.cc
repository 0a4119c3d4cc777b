// Language codes checked against Debian's iso-codes list, which is kept
// independently of ours; genre names and the string wrapper.
#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include <climits>
#include <fstream>
#include <map>
#include <string>

#include "sys_lang.h"

namespace {

TEST(LanguageCodes, EveryIso639_1CodeMapsToItsBibliographicCodeComparingTwoBytes) {
    for (const char* code : {"EN", "En", "xx", "qq", "", "e"})
        EXPECT_EQ(sys_alpha2_to_alpha3(code), nullptr) << code;
    const char unterminated[2] = {'f', 'r'};
    EXPECT_STREQ(sys_alpha2_to_alpha3(unterminated), "fre");
    for (const auto& [two, three] : {std::pair{"ab", "abk"}, {"zu", "zul"}})  // table ends
        EXPECT_STREQ(sys_alpha2_to_alpha3(two), three);
    EXPECT_EQ(sys_alpha2_to_alpha3(nullptr), nullptr);
    std::ifstream f("/usr/share/iso-codes/json/iso_639-2.json");
    if (!f) GTEST_SKIP() << "iso_639-2.json missing (Debian package iso-codes)";
    std::map<std::string, std::string> expected = {{"en-US", "eng"}, {"es-419", "spa"}};
    const nlohmann::json doc = nlohmann::json::parse(f);
    for (const auto& e : doc.at("639-2"))
        if (e.contains("alpha_2"))
            expected[e.at("alpha_2")] =
                e.value("bibliographic", e.at("alpha_3").get<std::string>());
    ASSERT_EQ(expected.size(), 186u) << "the independent list changed shape";
    for (const auto& [two, three] : expected) {
        const char* got = sys_alpha2_to_alpha3(two.c_str());
        EXPECT_EQ(got ? std::string(got) : "(none)", three) << two;
    }
}

TEST(Genres, IndexLimitsAndNames) {
    for (const auto& [index, name] :
         {std::pair{0, "Blues"}, {17, "Rock"}, {147, "Synthpop"}, {148, ""}})
        EXPECT_STREQ(sys_index_to_genre(index), name);
    for (int index : {149, -1, INT_MIN}) EXPECT_EQ(sys_index_to_genre(index), nullptr) << index;
    hova_data_info_st info{123, reinterpret_cast<unsigned char*>(&info)};
    sys_set_info_from_string(&info, nullptr);
    EXPECT_EQ(std::make_pair(info.length, info.payload),
              std::make_pair(0, (unsigned char*)nullptr));
    char abc[] = "abc", empty[] = "";
    sys_set_info_from_string(&info, abc);
    EXPECT_EQ(std::make_pair(info.length, info.payload), std::make_pair(4, (unsigned char*)abc));
    sys_set_info_from_string(&info, empty);
    EXPECT_EQ(info.length, 1) << "the terminator counts";
}

}  // namespace
