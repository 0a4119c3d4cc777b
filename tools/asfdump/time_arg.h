// Times on the command line: "30s", "1:02.5", "500ms", "1h2m", "1h2m3.5s" or a
// plain number of microseconds ("2000000"). A leading '-' negates.
#pragma once

#include <cstdint>
#include <string>

namespace asfdump {

// Parses `text` into microseconds; false (and *us untouched) when it is not a time.
bool parse_time_us(const char* text, int64_t* us);

// Formats microseconds as h:mm:ss.mmm for people (negative times keep their sign).
std::string format_time_us(int64_t us);

}  // namespace asfdump
