// The metadata parser interface over arbitrary bytes: its own header parse
// (Parser_ParseMetadata), optionally with one allocation failing, then its
// queries over every entry. Every answer must be one of the declared ones and
// every block the parse allocated must be freed again. The header parse's own
// answers, limits and tables are pinned by the header parse tests and by the
// plug-in fuzzer, whose rating runs the same parse.
//
// First byte: bit 0 unseekable, bit 2 the parse's nth allocation fails,
// n = bits 3-7 (0: none); bit 1 is left unused.

#include <strings.h>

#include <cstring>

#include "core/metadata_list.h"
#include "core/status.h"
#include "filter/metadata_parser.h"
#include "fuzz/fuzz_input.h"
#include "host/input_streams.h"
#include "platform/mmf_status.h"

namespace {

using fuzz_input::Check;
using fuzz_input::OneOf;

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
  fuzz_input::ExpectNoBlockLeft(
      [&] { RunMetadataParse(data + 1, size - 1, (mode & 1) == 0, (mode & 4) ? mode >> 3 : 0); });
  return 0;
}
