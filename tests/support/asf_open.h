// Opening built ASF bytes through the plug-in's descriptor, in process, with
// the reference host. The context can then be inspected field by field.
#pragma once

#include <memory>
#include <vector>

#include "asf_api.h"
#include "asf_builder.h"
#include "session.h"

namespace testsupport {

struct Opened {
    std::unique_ptr<host::Session> session;
    int rc = -1;
    asf_demuxer_st* ctx() const { return static_cast<asf_demuxer_st*>(session->context()); }
    // Closes when open; true when the host then holds no block of the plug-in.
    bool close_clean() { return session->close(), session->blocks_outstanding() == 0; }
};

inline Opened open_bytes(std::vector<uint8_t> bytes, const host::SessionOptions& opts = {}) {
    Opened o;
    o.session = host::Session::from_bytes(&hova_asff_demuxer, std::move(bytes), opts);
    o.rc = o.session->open();
    return o;
}

inline Opened open_file(const asfb::File& f, const host::SessionOptions& opts = {}) {
    return open_bytes(asfb::build(f), opts);
}

// A file with the given file properties, the given header children after
// them and `packet_count` zero-filled packets.
inline asfb::File file_with(std::vector<asfb::Bytes> children, asfb::FileProps fp = {}) {
    asfb::File f;
    f.header_children = std::move(children);
    f.header_children.insert(f.header_children.begin(), asfb::file_properties(fp));
    f.packets.assign(fp.packet_count, asfb::Bytes(fp.min_packet_size));
    return f;
}

}  // namespace testsupport
