#include <gtest/gtest.h>

#include <utility>
#include <vector>

#include "core/header/element_handlers.h"
#include "core/status.h"
#include "host/heap_control.h"
#include "platform/ao_log.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"
#include "tests/support/log_recorder.h"

namespace {

using namespace ebml;
using testing_support::HeaderParse;
using Entries = std::vector<std::pair<uint32_t, uint64_t>>;  // seek_id, seek_position

Bytes seek(uint32_t target, uint64_t position) {
  return master(kSeek, {element(kSeekId, id_bytes(target)), uinteger(kSeekPosition, position)});
}

// Runs the handler over `payload` as the data of one SeekHead.
int run_handler(HeaderParse& parse, const Bytes& payload) {
  uint32_t id = kSeekHead;
  uint64_t size = payload.size();
  return mkv_meta_seek_handler(&parse.info(), &parse.stream(), &id, &size);
}

Entries entries_of(const mkv_queue& list) {
  Entries out;
  mkv_queue_node* node = list.head;
  for (uint32_t i = 0; i < list.count; ++i, node = node->next) {
    const auto* entry = static_cast<const mkv_seek_entry*>(node->data);
    out.emplace_back(entry->seek_id, entry->seek_position);
  }
  return out;
}

TEST(MetaSeekHandlerTest, EntriesAreSortedByPositionKeepingFileOrderOfTies) {
  const struct {
    const char* name;
    Bytes payload;
    Entries sorted;
  } cases[] = {
      {"cues, info, tracks", cat({seek(kCues, 5000), seek(kInfo, 100), seek(kTracks, 300)}),
       {{kInfo, 100}, {kTracks, 300}, {kCues, 5000}}},
      {"equal positions", cat({seek(kTags, 70), seek(kCues, 70), seek(kInfo, 9), seek(kTracks, 70)}),
       {{kInfo, 9}, {kTags, 70}, {kCues, 70}, {kTracks, 70}}},
      {"position over 32 bits", seek(kCues, 12345678901ull), {{kCues, 12345678901ull}}},
      {"no SeekPosition points at the segment's start", cat({seek(kTags, 4), master(kSeek, {element(kSeekId, id_bytes(kCues))})}),
       {{kCues, 0}, {kTags, 4}}},
      {"one-byte stored ID", seek(kVoid, 8), {{kVoid, 8}}},
      {"unknown children and a Void", cat({bin(kVoid, filler(3)), master(kSeek, {bin(0x4321, filler(2)), seek(kInfo, 6)})}),
       {{0, 0}, {kInfo, 6}}},
      // A SeekHead without a Seek is not counted.
      {"empty", {}, {}},
      {"only a Void", bin(kVoid, filler(5)), {}},
      {"Seek children without their Seek", cat({element(kSeekId, id_bytes(kCues)), uinteger(kSeekPosition, 9)}), {}},
  };
  for (const auto& c : cases) {
    HeaderParse parse(cat({c.payload, filler(4)}));
    ASSERT_EQ(run_handler(parse, c.payload), kStatusOk) << c.name;
    EXPECT_EQ(entries_of(parse.info().seek_lists[0]), c.sorted) << c.name;
    EXPECT_EQ(parse.info().seek_head_count, c.sorted.empty() ? 0 : 1) << c.name;
    EXPECT_EQ((parse.info().parse_flags & kMetSeekHead) != 0, !c.sorted.empty()) << c.name;
  }
}

// A damaged SeekHead is dropped and the walk goes on behind it; a value that
// cannot be read fails the element. Either way no entry is kept.
TEST(MetaSeekHandlerTest, DamagedSeekHeadIsDroppedAndBadValuesFailTheElement) {
  const struct {
    const char* name;
    Bytes payload;
    int status;
  } cases[] = {
      {"malformed child ID", cat({seek(kInfo, 1), Bytes{0x00, 0x81, 0x00}, seek(kCues, 2)}), kStatusOk},
      {"malformed child size", cat({seek(kInfo, 1), Bytes{0xEC, 0x00}, seek(kCues, 2)}), kStatusOk},
      {"stored ID of five bytes", cat({seek(kInfo, 1), master(kSeek, {element(kSeekId, Bytes{0x08, 1, 2, 3, 4})})}),
       kStatusOk},
      {"stored ID starting with 0x00", cat({seek(kInfo, 1), master(kSeek, {element(kSeekId, Bytes{0x00})})}), kStatusOk},
      {"SeekPosition of 9 bytes",
       cat({seek(kInfo, 1), master(kSeek, {element(kSeekId, id_bytes(kCues)), element(kSeekPosition, filler(9))})}),
       kStatusMalformed},
      {"SeekID of 9 bytes", cat({seek(kInfo, 1), master(kSeek, {element(kSeekId, filler(9, 0x81))})}), kStatusMalformed},
      // The element claims 4 bytes of position but the file ends after 2.
      {"short SeekPosition",
       cat({seek(kInfo, 1), id_bytes(kSeek), size_bytes(7), id_bytes(kSeekPosition), size_bytes(4), Bytes{1, 2}}),
       kStatusReadFailed},
  };
  for (const auto& c : cases) {
    int64_t live = host::LiveBlockCount();
    {
      HeaderParse parse(c.status == kStatusOk ? cat({c.payload, filler(8)}) : c.payload);
      EXPECT_EQ(run_handler(parse, c.payload), c.status) << c.name;
      if (c.status == kStatusOk) {
        EXPECT_EQ(mkvvstream_tell(&parse.stream()), c.payload.size()) << c.name;
      }
      EXPECT_EQ(parse.info().seek_head_count, 0) << c.name;
      EXPECT_EQ(parse.info().seek_lists[0].head, nullptr) << c.name;
      EXPECT_FALSE(parse.info().parse_flags & kMetSeekHead) << c.name;
    }
    EXPECT_EQ(host::LiveBlockCount(), live) << c.name;
  }
}

TEST(MetaSeekHandlerTest, FailedAllocationIsLoggedAndLeavesNothing) {
  Bytes payload = cat({seek(kInfo, 1), seek(kTracks, 2)});
  const struct {
    uint64_t failing;  // 3: the second entry, 4: its node
    const char* message;
  } cases[] = {
      {3, "Can't allocate new seek entry."},
      {4, "Can't allocate new queue entry."},
  };
  for (const auto& c : cases) {
    int64_t live = host::LiveBlockCount();
    {
      testing_support::LogRecorder log;
      HeaderParse parse(payload);
      host::FailNthAllocation(c.failing);
      EXPECT_EQ(run_handler(parse, payload), kStatusNoMemory) << c.failing;
      host::FailNthAllocation(0);
      EXPECT_TRUE(log.Contains(kAoLogNotice, c.message)) << c.failing;
      EXPECT_EQ(parse.info().seek_lists[0].count, 0u);
      EXPECT_EQ(parse.info().seek_head_count, 0);
    }
    EXPECT_EQ(host::LiveBlockCount(), live) << c.failing;
  }
}

TEST(MetaSeekHandlerTest, EachSeekHeadTakesTheNextListAndFiftyAreKept) {
  Bytes segment_children;
  for (int i = 0; i < 52; ++i) {
    Bytes one = master(kSeekHead, {seek(kInfo, static_cast<uint64_t>(i))});
    segment_children.insert(segment_children.end(), one.begin(), one.end());
  }
  int64_t live = host::LiveBlockCount();
  {
    HeaderParse parse(cat({ebml_header(), element(kSegment, segment_children)}));
    (void)parse.Parse();
    ASSERT_EQ(parse.info().seek_head_count, kMaxSeekLists);
    EXPECT_EQ(entries_of(parse.info().seek_lists[0]), (Entries{{kInfo, 0}}));
    EXPECT_EQ(entries_of(parse.info().seek_lists[49]), (Entries{{kInfo, 49}}));
  }
  EXPECT_EQ(host::LiveBlockCount(), live);
}

}  // namespace
