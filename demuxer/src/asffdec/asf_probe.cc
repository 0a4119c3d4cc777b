// Recognises ASF content by the header object GUID at the start of the input
// or, on a seekable raw input, right behind a leading ID3v2 tag.
#include <cstring>

#include "asf_api.h"
#include "asf_guid.h"

namespace {

constexpr int kGuidSize = 16;

// Bytes 6..9 of an ID3v2 header are a syncsafe size; the tag and its 10-byte
// header occupy that many bytes plus 10.
cb_off_t id3v2_tag_length(const uint8_t* h) {
    return static_cast<cb_off_t>(((h[6] & 0x7F) << 21) | ((h[7] & 0x7F) << 14) |
                                 ((h[8] & 0x7F) << 7) | (h[9] & 0x7F)) +
           10;
}

bool is_header_guid(const uint8_t* p) {
    return std::memcmp(p, &asf_header_object, kGuidSize) == 0;
}

}  // namespace

extern "C" int asf_probe(const uint8_t* header, int len, cb_io_st* cbio, hova_probe_method_et) {
    if (!header) return 0;
    // The ID3 branch needs the tag header's size bytes; a probe buffer shorter
    // than the 10-byte tag header cannot reach them.
    if (len >= 10 && std::memcmp(header, "ID3", 3) == 0 && cbio && cbio->seekable) {
        if (cbio->seek(cbio, id3v2_tag_length(header), CB_SEEK_SET) < 0) return 0;
        uint8_t guid[kGuidSize] = {};
        const size_t got = cbio->read(cbio, guid, sizeof guid);
        cbio->seek(cbio, 0, CB_SEEK_SET);
        return (got >= sizeof guid && is_header_guid(guid)) ? 1 : 0;
    }
    if (len < kGuidSize) return 0;
    return is_header_guid(header) ? 1 : 0;
}
