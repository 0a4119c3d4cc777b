#include "sys_id3.h"

#include <climits>
#include <cstring>

#include "dprintf.h"
#include "plimo_string.h"
#include "streaming.h"
#include "sys_lang.h"

namespace {

constexpr int kProbeBytes = 266;  // room for a tag that starts up to byte 256
constexpr int kHeaderBytes = 10;
constexpr int kV1Bytes = 128;
constexpr cb_fpos kUnknownSize = ~cb_fpos{0};

struct FrameKind {
    const char* id3;   // ID of versions 3 and 4
    const char* id2;   // ID of version 2
    size_t item;       // offset of the item in ST_ID3_INFO; SIZE_MAX for the picture
    uint32_t flag;
};

constexpr size_t kPicture = SIZE_MAX;

const FrameKind kFrames[] = {
    {"TIT2", "TT2", offsetof(ST_ID3_INFO, Title), ID3_TITLE},
    {"TPE1", "TP1", offsetof(ST_ID3_INFO, Artist), ID3_ARTIST},
    {"TALB", "TAL", offsetof(ST_ID3_INFO, Album), ID3_ALBUM},
    {"TYER", "TYE", offsetof(ST_ID3_INFO, Year), ID3_YEAR},
    {"TDRC", nullptr, offsetof(ST_ID3_INFO, Year), ID3_YEAR},
    {"COMM", "COM", offsetof(ST_ID3_INFO, Comment), ID3_COMMENT},
    {"TCON", "TCO", offsetof(ST_ID3_INFO, Genre), ID3_GENRE},
    {"TCMP", "TCP", offsetof(ST_ID3_INFO, Compilation), ID3_COMPILATION},
    {"TCOM", "TCM", offsetof(ST_ID3_INFO, Composer), ID3_COMPOSER},
    {"TPE2", "TP2", offsetof(ST_ID3_INFO, AlbumArtist), ID3_ALBUMARTIST},
    {"TPOS", "TPA", offsetof(ST_ID3_INFO, DiscNumber), ID3_DISCNUMBER},
    {"TRCK", "TRK", offsetof(ST_ID3_INFO, CDTrackNumber), ID3_CDTRACKNUMBER},
    {"TIT1", "TT1", offsetof(ST_ID3_INFO, Grouping), ID3_GROUPING},
    {"TEXT", "TXT", offsetof(ST_ID3_INFO, Lyricist), ID3_LYRICIST},
    {"APIC", "PIC", kPicture, ID3_APIC},
};

const FrameKind* find_frame_kind(const uint8_t* id, int version) {
    const size_t n = version == 2 ? 3 : 4;
    for (const auto& k : kFrames) {
        const char* name = version == 2 ? k.id2 : k.id3;
        if (name != nullptr && std::memcmp(id, name, n) == 0) return &k;
    }
    return nullptr;
}

uint32_t load_be(const uint8_t* p, int n) {
    uint32_t v = 0;
    for (int i = 0; i < n; ++i) v = (v << 8) | p[i];
    return v;
}

// Bytes up to and including the first NUL in [p, end), or all of them.
uint32_t terminated_length(const uint8_t* p, const uint8_t* end) {
    const uint8_t* q = p;
    while (q < end && *q != 0) ++q;
    return static_cast<uint32_t>(q < end ? q - p + 1 : q - p);
}

// Decimal value of a text item: blanks, a sign, then digits; 0 without digits.
// Stays within the item and saturates instead of overflowing.
int item_to_int(const hova_string_info_st& item) {
    const uint8_t* p = item.payload;
    const uint8_t* end = p + item.size;
    while (p < end && (*p == ' ' || (*p >= '\t' && *p <= '\r'))) ++p;
    bool negative = false;
    if (p < end && (*p == '+' || *p == '-')) negative = *p++ == '-';
    long long v = 0;
    for (; p < end && *p >= '0' && *p <= '9'; ++p) {
        v = v * 10 + (*p - '0');
        if (v > static_cast<long long>(INT_MAX) + 1) v = static_cast<long long>(INT_MAX) + 1;
    }
    if (negative) v = -v;
    if (v > INT_MAX) v = INT_MAX;
    return static_cast<int>(v);
}

class Id3Parser {
public:
    Id3Parser(cb_buffer_st* reader, const hova_callback_st* cb, id3_context_st* ctx)
        : reader_(reader), cb_(cb), ctx_(ctx) {}

