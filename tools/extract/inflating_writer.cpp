#include "tools/extract/inflating_writer.h"

#include <zlib.h>

namespace {

constexpr size_t kMaxFrameSize = size_t{1} << 30;  // a bound for what one stored frame may inflate to

}  // namespace

bool InflatingWriter::Inflate(const Bytes& stored, Bytes* plain) {
  z_stream zs{};
  if (inflateInit(&zs) != Z_OK) return Fail("zlib cannot start inflating");
  zs.next_in = const_cast<Bytef*>(stored.data());
  zs.avail_in = static_cast<uInt>(stored.size());
  plain->resize(std::max<size_t>(stored.size() * 4, 256));
  int status = Z_OK;
  while (status == Z_OK) {
    if (zs.total_out == plain->size()) {
      if (plain->size() >= kMaxFrameSize) break;
      plain->resize(plain->size() * 2);
    }
    zs.next_out = plain->data() + zs.total_out;
    zs.avail_out = static_cast<uInt>(plain->size() - zs.total_out);
    status = inflate(&zs, Z_NO_FLUSH);
    if (status == Z_BUF_ERROR && zs.avail_out != 0) break;  // the stored bytes end before the stream does
    if (status == Z_BUF_ERROR) status = Z_OK;
  }
  plain->resize(zs.total_out);
  inflateEnd(&zs);
  return status == Z_STREAM_END || Fail("a frame is not a complete zlib stream");
}

bool InflatingWriter::Begin(const std::vector<Bytes>& config) {
  if (!config_compressed_) return inner_->Begin(config) || Fail(inner_->error());
  std::vector<Bytes> plain(config.size());
  for (size_t i = 0; i < config.size(); ++i) {
    if (!Inflate(config[i], &plain[i])) return false;
  }
  return inner_->Begin(plain) || Fail(inner_->error());
}

bool InflatingWriter::Frame(const FrameView& frame) {
  stored_.resize(frame.size);
  (void)CopyFrameBytes(frame, 0, frame.size, stored_.data());
  if (!Inflate(stored_, &plain_)) return false;
  const iovec piece{plain_.data(), plain_.size()};
  FrameView inflated{&piece, 1, plain_.size(), frame.time_us};
  return inner_->Frame(inflated) || Fail(inner_->error());
}
