#pragma once
// A readable builder for crafted EBML bytes:
//   master(kSegment, {master(kInfo, {uinteger(kTimecodeScale, 1000000)})})
// Sizes are written in their shortest form unless a width is given.

#include <bit>
#include <cstdint>
#include <initializer_list>
#include <string_view>
#include <vector>

namespace ebml {

using Bytes = std::vector<uint8_t>;

// IDs as read, with their length-marker bits; a line per master and its children.
enum : uint32_t {
  kEbmlHeader = 0x1A45DFA3, kEbmlVersion = 0x4286, kEbmlReadVersion = 0x42F7, kEbmlMaxIdLength = 0x42F2,
  kEbmlMaxSizeLength = 0x42F3, kDocType = 0x4282, kDocTypeVersion = 0x4287, kDocTypeReadVersion = 0x4285,
  kSegment = 0x18538067, kVoid = 0xEC, kCrc32 = 0xBF, kAttachments = 0x1941A469, kChapters = 0x1043A770,
  kSeekHead = 0x114D9B74, kSeek = 0x4DBB, kSeekId = 0x53AB, kSeekPosition = 0x53AC,
  kInfo = 0x1549A966, kSegmentUid = 0x73A4, kSegmentFilename = 0x7384, kTimecodeScale = 0x2AD7B1, kDuration = 0x4489,
  kDateUtc = 0x4461, kTitle = 0x7BA9, kMuxingApp = 0x4D80,
  kCluster = 0x1F43B675, kTimecode = 0xE7, kSimpleBlock = 0xA3, kBlockGroup = 0xA0, kBlock = 0xA1, kBlockDuration = 0x9B,
  kReferenceBlock = 0xFB,
  kTracks = 0x1654AE6B, kTrackEntry = 0xAE, kTrackNumber = 0xD7, kTrackUid = 0x73C5, kTrackType = 0x83, kCodecId = 0x86,
  kCodecPrivate = 0x63A2, kDefaultDuration = 0x23E383, kFlagForced = 0x55AA, kFlagLacing = 0x9C,
  kTrackTimecodeScale = 0x23314F, kName = 0x536E, kLanguage = 0x22B59C, kCodecName = 0x258688,
  kVideo = 0xE0, kPixelWidth = 0xB0, kPixelHeight = 0xBA, kColourSpace = 0x2EB524,
  kAudio = 0xE1, kSamplingFrequency = 0xB5, kChannels = 0x9F,
  kContentEncodings = 0x6D80, kContentEncoding = 0x6240, kContentEncodingOrder = 0x5031, kContentEncodingScope = 0x5032,
  kContentEncodingType = 0x5033, kContentCompression = 0x5034, kContentCompAlgo = 0x4254, kContentCompSettings = 0x4255,
  kContentEncryption = 0x5035, kContentEncAlgo = 0x47E1, kContentEncKeyId = 0x47E2, kContentSignature = 0x47E3,
  kContentSigKeyId = 0x47E4,
  kCues = 0x1C53BB6B, kCuePoint = 0xBB, kCueTime = 0xB3, kCueTrackPositions = 0xB7, kCueTrack = 0xF7,
  kCueClusterPosition = 0xF1, kCueBlockNumber = 0x5378, kCueCodecState = 0xEA, kCueReference = 0xDB, kCueRefTime = 0x96,
  kCueRelativePosition = 0xF0,
  kTags = 0x1254C367, kTag = 0x7373, kSimpleTag = 0x67C8, kTagName = 0x45A3, kTagString = 0x4487, kTagBinary = 0x4485,
};

// The EBML unknown-size value, as an 8-byte size field writes it.
constexpr uint64_t kUnknownSize = 0x00FFFFFFFFFFFFFF;

// The low `width` bytes of `value`, most significant first.
inline Bytes big_endian(uint64_t value, int width) {
  Bytes out(static_cast<size_t>(width));
  for (int i = width - 1; i >= 0; --i, value >>= 8) out[static_cast<size_t>(i)] = static_cast<uint8_t>(value);
  return out;
}

inline Bytes id_bytes(uint32_t id) { return big_endian(id, id > 0xFFFFFF ? 4 : id > 0xFFFF ? 3 : id > 0xFF ? 2 : 1); }

// A size field; width 0 picks the shortest that holds the value.
inline Bytes size_bytes(uint64_t size, int width = 0) {
  if (width == 0) {
    width = 1;
    // All ones in the value bits would read as "unknown": go one byte wider.
    while (width < 8 && size >= (uint64_t{1} << (7 * width)) - 1) ++width;
  }
  Bytes out = big_endian(size, width);
  out[0] |= static_cast<uint8_t>(0x80 >> (width - 1));
  return out;
}

inline Bytes cat(std::initializer_list<Bytes> parts) {
  Bytes out;
  for (const Bytes& part : parts) out.insert(out.end(), part.begin(), part.end());
  return out;
}

inline Bytes element(uint32_t id, const Bytes& payload, int size_width = 0) {
  return cat({id_bytes(id), size_bytes(payload.size(), size_width), payload});
}
inline Bytes master(uint32_t id, std::initializer_list<Bytes> children) { return element(id, cat(children)); }
// A master whose size field claims `size` whatever the children add up to.
inline Bytes master_sized(uint32_t id, uint64_t size, std::initializer_list<Bytes> children, int size_width = 0) {
  return cat({id_bytes(id), size_bytes(size, size_width), cat(children)});
}
inline Bytes unknown_size(uint32_t id, std::initializer_list<Bytes> children) {
  return master_sized(id, kUnknownSize, children, 8);
}
// width 0: shortest, at least one byte
inline Bytes uinteger(uint32_t id, uint64_t value, int width = 0) {
  if (width == 0) {
    width = 1;
    while (width < 8 && (value >> (8 * width)) != 0) ++width;
  }
  return element(id, big_endian(value, width));
}
inline Bytes sinteger(uint32_t id, int64_t value, int width) { return element(id, big_endian(static_cast<uint64_t>(value), width)); }
inline Bytes str(uint32_t id, std::string_view text) { return element(id, Bytes(text.begin(), text.end())); }
inline Bytes f64(uint32_t id, double value) { return element(id, big_endian(std::bit_cast<uint64_t>(value), 8)); }
inline Bytes bin(uint32_t id, const Bytes& payload) { return element(id, payload); }
// n bytes of `fill`.
inline Bytes filler(size_t n, uint8_t fill = 0) { return Bytes(n, fill); }

// An EBML header with the usual versions and the given DocType.
inline Bytes ebml_header(std::string_view doc_type = "matroska") {
  return master(kEbmlHeader, {uinteger(kEbmlVersion, 1), uinteger(kEbmlReadVersion, 1), uinteger(kEbmlMaxIdLength, 4),
                              uinteger(kEbmlMaxSizeLength, 8), str(kDocType, doc_type), uinteger(kDocTypeVersion, 4),
                              uinteger(kDocTypeReadVersion, 2)});
}

}  // namespace ebml