    int run();

private:
    bool take_v2(const uint8_t* probe, int probe_len);
    void walk_frames(uint8_t* tag, int version, uint32_t tag_size);
    void take_picture(uint8_t* tag, uint32_t at, uint32_t frame_size, bool v2_format);
    int try_v1();
    void release_buffer() { cb_->freep(cb_->context, &ctx_->id3_info_buffer); }
    [[nodiscard]] bool seek_to(cb_fpos pos) {
        return reader_->cb_seek64(reader_, static_cast<cb_off_t>(pos), CB_SEEK_SET) != -1;
    }
    [[nodiscard]] bool read_exact(uint8_t* dst, int32_t n) {
        return reader_->cb_read(reader_, dst, n) == n;
    }

    cb_buffer_st* reader_;
    const hova_callback_st* cb_;
    id3_context_st* ctx_;
    cb_fpos start_ = 0;
};

bool Id3Parser::take_v2(const uint8_t* probe, int probe_len) {
    int pos = 0;
    int size = 0;
    if (find_ID3v2(probe, probe_len, &pos, &size) != 1) {
        DPRINTF("[parse_ID3] find_ID3v2 fail\n");
        return false;
    }
    ctx_->id3_v2_size = size;
    const cb_fpos tag_start = start_ + static_cast<cb_fpos>(pos);
    // A tag that claims to run past the end of an input of known size cannot
    // be read; do not ask the host for a block of that size first.
    if (ctx_->file_size != kUnknownSize && tag_start + static_cast<cb_fpos>(size) > ctx_->file_size) {
        DPRINTF("[parse_ID3] cb_read fail\n");
        return false;
    }
    ctx_->id3_info_buffer = static_cast<uint8_t*>(cb_->malloc(cb_->context, static_cast<size_t>(size)));
    uint8_t* tag = ctx_->id3_info_buffer;
    if (tag == nullptr) {
        DPRINTF("[parse_ID3] malloc id3_info_buffer fail (%d bytes)\n", size);
        return false;
    }
    if (pos + size > probe_len) {
        const int have = probe_len - pos;
        std::memcpy(tag, probe + pos, static_cast<size_t>(have));
        if (!read_exact(tag + have, size - have)) {
            DPRINTF("[parse_ID3] cb_read fail\n");
            return false;
        }
    } else {
        std::memcpy(tag, probe + pos, static_cast<size_t>(size));
        if (!seek_to(tag_start + static_cast<cb_fpos>(size))) {
            DPRINTF("[parse_ID3] cb_seek64 fail\n");
            return false;
        }
    }

    ST_ID3_INFO& info = ctx_->id3_info;
    const int version = tag[3];
    const uint8_t flags = tag[5];
    info.u32ID3TagSize = calc_ID3v2_size(tag + 6);
    DPRINTF("[parseID3v2] u32ID3Ver = %d ID3v2Size = %d u8ID3Flags = 0x%x\n", version,
            static_cast<int>(info.u32ID3TagSize), flags);
    if (version < 2 || version > 4) {
        DPRINTF("[parseID3v2] unsupport ID3v2 version\n");
        return false;
    }
    if (flags & 0x80) {
        DPRINTF("[parseID3v2] parse unsynchronization\n");
        // Decide on the stored bytes, so FF 00 00 keeps its second 00.
        uint8_t* body = tag + kHeaderBytes;
        uint32_t kept = 0;
        uint8_t previous = 0;
        for (uint32_t i = 0; i < info.u32ID3TagSize; ++i) {
            const uint8_t b = body[i];
            if (!(b == 0x00 && previous == 0xFF)) body[kept++] = b;
            previous = b;
        }
        info.u32ID3TagSize = kept;
    }
    info.eID3TagFlags = ID3_NONE;
    if (info.u32ID3TagSize > static_cast<uint32_t>(kHeaderBytes)) walk_frames(tag, version, info.u32ID3TagSize);
    return true;
}

void Id3Parser::walk_frames(uint8_t* tag, int version, uint32_t tag_size) {
    ST_ID3_INFO& info = ctx_->id3_info;
    const uint32_t header = version == 2 ? 6 : 10;
    const int id_len = version == 2 ? 3 : 4;
    const uint32_t tag_end = tag_size + kHeaderBytes;  // bytes of the buffer in use
    // offset < tag_size keeps a whole frame header (at most 10 bytes) inside.
    for (uint32_t offset = kHeaderBytes; offset < tag_size;) {
        const uint8_t* fh = tag + offset;
        const uint32_t id = load_be(fh, id_len);
        uint32_t size = load_be(fh + id_len, id_len == 3 ? 3 : 4);
        if (version == 4 && size >= 128) {
            const uint32_t syncsafe = calc_ID3v2_size(fh + 4);
            if (size >= tag_end - offset) {
                size = syncsafe;
            } else if (check_tag(tag, tag_end, offset + header + syncsafe) == 1) {
                size = syncsafe;
            } else if (check_tag(tag, tag_end, offset + header + size) != 1) {
                // Neither reading leads to another frame: the size is unusable.
                DPRINTF("[parseID3v2] check tag fail\n");
                return;
            }
        }
        if (size == 0) {
            if (id == 0) return;  // padding
            offset += header;
            continue;
        }
        if (id == 0 || size > tag_size - offset) return;
        if (static_cast<uint64_t>(offset) + header + size > tag_end) {
            DPRINTF("[parseID3v2] u32FrameSize %d is larger then total id3tag size %d\n",
                    static_cast<int>(size), static_cast<int>(tag_size));
            return;
        }
        const FrameKind* kind = find_frame_kind(fh, version);
        uint8_t* data = tag + offset + header;
        if (kind == nullptr) {
            DPRINTF("[parseID3v2] unsupported TAG %x\n", id);
        } else if (kind->item == kPicture) {
            take_picture(tag, offset + header, size, version == 2);
        } else {
            auto* item = reinterpret_cast<hova_string_info_st*>(reinterpret_cast<uint8_t*>(&info) + kind->item);
            const uint8_t encoding = data[0];
            move_zero_to_string_end(data, size);
            item->payload = data;
            item->size = size - 1;
            item->stringformat = parse_string_format(encoding);
            info.eID3TagFlags |= kind->flag;
        }
        offset += header + size;
    }
}

void Id3Parser::take_picture(uint8_t* tag, uint32_t at, uint32_t frame_size, bool v2_format) {
    ST_ID3_INFO& info = ctx_->id3_info;
    const uint8_t* frame = tag + at;
    const uint8_t* frame_end = frame + frame_size;
    const uint8_t encoding = frame[0];
    // MIME type (NUL-terminated) or, in version 2, a 3-byte image format.
    const uint32_t mime_len = v2_format ? 3 : terminated_length(frame + 1, frame_end);
    // Encoding byte, MIME, picture type byte: where the description starts.
    const uint64_t desc_at = 2ull + mime_len;
    uint32_t desc_len = 0;
    if (desc_at < frame_size) {
        const uint8_t* desc = frame + desc_at;
        desc_len = (encoding == 1 || encoding == 2)
                       ? static_cast<uint32_t>(get_UTF16_byte_length(desc, frame_end))
                       : terminated_length(desc, frame_end);
    }
    const uint64_t data_at = desc_at + desc_len;
    const uint32_t clamped = data_at < frame_size ? static_cast<uint32_t>(data_at) : frame_size;
    info.pic_offset = at + clamped;
    info.Pic.payload = tag + at + clamped;
    // The picture type byte must be inside the frame as well.
    if (static_cast<uint64_t>(mime_len) + desc_len >= frame_size || data_at > frame_size) {
        info.Pic.length = 0;
        DPRINTF("[Pic] u32FrameSize error\n");
        return;
    }
    info.Pic.length = static_cast<int>(frame_size - 2 - mime_len - desc_len);
    info.eID3TagFlags |= ID3_APIC;
    DPRINTF("[Pic] Image address = %p, size = %d\n", static_cast<void*>(info.Pic.payload), info.Pic.length);
}

int Id3Parser::try_v1() {
    const cb_fpos noted = cb_tell64(reader_);
    const cb_io_st* input = reader_->input;
    int result = 0;
    bool tried = false;
    if (input != nullptr && input->seekable && ctx_->file_size != kUnknownSize &&
        ctx_->file_size >= static_cast<cb_fpos>(kV1Bytes)) {
        if (input->open_done) reader_->input->open_done(reader_->input, -1, -1, 0);
        ctx_->id3_info_buffer = static_cast<uint8_t*>(cb_->malloc(cb_->context, ID3V1_BLOCK_SIZE));
        if (ctx_->id3_info_buffer == nullptr) {
            DPRINTF("[parse_ID3] malloc id3_info_buffer fail (%d bytes)\n", ID3V1_BLOCK_SIZE);
        } else {
            tried = true;
            uint8_t block[kV1Bytes];
            if (!seek_to(ctx_->file_size - kV1Bytes)) {
                DPRINTF("[parse_ID3] cb_seek64 fail\n");
            } else if (!read_exact(block, kV1Bytes)) {
                DPRINTF("[parse_ID3] cb_read fail\n");
            } else if (std::memcmp(block, "TAG", 3) == 0) {
                ST_ID3_INFO& info = ctx_->id3_info;
                uint8_t* out = ctx_->id3_info_buffer;
                const uint8_t* cursor = block + 3;
                struct Field {
                    hova_string_info_st* item;
                    int width;
                    int at;
                };
                const Field fields[] = {{&info.Title, 30, 0},  {&info.Artist, 30, 31},
                                        {&info.Album, 30, 62}, {&info.Year, 4, 93},
                                        {&info.Comment, 30, 98}, {&info.Genre, 1, 129}};
                for (const auto& f : fields) {
                    copy_id3_tag(&cursor, f.width, out + f.at, &f.item->size);
                    f.item->payload = out + f.at;
                    f.item->stringformat = HOVA_STRING_FORMAT_ASCII;
                }
                info.eID3TagFlags = ID3_TITLE | ID3_ALBUM | ID3_ARTIST | ID3_GENRE | ID3_YEAR | ID3_COMMENT;
                DPRINTF("[parseID3v1]Parse OK\n");
                result = 1;
            } else {
                DPRINTF("[parseID3v1]No ID3v1 tag\n");
            }
        }
    }
    if (tried) {
        if (seek_to(0)) {
            ctx_->id3_v1_size = kV1Bytes;
        } else {
            DPRINTF("[parse_ID3] cb_seek64 fail\n");
        }
        if (result == 1) return 1;
    }
    if (!seek_to(noted)) DPRINTF("[parse_ID3] cb_seek64 fail\n");
    release_buffer();
    return 0;
}

int Id3Parser::run() {
    start_ = cb_tell64(reader_);
    uint8_t probe[kProbeBytes];
    if (!read_exact(probe, kProbeBytes)) {
        DPRINTF("[parse_ID3] cb_read fail\n");
    } else if (take_v2(probe, kProbeBytes)) {
        return 1;
    }
    // No usable ID3v2 tag: back to the start, and look at the end instead.
    (void)seek_to(start_);
    release_buffer();
    return try_v1();
}

}  // namespace

