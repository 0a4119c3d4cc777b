// Command line of asfdump: the command, the file and the input and play options.
#pragma once

#include <cstdint>
#include <string>

#include "raw_input.h"

namespace asfdump {

// thumb's options as given; thumb_cmd.cc reads and checks them.
struct ThumbArgs {
    const char* at = nullptr;       // --at TIME
    const char* output = nullptr;   // -o OUT.png
    const char* width = nullptr;    // --width N
    const char* every = nullptr;    // --every DURATION
    const char* sheet = nullptr;    // --sheet OUT.png
    const char* columns = nullptr;  // --columns N
};

struct Options {
    std::string command;  // empty: the summary for a person
    std::string file;
    std::string plugin;  // --plugin PATH
    host::InputOptions input;
    int ring_size = 1048576;
    bool not_seekable = false;
    bool is_url = false;  // FILE is an http:// URL
    int streams = -1;     // --streams N: stream records in the context; -1: the command's default
    // play options
    bool has_seek = false;
    int64_t seek_us = 0;
    bool backward = false;
    bool query = false;
    bool has_resync = false;
    int64_t resync_us = 0;
    bool has_thumbnail = false;
    int64_t thumbnail_us = 0;
    bool no_audio = false;
    bool no_video = false;
    int64_t max_frames = -1;
    std::string dump_dir;
    bool log = false;
    ThumbArgs thumb;  // thumb's own options, checked by the command
    bool help = false;  // --help or -h: print the usage and nothing else
    bool version = false;  // --version: the versions of asfdump and the loaded plug-in
};

// Parses argv: `[COMMAND] FILE` and options in any order (one positional
// argument is the file, for the summary). Which command words exist is
// main.cc's table. On a usage error returns false with a message in `error`.
// With --help (or -h) anywhere it returns true with `help` set at once.
bool parse_options(int argc, char** argv, Options* out, std::string* error);

const char* usage_text();

enum ExitCode { kExitOk = 0, kExitOpenFailed = 1, kExitUsage = 2, kExitUnreadable = 3, kExitRefused = 4 };

}  // namespace asfdump
