#include "tools/extract/ogg_writer.h"

#include <array>

namespace {

constexpr uint8_t kContinued = 0x01;
constexpr uint8_t kFirstPage = 0x02;
constexpr uint8_t kLastPage = 0x04;
constexpr size_t kMaxSegments = 255;
constexpr size_t kPageHeaderSize = 27;
constexpr size_t kCrcOffset = 22;

// Ogg's CRC-32: polynomial 0x04C11DB7, most significant bit first, no reflection, start 0.
const std::array<uint32_t, 256>& CrcTable() {
  static const std::array<uint32_t, 256> table = [] {
    std::array<uint32_t, 256> t{};
    for (uint32_t i = 0; i < 256; ++i) {
      uint32_t r = i << 24;
      for (int k = 0; k < 8; ++k) r = r & 0x80000000u ? r << 1 ^ 0x04C11DB7u : r << 1;
      t[i] = r;
    }
    return t;
  }();
  return table;
}

uint32_t Crc(uint32_t crc, const void* data, size_t size) {
  const auto& table = CrcTable();
  const auto* bytes = static_cast<const uint8_t*>(data);
  for (size_t i = 0; i < size; ++i) crc = crc << 8 ^ table[(crc >> 24 ^ bytes[i]) & 0xFF];
  return crc;
}

void PutLe(uint8_t* at, uint64_t value, int bytes) {
  for (int i = 0; i < bytes; ++i) at[i] = static_cast<uint8_t>(value >> (8 * i));
}

FrameView ViewOf(const Bytes& bytes, iovec* piece) {
  *piece = iovec{const_cast<uint8_t*>(bytes.data()), bytes.size()};
  return FrameView{piece, 1, bytes.size(), 0};
}

}  // namespace

bool OggWriter::Begin(const std::vector<Bytes>& config) {
  std::vector<Bytes> headers = config.size() == 1 ? SplitXiphLacing(config[0]) : config;
  if (headers.size() != 3) return Fail("the track lacks its three codec headers");
  if (!granules_->Init(headers)) return Fail("the codec headers cannot be read");
  for (size_t i = 0; i < 3; ++i) {
    iovec piece;
    if (!Packet(ViewOf(headers[i], &piece), 0, i == 0 ? kFirstPage : 0)) return false;
  }
  return true;
}

bool OggWriter::Frame(const FrameView& frame) {
  uint8_t first = 0;
  (void)CopyFrameBytes(frame, 0, 1, &first);
  granule_ = granules_->After(first, frame.size);
  return Packet(frame, granule_, 0);
}

bool OggWriter::Finish() {
  FrameView none;
  return Page(none, 0, 0, nullptr, 0, granule_, kLastPage) && out_->Close();
}

bool OggWriter::Packet(const FrameView& packet, int64_t granule, uint8_t flags) {
  // Lacing: 255 for every full 255 bytes, then the rest (0 when it divides evenly).
  size_t offset = 0;
  size_t left_segments = packet.size / 255 + 1;
  uint8_t lacing[kMaxSegments];
  while (left_segments > 0) {
    size_t segments = std::min(left_segments, kMaxSegments);
    left_segments -= segments;
    size_t length = 0;
    for (size_t i = 0; i < segments; ++i) {
      lacing[i] = left_segments == 0 && i + 1 == segments ? static_cast<uint8_t>(packet.size - offset - length) : 255;
      length += lacing[i];
    }
    // Only the page on which the packet ends has a granule position.
    if (!Page(packet, offset, length, lacing, segments, left_segments == 0 ? granule : -1, flags)) return false;
    offset += length;
    flags = kContinued;
  }
  return true;
}

bool OggWriter::Page(const FrameView& packet, size_t offset, size_t length, const uint8_t* lacing, size_t segments,
                     int64_t granule, uint8_t flags) {
  uint8_t header[kPageHeaderSize + kMaxSegments] = {'O', 'g', 'g', 'S', 0, flags};
  PutLe(header + 6, static_cast<uint64_t>(granule), 8);
  PutLe(header + 14, serial_, 4);
  PutLe(header + 18, sequence_++, 4);
  header[26] = static_cast<uint8_t>(segments);
  for (size_t i = 0; i < segments; ++i) header[kPageHeaderSize + i] = lacing[i];
  size_t header_size = kPageHeaderSize + segments;
  list_.assign(1, iovec{header, header_size});
  AppendFrameRange(packet, offset, length, &list_);
  uint32_t crc = 0;
  for (const iovec& piece : list_) crc = Crc(crc, piece.iov_base, piece.iov_len);
  PutLe(header + kCrcOffset, crc, 4);
  return out_->Write(list_.data(), list_.size());
}