extern "C" {

int parse_ID3(cb_buffer_st* reader, const hova_callback_st* cb, id3_context_st* ctx) {
    Id3Parser parser(reader, cb, ctx);
    return parser.run();
}

void get_id3_info(hova_program_info_st* info, const ST_ID3_INFO* id3) {
    const uint32_t f = id3->eID3TagFlags;
    if (f & ID3_YEAR) info->year = item_to_int(id3->Year);
    if (f & ID3_CDTRACKNUMBER) info->track_number = item_to_int(id3->CDTrackNumber);
    if (f & ID3_DISCNUMBER) info->disc_number = item_to_int(id3->DiscNumber);
    if (f & ID3_COMPILATION) info->compilation = item_to_int(id3->Compilation);
    if (f & ID3_ALBUM) info->album = id3->Album;
    if (f & ID3_COMMENT) info->comment = id3->Comment;
    if (f & ID3_COMPOSER) info->composer = id3->Composer;
    if (f & ID3_ALBUMARTIST) info->album_artist = id3->AlbumArtist;
    if (f & ID3_GROUPING) info->grouping = id3->Grouping;
    if (f & ID3_TITLE) info->title = id3->Title;
    if (f & ID3_ARTIST) info->artist = id3->Artist;
    if (f & ID3_LYRICIST) info->writer = id3->Lyricist;
    if (f & ID3_APIC) {
        info->cover.length = id3->Pic.length;
        info->cover.payload = id3->Pic.payload;
        info->pic_offset = static_cast<int>(id3->pic_offset);
    }
    if ((f & ID3_GENRE) && id3->Genre.size == 2) {
        // A one-character genre string holds the ID3v1 genre number.
        const int index = id3->Genre.payload[0];
        info->genre = index < 149 ? sys_index_to_genre(index) : nullptr;
    }
}

int find_ID3v2(const uint8_t* buf, int count, int* position, int* size) {
    if (buf == nullptr || count < kHeaderBytes) {
        DPRINTF("findID3v2 : Not enough input data\n");
        return 0;
    }
    for (int p = 0; p <= count - kHeaderBytes; ++p) {
        if (buf[p] == 'I' && buf[p + 1] == 'D' && buf[p + 2] == '3') {
            *position = p;
            *size = static_cast<int>(calc_ID3v2_size(buf + p + 6)) + kHeaderBytes;
            DPRINTF("findID3v2 : size = %d (include id3v2 header), position = %d\n", *size, p);
            return 1;
        }
    }
    DPRINTF("findID3v2 : No ID3 v2 tag within search range\n");
    return 0;
}

uint32_t calc_ID3v2_size(const uint8_t* b) {
    return (static_cast<uint32_t>(b[0] & 0x7F) << 21) | (static_cast<uint32_t>(b[1] & 0x7F) << 14) |
           (static_cast<uint32_t>(b[2] & 0x7F) << 7) | (b[3] & 0x7F);
}

int check_tag(const uint8_t* buf, uint32_t count, uint32_t offset) {
    if (static_cast<uint64_t>(offset) + 4 > count) return -1;
    for (int i = 0; i < 4; ++i) {
        const uint8_t c = buf[offset + static_cast<uint32_t>(i)];
        if (!((c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9'))) return 0;
    }
    return 1;
}

void copy_id3_tag(const uint8_t** cursor, int width, uint8_t* out, unsigned int* len) {
    std::memcpy(out, *cursor, static_cast<size_t>(width));
    out[width] = 0;
    *cursor += width;
    *len = static_cast<unsigned int>(std::strlen(reinterpret_cast<const char*>(out))) + 1;
}

hova_string_format_et parse_string_format(uint8_t encoding) {
    switch (encoding) {
        case 0: return HOVA_STRING_FORMAT_ASCII;
        case 1: return HOVA_STRING_FORMAT_UCS2;
        case 2: return HOVA_STRING_FORMAT_UTF16BE;
        default: return HOVA_STRING_FORMAT_UTF8;
    }
}

void move_zero_to_string_end(uint8_t* frame, uint32_t size) {
    if (size == 0) return;
    std::memmove(frame, frame + 1, size - 1);
    frame[size - 1] = 0;
}

}  // extern "C"
