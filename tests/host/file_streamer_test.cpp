#include <cstring>
#include <memory>
#include <vector>

#include <gtest/gtest.h>

#include "host/file_streamer.h"
#include "host/graph_clock.h"
#include "host/input_streams.h"
#include "platform/mmf_status.h"
#include "platform/read_list.h"

namespace {

constexpr uint32_t kElementBytes = 1;
constexpr uint32_t kElementProperty = 2;

// What one delivered input media buffer holds.
struct Delivered {
  bool has_marker = false;
  uint64_t marker = 0;
  uint64_t offset = 0;
  std::vector<uint8_t> bytes;
  const uint8_t* address = nullptr;
  MmfPoolBuffer* handle = nullptr;
};

Delivered Read(MmfMra* mra) {
  Delivered out;
  uint32_t kind = 0;
  for (uint32_t i = 0; MmfGetMraElementType(mra, i, &kind) == 0; ++i) {
    if (kind == kElementProperty) {
      uint32_t type = 0, low = 0;
      uint16_t high = 0;
      EXPECT_EQ(MmfGetMraPropertyElement(mra, i, &type, &low, &high), 0);
      if (type == kMmfPropTimeMarker) {
        EXPECT_EQ(i, 0u) << "the time marker heads the buffer";
        out.has_marker = true;
        out.marker = MmfPropertyValue(low, high);
      } else {
        EXPECT_EQ(type, uint32_t{kMmfPropFileOffset});
        out.offset = MmfPropertyValue(low, high);
      }
    } else {
      EXPECT_EQ(kind, kElementBytes);
      uint8_t* address = nullptr;
      uint32_t size = 0;
      EXPECT_EQ(MmfGetMraBufferElement(mra, i, &out.handle, &address, &size), 0);
      out.address = address;
      out.bytes.assign(address, address + size);
    }
  }
  return out;
}

std::vector<uint8_t> Pattern(size_t size) {
  std::vector<uint8_t> bytes(size);
  for (size_t i = 0; i < size; ++i) bytes[i] = static_cast<uint8_t>(i * 7 + i / 251);
  return bytes;
}

std::vector<uint8_t> Slice(const std::vector<uint8_t>& bytes, size_t from, size_t size) {
  return std::vector<uint8_t>(bytes.begin() + from, bytes.begin() + from + size);
}

class FileStreamerTest : public testing::Test {
 protected:
  void Make(size_t size, uint32_t buffer_size, bool seekable = true) {
    file_ = Pattern(size);
    source_ = host::MakeMemoryStream(file_.data(), file_.size(), seekable);
    streamer_ = std::make_unique<host::FileStreamer>(source_.get(), host::StreamerConfig{buffer_size, 8});
  }
  int Next(Delivered* delivered) {
    MmfMra* mra = nullptr;
    int result = host::FileStreamer::Ops()->NextBuffer(streamer_->output(), &mra);
    if (result == kMmfBufferDelivered) {
      *delivered = Read(mra);
      EXPECT_EQ(MmfReleaseMra(mra), 0);
    } else {
      EXPECT_EQ(mra, nullptr);
    }
    return result;
  }

