#include "file_check.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstring>

#include "options.h"

namespace asfdump {

namespace {

// The ASF header object GUID as stored.
constexpr uint8_t kHeaderGuid[16] = {0x30, 0x26, 0xB2, 0x75, 0x8E, 0x66, 0xCF, 0x11,
                                     0xA6, 0xD9, 0x00, 0xAA, 0x00, 0x62, 0xCE, 0x6C};
constexpr size_t kHeadBytes = 64 * 1024;

bool at(const std::vector<uint8_t>& b, size_t off, const char* magic, size_t n) {
    return b.size() >= off + n && std::memcmp(b.data() + off, magic, n) == 0;
}

// Formats a person is likely to mistake for ASF, told by their first bytes.
std::string looks_like(const std::vector<uint8_t>& b) {
    if (at(b, 4, "ftyp", 4) || at(b, 4, "moov", 4) || at(b, 4, "mdat", 4)) return "an MP4 (ISO base media) file";
    if (at(b, 0, "\x1A\x45\xDF\xA3", 4)) return "a Matroska or WebM file";
    if (at(b, 0, "RIFF", 4) && at(b, 8, "AVI ", 4)) return "a RIFF file (AVI)";
    if (at(b, 0, "RIFF", 4) && at(b, 8, "WAVE", 4)) return "a RIFF file (WAVE)";
    if (at(b, 0, "RIFF", 4)) return "a RIFF file";
    if (at(b, 0, "\x00\x00\x01\xBA", 4)) return "an MPEG program stream";
    if (b.size() > 188 && b[0] == 0x47 && b[188] == 0x47) return "an MPEG transport stream";
    if (at(b, 0, "ID3", 3)) return "an MP3 or other file behind an ID3v2 tag";
    if (b.size() >= 2 && b[0] == 0xFF && (b[1] & 0xE0) == 0xE0) return "MPEG audio (MP3)";
    if (at(b, 0, "OggS", 4)) return "an Ogg file";
    if (at(b, 0, "fLaC", 4)) return "a FLAC file";
    if (at(b, 0, "FLV", 3)) return "an FLV file";
    return "";
}

uint64_t le64(const uint8_t* p) {
    uint64_t v = 0;
    for (int i = 7; i >= 0; --i) v = v << 8 | p[i];
    return v;
}

// Size of an ID3v2 tag at the start of `b` (its header included), or 0.
uint64_t id3_length(const std::vector<uint8_t>& b) {
    if (!at(b, 0, "ID3", 3) || b.size() < 10) return 0;
    return ((uint64_t(b[6] & 0x7F) << 21) | (uint64_t(b[7] & 0x7F) << 14) | (uint64_t(b[8] & 0x7F) << 7) |
            uint64_t(b[9] & 0x7F)) + 10;
}

}  // namespace

int check_file(const std::string& path) {
    struct stat st {};
    if (::stat(path.c_str(), &st) != 0) {
        std::fprintf(stderr, "asfdump: cannot read %s: %s\n", path.c_str(),
                     errno == ENOENT ? "no such file" : std::strerror(errno));
        return kExitUnreadable;
    }
    if (S_ISDIR(st.st_mode)) {
        std::fprintf(stderr, "asfdump: cannot read %s: it is a directory; give a file in it\n", path.c_str());
        return kExitUnreadable;
    }
    if (!S_ISREG(st.st_mode)) {
        std::fprintf(stderr, "asfdump: cannot read %s: not a regular file (a device, pipe or socket)\n",
                     path.c_str());
        return kExitUnreadable;
    }
    if (::access(path.c_str(), R_OK) != 0) {
        std::fprintf(stderr, "asfdump: cannot read %s: %s\n", path.c_str(),
                     errno == EACCES ? "permission denied (check the file's read permission)"
                                     : std::strerror(errno));
        return kExitUnreadable;
    }
    return kExitOk;
}

std::string explain_not_asf(const std::vector<uint8_t>& head, uint64_t size) {
    if (size == 0) return "empty file (0 bytes): not an ASF file";
    const uint64_t start = id3_length(head);
    const bool asf_at_0 = head.size() >= 16 && std::memcmp(head.data(), kHeaderGuid, 16) == 0;
    const bool asf_after_id3 = start > 0 && head.size() >= start + 16 &&
                               std::memcmp(head.data() + start, kHeaderGuid, 16) == 0;
    if (!asf_at_0 && !asf_after_id3) {
        if (start > 0 && size < start + 16)
            return "truncated: the ID3v2 tag at its start needs " + std::to_string(start) +
                   " bytes and the file has " + std::to_string(size);
        if (size < 16 && head.size() == size && std::memcmp(head.data(), kHeaderGuid, size) == 0)
            return "truncated header: the file ends after " + std::to_string(size) + " bytes of the ASF header";
        const std::string what = looks_like(head);
        return what.empty() ? "not an ASF file (no ASF header object at its start)"
                            : "not an ASF file: it looks like " + what;
    }
    const uint64_t off = asf_at_0 ? 0 : start;
    if (size < off + 30) return "truncated header: the file ends inside the ASF header object's first 30 bytes";
    if (head.size() < off + 24) return "";
    const uint64_t header_size = le64(head.data() + off + 16);
    if (off + header_size > size)
        return "truncated header: the header object needs " + std::to_string(header_size) +
               " bytes and the file has " + std::to_string(size - off) + " from it";
    if (off + header_size + 50 > size) return "truncated: the file ends before its data object";
    return "";
}

namespace {

// The first 64 KiB of the file and its size; false when it cannot be read.
bool read_head(const std::string& path, std::vector<uint8_t>* head, uint64_t* size) {
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) return false;
    struct stat st {};
    head->resize(kHeadBytes);
    const ssize_t got = ::fstat(fd, &st) == 0 ? ::pread(fd, head->data(), head->size(), 0) : -1;
    ::close(fd);
    if (got < 0) return false;
    head->resize(static_cast<size_t>(got));
    *size = static_cast<uint64_t>(st.st_size);
    return true;
}

}  // namespace

std::string explain_file(const std::string& path) {
    std::vector<uint8_t> head;
    uint64_t size = 0;
    return read_head(path, &head, &size) ? explain_not_asf(head, size) : "";
}

FileProperties read_file_properties(const std::string& path) {
    static constexpr uint8_t kFilePropsGuid[16] = {0xA1, 0xDC, 0xAB, 0x8C, 0x47, 0xA9, 0xCF, 0x11,
                                                   0x8E, 0xE4, 0x00, 0xC0, 0x0C, 0x20, 0x53, 0x65};
    FileProperties fp;
    std::vector<uint8_t> head;
    uint64_t size = 0;
    if (!read_head(path, &head, &size)) return fp;
    uint64_t pos = id3_length(head) + 30;  // the header object's first child
    while (pos + 24 <= head.size()) {
        const uint64_t object_size = le64(head.data() + pos + 16);
        if (std::memcmp(head.data() + pos, kFilePropsGuid, 16) == 0 && pos + 92 <= head.size()) {
            fp.found = true;
            fp.packet_count = le64(head.data() + pos + 56);
            fp.broadcast = (head[pos + 88] & 1) != 0;
            break;
        }
        if (object_size < 24) break;
        pos += object_size;
    }
    return fp;
}

}  // namespace asfdump
