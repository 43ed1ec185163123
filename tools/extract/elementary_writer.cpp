#include "tools/extract/elementary_writer.h"

#include <algorithm>

bool ElementaryWriter::Begin(const std::vector<Bytes>& config) {
  if (headers_first_ && !config.empty() && config[0].size() > header_skip_) {
    headers_.assign(config[0].begin() + static_cast<ptrdiff_t>(header_skip_), config[0].end());
  }
  return true;
}

bool ElementaryWriter::Frame(const FrameView& frame) {
  if (!headers_.empty()) {
    Bytes start(std::min(headers_.size(), frame.size));
    (void)CopyFrameBytes(frame, 0, start.size(), start.data());
    if (start != headers_ && !out_->Write(headers_.data(), headers_.size())) return false;
    headers_.clear();
  }
  return out_->Write(frame.pieces, frame.count);
}
