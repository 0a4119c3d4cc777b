/*
 * plimo_play: a minimal host for the ASF demuxer plug-in, in plain C.
 *
 *   plimo_play [--thread] [--streams N] PLUGIN FILE [SEEK_US]
 *
 * Loads PLUGIN with dlopen, probes and opens FILE, plays it to the end and,
 * when SEEK_US is given, seeks there and plays to the end again. It prints
 * one line per thing the plug-in hands over:
 *
 *   info audio 1 video 1 duration 9000000 seekable 1
 *   config audio codec 24 size 14 crc32 0a1b2c3d
 *   frame video pts 1500000 size 9000 crc32 89abcdef
 *   discard video
 *   eos audio
 *   seek result 0 pts 5000000
 *   end result 8 blocks 0
 *
 * crc32 is the CRC-32 of zlib and ffprobe, in eight hex digits. Copy it and
 * replace the printing by the decoder's input queues. The host contract it
 * follows is docs/integration.md.
 */
#define _POSIX_C_SOURCE 200809L
#define _FILE_OFFSET_BITS 64

#include <dlfcn.h>
#include <inttypes.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include "hova_dmx.h"

/* ---- CRC-32 (polynomial 0xEDB88320), to print checkable lines ---- */

static uint32_t crc_table[256];

static void crc_init(void) {
    for (uint32_t n = 0; n < 256; ++n) {
        uint32_t c = n;
        for (int k = 0; k < 8; ++k) c = (c & 1) ? 0xEDB88320u ^ (c >> 1) : c >> 1;
        crc_table[n] = c;
    }
}

static uint32_t crc32_of(const uint8_t* p, size_t n) {
    uint32_t c = 0xFFFFFFFFu;
    while (n--) c = crc_table[(c ^ *p++) & 0xFF] ^ (c >> 8);
    return c ^ 0xFFFFFFFFu;
}

/* ---- the raw input: a stdio file ---- */

/* The plug-in calls read, seek and tell with the cb_io_st pointer it was
 * given; keeping it first lets the callbacks find the FILE. With use_thread
 * set, read is called by the plug-in's streaming thread as well as by the
 * thread that calls the entry points, never by both at once (the plug-in
 * holds its ring's lock around every input call). */
typedef struct file_input {
    cb_io_st io;
    FILE* f;
} file_input;

static size_t input_read(cb_io_st* io, void* dst, size_t len) {
    return fread(dst, 1, len, ((file_input*)io)->f); /* 0: end of input or error */
}

static cb_off_t input_seek(cb_io_st* io, cb_off_t offset, int whence) {
    FILE* f = ((file_input*)io)->f;
    const int w = whence == CB_SEEK_CUR ? SEEK_CUR : whence == CB_SEEK_END ? SEEK_END : SEEK_SET;
    if (fseeko(f, (off_t)offset, w) != 0) return -1;
    return (cb_off_t)ftello(f); /* the new absolute position */
}

static cb_off_t input_tell(cb_io_st* io) { return (cb_off_t)ftello(((file_input*)io)->f); }

/* ---- the callback table ---- */

typedef struct pending_frame {
    uint8_t* base;
    size_t capacity;
    int open;
} pending_frame;

typedef struct host {
    pending_frame frame[2]; /* audio, video */
    long blocks;            /* plug-in blocks not yet given back */
} host;

static const char* type_name(hova_stream_type_et type) {
    return type == HOVA_STREAM_AUDIO ? "audio" : type == HOVA_STREAM_VIDEO ? "video" : "other";
}

static pending_frame* frame_of(void* context, hova_stream_type_et type) {
    host* h = context;
    if (type == HOVA_STREAM_AUDIO) return &h->frame[0];
    if (type == HOVA_STREAM_VIDEO) return &h->frame[1];
    return NULL;
}

static int cb_notify(void* context, hova_stream_type_et type, hova_event_et event) {
    (void)context;
    if (event == HOVA_EVENT_EOS) printf("eos %s\n", type_name(type));
    return 0;
}

static void* cb_malloc(void* context, size_t size) {
    void* p = malloc(size ? size : 1);
    if (p) ((host*)context)->blocks++;
    return p;
}