  std::vector<uint8_t> file_;
  std::unique_ptr<host::InputStream> source_;
  std::unique_ptr<host::FileStreamer> streamer_;
};

TEST_F(FileStreamerTest, DeliversTheWholeFileInBufferSizedStretchesThenEndOfStream) {
  const struct {
    size_t file;
    uint32_t buffer;
  } cases[] = {{10000, 1000}, {10001, 1000}, {999, 1000}, {4096, 4096}, {1, 16}};
  for (const auto& c : cases) {
    SCOPED_TRACE(std::to_string(c.file) + " / " + std::to_string(c.buffer));
    Make(c.file, c.buffer);
    size_t offset = 0;
    Delivered delivered;
    while (Next(&delivered) == kMmfBufferDelivered) {
      EXPECT_FALSE(delivered.has_marker);
      EXPECT_EQ(delivered.offset, offset);
      size_t expected = std::min<size_t>(c.buffer, c.file - offset);
      ASSERT_EQ(delivered.bytes.size(), expected);
      EXPECT_EQ(delivered.bytes, Slice(file_, offset, expected));
      offset += expected;
    }
    EXPECT_EQ(offset, c.file);
    EXPECT_EQ(Next(&delivered), kMmfEndOfStream);
    EXPECT_EQ(streamer_->bytes_read(), c.file);
  }
}

TEST_F(FileStreamerTest, BytesAreReadStraightIntoTheDeliveredPoolBuffer) {
  Make(3000, 1000);
  MmfMra* mra = nullptr;
  ASSERT_EQ(host::FileStreamer::Ops()->NextBuffer(streamer_->output(), &mra), kMmfBufferDelivered);
  Delivered delivered = Read(mra);
  ASSERT_NE(delivered.handle, nullptr);
  EXPECT_EQ(delivered.address, delivered.handle->Data);
  // The media buffer holds the only reference: no copy of the bytes stays behind.
  EXPECT_EQ(host::BufferReferences(delivered.handle), 1u);
  EXPECT_EQ(source_->counters().bytes_read, 1000u);
  MmfReleaseMra(mra);
  EXPECT_EQ(host::BufferReferences(delivered.handle), 0u);
}

TEST_F(FileStreamerTest, BufferAfterASeekStartsWithATimeMarker) {
  Make(20000, 1000);
  Delivered delivered;
  ASSERT_EQ(Next(&delivered), kMmfBufferDelivered);
  const uint64_t kTime = 0x123456789ABull;  // needs all 48 bits
  EXPECT_EQ(streamer_->Seek(15500, kTime), 0);
  ASSERT_EQ(Next(&delivered), kMmfBufferDelivered);
  EXPECT_TRUE(delivered.has_marker);
  EXPECT_EQ(delivered.marker, kTime);
  EXPECT_EQ(delivered.offset, 15500u);
  EXPECT_EQ(delivered.bytes, Slice(file_, 15500, 1000));
  ASSERT_EQ(Next(&delivered), kMmfBufferDelivered);
  EXPECT_FALSE(delivered.has_marker);
  EXPECT_EQ(delivered.offset, 16500u);
}

TEST_F(FileStreamerTest, SeekAfterTheEndStartsStreamingAgain) {
  Make(1500, 1000);
  Delivered delivered;
  while (Next(&delivered) == kMmfBufferDelivered) {
  }
  EXPECT_EQ(streamer_->Seek(0, 0), 0);
  ASSERT_EQ(Next(&delivered), kMmfBufferDelivered);
  EXPECT_TRUE(delivered.has_marker);
  EXPECT_EQ(delivered.offset, 0u);
}

TEST_F(FileStreamerTest, UnknownOutputChannelIsRefused) {
  Make(100, 10);
  MmfChannel other{};
  MmfMra* mra = nullptr;
  EXPECT_EQ(host::FileStreamer::Ops()->NextBuffer(&other, &mra), 22);
  EXPECT_EQ(host::FileStreamer::Ops()->NextBuffer(streamer_->output(), nullptr), 22);
  EXPECT_EQ(host::FileStreamer::OfOutput(streamer_->output()), streamer_.get());
}

// A list maker that follows the framework protocol: asked without a previous
// entry it answers its current entry; asked with the current one it fills the
// next entry from its script.
struct ScriptedListMaker {
  struct Step {
    uint64_t position;
    uint64_t time;
    int32_t length;
  };
  std::vector<Step> script;
  size_t next = 0;
  MmfReadRequest requests[2]{};
  MmfReadListEntry entries[2]{};
  MmfReadListEntry* current = nullptr;
  int calls_with_previous = 0;
  int wrong_previous = 0;

