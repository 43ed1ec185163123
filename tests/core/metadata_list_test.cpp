#include "core/metadata_list.h"

#include <gtest/gtest.h>

#include <cstring>

#include "core/memory.h"
#include "core/status.h"
#include "host/heap_control.h"

namespace {

TEST(AddMetadataEntryTest, ValueSizeDecidesWhetherTheEntryIsAdded) {
  static const uint8_t bytes[kMaxMetadataValueSize + 1] = {1, 2, 3};
  const struct {
    int32_t size;
    int status;
  } cases[] = {
      {-1, kStatusNoMemory}, {0, kStatusOk}, {3, kStatusOk}, {kMaxMetadataValueSize, kStatusOk},
      {kMaxMetadataValueSize + 1, kStatusNoMemory}, {INT32_MIN, kStatusNoMemory},
  };
  for (const auto& c : cases) {
    int64_t live = host::LiveBlockCount();
    auto* list = mem_new_zeroed<mkv_metadata_list>();
    ASSERT_NE(list, nullptr);
    EXPECT_EQ(add_metadata_entry(list, "NUM8", "Key", bytes, c.size), c.status) << c.size;
    if (c.status == kStatusOk) {
      ASSERT_EQ(list->entry_count, 1) << c.size;
      EXPECT_STREQ(list->key[0], "Key");
      EXPECT_EQ(list->value_type[0], kMetadataTypeNum8);
      EXPECT_EQ(list->value_size[0], c.size);
      ASSERT_NE(list->value[0], nullptr);
      EXPECT_EQ(std::memcmp(list->value[0], bytes, static_cast<size_t>(c.size)), 0);
    } else {
      EXPECT_EQ(list->entry_count, 0) << c.size;
      EXPECT_EQ(list->key[0], nullptr);
      EXPECT_EQ(list->value[0], nullptr);
    }
    FreeMetadata(list);
    EXPECT_EQ(host::LiveBlockCount(), live) << c.size;
  }
}

}  // namespace