static void* cb_realloc(void* context, void* ptr, size_t size) {
    (void)context; /* never called by this plug-in */
    return realloc(ptr, size);
}

/* freep receives the address of the plug-in's pointer, not the pointer. */
static void cb_freep(void* context, void* pptr) {
    void** slot = pptr;
    if (!slot || !*slot) return;
    free(*slot);
    *slot = NULL;
    ((host*)context)->blocks--;
}

static int64_t cb_get_time(void* context) {
    (void)context;
    struct timespec t;
    clock_gettime(CLOCK_MONOTONIC, &t);
    return (int64_t)t.tv_sec * 1000000 + t.tv_nsec / 1000;
}

/* A frame buffer of `size` bytes: 0 and its address stored through
 * `buffer`, or -1 (and NULL) when there is none. */
static int cb_stream_alloc(void* context, hova_stream_type_et type, void** buffer, int size) {
    pending_frame* f = frame_of(context, type);
    *buffer = NULL;
    if (!f || size < 0) return -1;
    if (!f->base || (size_t)size > f->capacity) {
        const size_t want = size > 0 ? (size_t)size : 1;
        uint8_t* bigger = realloc(f->base, want);
        if (!bigger) return -1;
        f->base = bigger;
        f->capacity = want;
    }
    f->open = 1;
    *buffer = f->base;
    return 0;
}

/* Grows the pending frame to `size`, keeping its bytes; the address may move. */
static int cb_stream_realloc(void* context, hova_stream_type_et type, void** buffer, int size) {
    pending_frame* f = frame_of(context, type);
    if (!f || !f->open || size < 0) {
        *buffer = NULL;
        return -1;
    }
    if ((size_t)size > f->capacity) {
        uint8_t* bigger = realloc(f->base, (size_t)size * 2);
        if (!bigger) {
            *buffer = NULL;
            return -1;
        }
        f->base = bigger;
        f->capacity = (size_t)size * 2;
    }
    *buffer = f->base;
    return 0;
}

static int cb_stream_discard(void* context, hova_stream_type_et type) {
    pending_frame* f = frame_of(context, type);
    if (f) f->open = 0;
    printf("discard %s\n", type_name(type));
    return 0;
}

/* packet_type 1: a configuration record (4-byte codec code, then the codec
 * data); 0: a media frame with its presentation time in microseconds. */
static int cb_stream_commit(void* context, hova_stream_type_et type, int size, int64_t pts,
                            int64_t duration, int packet_type) {
    (void)duration;
    pending_frame* f = frame_of(context, type);
    if (!f || !f->open) return -1;
    f->open = 0;
    const uint32_t crc = crc32_of(f->base, (size_t)size);
    if (packet_type == 1) {
        int32_t codec = -1;
        if (size >= 4) memcpy(&codec, f->base, 4);
        printf("config %s codec %" PRId32 " size %d crc32 %08" PRIx32 "\n", type_name(type), codec,
               size, crc);
    } else {
        printf("frame %s pts %" PRId64 " size %d crc32 %08" PRIx32 "\n", type_name(type), pts, size,
               crc);
    }
    return 0;
}

static int cb_stream_check_rbuf_size(void* context, hova_stream_type_et type) {
    (void)context;
    (void)type;
    return 0;
}

/* ---- playing ---- */

/* get_data until the end of the stream (or a failure): each call delivers at
 * most one frame; HOVA_TryAgain means a damaged packet was skipped. */
static int play(const hova_dmx_func_st* dmx, void* ctx) {
    for (;;) {
        hova_stream_type_et type = HOVA_STREAM_NONE;
        int size = 0;
        int64_t pts = 0;
        const int r = dmx->get_data(ctx, &type, &size, &pts);
        if (r != HOVA_OK && r != HOVA_TryAgain) return r;
    }
}

static int usage(void) {
    fputs("usage: plimo_play [--thread] [--streams N] PLUGIN FILE [SEEK_US]\n", stderr);
    return 2;
}

