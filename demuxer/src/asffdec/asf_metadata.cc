// Descriptive metadata: title and author from the content description, album,
// year, genre and cover from the extended content description, and a cover
// from the metadata library.
#include <cstdlib>
#include <cstring>

#include "asf_internal.h"
#include "asf_io.h"
#include "asf_objects.h"
#include "byte_reader.h"
#include "dprintf.h"
#include "plimo_string.h"
#include "sys_output.h"

using plimo::load_le;

namespace {

constexpr uint32_t kNameBufLen = 100;
constexpr int kGenreTempLen = 1000;
// Counts in front of the descriptor entries: object header plus uint16.
constexpr uint64_t kListStart = asf::kObjectHeaderSize + 2;

bool name_is(const uint8_t* name, const char* what) {
    return std::strcmp(reinterpret_cast<const char*>(name), what) == 0;
}

// Releases the block behind `p` through the host.
template <typename T>
void release(asf_demuxer_st* d, T*& p) {
    sys_free(&d->s, p);
}

}  // namespace

int asf_read_wchar_str_with_malloc(asf_demuxer_st* d, uint32_t length,
                                   hova_string_info_st* si) {
    if (si->payload) return 0;
    si->size = 0;
    si->stringformat = HOVA_STRING_FORMAT_UTF16LE;
    if (length == 0) return 0;
    auto* block = static_cast<uint8_t*>(sys_malloc(&d->s, static_cast<size_t>(length) + 2));
    if (!block) return 0;
    const uint64_t got = asf::read(d, block, length);
    // Terminated behind what was read as well as behind the declared length.
    block[got] = 0;
    block[got + 1] = 0;
    block[length] = 0;
    block[static_cast<size_t>(length) + 1] = 0;
    si->payload = block;
    si->size = static_cast<unsigned>(got);
    if (got == 0) release(d, si->payload);
    return static_cast<int>(si->size);
}

size_t asf_read_utf16(asf_demuxer_st* d, uint8_t* buffer, uint32_t buffer_len, uint32_t size) {
    uint8_t scratch[kNameBufLen];
    std::memset(scratch, 0, sizeof scratch);
    if (size > sizeof scratch) {
        (void)asf::skip(d, size);
        return size;
    }
    const uint64_t n = asf::read(d, scratch, size);
    if (n == 0) return 0;  // nothing to convert; the buffer stays empty
    const int need = calculate_UTF16_to_UTF8_size(scratch, scratch + n);
    if (need < 0 || static_cast<uint32_t>(need) > buffer_len) return n;
    convert_UTF16_to_UTF8(scratch, scratch + n, buffer);
    return n;
}

void asf_convert_wchar_to_char(hova_string_info_st* si) {
    if (si->stringformat != HOVA_STRING_FORMAT_UTF16LE || !si->payload) return;
    const uint8_t* start = si->payload;
    const int n = calculate_UTF16_to_UTF8_size(start, start + si->size);
    if (n > kGenreTempLen || static_cast<unsigned>(n) > si->size) {
        ASF_LOG("size for wchar %d, new size for char %d, temp buf size %d, can't not convert\n",
                static_cast<int>(si->size), n, kGenreTempLen);
        return;
    }
    if (n == 0) {
        si->payload[0] = 0;
    } else {
        uint8_t temp[kGenreTempLen];
        convert_UTF16_to_UTF8(start, start + si->size, temp);
        std::memcpy(si->payload, temp, static_cast<size_t>(n));
    }
    si->size = static_cast<unsigned>(n);
    si->stringformat = HOVA_STRING_FORMAT_UTF8;
}

int asf_skip_picture_header_and_get_size(uint8_t* input, uint32_t input_len) {
    if (input_len <= 4) return 0;
    const uint8_t* end = input + input_len;
    // Picture type byte and the 4-byte data length, then MIME type and
    // description, each a terminated UTF-16 string.
    uint32_t used = 5;
    used += static_cast<uint32_t>(get_UTF16_byte_length(input + used, end));
    if (used < input_len)
        used += static_cast<uint32_t>(get_UTF16_byte_length(input + used, end));
    if (used >= input_len) return 0;
    std::memmove(input, input + used, input_len - used);
    return static_cast<int>(input_len - used);
}

int asf_read_cover(asf_demuxer_st* d, uint32_t v) {
    if (d->cover.payload) return 0;
    // A picture must fit the record's int length.
    if (v == 0 || v > static_cast<uint32_t>(INT32_MAX)) return 0;
    auto* block = static_cast<uint8_t*>(sys_malloc(&d->s, v));
    if (!block) return 0;
    const uint32_t p = static_cast<uint32_t>(asf::position(d));
    const uint32_t r = static_cast<uint32_t>(asf::read(d, block, v));
    d->cover.payload = block;
    d->cover.length = asf_skip_picture_header_and_get_size(block, r);
    if (d->cover.length == 0) release(d, d->cover.payload);
    d->pic_offset = v - static_cast<uint32_t>(d->cover.length) + p;
    ASF_LOG("get cover with size %d\n", d->cover.length);
    return static_cast<int>(r);
}

