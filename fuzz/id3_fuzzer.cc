// ID3 parsing through the buffered reader over an input held in memory.
// The first byte chooses how the input looks (see kOptions below), the rest
// is the input. Every decoded item must lie inside the tag block, and when
// the block is released the host must hold nothing but the reader's blocks.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "callbacks.h"
#include "raw_input.h"
#include "streaming.h"
#include "sys_id3.h"

namespace {

// bit 0: seekable; bits 1-2: buffering (cache, none, small cache, ring);
// bit 3: size unknown; bits 4-5: which host allocation of the parse fails;
// bit 6: with the ring, a streaming thread fills it.
host::InputOptions options_for(uint8_t opt) {
    host::InputOptions o;
    o.seekable = opt & 1;
    switch ((opt >> 1) & 3) {
        case 0: break;
        case 1: o.disable_cache = true; break;
        case 2: o.block_size = 64; break;
        default:
            // Ring filled by the streaming thread or, without one, synchronously.
            o.rbuf_mode = CBIO_APPLY_RBUF;
            o.use_thread = (opt & 0x40) != 0;
            o.block_size = 512;
            o.ring_size = 4096;
            break;
    }
    return o;
}

volatile uint32_t g_sink;

void touch(const uint8_t* block, size_t block_size, const uint8_t* p, size_t n) {
    if (n == 0) return;
    if (p < block || p + n > block + block_size) std::abort();
    uint32_t sum = 0;
    for (size_t i = 0; i < n; ++i) sum += p[i];
    g_sink = sum;
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    if (!std::getenv("PLIMO_FUZZ_LOG")) setenv("PLIMO_LOG", "off", 1);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1 || size > (1u << 20)) return 0;
    const uint8_t opt = data[0];
    const host::InputOptions o = options_for(opt);
    host::HostCallbacks host;
    auto input = host::RawInput::borrow_memory(data + 1, size - 1, o);
    cb_buffer_st reader{};
    if (OpenURL(&reader, input->io(), o.ring_size, host.table()) != 0) std::abort();
    const size_t reader_blocks = host.outstanding_blocks();

    id3_context_st ctx{};
    ctx.file_size = (opt & 8) ? ~cb_fpos{0} : static_cast<cb_fpos>(size - 1);
    host.fail_malloc_at((opt >> 4) & 3);
    const int r = parse_ID3(&reader, host.table(), &ctx);
    host.fail_malloc_at(0);

    if (r == 1) {
        if (ctx.id3_info_buffer == nullptr) std::abort();
        const ST_ID3_INFO& id3 = ctx.id3_info;
        // The block is the tag (ID3v2) or the fixed ID3v1 copy.
        // (A taken ID3v2 tag returns before the end of the input is examined.)
        const size_t block_size =
            ctx.id3_v1_size == 128 ? ID3V1_BLOCK_SIZE : static_cast<size_t>(ctx.id3_v2_size);
        const hova_string_info_st* items[] = {&id3.Title,       &id3.Artist,      &id3.Album,
                                              &id3.Year,        &id3.Comment,     &id3.Genre,
                                              &id3.Compilation, &id3.Composer,    &id3.AlbumArtist,
                                              &id3.DiscNumber,  &id3.CDTrackNumber, &id3.Grouping,
                                              &id3.Lyricist};
        for (const auto* item : items)
            if (item->payload) touch(ctx.id3_info_buffer, block_size, item->payload, item->size);
        if (id3.eID3TagFlags & ID3_APIC) {
            if (id3.Pic.length < 0) std::abort();
            touch(ctx.id3_info_buffer, block_size, id3.Pic.payload, static_cast<size_t>(id3.Pic.length));
        }
        hova_program_info_st program{};
        get_id3_info(&program, &id3);
        host.table()->freep(host.table()->context, &ctx.id3_info_buffer);
    } else if (ctx.id3_info_buffer != nullptr) {
        std::abort();
    }
    if (host.outstanding_blocks() != reader_blocks) std::abort();
    CloseURL(&reader, host.table());
    if (host.outstanding_blocks() != 0 || host.foreign_frees() != 0) std::abort();
    return 0;
}
