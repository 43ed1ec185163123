#include "tools/extract/avi_writer.h"

#include <algorithm>
#include <numeric>

namespace {

constexpr uint32_t kMainHeaderSize = 56;    // avih
constexpr uint32_t kStreamHeaderSize = 56;  // strh
constexpr uint32_t kBitmapHeaderSize = 40;
constexpr uint32_t kHasIndex = 0x10;        // avih flag
constexpr uint32_t kKeyFrame = 0x10;        // idx1 flag
constexpr uint64_t kMaxRiffSize = 0xFFFFFFF0u;

// Offsets in the header, from the file's start.
constexpr size_t kMicroSecondsPerFrameAt = 32;
constexpr size_t kTotalFramesAt = 48;
constexpr size_t kSuggestedBufferAt = 60;

void Put32(Bytes* out, uint32_t value) {
  for (int i = 0; i < 4; ++i) out->push_back(static_cast<uint8_t>(value >> (8 * i)));
}
void Put16(Bytes* out, uint16_t value) {
  out->push_back(static_cast<uint8_t>(value));
  out->push_back(static_cast<uint8_t>(value >> 8));
}
void PutCode(Bytes* out, const char* code) { out->insert(out->end(), code, code + 4); }
uint32_t Get32(const Bytes& bytes, size_t at) {
  return at + 4 <= bytes.size() ? static_cast<uint32_t>(bytes[at] | bytes[at + 1] << 8 | bytes[at + 2] << 16 |
                                                        static_cast<uint32_t>(bytes[at + 3]) << 24)
                                : 0;
}
void Patch32(OutputFile* out, uint64_t at, uint32_t value) {
  uint8_t bytes[4];
  for (int i = 0; i < 4; ++i) bytes[i] = static_cast<uint8_t>(value >> (8 * i));
  out->WriteAt(at, bytes, 4);
}

}  // namespace

bool AviWriter::Begin(const std::vector<Bytes>& config) {
  if (config.empty() || config[0].size() < kBitmapHeaderSize) {
    return Fail("the track has no BITMAPINFOHEADER to describe the AVI stream");
  }
  Bytes format = config[0];
  if (format.size() % 2) format.push_back(0);
  const uint32_t width = Get32(format, 4);
  const uint32_t height = Get32(format, 8);
  const uint32_t strl_size = 4 + 8 + kStreamHeaderSize + 8 + static_cast<uint32_t>(format.size());
  const uint32_t hdrl_size = 4 + 8 + kMainHeaderSize + 8 + strl_size;

  Bytes header;
  PutCode(&header, "RIFF");
  Put32(&header, 0);  // filled in at the end
  PutCode(&header, "AVI ");
  PutCode(&header, "LIST");
  Put32(&header, hdrl_size);
  PutCode(&header, "hdrl");
  PutCode(&header, "avih");
  Put32(&header, kMainHeaderSize);
  Put32(&header, 0);  // microseconds per frame: at the end
  Put32(&header, 0);  // max bytes per second
  Put32(&header, 0);  // padding granularity
  Put32(&header, kHasIndex);
  Put32(&header, 0);  // total frames: at the end
  Put32(&header, 0);  // initial frames
  Put32(&header, 1);  // streams
  Put32(&header, 0);  // suggested buffer size: at the end
  Put32(&header, width);
  Put32(&header, height);
  for (int i = 0; i < 4; ++i) Put32(&header, 0);
  PutCode(&header, "LIST");
  Put32(&header, strl_size);
  PutCode(&header, "strl");
  PutCode(&header, "strh");
  Put32(&header, kStreamHeaderSize);
  stream_header_at_ = header.size();
  PutCode(&header, "vids");
  header.insert(header.end(), format.begin() + 16, format.begin() + 20);  // handler: the compression code
  Put32(&header, 0);  // flags
  Put16(&header, 0);  // priority
  Put16(&header, 0);  // language
  Put32(&header, 0);  // initial frames
  Put32(&header, 0);  // scale: at the end
  Put32(&header, 0);  // rate: at the end
  Put32(&header, 0);  // start
  Put32(&header, 0);  // length: at the end
  Put32(&header, 0);  // suggested buffer size: at the end
  Put32(&header, 0xFFFFFFFFu);  // quality: the default
  Put32(&header, 0);  // sample size: frames vary
  Put16(&header, 0);
  Put16(&header, 0);
  Put16(&header, static_cast<uint16_t>(width));
  Put16(&header, static_cast<uint16_t>(height));
  PutCode(&header, "strf");
  Put32(&header, static_cast<uint32_t>(config[0].size()));
  header.insert(header.end(), format.begin(), format.end());
  PutCode(&header, "LIST");
  Put32(&header, 0);  // movi size: at the end
  movi_start_ = header.size();
  PutCode(&header, "movi");
  return out_->Write(header.data(), header.size());
}

bool AviWriter::Frame(const FrameView& frame) {
  if (out_->size() + frame.size + 8 + index_.size() + 16 > kMaxRiffSize) {
    return Fail("the track does not fit an AVI file's 32-bit sizes");
  }
  if (frames_ == 0) first_time_us_ = frame.time_us;
  last_time_us_ = frame.time_us;
  Bytes chunk;
  PutCode(&chunk, "00dc");
  Put32(&chunk, static_cast<uint32_t>(frame.size));
  PutCode(&index_, "00dc");
  Put32(&index_, kKeyFrame);
  Put32(&index_, static_cast<uint32_t>(out_->size() - movi_start_));
  Put32(&index_, static_cast<uint32_t>(frame.size));
  ++frames_;
  largest_ = std::max(largest_, static_cast<uint32_t>(frame.size));
  const uint8_t pad = 0;
  return out_->Write(chunk.data(), chunk.size()) && out_->Write(frame.pieces, frame.count) &&
         (frame.size % 2 == 0 || out_->Write(&pad, 1));
}

bool AviWriter::Finish() {
  if (movi_start_ == 0) return out_->Close();
  Patch32(out_, movi_start_ - 4, static_cast<uint32_t>(out_->size() - movi_start_));
  Bytes index;
  PutCode(&index, "idx1");
  Put32(&index, static_cast<uint32_t>(index_.size()));
  out_->Write(index.data(), index.size());
  out_->Write(index_.data(), index_.size());
  Patch32(out_, 4, static_cast<uint32_t>(out_->size() - 8));
  // The frame period: DefaultDuration, else the frames' own spacing, else 25 per second.
  uint64_t scale = facts_.default_duration_ns, rate = 1000000000;
  if (!scale && frames_ > 1 && last_time_us_ > first_time_us_) {
    scale = last_time_us_ - first_time_us_;
    rate = uint64_t{1000000} * (frames_ - 1);
  }
  if (!scale) scale = 40000000;
  const uint64_t common = std::gcd(scale, rate);
  scale /= common;
  rate /= common;
  while (scale > 0xFFFFFFFFu || rate > 0xFFFFFFFFu) {
    scale = (scale + 1) / 2;
    rate = (rate + 1) / 2;
  }
  Patch32(out_, kMicroSecondsPerFrameAt, static_cast<uint32_t>(scale * 1000000 / rate));
  Patch32(out_, kTotalFramesAt, frames_);
  Patch32(out_, kSuggestedBufferAt, largest_);
  Patch32(out_, stream_header_at_ + 20, static_cast<uint32_t>(scale));
  Patch32(out_, stream_header_at_ + 24, static_cast<uint32_t>(rate));
  Patch32(out_, stream_header_at_ + 32, frames_);
  Patch32(out_, stream_header_at_ + 36, largest_);
  return out_->Close();
}
