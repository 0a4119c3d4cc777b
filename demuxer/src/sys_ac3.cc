#include "sys_ac3.h"

#include "dprintf.h"

const uint8_t AC3ChannelTable[8] = {2, 1, 2, 3, 3, 4, 4, 5};

namespace {

constexpr int kMaxFrameSizeCode = 37;

int ac3_lfeon(uint8_t byte6, int acmod) {
    // acmod takes bits 7..5; the mix level and surround fields that follow it
    // depend on acmod, and lfeon comes right after them.
    int skipped = 0;
    if ((acmod & 1) && acmod != 1) skipped += 2;  // centre mix level
    if (acmod & 4) skipped += 2;                  // surround mix level
    if (acmod == 2) skipped += 2;                 // Dolby surround mode
    return (byte6 >> (4 - skipped)) & 1;
}

}  // namespace

extern "C" {

int sys_get_ac3_channel_count(const uint8_t* buf, int len, int EAC3_flag, int* channels) {
    if (buf == nullptr || channels == nullptr || len <= 0) return -1;
    const int header = EAC3_flag ? SYS_EAC3_HEADER_BYTES : SYS_AC3_HEADER_BYTES;
    for (int i = 0; i + header <= len; ++i) {
        if (buf[i] != 0x0B || buf[i + 1] != 0x77) continue;
        int acmod = 0;
        int lfeon = 0;
        if (EAC3_flag) {
            acmod = (buf[i + 4] >> 1) & 7;
            lfeon = buf[i + 4] & 1;
        } else {
            if ((buf[i + 4] & 0x3F) > kMaxFrameSizeCode) continue;
            acmod = buf[i + 6] >> 5;
            lfeon = ac3_lfeon(buf[i + 6], acmod);
        }
        *channels = AC3ChannelTable[acmod] + lfeon;
        return 1;
    }
    return -1;
}

void sys_update_ac4_header(uint8_t* header, uint32_t frame_size) {
    if (header == nullptr) {
        DPRINTF("[SYS]Error! Input bffer is NULL\n");
        return;
    }
    header[0] = 0xAC;
    header[1] = 0x40;  // sync word without CRC
    header[2] = 0xFF;  // 16-bit size escape: the size follows in 24 bits
    header[3] = 0xFF;
    header[4] = static_cast<uint8_t>(frame_size >> 16);
    header[5] = static_cast<uint8_t>(frame_size >> 8);
    header[6] = static_cast<uint8_t>(frame_size);
}

}  // extern "C"
