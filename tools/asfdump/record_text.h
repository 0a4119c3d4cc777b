// Text the host records carry, as UTF-8 for printing.
#pragma once

#include <cstddef>
#include <string>

#include "hova_dmx.h"

namespace asfdump {

// UTF-16LE bytes to UTF-8, pairing surrogates; stops at a zero unit.
std::string utf16le_to_utf8(const unsigned char* p, size_t size);
// A string record's text (UTF-16 converted), trailing NULs dropped; "" when it has no payload.
std::string record_text(const hova_string_info_st& s);
// The three-letter language code of a stream record ("" when none).
std::string record_language(const char (&l)[4]);

}  // namespace asfdump
