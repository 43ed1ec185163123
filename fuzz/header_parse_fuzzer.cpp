// The header parse over arbitrary bytes, configured as its real callers do:
// valid_mkv through the sniffer's peek-mode stream, then parse_mkvfile with the
// creators' limits and a metadata list, through a buffered or an unbuffered
// stream as the first input byte chooses; then the metadata parser
// interface's own parse (Parser_ParseMetadata) and its queries over every
// entry, optionally with one allocation failing. Every answer must be one of
// the declared ones and every block the parse allocated must be freed again.
//
// First byte: bit 0 unseekable, bit 1 larger stream buffers, bit 2 the
// metadata parse's nth allocation fails, n = bits 3-7 (0: none).

#include <strings.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "core/file_model.h"
#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "filter/metadata_parser.h"
#include "host/heap_control.h"
#include "host/input_streams.h"
#include "host/log_control.h"
#include "platform/mmf_status.h"
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

// Every entry as iteration hands it out, and each found again by its key and
// occurrence (width and height only after a video MediaType).
void CheckMetadataQueries(const mkv_metadata_list* list) {
  Check(list->entry_count >= 0 && list->entry_count <= kMaxMetadataEntries);
  Check(list->owner_flags & kMetadataFromCompleteParse);
  int32_t index = 0;
  char* key = nullptr;
  MmfMetadataValue value{};
  uint32_t sum = 0;
  while (Parser_IterateMetadata(list, &index, &key, &value) == 1) {
    const int32_t i = index - 1;
    Check(key != nullptr && std::memchr(key, 0, 4096) != nullptr);
    Check(value.Type == kMetadataTypeUtf8 || value.Type == kMetadataTypeNum4 || value.Type == kMetadataTypeNum8);
    Check(value.Type != kMetadataTypeNum4 || value.Size == 4);
    Check(value.Type != kMetadataTypeNum8 || value.Size == 8);
    Check(value.Size >= 0 && value.Size <= kMaxMetadataValueSize && value.Size == list->value_size[i]);
    const auto* bytes = static_cast<const uint8_t*>(MmfMetadataData(&value));
    Check(value.Size == 0 || bytes != nullptr);
    for (int64_t b = 0; b < value.Size; ++b) sum += bytes[b];
    uint32_t occurrence = 0;
    for (int32_t j = 0; j < i; ++j) occurrence += strcasecmp(list->key[j], key) == 0 ? 1 : 0;
    MmfMetadataValue found{};
    if (Parser_QueryMetadata(list, key, occurrence, &found) == 1) {
      Check(found.Data == value.Data && found.Size == value.Size && found.Type == value.Type);
    } else {
      Check(strcasecmp(key, "width") == 0 || strcasecmp(key, "height") == 0);
    }
  }
  Check(index == list->entry_count);
  MmfMetadataValue none{};
  Check(Parser_QueryMetadata(list, "no such key", 0, &none) == 0);
  index = -1;
  Check(Parser_IterateMetadata(list, &index, &key, &none) == 0 && index == -1);
  (void)sum;
}

void RunMetadataParse(const uint8_t* data, size_t size, bool seekable, uint64_t failing_allocation) {
  auto input = host::MakeMemoryStream(data, size, seekable, "fuzz");
  const int64_t live_before = host::LiveBlockCount();
  mkv_metadata_list* list = nullptr;
  host::FailNthAllocation(failing_allocation);
  const int result = Parser_ParseMetadata(input->record(), &list);
  host::FailNthAllocation(0);
  Check(result == kMmfOk || result == kMmfNoConversion || result == kStatusNoMemory || result == kStatusMalformed);
  Check((result == kMmfOk) == (list != nullptr));
  if (list) {
    CheckMetadataQueries(list);
    Parser_FreeMetadata(list);
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
  RunMetadataParse(data + 1, size - 1, (mode & 1) == 0, (mode & 4) ? mode >> 3 : 0);
  return 0;
}
