// Plays a real file through the reference host the way the framework drives the
// descriptor, and keeps what the host saw. Shared by the corpus and HTTP suites.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include "asf_api.h"
#include "asf_demuxer.h"
#include "session.h"
#include "test_env.h"

namespace corpus {

struct Player {
    explicit Player(std::unique_ptr<host::RawInput> in) : s(&hova_asff_demuxer, std::move(in)) { rc = s.open(); }
    Player(const std::vector<uint8_t>& f, const host::InputOptions& in = {})
        : Player(host::RawInput::from_memory(f, in)) {}
    host::HostCallbacks& cb() { return s.callbacks(); }
    asf_demuxer_st* ctx() { return static_cast<asf_demuxer_st*>(s.context()); }
    // Media frames of a kind committed since event `from`.
    std::vector<host::HostEvent> frames(hova_stream_type_et t, size_t from = 0) {
        std::vector<host::HostEvent> out;
        for (size_t i = from; i < cb().events().size(); ++i) {
            const host::HostEvent& e = cb().events()[i];
            if (e.kind == host::EventKind::Commit && !e.packet_type && (!t || e.type == t))
                out.push_back(e);
        }
        return out;
    }
    bool framed_since(size_t from) { return !frames(HOVA_STREAM_NONE, from).empty(); }
    int step() {
        cb().call = ++calls;
        hova_stream_type_et t = HOVA_STREAM_NONE;
        int bs = 0;
        int64_t pts = 0;
        return last = hova_asff_demuxer.get_data(s.context(), &t, &bs, &pts);
    }
    // get_data until something other than OK or TryAgain (or `max` calls in all).
    int play(uint64_t max = 1000000) {
        while (rc == HOVA_OK && calls < max &&
               (last < 0 || last == HOVA_OK || last == HOVA_TryAgain))
            step();
        return last;
    }
    int seek(int dir, int64_t* t, int query = 0) { return hova_asff_demuxer.seek_time(s.context(), dir, t, query); }
    // Every event as a line, then the last result and the number of calls.
    std::vector<std::string> trace() {
        std::vector<std::string> out;
        for (const host::HostEvent& e : cb().events())
            out.push_back(testing::PrintToString(std::vector<int64_t>{
                int64_t(e.call), int(e.kind), e.type, e.packet_type, e.size, e.pts, e.crc32}));
        out.push_back("last " + std::to_string(last) + " calls " + std::to_string(calls));
        return out;
    }
    // Closed, nothing held by the plug-in, no misuse of the frame buffers.
    void expect_clean_close() {
        EXPECT_EQ(s.close(), HOVA_OK);
        EXPECT_EQ(s.blocks_outstanding(), 0u);
        EXPECT_EQ(cb().protocol_errors(), 0u);
    }

    host::Session s;
    int rc = -1, last = -1;
    uint64_t calls = 0;
};

inline std::string base_name(const std::string& p) { return p.substr(p.find_last_of('/') + 1); }

}  // namespace corpus
