#include "tools/extract/wav_writer.h"

#include <algorithm>

namespace {

constexpr uint16_t kFormatPcm = 1;
constexpr uint16_t kFormatFloat = 3;
constexpr size_t kHeaderSize = 44;
constexpr uint64_t kMaxDataSize = 0xFFFFFFFFu - kHeaderSize;

void Put(uint8_t* at, uint32_t value, int bytes) {
  for (int i = 0; i < bytes; ++i) at[i] = static_cast<uint8_t>(value >> (8 * i));
}

}  // namespace

bool WavWriter::Begin(const std::vector<Bytes>&) {
  uint32_t bits = facts_.bit_depth ? facts_.bit_depth : 16;
  if (bits % 8 || bits > 64) return Fail("WAV cannot carry " + std::to_string(bits) + "-bit samples");
  if (facts_.channels == 0 || facts_.sample_rate == 0) return Fail("the PCM format has no channels or sample rate");
  sample_bytes_ = bits / 8;
  bool is_float = facts_.codec_id.find("FLOAT") != std::string::npos;
  uint32_t block_align = sample_bytes_ * facts_.channels;
  uint8_t header[kHeaderSize] = {'R', 'I', 'F', 'F', 0, 0, 0, 0, 'W', 'A', 'V', 'E', 'f', 'm', 't', ' '};
  Put(header + 16, 16, 4);
  Put(header + 20, is_float ? kFormatFloat : kFormatPcm, 2);
  Put(header + 22, facts_.channels, 2);
  Put(header + 24, facts_.sample_rate, 4);
  Put(header + 28, facts_.sample_rate * block_align, 4);
  Put(header + 32, block_align, 2);
  Put(header + 34, bits, 2);
  std::copy_n("data", 4, header + 36);
  return out_->Write(header, kHeaderSize);
}

bool WavWriter::Frame(const FrameView& frame) {
  data_size_ += frame.size;
  if (data_size_ > kMaxDataSize) return Fail("the PCM data does not fit a WAV file's 32-bit sizes");
  if (facts_.pcm_byte_order != 2 || sample_bytes_ == 1) return out_->Write(frame.pieces, frame.count);
  if (frame.size % sample_bytes_) return Fail("a big-endian PCM frame ends inside a sample");
  swapped_.resize(frame.size);
  (void)CopyFrameBytes(frame, 0, frame.size, swapped_.data());
  for (size_t i = 0; i < swapped_.size(); i += sample_bytes_) {
    std::reverse(swapped_.begin() + static_cast<ptrdiff_t>(i),
                 swapped_.begin() + static_cast<ptrdiff_t>(i + sample_bytes_));
  }
  return out_->Write(swapped_.data(), swapped_.size());
}

bool WavWriter::Finish() {
  if (out_->size() < kHeaderSize) return out_->Close();
  uint8_t pad = 0;
  if (data_size_ % 2) out_->Write(&pad, 1);  // RIFF chunks have even lengths
  uint8_t size[4];
  Put(size, static_cast<uint32_t>(out_->size() - 8), 4);
  out_->WriteAt(4, size, 4);
  Put(size, static_cast<uint32_t>(data_size_), 4);
  out_->WriteAt(40, size, 4);
  return out_->Close();
}
