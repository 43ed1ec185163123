#include "tools/extract/raw_index_writer.h"

#include <cinttypes>
#include <cstdio>

namespace {

constexpr size_t kIndexFlushSize = 64 * 1024;

}  // namespace

RawIndexWriter::RawIndexWriter(OutputFile* out, const std::string& index_path, const ChannelFacts& facts)
    : FrameWriter(out), index_path_(index_path), facts_(facts) {}

bool RawIndexWriter::Begin(const std::vector<Bytes>& config) {
  if (!index_.Open(index_path_)) return Fail(index_.error());
  char line[256];
  std::snprintf(line, sizeof line,
                "# kelvane frame index of track %" PRIu64
                " (%s)\n"
                "# config OFFSET SIZE | frame OFFSET SIZE TIME_US\n",
                facts_.track, facts_.codec_id.c_str());
  pending_ = line;
  for (const Bytes& packet : config) {
    if (!Line("config", out_->size(), packet.size(), nullptr) || !out_->Write(packet.data(), packet.size())) {
      return false;
    }
  }
  return true;
}

bool RawIndexWriter::Frame(const FrameView& frame) {
  return Line("frame", out_->size(), frame.size, &frame.time_us) && out_->Write(frame.pieces, frame.count);
}

bool RawIndexWriter::Line(const char* kind, uint64_t offset, size_t size, const uint64_t* time_us) {
  char line[96];
  if (time_us) {
    std::snprintf(line, sizeof line, "%s %" PRIu64 " %zu %" PRIu64 "\n", kind, offset, size, *time_us);
  } else {
    std::snprintf(line, sizeof line, "%s %" PRIu64 " %zu\n", kind, offset, size);
  }
  pending_ += line;
  return pending_.size() < kIndexFlushSize || FlushIndex();
}

bool RawIndexWriter::FlushIndex() {
  bool ok = index_.Write(pending_.data(), pending_.size());
  pending_.clear();
  return ok || Fail(index_.error());
}

bool RawIndexWriter::Finish() {
  bool ok = FlushIndex();
  ok = index_.Close() && ok;
  if (!ok) Fail(index_.error());
  return out_->Close() && ok;
}
