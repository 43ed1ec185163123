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

#include <cstring>
#include <memory>

#include "core/file_model.h"
#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "filter/metadata_parser.h"
#include "fuzz/fuzz_input.h"
#include "host/input_streams.h"
#include "platform/mmf_status.h"
#include "stream/mkvvstream.h"

namespace {

using fuzz_input::Check;
using fuzz_input::OneOf;

// valid_mkv through a peek-mode stream, then parse_mkvfile through a read-mode one.
void Run(const uint8_t* data, size_t size, bool seekable, int64_t buffer_size) {
  for (const bool peek : {true, false}) {
    auto input = host::MakeMemoryStream(data, size, seekable, "fuzz");
    mkvvstream stream{};
    if (mkvvstream_init(&stream, input->record(), peek ? 500 : buffer_size, 1, peek ? kFillWithPeek : kFillWithRead,
                        peek || seekable ? 1 : 0) != 0) {
      return;
    }
    auto info = std::make_unique<mkv_file_info>();
    std::memset(info.get(), 0, sizeof *info);
    mkv_parse_limits limits{kDefaultMaxStringSize, seekable ? 1u : 0u};
    if (peek) {
      Check(OneOf(valid_mkv(&stream, info.get()), {kStatusOk, kStatusReadFailed, kStatusNoMemory, kStatusMalformed}),
            "valid_mkv");
    } else {
      info->parse_limits = &limits;
      info->metadata = mem_new_zeroed<mkv_metadata_list>();
      Check(info->metadata != nullptr, "metadata list");
      Check(OneOf(parse_mkvfile(info.get(), &stream), {kParseSucceeded, kParseMalformed, kParseIncomplete, kParseNoMemory}),
            "parse_mkvfile");
      Check(info->track_count <= kMaxTracks && info->tag_count <= kMaxTags && info->seek_head_count <= kMaxSeekLists,
            "a table overrun");
      Check(info->metadata->entry_count >= 0 && info->metadata->entry_count <= kMaxMetadataEntries, "metadata overrun");
      Check(std::memchr(info->doc_type, 0, sizeof info->doc_type) != nullptr, "DocType unterminated");
      FreeMetadata(info->metadata);
    }
    destroy_mkv_file_info(info.get());
    mkvvstream_destroy(&stream);
  }
}

// Every entry as iteration hands it out, and each found again by its key and
// occurrence (width and height only after a video MediaType).
void CheckMetadataQueries(const mkv_metadata_list* list) {
  Check(list->entry_count >= 0 && list->entry_count <= kMaxMetadataEntries, "entry count");
  Check(list->owner_flags & kMetadataFromCompleteParse, "owner flags");
  int32_t index = 0;
  char* key = nullptr;
  MmfMetadataValue value{}, found{};
  while (Parser_IterateMetadata(list, &index, &key, &value) == 1) {
    const int32_t i = index - 1;
    Check(key != nullptr && std::memchr(key, 0, 4096) != nullptr, "key");
    const int64_t fixed = value.Type == kMetadataTypeNum4 ? 4 : value.Type == kMetadataTypeNum8 ? 8 : value.Size;
    Check(OneOf(value.Type, {kMetadataTypeUtf8, kMetadataTypeNum4, kMetadataTypeNum8}) && value.Size == fixed,
          "value type", value.Type);
    Check(value.Size >= 0 && value.Size <= kMaxMetadataValueSize && value.Size == list->value_size[i], "value size");
    const auto* bytes = static_cast<const volatile uint8_t*>(MmfMetadataData(&value));
    Check(value.Size == 0 || bytes != nullptr, "value data");
    for (int64_t b = 0; b < value.Size; ++b) (void)bytes[b];  // every byte readable
    uint32_t occurrence = 0;
    for (int32_t j = 0; j < i; ++j) occurrence += strcasecmp(list->key[j], key) == 0 ? 1 : 0;
    if (Parser_QueryMetadata(list, key, occurrence, &found) == 1) {
      Check(found.Data == value.Data && found.Size == value.Size && found.Type == value.Type, "query answer");
    } else {
      Check(strcasecmp(key, "width") == 0 || strcasecmp(key, "height") == 0, "an entry not found by its key");
    }
  }
  Check(index == list->entry_count, "iteration end");
  Check(Parser_QueryMetadata(list, "no such key", 0, &found) == 0, "an unknown key found");
  index = -1;
  Check(Parser_IterateMetadata(list, &index, &key, &found) == 0 && index == -1, "iteration from -1");
}

void RunMetadataParse(const uint8_t* data, size_t size, bool seekable, uint64_t failing_allocation) {
  auto input = host::MakeMemoryStream(data, size, seekable, "fuzz");
  mkv_metadata_list* list = nullptr;
  host::FailNthAllocation(failing_allocation);
  const int result = Parser_ParseMetadata(input->record(), &list);
  host::FailNthAllocation(0);
  Check(OneOf(result, {kMmfOk, kMmfNoConversion, kStatusNoMemory, kStatusMalformed}), "Parser_ParseMetadata", result);
  Check((result == kMmfOk) == (list != nullptr), "a list without success");
  if (list) {
    CheckMetadataQueries(list);
    Parser_FreeMetadata(list);
  }
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  host::SetLogThreshold(0);
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 1) return 0;
  const uint8_t mode = data[0];
  fuzz_input::ExpectNoBlockLeft([&] { Run(data + 1, size - 1, (mode & 1) == 0, (mode & 2) ? 480 : 240); });
  fuzz_input::ExpectNoBlockLeft(
      [&] { RunMetadataParse(data + 1, size - 1, (mode & 1) == 0, (mode & 4) ? mode >> 3 : 0); });
  return 0;
}