  void Fill(MmfReadListEntry* entry, const Step& step) {
    entry->Request->Position = step.position;
    entry->Request->Time = step.time;
    entry->Request->Length = step.length;
    entry->Ready = 1;
  }
  void Start() {
    for (int i = 0; i < 2; ++i) {
      entries[i].Index = static_cast<uint32_t>(i);
      entries[i].RequestCount = 1;
      entries[i].Request = &requests[i];
    }
    current = &entries[0];
    Fill(current, script[next++]);
  }
  int Answer(MmfReadListEntry** out, MmfReadListEntry* previous) {
    if (previous) ++calls_with_previous;
    if (!previous || previous != current) {
      if (previous) ++wrong_previous;
      *out = current;
      return 0;
    }
    current = current == &entries[0] ? &entries[1] : &entries[0];
    current->Ready = 0;
    Fill(current, next < script.size() ? script[next++] : Step{0, 0, -1});
    *out = current;
    return 0;
  }
};

ScriptedListMaker* active_list_maker = nullptr;
MmfChannel downstream_input{};

int GetNextReadList(MmfChannel* input, MmfReadListEntry** entry, MmfReadListEntry* previous) {
  EXPECT_EQ(input, &downstream_input);
  return active_list_maker->Answer(entry, previous);
}

const MmfListMakerOps kListMaker = {.GetNextReadList = GetNextReadList};

class FileStreamerListModeTest : public FileStreamerTest {
 protected:
  void Start(std::vector<ScriptedListMaker::Step> script) {
    maker_.script = std::move(script);
    maker_.Start();
    active_list_maker = &maker_;
    streamer_->ConnectListMaker(&kListMaker, &downstream_input);
  }
  ScriptedListMaker maker_;
};

TEST_F(FileStreamerListModeTest, ReadsOnlyTheRequestedRangesUntilLengthMinusOne) {
  Make(50000, 1000);
  Start({{1000, 1000000, 2500}, {30000, 6000000, 700}, {42000, 11000000, 1000}});
  Delivered delivered;
  ASSERT_EQ(Next(&delivered), kMmfBufferDelivered);  // normal streaming before the switch
  EXPECT_EQ(delivered.offset, 0u);
  ASSERT_EQ(streamer_->SetListMode(1), 0);

  const struct {
    uint64_t offset;
    size_t size;
    bool marker;
    uint64_t time;
  } expected[] = {{1000, 1000, true, 1000000}, {2000, 1000, false, 0},      {3000, 500, false, 0},
                  {30000, 700, true, 6000000}, {42000, 1000, true, 11000000}};
  for (const auto& e : expected) {
    SCOPED_TRACE(e.offset);
    ASSERT_EQ(Next(&delivered), kMmfBufferDelivered);
    EXPECT_EQ(delivered.offset, e.offset);
    EXPECT_EQ(delivered.bytes, Slice(file_, e.offset, e.size));
    EXPECT_EQ(delivered.has_marker, e.marker);
    if (e.marker) {
      EXPECT_EQ(delivered.marker, e.time);
    }
  }
  EXPECT_EQ(Next(&delivered), kMmfEndOfStream);
  EXPECT_EQ(Next(&delivered), kMmfEndOfStream);
  EXPECT_EQ(maker_.calls_with_previous, 3);
  EXPECT_EQ(maker_.wrong_previous, 0);
  EXPECT_EQ(streamer_->bytes_read(), 1000u + 2500 + 700 + 1000);
}

TEST_F(FileStreamerListModeTest, FirstRequestOfLengthMinusOneEndsTheStreamAtOnce) {
  Make(5000, 1000);
  Start({{0, 0, -1}});
  ASSERT_EQ(streamer_->SetListMode(1), 0);
  Delivered delivered;
  EXPECT_EQ(Next(&delivered), kMmfEndOfStream);
  EXPECT_EQ(streamer_->bytes_read(), 0u);
}

TEST_F(FileStreamerListModeTest, ModeZeroStreamsOnFromTheCurrentRequest) {
  Make(20000, 1000);
  Start({{4000, 2000000, 1000}, {9000, 4500000, 1000}});
  ASSERT_EQ(streamer_->SetListMode(1), 0);
  Delivered delivered;
  ASSERT_EQ(Next(&delivered), kMmfBufferDelivered);
  EXPECT_EQ(delivered.offset, 4000u);
  // The scan ends: the list maker's current entry names where normal play resumes.
  MmfReadListEntry* entry = nullptr;
  ASSERT_EQ(maker_.Answer(&entry, maker_.current), 0);
  ASSERT_EQ(streamer_->SetListMode(0), 0);
  ASSERT_EQ(Next(&delivered), kMmfBufferDelivered);
  EXPECT_TRUE(delivered.has_marker);
  EXPECT_EQ(delivered.marker, 4500000u);
  EXPECT_EQ(delivered.offset, 9000u);
  ASSERT_EQ(Next(&delivered), kMmfBufferDelivered);
  EXPECT_FALSE(delivered.has_marker);
  EXPECT_EQ(delivered.offset, 10000u);
}

TEST_F(FileStreamerListModeTest, ListModeWithoutAListMakerAnswers4044) {
  Make(100, 10);
  EXPECT_EQ(streamer_->SetListMode(1), 4044);
}

TEST_F(FileStreamerListModeTest, ReadListSwitchesTheStreamerItsChannelIsConnectedTo) {
  Make(20000, 1000);
  Start({{6000, 3000000, 1000}});
  MmfChannel input{};
  input.Kind = kMmfChannelKind;
  input.Direction = kMmfDirectionInput;
  MmfReadList* list = nullptr;
  ASSERT_EQ(MmfAllocateReadlist(&list, &input, 2, 2), 0);
  EXPECT_EQ(MmfStreamerSetListMode(list, 1), 4044);  // not connected to any streamer yet
  input.Peer = streamer_->output();
  ASSERT_EQ(MmfStreamerSetListMode(list, 1), 0);
  Delivered delivered;
  ASSERT_EQ(Next(&delivered), kMmfBufferDelivered);
  EXPECT_EQ(delivered.offset, 6000u);
  EXPECT_EQ(delivered.marker, 3000000u);
  EXPECT_EQ(Next(&delivered), kMmfEndOfStream);
  EXPECT_EQ(MmfStreamerSetListMode(nullptr, 1), 22);
  MmfFreeReadlist(list);
}

TEST(GraphClockTest, ReportsTheMediaTimeConsumedOnTheAttachedGraph) {
  host::GraphClock clock;
  auto* graph = reinterpret_cast<MmfGraph*>(&clock);  // any distinct address names a graph
  MmfClock* handle = nullptr;
  const MmfClockOps* ops = nullptr;
  EXPECT_EQ(MmfGetGraphClock(graph, &handle, &ops), 4044);
  host::AttachGraphClock(graph, &clock);
  ASSERT_EQ(MmfGetGraphClock(graph, &handle, &ops), 0);
  ASSERT_NE(ops, nullptr);
  EXPECT_EQ(ops->GetTime(handle, 0, 1, 0, 0, 0), 0u);
  clock.Consumed(7250000);
  EXPECT_EQ(ops->GetTime(handle, 0, 1, 0, 0, 0), 7250000u);
  host::AttachGraphClock(graph, nullptr);
  EXPECT_EQ(MmfGetGraphClock(graph, &handle, &ops), 4044);
  EXPECT_EQ(MmfGetGraphClock(nullptr, &handle, &ops), 22);
}

}  // namespace
