#include "tools/extract/flac_writer.h"

#include <cstring>

namespace {

constexpr char kMarker[4] = {'f', 'L', 'a', 'C'};
constexpr uint8_t kLastBlockFlag = 0x80;
constexpr size_t kBlockHeaderSize = 4;
constexpr uint8_t kStreamInfoType = 0;

}  // namespace

bool FlacWriter::Begin(const std::vector<Bytes>& config) {
  if (config.empty() || config[0].empty()) return Fail("the FLAC track has no STREAMINFO");
  const Bytes& packet = config[0];
  size_t skip = packet.size() >= sizeof kMarker && !std::memcmp(packet.data(), kMarker, sizeof kMarker) ? 4 : 0;
  Bytes blocks(packet.begin() + static_cast<ptrdiff_t>(skip), packet.end());
  if (blocks.empty() || (blocks[0] & 0x7F) != kStreamInfoType)
    return Fail("the FLAC metadata does not begin with STREAMINFO");
  // Walk the block headers: a stream whose last block is not flagged has no
  // end of metadata, and one flagged early hides the blocks after it.
  size_t pos = 0;
  while (pos + kBlockHeaderSize <= blocks.size()) {
    size_t length = static_cast<size_t>(blocks[pos + 1] << 16 | blocks[pos + 2] << 8 | blocks[pos + 3]);
    size_t next = pos + kBlockHeaderSize + length;
    if (next > blocks.size()) return Fail("a FLAC metadata block runs past the decoder configuration");
    blocks[pos] = static_cast<uint8_t>((blocks[pos] & 0x7F) | (next == blocks.size() ? kLastBlockFlag : 0));
    pos = next;
  }
  if (pos != blocks.size()) return Fail("the FLAC metadata ends inside a block header");
  iovec list[2] = {{const_cast<char*>(kMarker), sizeof kMarker}, {blocks.data(), blocks.size()}};
  return out_->Write(list, 2);
}
