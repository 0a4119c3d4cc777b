// Fixed-layout on-disk records of ASF: sizes and field offsets. Records are
// read whole through the reader and their fields taken with load_le.
#ifndef ASF_OBJECTS_H
#define ASF_OBJECTS_H

#include <cstddef>

namespace asf {

// Object header: GUID, then the 64-bit size of the whole object.
inline constexpr size_t kObjectHeaderSize = 24;
inline constexpr size_t kObjSize = 16;

// Header object: object header, child count, two reserved bytes (1 and 2).
inline constexpr size_t kHeaderObjectSize = 30;
inline constexpr size_t kHeaderNumObjects = 24;
inline constexpr size_t kHeaderReserved1 = 28;
inline constexpr size_t kHeaderReserved2 = 29;

// File properties body (after the object header).
namespace file_prop {
inline constexpr size_t kSize = 80;
inline constexpr size_t kFileId = 0, kFileSize = 16, kCreationDate = 24, kPacketCount = 32,
                        kPlayDuration = 40, kSendDuration = 48, kPreroll = 56, kFlags = 64,
                        kMinPacketSize = 68, kMaxPacketSize = 72, kMaxBitrate = 76;
inline constexpr unsigned kFlagBroadcast = 0x1;
}  // namespace file_prop

// Stream properties body; type-specific data and error correction data follow.
namespace stream_prop {
inline constexpr size_t kSize = 54;
inline constexpr size_t kStreamType = 0, kEcType = 16, kTimeOffset = 32, kConfigLen = 40,
                        kEcDataLen = 44, kFlags = 48, kReserved = 50;
inline constexpr unsigned kStreamNumberMask = 0x7F;
}  // namespace stream_prop

// Header extension body before its children.
namespace header_ext {
inline constexpr size_t kSize = 22;
inline constexpr size_t kReserved1 = 0, kReserved2 = 16, kDataSize = 18;
inline constexpr unsigned kReserved2Value = 6;
}  // namespace header_ext

// Extended stream properties fixed body.
namespace ext_stream_prop {
inline constexpr size_t kSize = 64;
inline constexpr size_t kStartTime = 0, kEndTime = 8, kBitrate = 16, kBufferSize = 20,
                        kInitBufferFullness = 24, kAltBitrate = 28, kAltBufferSize = 32,
                        kAltInitBufferFullness = 36, kMaxObjSize = 40, kFlags = 44,
                        kStreamNum = 48, kStreamLanguageIndex = 50, kAvgTimePerFrame = 52,
                        kStreamNameCount = 60, kPayloadExtSystemCount = 62;
// Entries behind the body: a stream name (language index, byte count, name)
// and a payload extension system (GUID, data size, info length, info).
inline constexpr size_t kStreamNameFixed = 4, kStreamNameLength = 2;
inline constexpr size_t kExtSystemFixed = 22, kExtSystemInfoLength = 18;
}  // namespace ext_stream_prop

// Content description: five uint16 byte counts, then the five strings.
namespace content_desc {
inline constexpr size_t kSize = 10;
inline constexpr size_t kTitleLength = 0, kAuthorLength = 2, kCopyrightLength = 4,
                        kDescriptionLength = 6, kRatingLength = 8;
}  // namespace content_desc

// Metadata library description record header.
namespace description_record {
inline constexpr size_t kSize = 12;
inline constexpr size_t kLanguageListIndex = 0, kStreamNumber = 2, kNameLength = 4,
                        kDataType = 6, kDataLength = 8;
}  // namespace description_record

// Data object header; the packets follow.
namespace data_object {
inline constexpr size_t kSize = 50;
inline constexpr size_t kFileId = 24, kNumPackets = 40, kReserved = 48;
}  // namespace data_object

// Simple index object header; index_count 6-byte entries follow.
namespace simple_index {
inline constexpr size_t kSize = 56;
inline constexpr size_t kFileId = 24, kTimeInterval = 40, kMaxPacketCount = 48, kIndexCount = 52;
inline constexpr size_t kEntrySize = 6;
inline constexpr size_t kEntryPacketNumber = 0, kEntryPacketCount = 4;
}  // namespace simple_index

}  // namespace asf

#endif  // ASF_OBJECTS_H
