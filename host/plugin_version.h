// The version of a loaded plug-in, read from the packaging-metadata note that
// the build puts in the library: the host needs no export for it and reads
// the copy the dynamic loader mapped, not a file that may have changed since.
#pragma once

#include <string>

namespace host {

// The version of the shared object that holds `address` (any address inside
// a loaded plug-in, such as its descriptor), or "" when that object carries
// no version note.
std::string plugin_version(const void* address);

// The "version" value of the note's JSON text, or "" when it has none.
std::string version_from_note_json(const std::string& json);

}  // namespace host
