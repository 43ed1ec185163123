#include "tests/support/indexed_file.h"

namespace testing_support {
namespace {

using namespace ebml;

Bytes seek_head(const std::vector<SegmentPart>& parts, const std::vector<uint64_t>& positions, const Bytes& tail) {
  Bytes payload;
  for (size_t i = 0; i < parts.size(); ++i) {
    if (parts[i].listed_as == 0) continue;
    Bytes entry = master(kSeek, {element(kSeekId, id_bytes(parts[i].listed_as)),
                                 uinteger(kSeekPosition, positions[i], 8)});
    payload.insert(payload.end(), entry.begin(), entry.end());
  }
  payload.insert(payload.end(), tail.begin(), tail.end());
  return element(kSeekHead, payload, 8);
}

}  // namespace

Bytes IndexedFile(const std::vector<SegmentPart>& parts, const Bytes& seek_head_tail) {
  // Offsets from the Segment's data start; the SeekHead's size does not depend on them.
  std::vector<uint64_t> positions(parts.size(), 0);
  uint64_t position = seek_head(parts, positions, seek_head_tail).size();
  for (size_t i = 0; i < parts.size(); ++i) {
    positions[i] = position;
    position += parts[i].bytes.size();
  }
  Bytes segment = seek_head(parts, positions, seek_head_tail);
  for (const SegmentPart& part : parts) segment.insert(segment.end(), part.bytes.begin(), part.bytes.end());
  return cat({ebml_header(), element(kSegment, segment, 8)});
}

}  // namespace testing_support
