#include "record_text.h"

namespace asfdump {

std::string utf16le_to_utf8(const unsigned char* p, size_t size) {
    std::string out;
    for (size_t i = 0; i + 1 < size; i += 2) {
        uint32_t c = static_cast<uint32_t>(p[i] | (p[i + 1] << 8));
        if (c == 0) break;
        if (c >= 0xD800 && c <= 0xDBFF && i + 3 < size) {
            const uint32_t lo = static_cast<uint32_t>(p[i + 2] | (p[i + 3] << 8));
            if (lo >= 0xDC00 && lo <= 0xDFFF) {
                c = 0x10000 + ((c - 0xD800) << 10) + (lo - 0xDC00);
                i += 2;
            }
        }
        if (c < 0x80) {
            out += static_cast<char>(c);
        } else if (c < 0x800) {
            out += static_cast<char>(0xC0 | (c >> 6));
            out += static_cast<char>(0x80 | (c & 0x3F));
        } else if (c < 0x10000) {
            out += static_cast<char>(0xE0 | (c >> 12));
            out += static_cast<char>(0x80 | ((c >> 6) & 0x3F));
            out += static_cast<char>(0x80 | (c & 0x3F));
        } else {
            out += static_cast<char>(0xF0 | (c >> 18));
            out += static_cast<char>(0x80 | ((c >> 12) & 0x3F));
            out += static_cast<char>(0x80 | ((c >> 6) & 0x3F));
            out += static_cast<char>(0x80 | (c & 0x3F));
        }
    }
    return out;
}

std::string record_text(const hova_string_info_st& s) {
    if (!s.payload) return "";
    std::string t;
    if (s.stringformat == HOVA_STRING_FORMAT_UTF16LE || s.stringformat == HOVA_STRING_FORMAT_UTF16BE ||
        s.stringformat == HOVA_STRING_FORMAT_UCS2)
        t = utf16le_to_utf8(s.payload, s.size);
    else
        t.assign(reinterpret_cast<const char*>(s.payload), s.size);
    while (!t.empty() && t.back() == '\0') t.pop_back();
    return t;
}

std::string record_language(const char (&l)[4]) {
    std::string s(l, 4);
    return s.substr(0, s.find('\0'));
}

}  // namespace asfdump