int asf_parse_content_desc(asf_demuxer_st* d, uint64_t size) {
    namespace cd = asf::content_desc;
    if (size < asf::kObjectHeaderSize + cd::kSize) return HOVA_OpenFailed;
    uint8_t b[cd::kSize];
    if (!asf::read_exact(d, b, sizeof b)) return HOVA_EndOfStream;
    const uint16_t title_len = load_le<uint16_t>(b + cd::kTitleLength);
    const uint16_t author_len = load_le<uint16_t>(b + cd::kAuthorLength);
    ASF_LOG("length for title %d author %d copyright %d desc %d rating %d\n", title_len,
            author_len, load_le<uint16_t>(b + cd::kCopyrightLength),
            load_le<uint16_t>(b + cd::kDescriptionLength), load_le<uint16_t>(b + cd::kRatingLength));
    uint64_t consumed = asf::kObjectHeaderSize + cd::kSize;
    // Both strings must lie inside the object, not only each be shorter than it.
    if (title_len < size && author_len < size &&
        consumed + title_len + author_len <= size) {
        consumed += static_cast<uint64_t>(asf_read_wchar_str_with_malloc(d, title_len, &d->title));
        consumed +=
            static_cast<uint64_t>(asf_read_wchar_str_with_malloc(d, author_len, &d->author));
    }
    if (size > consumed) (void)asf::skip(d, size - consumed);
    return HOVA_OK;
}

int asf_parse_ext_content_desc(asf_demuxer_st* d, uint64_t size) {
    uint8_t b2[2];
    if (!asf::read_exact(d, b2, 2)) return HOVA_EndOfStream;
    const uint16_t count = load_le<uint16_t>(b2);
    uint64_t consumed = kListStart;
    uint8_t name[kNameBufLen];
    for (uint32_t i = 0; i < count; ++i) {
        std::memset(name, 0, sizeof name);
        if (size < consumed + 2) break;
        if (!asf::read_exact(d, b2, 2)) return HOVA_EndOfStream;
        const uint16_t name_len = load_le<uint16_t>(b2);
        consumed += 2;
        if (size < consumed + name_len) break;
        consumed += asf_read_utf16(d, name, kNameBufLen, name_len);
        if (size < consumed + 4) break;
        uint8_t b4[4];
        if (!asf::read_exact(d, b4, 4)) return HOVA_EndOfStream;
        const uint16_t type = load_le<uint16_t>(b4);
        const uint16_t v = load_le<uint16_t>(b4 + 2);
        consumed += 4;
        // A value must lie inside what is left of the object.
        if (v > size - consumed) break;
        uint64_t used = 0;
        if (name_is(name, "WM/Picture") && type == ASF_DATA_BYTE) {
            used = static_cast<uint64_t>(asf_read_cover(d, v));
        } else if (name_is(name, "WM/AlbumTitle") && type == ASF_DATA_STRING) {
            used = static_cast<uint64_t>(asf_read_wchar_str_with_malloc(d, v, &d->albumTitle));
        } else if (name_is(name, "WM/Year") && type == ASF_DATA_STRING) {
            uint8_t text[kNameBufLen];
            std::memset(text, 0, sizeof text);
            used = asf_read_utf16(d, text, kNameBufLen, v);
            d->year = static_cast<int>(std::strtol(reinterpret_cast<const char*>(text), nullptr, 10));
        } else if (name_is(name, "WM/Genre") && type == ASF_DATA_STRING) {
            hova_string_info_st genre = {};
            used = static_cast<uint64_t>(asf_read_wchar_str_with_malloc(d, v, &genre));
            asf_convert_wchar_to_char(&genre);
            if (genre.size != 0) {
                release(d, d->genre);  // a later genre replaces the earlier one
                d->genre = reinterpret_cast<char*>(genre.payload);
            } else {
                release(d, genre.payload);
            }
        }
        if (used < v) (void)asf::skip(d, v - used);
        consumed += v;
    }
    if (size > consumed) (void)asf::skip(d, size - consumed);
    return HOVA_OK;
}

int asf_parse_metadata_library(asf_demuxer_st* d, uint64_t size) {
    namespace dr = asf::description_record;
    if (size <= kListStart - 1) {
        if (size > asf::kObjectHeaderSize) (void)asf::skip(d, size - asf::kObjectHeaderSize);
        return HOVA_OK;
    }
    uint8_t b2[2];
    if (!asf::read_exact(d, b2, 2)) return HOVA_EndOfStream;
    const uint16_t count = load_le<uint16_t>(b2);
    uint64_t consumed = kListStart;
    uint8_t name[kNameBufLen];
    for (uint32_t i = 0; i < count; ++i) {
        std::memset(name, 0, sizeof name);
        if (size < consumed + dr::kSize) break;
        uint8_t rec[dr::kSize];
        if (!asf::read_exact(d, rec, sizeof rec)) return HOVA_EndOfStream;
        consumed += dr::kSize;
        const uint16_t name_len = load_le<uint16_t>(rec + dr::kNameLength);
        const uint16_t type = load_le<uint16_t>(rec + dr::kDataType);
        const uint32_t data_len = load_le<uint32_t>(rec + dr::kDataLength);
        if (size < consumed + name_len + data_len) break;
        const uint64_t n = asf_read_utf16(d, name, kNameBufLen, name_len);
        uint64_t used = 0;
        if (name_is(name, "WM/Picture") && type == ASF_DATA_BYTE && data_len <= size)
            used = static_cast<uint64_t>(asf_read_cover(d, data_len));
        if (used < data_len) (void)asf::skip(d, data_len - used);
        consumed += n + data_len;
    }
    if (size > consumed) (void)asf::skip(d, size - consumed);
    return HOVA_OK;
}
