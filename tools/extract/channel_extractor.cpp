#include "tools/extract/channel_extractor.h"

void ChannelExtractor::Consume(MmfMra* buffer) {
  uint32_t kind = 0;
  for (uint32_t i = 0; MmfGetMraElementType(buffer, i, &kind) == 0; ++i) {
    if (kind == kMmfElementProperty) {
      uint32_t type = 0, low = 0;
      uint16_t high = 0;
      if (MmfGetMraPropertyElement(buffer, i, &type, &low, &high) == 0) Property(type, MmfPropertyValue(low, high));
    } else if (kind == kMmfElementBuffer) {
      MmfPoolBuffer* handle = nullptr;
      uint8_t* address = nullptr;
      uint32_t size = 0;
      if (MmfGetMraBufferElement(buffer, i, &handle, &address, &size) == 0) Piece(address, size);
    }
  }
  // The rest of this frame comes in a later buffer, when these pieces may be gone.
  for (const iovec& piece : pieces_) {
    const auto* bytes = static_cast<const uint8_t*>(piece.iov_base);
    carried_.insert(carried_.end(), bytes, bytes + piece.iov_len);
  }
  pieces_.clear();
}

void ChannelExtractor::Property(uint32_t type, uint64_t value) {
  switch (type) {
    case kMmfPropVideoTime:
    case kMmfPropAudioTime:
    case kMmfPropSubtitleTime:
      time_us_ = value;
      break;
    case kMmfPropConfigCount:
      config_left_ = static_cast<uint32_t>(value);
      break;
    case kMmfPropFramePart:
    case kMmfPropFrameEnd:
      if (!in_parts_) frame_time_us_ = time_us_;
      in_parts_ = true;
      last_part_ = last_part_ || type == kMmfPropFrameEnd;
      break;
    default:
      break;
  }
}

void ChannelExtractor::Piece(uint8_t* address, uint32_t size) {
  if (config_left_ > 0) {
    --config_left_;
    if (!begun_) config_.emplace_back(address, address + size);
    return;
  }
  if (!in_parts_) frame_time_us_ = time_us_;
  pieces_.push_back(iovec{address, size});
  if (in_parts_ && !last_part_) return;
  Deliver();
  in_parts_ = false;
  last_part_ = false;
}

void ChannelExtractor::Deliver() {
  if (!carried_.empty()) pieces_.insert(pieces_.begin(), iovec{carried_.data(), carried_.size()});
  FrameView frame{pieces_.data(), pieces_.size(), 0, frame_time_us_};
  for (const iovec& piece : pieces_) frame.size += piece.iov_len;
  Begin();
  if (!failed_) Check(writer_->Frame(frame));
  ++frames_;
  bytes_ += frame.size;
  if (progress_) progress_->Add(frame.size, 1);
  pieces_.clear();
  carried_.clear();
}

void ChannelExtractor::Begin() {
  if (begun_) return;
  begun_ = true;
  Check(writer_->Begin(config_));
}

void ChannelExtractor::Check(bool ok) {
  if (ok || failed_) return;
  failed_ = true;
  error_ = writer_->error();
}

bool ChannelExtractor::Finish() {
  // A frame cut by the end of the input (a truncated file, a channel that
  // stopped) is left out; the command reports that damage on its own.
  Begin();
  bool closed = writer_->Finish();
  if (!failed_ && !closed) Check(false);
  return !failed_;
}
