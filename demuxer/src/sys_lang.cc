#include "sys_lang.h"

#include <cstring>

namespace {

struct lang_pair {
    const char* alpha2;
    const char* alpha3;
};

// ISO 639-1 codes ordered by English language name, each with its ISO 639-2
// bibliographic code; an empty pair ends the table.
constexpr lang_pair lang_code[185] = {
    {"ab", "abk"}, {"aa", "aar"}, {"af", "afr"}, {"ak", "aka"}, {"sq", "alb"}, {"am", "amh"},
    {"ar", "ara"}, {"an", "arg"}, {"hy", "arm"}, {"as", "asm"}, {"av", "ava"}, {"ae", "ave"},
    {"ay", "aym"}, {"az", "aze"}, {"bm", "bam"}, {"ba", "bak"}, {"eu", "baq"}, {"be", "bel"},
    {"bn", "ben"}, {"bh", "bih"}, {"bi", "bis"}, {"bs", "bos"}, {"br", "bre"}, {"bg", "bul"},
    {"my", "bur"}, {"ca", "cat"}, {"ch", "cha"}, {"ce", "che"}, {"ny", "nya"}, {"zh", "chi"},
    {"za", "zha"}, {"cv", "chv"}, {"kw", "cor"}, {"co", "cos"}, {"cr", "cre"}, {"hr", "hrv"},
    {"cs", "cze"}, {"da", "dan"}, {"dv", "div"}, {"nl", "dut"}, {"dz", "dzo"}, {"en", "eng"},
    {"eo", "epo"}, {"et", "est"}, {"ee", "ewe"}, {"fo", "fao"}, {"fj", "fij"}, {"fi", "fin"},
    {"fr", "fre"}, {"ff", "ful"}, {"gl", "glg"}, {"ka", "geo"}, {"de", "ger"}, {"el", "gre"},
    {"gn", "grn"}, {"gu", "guj"}, {"ht", "hat"}, {"ha", "hau"}, {"he", "heb"}, {"hz", "her"},
    {"hi", "hin"}, {"ho", "hmo"}, {"hu", "hun"}, {"ia", "ina"}, {"id", "ind"}, {"ie", "ile"},
    {"ga", "gle"}, {"ig", "ibo"}, {"ik", "ipk"}, {"io", "ido"}, {"is", "ice"}, {"it", "ita"},
    {"iu", "iku"}, {"ja", "jpn"}, {"jv", "jav"}, {"kl", "kal"}, {"kn", "kan"}, {"kr", "kau"},
    {"ks", "kas"}, {"kk", "kaz"}, {"km", "khm"}, {"ki", "kik"}, {"rw", "kin"}, {"ky", "kir"},
    {"kv", "kom"}, {"kg", "kon"}, {"ko", "kor"}, {"ku", "kur"}, {"kj", "kua"}, {"la", "lat"},
    {"lb", "ltz"}, {"lg", "lug"}, {"li", "lim"}, {"ln", "lin"}, {"lo", "lao"}, {"lt", "lit"},
    {"lu", "lub"}, {"lv", "lav"}, {"gv", "glv"}, {"mk", "mac"}, {"mg", "mlg"}, {"ms", "may"},
    {"ml", "mal"}, {"mt", "mlt"}, {"mi", "mao"}, {"mr", "mar"}, {"mh", "mah"}, {"mn", "mon"},
    {"na", "nau"}, {"nv", "nav"}, {"nd", "nde"}, {"ne", "nep"}, {"ng", "ndo"}, {"nb", "nob"},
    {"nn", "nno"}, {"no", "nor"}, {"ii", "iii"}, {"nr", "nbl"}, {"oc", "oci"}, {"oj", "oji"},
    {"cu", "chu"}, {"om", "orm"}, {"or", "ori"}, {"os", "oss"}, {"pa", "pan"}, {"pi", "pli"},
    {"fa", "per"}, {"pl", "pol"}, {"ps", "pus"}, {"pt", "por"}, {"qu", "que"}, {"rm", "roh"},
    {"rn", "run"}, {"ro", "rum"}, {"ru", "rus"}, {"sa", "san"}, {"sc", "srd"}, {"sd", "snd"},
    {"se", "sme"}, {"sm", "smo"}, {"sg", "sag"}, {"sr", "srp"}, {"gd", "gla"}, {"sn", "sna"},
    {"si", "sin"}, {"sk", "slo"}, {"sl", "slv"}, {"so", "som"}, {"st", "sot"}, {"es", "spa"},
    {"su", "sun"}, {"sw", "swa"}, {"ss", "ssw"}, {"sv", "swe"}, {"ta", "tam"}, {"te", "tel"},
    {"tg", "tgk"}, {"th", "tha"}, {"ti", "tir"}, {"bo", "tib"}, {"tk", "tuk"}, {"tl", "tgl"},
    {"tn", "tsn"}, {"to", "ton"}, {"tr", "tur"}, {"ts", "tso"}, {"tt", "tat"}, {"tw", "twi"},
    {"ty", "tah"}, {"ug", "uig"}, {"uk", "ukr"}, {"ur", "urd"}, {"uz", "uzb"}, {"ve", "ven"},
    {"vi", "vie"}, {"vo", "vol"}, {"wa", "wln"}, {"cy", "wel"}, {"wo", "wol"}, {"fy", "fry"},
    {"xh", "xho"}, {"yi", "yid"}, {"yo", "yor"}, {"zu", "zul"},
    {"", ""},
};

constexpr const char* id3_genres[149] = {
    "Blues", "Classic Rock", "Country", "Dance", "Disco", "Funk", "Grunge", "Hip-Hop", "Jazz",
    "Metal", "New Age", "Oldies", "Other", "Pop", "R&B", "Rap", "Reggae", "Rock", "Techno",
    "Industrial", "Alternative", "Ska", "Death Metal", "Pranks", "Soundtrack", "Euro-Techno",
    "Ambient", "Trip-Hop", "Vocal", "Jazz+Funk", "Fusion", "Trance", "Classical",
    "Instrumental", "Acid", "House", "Game", "Sound Clip", "Gospel", "Noise", "AlternRock",
    "Bass", "Soul", "Punk", "Space", "Meditative", "Instrumental Pop", "Instrumental Rock",
    "Ethnic", "Gothic", "Darkwave", "Techno-Industrial", "Electronic", "Pop-Folk",
    "Eurodance", "Dream", "Southern Rock", "Comedy", "Cult", "Gangsta", "Top 40",
    "Christian Rap", "Pop/Funk", "Jungle", "Native American", "Cabaret", "New Wave",
    "Psychadelic", "Rave", "Showtunes", "Trailer", "Lo-Fi", "Tribal", "Acid Punk",
    "Acid Jazz", "Polka", "Retro", "Musical", "Rock & Roll", "Hard Rock", "Folk", "Folk-Rock",
    "National Folk", "Swing", "Fast Fusion", "Bebob", "Latin", "Revival", "Celtic",
    "Bluegrass", "Avantgarde", "Gothic Rock", "Progressive Rock", "Psychedelic Rock",
    "Symphonic Rock", "Slow Rock", "Big Band", "Chorus", "Easy Listening", "Acoustic",
    "Humour", "Speech", "Chanson", "Opera", "Chamber Music", "Sonata", "Symphony",
    "Booty Bass", "Primus", "Porn Groove", "Satire", "Slow Jam", "Club", "Tango", "Samba",
    "Folklore", "Ballad", "Power Ballad", "Rhythmic Soul", "Freestyle", "Duet", "Punk Rock",
    "Drum Solo", "A capella", "Euro-House", "Dance Hall", "Goa", "Drum & Bass", "Club-House",
    "Hardcore", "Terror", "Indie", "Britpop", "Negerpunk", "Polsk Punk", "Beat",
    "Christian Gangsta", "Heavy Metal", "Black Metal", "Crossover", "Contemporary Christian",
    "Christian Rock", "Merengue", "Salsa", "Thrash Metal", "Anime", "JPop", "Synthpop", "",
};

}  // namespace

extern "C" const char* sys_alpha2_to_alpha3(const char* code) {
    if (!code) return nullptr;
    for (const lang_pair& p : lang_code) {
        if (p.alpha2[0] == '\0') break;
        if (p.alpha2[0] == code[0] && p.alpha2[1] == code[1]) return p.alpha3;
    }
    return nullptr;
}

extern "C" const char* sys_index_to_genre(int index) {
    if (index < 0 || index > 148) return nullptr;
    return id3_genres[index];
}

extern "C" void sys_set_info_from_string(hova_data_info_st* info, char* str) {
    info->length = str ? static_cast<int>(std::strlen(str)) + 1 : 0;
    info->payload = reinterpret_cast<unsigned char*>(str);
}
