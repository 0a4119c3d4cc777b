// Reasons a person can act on when a file cannot be read or opened: missing,
// unreadable, a directory, empty, not ASF (and what it looks like), a header
// cut short.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace asfdump {

// kExitOk when `path` is a regular file this process can read; otherwise the
// reason on stderr and kExitUnreadable.
int check_file(const std::string& path);

// What the first bytes of a file say about it, for a file the plug-in did not
// open: "" when nothing is wrong with them that can be told (an ASF header
// object that fits the file), otherwise the reason ("empty file", "not an ASF
// file: it looks like an MP4 (ISO base media) file", "truncated header: ...").
// `size` is the whole file's size; `head` its first bytes (at least 64 KiB or all).
std::string explain_not_asf(const std::vector<uint8_t>& head, uint64_t size);

// explain_not_asf over the file at `path` ("" when it cannot be read).
std::string explain_file(const std::string& path);

// The file properties object's broadcast flag and packet count, read from the
// file's header (the host records carry neither).
struct FileProperties {
    bool found = false;
    bool broadcast = false;
    uint64_t packet_count = 0;
};
FileProperties read_file_properties(const std::string& path);

}  // namespace asfdump
