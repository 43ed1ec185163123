#include <cstring>

#include "core/file_model.h"
#include "core/header/element_walker.h"
#include "core/status.h"
#include "filter/rating.h"
#include "platform/ao_log.h"
#include "stream/mkvvstream.h"

namespace {

constexpr int64_t kSniffBufferSize = 500;

}  // namespace

int SniffStream(const MmfInputStream* stream) {
  // Both records live on this stack: sniffing allocates nothing but the stream's buffer.
  mkv_file_info info;
  std::memset(&info, 0, sizeof info);
  mkvvstream vstream;
  std::memset(&vstream, 0, sizeof vstream);
  if (mkvvstream_init(&vstream, stream, kSniffBufferSize, 1, kFillWithPeek, 1) != 0) {
    AoLog(kAoLogFailure, "kelvane: SniffStream() couldn't create vstream.");
    return kRatingRefused;
  }
  int status = valid_mkv(&vstream, &info);
  destroy_mkv_file_info(&info);
  mkvvstream_destroy(&vstream);
  return status == kStatusOk ? kRatingAccepted : kRatingRefused;
}
