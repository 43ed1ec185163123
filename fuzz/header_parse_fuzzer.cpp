// The header parse over arbitrary bytes, configured as its real callers do:
// valid_mkv through the sniffer's peek-mode stream, then parse_mkvfile with the
// creators' limits and a metadata list, through a buffered or an unbuffered
// stream as the first input byte chooses. Every answer must be one of the
// declared ones and every block the parse allocated must be freed again.

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "core/file_model.h"
#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "host/heap_control.h"
#include "host/input_streams.h"
#include "host/log_control.h"
#include "stream/mkvvstream.h"

namespace {

void Check(bool condition) {
  if (!condition) std::abort();
}

bool IsCoreStatus(int status) {
  return status == kStatusOk || status == kStatusReadFailed || status == kStatusNoMemory ||
         status == kStatusMalformed;
}

void Run(const uint8_t* data, size_t size, bool seekable, int64_t buffer_size) {
  auto input = host::MakeMemoryStream(data, size, seekable, "fuzz");
  int64_t live_before = host::LiveBlockCount();
  {
    mkvvstream stream{};
    if (mkvvstream_init(&stream, input->record(), 500, 1, kFillWithPeek, 1) != 0) return;
    auto info = std::make_unique<mkv_file_info>();
    std::memset(info.get(), 0, sizeof *info);
    Check(IsCoreStatus(valid_mkv(&stream, info.get())));
    destroy_mkv_file_info(info.get());
    mkvvstream_destroy(&stream);
  }
  {
    auto restarted = host::MakeMemoryStream(data, size, seekable, "fuzz");
    mkvvstream stream{};
    if (mkvvstream_init(&stream, restarted->record(), buffer_size, 1, kFillWithRead, seekable ? 1 : 0) != 0) return;
    auto info = std::make_unique<mkv_file_info>();
    std::memset(info.get(), 0, sizeof *info);
    mkv_parse_limits limits{kDefaultMaxStringSize, seekable ? 1u : 0u};
    info->parse_limits = &limits;
    info->metadata = mem_new_zeroed<mkv_metadata_list>();
    if (!info->metadata) std::abort();
    int result = parse_mkvfile(info.get(), &stream);
    Check(result == kParseSucceeded || result == kParseMalformed || result == kParseIncomplete ||
          result == kParseNoMemory);
    Check(info->track_count <= kMaxTracks && info->tag_count <= kMaxTags &&
          info->seek_head_count <= kMaxSeekLists);
    Check(info->metadata->entry_count >= 0 && info->metadata->entry_count <= kMaxMetadataEntries);
    Check(std::memchr(info->doc_type, 0, sizeof info->doc_type) != nullptr);
    FreeMetadata(info->metadata);
    destroy_mkv_file_info(info.get());
    mkvvstream_destroy(&stream);
  }
  Check(host::LiveBlockCount() == live_before);
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  host::SetLogThreshold(0);
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 1) return 0;
  uint8_t mode = data[0];
  Run(data + 1, size - 1, (mode & 1) == 0, (mode & 2) ? 480 : 240);
  return 0;
}
