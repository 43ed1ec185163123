#include "tools/extract/annexb_writer.h"

namespace {

constexpr uint8_t kStartCode[4] = {0, 0, 0, 1};
constexpr size_t kAvcCHeaderSize = 6;  // version, profile, compatibility, level, length size, SPS count

iovec StartCode() { return iovec{const_cast<uint8_t*>(kStartCode), sizeof kStartCode}; }

// Appends start code and NAL unit for each of `count` u16-length-prefixed units at *pos.
bool ParameterSets(const Bytes& avcc, size_t count, size_t* pos, std::vector<iovec>* list) {
  for (size_t i = 0; i < count; ++i) {
    if (*pos + 2 > avcc.size()) return false;
    size_t size = static_cast<size_t>(avcc[*pos] << 8 | avcc[*pos + 1]);
    *pos += 2;
    if (size > avcc.size() - *pos) return false;
    list->push_back(StartCode());
    list->push_back(iovec{const_cast<uint8_t*>(avcc.data() + *pos), size});
    *pos += size;
  }
  return true;
}

}  // namespace

bool AnnexBWriter::Begin(const std::vector<Bytes>& config) {
  // Without an avcC (version 1) the frames are taken to be Annex B already.
  if (config.empty() || config[0].size() < kAvcCHeaderSize || config[0][0] != 1) return true;
  const Bytes& avcc = config[0];
  length_size_ = static_cast<size_t>((avcc[4] & 3) + 1);
  std::vector<iovec> list;
  size_t pos = kAvcCHeaderSize;
  bool ok = ParameterSets(avcc, avcc[5] & 0x1F, &pos, &list) && pos < avcc.size();
  if (ok) {
    size_t pps_count = avcc[pos++];
    ok = ParameterSets(avcc, pps_count, &pos, &list);
  }
  if (!ok) return Fail("the AVC decoder configuration is cut short");
  return out_->Write(list.data(), list.size());
}

bool AnnexBWriter::Frame(const FrameView& frame) {
  if (length_size_ == 0) return out_->Write(frame.pieces, frame.count);
  list_.clear();
  size_t pos = 0;
  while (pos + length_size_ <= frame.size) {
    uint8_t field[4];
    (void)CopyFrameBytes(frame, pos, length_size_, field);
    size_t size = 0;
    for (size_t i = 0; i < length_size_; ++i) size = size << 8 | field[i];
    pos += length_size_;
    if (size > frame.size - pos) return Fail("a NAL unit runs past the end of its frame");
    list_.push_back(StartCode());
    AppendFrameRange(frame, pos, size, &list_);
    pos += size;
  }
  if (pos != frame.size) return Fail("a frame ends inside a NAL unit length field");
  return out_->Write(list_.data(), list_.size());
}