int main(int argc, char** argv) {
    int use_thread = 0, streams = 2, i = 1;
    for (; i < argc && strncmp(argv[i], "--", 2) == 0; ++i) {
        if (strcmp(argv[i], "--thread") == 0) use_thread = 1;
        else if (strcmp(argv[i], "--streams") == 0 && i + 1 < argc) streams = atoi(argv[++i]);
        else return usage();
    }
    if (argc - i < 2 || argc - i > 3 || streams < 1) return usage();
    const char* plugin = argv[i];
    const char* path = argv[i + 1];
    const int seek = argc - i == 3;
    const int64_t seek_us = seek ? strtoll(argv[i + 2], NULL, 10) : 0;
    crc_init();

    void* lib = dlopen(plugin, RTLD_NOW | RTLD_LOCAL);
    if (!lib) {
        fprintf(stderr, "plimo_play: %s\n", dlerror());
        return 1;
    }
    const hova_dmx_func_st* dmx = dlsym(lib, "hova_asff_demuxer");
    if (!dmx) {
        fprintf(stderr, "plimo_play: no hova_asff_demuxer in %s\n", plugin);
        return 1;
    }

    file_input in;
    memset(&in, 0, sizeof in);
    in.f = fopen(path, "rb");
    if (!in.f) {
        fprintf(stderr, "plimo_play: cannot read %s\n", path);
        return 3;
    }
    in.io.read = input_read;
    in.io.seek = input_seek;
    in.io.tell = input_tell;
    in.io.block_size = 32768;
    in.io.seekable = 1;
    /* Buffering: the file cache by default; the ring filled by the
     * plug-in's streaming thread with --thread. */
    in.io.rbuf_mode = use_thread ? CBIO_APPLY_RBUF : CBIO_NO_RBUF;
    in.io.use_thread = (uint8_t)use_thread;
    const int ring_size = 1 << 20;

    uint8_t first[64] = {0};
    const size_t got = fread(first, 1, sizeof first, in.f);
    rewind(in.f);
    if (dmx->probe(first, (int)got, &in.io, HOVA_PROBE_NORMAL) != 1) {
        fprintf(stderr, "plimo_play: %s is not ASF\n", path);
        return 1;
    }

    host h;
    memset(&h, 0, sizeof h);
    hova_callback_st cb;
    memset(&cb, 0, sizeof cb);
    cb.notify = cb_notify;
    cb.malloc = cb_malloc;
    cb.realloc = cb_realloc;
    cb.freep = cb_freep;
    cb.get_time = cb_get_time;
    cb.stream_alloc = cb_stream_alloc;
    cb.stream_discard = cb_stream_discard;
    cb.stream_commit = cb_stream_commit;
    cb.stream_realloc = cb_stream_realloc;
    cb.stream_check_rbuf_size = cb_stream_check_rbuf_size;
    cb.context = &h;

    /* min_context_size holds two stream records; each further pair of
     * streams needs as much again. malloc's alignment suits the context. */
    const size_t context_size = (size_t)dmx->min_context_size * (size_t)((streams + 1) / 2);
    void* buffer = malloc(context_size);
    void* ctx = NULL;
    int r = buffer ? dmx->open_file(&ctx, &in.io, buffer, (int)context_size, ring_size, &cb)
                   : HOVA_NotEnoughMemory;
    if (r != HOVA_OK) {
        fprintf(stderr, "plimo_play: open failed (%d)\n", r);
        free(buffer);
        fclose(in.f);
        return 1;
    }

    hova_clip_info_st clip;
    hova_program_info_st prog;
    dmx->get_info(ctx, HOVA_STREAM_NONE, 0, &clip);
    dmx->get_info(ctx, HOVA_STREAM_PROG, 0, &prog);
    printf("info audio %d video %d duration %" PRId64 " seekable %d\n", prog.num_audio_streams,
           prog.num_video_streams, prog.duration, clip.seekable);

    r = play(dmx, ctx);
    if (seek) {
        int64_t pts = seek_us;
        const int s = dmx->seek_time(ctx, HOVA_SEEK_FORWARD, &pts, 0);
        printf("seek result %d pts %" PRId64 "\n", s, pts);
        if (s == HOVA_OK) r = play(dmx, ctx);
    }

    dmx->close_file(ctx);
    printf("end result %d blocks %ld\n", r, h.blocks);
    free(buffer);
    free(h.frame[0].base);
    free(h.frame[1].base);
    fclose(in.f);
    dlclose(lib);
    return r == HOVA_EndOfStream ? 0 : 1;
}
