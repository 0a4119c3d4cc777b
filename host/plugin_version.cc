#include "plugin_version.h"

#include <elf.h>
#include <link.h>

#include <cstdint>
#include <cstring>

namespace host {

namespace {

constexpr uint32_t kPackagingNote = 0xcafe1a7e;

struct Search {
    uintptr_t address;
    std::string json;
};

size_t align4(size_t n) { return (n + 3) & ~size_t{3}; }

// The packaging note among the notes of one PT_NOTE segment.
bool find_note(const uint8_t* p, size_t size, std::string* json) {
    while (size >= sizeof(ElfW(Nhdr))) {
        ElfW(Nhdr) h;
        std::memcpy(&h, p, sizeof h);
        const size_t body = align4(h.n_namesz) + align4(h.n_descsz);
        if (body > size - sizeof h) return false;
        const uint8_t* name = p + sizeof h;
        const uint8_t* desc = name + align4(h.n_namesz);
        if (h.n_type == kPackagingNote && h.n_namesz == 4 && std::memcmp(name, "FDO", 4) == 0) {
            const auto* text = reinterpret_cast<const char*>(desc);
            json->assign(text, strnlen(text, h.n_descsz));
            return true;
        }
        p += sizeof h + body;
        size -= sizeof h + body;
    }
    return false;
}

int visit(struct dl_phdr_info* info, size_t, void* data) {
    auto* s = static_cast<Search*>(data);
    bool mine = false;
    for (int i = 0; i < info->dlpi_phnum && !mine; ++i) {
        const ElfW(Phdr)& ph = info->dlpi_phdr[i];
        const uintptr_t start = info->dlpi_addr + ph.p_vaddr;
        mine = ph.p_type == PT_LOAD && s->address >= start && s->address - start < ph.p_memsz;
    }
    if (!mine) return 0;
    for (int i = 0; i < info->dlpi_phnum; ++i) {
        const ElfW(Phdr)& ph = info->dlpi_phdr[i];
        if (ph.p_type != PT_NOTE) continue;
        const auto* p = reinterpret_cast<const uint8_t*>(info->dlpi_addr + ph.p_vaddr);
        if (find_note(p, ph.p_memsz, &s->json)) break;
    }
    return 1;  // the object holding the address: stop here
}

}  // namespace

std::string version_from_note_json(const std::string& json) {
    const std::string key = "\"version\":\"";
    const size_t at = json.find(key);
    if (at == std::string::npos) return "";
    const size_t from = at + key.size();
    const size_t to = json.find('"', from);
    return to == std::string::npos ? "" : json.substr(from, to - from);
}

std::string plugin_version(const void* address) {
    Search s{reinterpret_cast<uintptr_t>(address), {}};
    dl_iterate_phdr(visit, &s);
    return version_from_note_json(s.json);
}

}  // namespace host
