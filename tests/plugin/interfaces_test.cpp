#include <cstring>

#include <gtest/gtest.h>

#include "tests/plugin/plugin_loader.h"

namespace {

using plugin_test::LoadPlugin;

struct ExpectedRow {
  const char* name;
  int32_t version;
  size_t slots;  // function pointers in the table
};

const ExpectedRow kRows[] = {
    {"MediaFilter", 110, 2},        {"MediaInput", 101, 7},       {"MediaOutput", 101, 8},
    {"MediaFlush", 100, 1},         {"MediaTimeConverter", 100, 2}, {"MediaSeeker", 102, 2},
    {"AOStreamInspector", 100, 1},  {"AOResourceAccess", 100, 2}, {"MediaControl", 101, 5},
    {"MediaEventProducer", 100, 3}, {"MediaSetInputPosition", 100, 1}, {"MediaTrickPlay", 100, 4},
    {"MediaListMaker", 100, 1},     {"MediaMetadataParser", 100, 5},
};

TEST(InterfacesTest, RowsComeInTheFrameworkOrderAndEndWithZeros) {
  const AoInterface* rows = LoadPlugin().interfaces;
  ASSERT_NE(rows, nullptr);
  EXPECT_STREQ(rows[0].Name, "Name");
  EXPECT_EQ(rows[0].Version, 1);
  EXPECT_STREQ(static_cast<const char*>(rows[0].Interface), "kelvane");
  EXPECT_STREQ(rows[1].Name, "Version");
  EXPECT_EQ(rows[1].Version, 100);
  EXPECT_EQ(rows[1].Interface, nullptr);
  for (size_t i = 0; i < std::size(kRows); ++i) {
    SCOPED_TRACE(kRows[i].name);
    EXPECT_STREQ(rows[i + 2].Name, kRows[i].name);
    EXPECT_EQ(rows[i + 2].Version, kRows[i].version);
    EXPECT_NE(rows[i + 2].Interface, nullptr);
  }
  const AoInterface& end = rows[2 + std::size(kRows)];
  EXPECT_EQ(end.Name, nullptr);
  EXPECT_EQ(end.Version, 0);
  EXPECT_EQ(end.Interface, nullptr);
}

TEST(InterfacesTest, EverySlotIsFilledExceptTheFirstThreeOfMediaInput) {
  for (const ExpectedRow& expected : kRows) {
    SCOPED_TRACE(expected.name);
    const AoInterface* row = LoadPlugin().Row(expected.name);
    ASSERT_NE(row, nullptr);
    const auto* slots = static_cast<void* const*>(row->Interface);
    for (size_t slot = 0; slot < expected.slots; ++slot) {
      bool reserved = std::strcmp(expected.name, "MediaInput") == 0 && slot < 3;
      if (reserved) {
        EXPECT_EQ(slots[slot], nullptr) << "slot " << slot;
      } else {
        EXPECT_NE(slots[slot], nullptr) << "slot " << slot;
      }
    }
  }
}

}  // namespace
