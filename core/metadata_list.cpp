#include "core/metadata_list.h"

#include <cstring>

#include "core/codec_table.h"
#include "core/memory.h"
#include "core/status.h"

int add_metadata_entry(mkv_metadata_list* list, const char* type, const char* key, const void* value,
                       int32_t size) {
  if (list->entry_count < 0 || list->entry_count >= kMaxMetadataEntries) return kStatusNoMemory;
  int32_t entry = list->entry_count;

  size_t key_size = std::strlen(key) + 1;
  auto* key_copy = static_cast<char*>(mem_alloc(key_size));
  if (!key_copy) return kStatusNoMemory;
  std::memcpy(key_copy, key, key_size);

  // An empty value still gets a block of its own, so a set value pointer
  // always means "owned" whatever the heap answers for zero bytes.
  void* value_copy = nullptr;
  if (size >= 0 && size <= kMaxMetadataValueSize) value_copy = mem_alloc(size == 0 ? 1 : static_cast<size_t>(size));
  if (!value_copy) {
    mem_free(key_copy);
    list->key[entry] = nullptr;
    list->value[entry] = nullptr;
    return kStatusNoMemory;
  }
  if (size > 0) std::memcpy(value_copy, value, static_cast<size_t>(size));

  list->key[entry] = key_copy;
  list->value[entry] = value_copy;
  list->value_type[entry] = fourcc_value(type);
  list->value_size[entry] = size;
  ++list->entry_count;
  return kStatusOk;
}

void FreeMetadata(mkv_metadata_list* list) {
  if (!list) return;
  int32_t entries = list->entry_count < kMaxMetadataEntries ? list->entry_count : kMaxMetadataEntries;
  for (int32_t i = 0; i < entries; ++i) {
    mem_free(list->key[i]);
    mem_free(list->value[i]);
  }
  mem_free(list);
}
