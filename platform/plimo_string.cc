#include "plimo_string.h"

#include <cstddef>

#include "dprintf.h"

namespace {

// Lead-byte marks by UTF-8 sequence length.
constexpr uint8_t kFirstByteMark[7] = {0x00, 0x00, 0xC0, 0xE0, 0xF0, 0xF8, 0xFC};

inline uint16_t unit_at(const uint8_t* p) {
    return static_cast<uint16_t>(p[0] | (p[1] << 8));
}

inline int encoded_length(uint16_t u) { return u <= 0x7F ? 1 : (u <= 0x7FF ? 2 : 3); }

// Whole units in the range. A trailing odd byte is not part of any unit and is
// ignored rather than read past `end`.
inline ptrdiff_t unit_count(const uint8_t* start, const uint8_t* end) { return (end - start) / 2; }

}  // namespace

extern "C" int get_UTF16_byte_length(const uint8_t* start, const uint8_t* end) {
    if (!start || !end || start >= end) return 0;
    const ptrdiff_t m = end - start;
    if (m < 2) return static_cast<int>(m);
    ptrdiff_t walked = 0;
    while (walked < m) {
        if (walked + 2 > m) return static_cast<int>(m);
        walked += 2;
        if (unit_at(start + walked - 2) == 0) return static_cast<int>(walked);
    }
    return static_cast<int>(walked);
}

extern "C" int calculate_UTF16_to_UTF8_size(const uint8_t* start, const uint8_t* end) {
    if (!start || !end || start >= end) {
        DPRINTF("calculate UTF16 to UTF8 error : invalid input\n");
        return 0;
    }
    const ptrdiff_t n = unit_count(start, end);
    int size = 0;
    for (ptrdiff_t i = 0; i < n; ++i) size += encoded_length(unit_at(start + 2 * i));
    if (n == 0 || unit_at(start + 2 * (n - 1)) != 0) size += 1;
    return size;
}

extern "C" void convert_UTF16_to_UTF8(const uint8_t* start, const uint8_t* end, uint8_t* target) {
    if (!target || !start || !end || start >= end) {
        DPRINTF("convert UTF16 to UTF8 error : target is NULL or invalid input\n");
        return;
    }
    const ptrdiff_t n = unit_count(start, end);
    uint8_t* out = target;
    uint16_t u = 0;
    for (ptrdiff_t i = 0; i < n; ++i) {
        u = unit_at(start + 2 * i);
        const int len = encoded_length(u);
        switch (len) {
            case 3:
                out[2] = static_cast<uint8_t>(0x80 | (u & 0x3F));
                out[1] = static_cast<uint8_t>(0x80 | ((u >> 6) & 0x3F));
                out[0] = static_cast<uint8_t>(kFirstByteMark[3] | (u >> 12));
                break;
            case 2:
                out[1] = static_cast<uint8_t>(0x80 | (u & 0x3F));
                out[0] = static_cast<uint8_t>(kFirstByteMark[2] | (u >> 6));
                break;
            default:
                out[0] = static_cast<uint8_t>(u);
                break;
        }
        out += len;
    }
    if (n == 0 || u != 0) *out = 0;
}
