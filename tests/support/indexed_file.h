#pragma once
// Crafted files whose first Segment child is a SeekHead listing chosen parts at
// their real positions, for tests of the walker's jump over clusters.

#include <cstdint>
#include <vector>

#include "tests/support/ebml_builder.h"

namespace testing_support {

struct SegmentPart {
  ebml::Bytes bytes;
  uint32_t listed_as = 0;  // the ID the SeekHead names for this part; 0: not listed
};

// EBML header, then a Segment of a SeekHead and the parts in order. Seek
// positions are written 8 bytes wide, so the SeekHead's size never depends on
// them. `seek_head_tail` is appended inside the SeekHead after its entries.
ebml::Bytes IndexedFile(const std::vector<SegmentPart>& parts, const ebml::Bytes& seek_head_tail = {});

}  // namespace testing_support
