#include "tools/extract/adts_writer.h"

#include <cstdlib>

namespace {

constexpr uint32_t kFrequencies[] = {96000, 88200, 64000, 48000, 44100, 32000, 24000,
                                     22050, 16000, 12000, 11025, 8000,  7350};
constexpr uint32_t kEscapeIndex = 15;  // an explicit 24-bit frequency follows
constexpr uint32_t kObjectTypeSbr = 5;
constexpr uint32_t kObjectTypePs = 29;
constexpr size_t kHeaderSize = 7;
constexpr size_t kMaxFrameLength = 8191;  // 13 bits, header included

uint32_t NearestIndex(uint32_t hz) {
  uint32_t best = 0;
  for (uint32_t i = 1; i < std::size(kFrequencies); ++i) {
    if (std::labs(static_cast<long>(kFrequencies[i]) - hz) < std::labs(static_cast<long>(kFrequencies[best]) - hz)) {
      best = i;
    }
  }
  return best;
}

class BitReader {
 public:
  explicit BitReader(const Bytes& bytes) : bytes_(bytes) {}
  uint32_t Read(int count) {
    uint32_t value = 0;
    for (int i = 0; i < count; ++i, ++pos_) {
      size_t byte = pos_ / 8;
      uint32_t bit = byte < bytes_.size() ? (bytes_[byte] >> (7 - pos_ % 8)) & 1 : 0;
      value = value << 1 | bit;
    }
    return value;
  }
  bool overrun() const { return pos_ > bytes_.size() * 8; }

 private:
  const Bytes& bytes_;
  size_t pos_ = 0;
};

uint32_t ObjectType(BitReader& bits) {
  uint32_t type = bits.Read(5);
  return type == 31 ? 32 + bits.Read(6) : type;
}

uint32_t FrequencyIndex(BitReader& bits) {
  uint32_t index = bits.Read(4);
  return index == kEscapeIndex ? NearestIndex(bits.Read(24)) : index;
}

}  // namespace

bool AdtsWriter::Begin(const std::vector<Bytes>& config) {
  if (config.empty() || config[0].size() < 2) {
    const std::string& id = facts_.codec_id;
    profile_ = id.find("MAIN") != std::string::npos  ? 0
               : id.find("SSR") != std::string::npos ? 2
               : id.find("LTP") != std::string::npos ? 3
                                                     : 1;
    frequency_index_ = NearestIndex(facts_.sample_rate);
    channel_config_ = facts_.channels;
  } else {
    BitReader bits(config[0]);
    uint32_t type = ObjectType(bits);
    frequency_index_ = FrequencyIndex(bits);
    channel_config_ = bits.Read(4);
    // With explicit SBR or PS signalling the header describes the core AAC layer.
    if (type == kObjectTypeSbr || type == kObjectTypePs) {
      (void)FrequencyIndex(bits);
      type = ObjectType(bits);
    }
    if (bits.overrun()) return Fail("the AudioSpecificConfig is cut short");
    if (type < 1 || type > 4) return Fail("ADTS cannot carry AAC audio object type " + std::to_string(type));
    profile_ = type - 1;
  }
  if (frequency_index_ >= std::size(kFrequencies)) return Fail("the AudioSpecificConfig has no usable sampling rate");
  if (channel_config_ > 7) return Fail("ADTS cannot carry channel configuration " + std::to_string(channel_config_));
  return true;
}

bool AdtsWriter::Frame(const FrameView& frame) {
  size_t length = frame.size + kHeaderSize;
  if (length > kMaxFrameLength) return Fail("an AAC frame is too long for an ADTS header");
  uint8_t header[kHeaderSize] = {
      0xFF,
      0xF1,  // MPEG-4, layer 0, no CRC
      static_cast<uint8_t>(profile_ << 6 | frequency_index_ << 2 | channel_config_ >> 2),
      static_cast<uint8_t>((channel_config_ & 3) << 6 | length >> 11),
      static_cast<uint8_t>(length >> 3),
      static_cast<uint8_t>((length & 7) << 5 | 0x1F),  // buffer fullness 0x7FF: variable rate
      0xFC,                                            // one raw data block
  };
  list_.assign(1, iovec{header, kHeaderSize});
  list_.insert(list_.end(), frame.pieces, frame.pieces + frame.count);
  return out_->Write(list_.data(), list_.size());
}
