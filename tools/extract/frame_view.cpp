#include <algorithm>
#include <cstring>

#include "tools/extract/frame_writer.h"

namespace {

// The piece holding byte `offset` of the frame, and the offset inside it.
size_t Locate(const FrameView& frame, size_t* offset) {
  size_t k = 0;
  while (k < frame.count && *offset >= frame.pieces[k].iov_len) *offset -= frame.pieces[k++].iov_len;
  return k;
}

}  // namespace

bool CopyFrameBytes(const FrameView& frame, size_t offset, size_t length, uint8_t* out) {
  if (offset > frame.size || length > frame.size - offset) return false;
  size_t k = Locate(frame, &offset);
  while (length > 0) {
    size_t run = std::min(length, frame.pieces[k].iov_len - offset);
    std::memcpy(out, static_cast<const uint8_t*>(frame.pieces[k].iov_base) + offset, run);
    out += run;
    length -= run;
    offset = 0;
    ++k;
  }
  return true;
}

void AppendFrameRange(const FrameView& frame, size_t offset, size_t length, std::vector<iovec>* list) {
  size_t k = Locate(frame, &offset);
  while (length > 0 && k < frame.count) {
    size_t run = std::min(length, frame.pieces[k].iov_len - offset);
    list->push_back(iovec{static_cast<uint8_t*>(frame.pieces[k].iov_base) + offset, run});
    length -= run;
    offset = 0;
    ++k;
  }
}
