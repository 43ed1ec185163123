// The host's input streams (file and memory, seekable or pipe-like) and the
// file streamer that delivers them as input media buffers, normally and in
// list mode. Whole fixtures in every buffer size go through both in the
// sweep and plug-in tests; here are the markers, the list protocol and the
// answers to misuse.

#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/file_streamer.h"
#include "host/graph_clock.h"
#include "host/input_streams.h"
#include "platform/mmf_status.h"
#include "platform/read_list.h"

namespace {

using Bytes = std::vector<uint8_t>;

Bytes Pattern(size_t size) {
  Bytes bytes(size);
  for (size_t i = 0; i < size; ++i) bytes[i] = static_cast<uint8_t>(i * 7 + i / 251);
  return bytes;
}

Bytes Slice(const Bytes& bytes, size_t from, size_t size) { return Bytes(bytes.begin() + from, bytes.begin() + from + size); }

TEST(HostInputStreamTest, PeekReadSeekAndLengthFollowTheKind) {
  const Bytes bytes = Pattern(10000);
  char path[] = "/tmp/kelvane-stream-XXXXXX";
  int fd = mkstemp(path);
  ASSERT_EQ(write(fd, bytes.data(), bytes.size()), 10000);
  close(fd);
  for (bool file : {true, false}) {
    for (bool seekable : {true, false}) {
      SCOPED_TRACE(std::string(file ? "file" : "memory") + (seekable ? ", seekable" : ", pipe-like"));
      auto stream = file ? host::OpenFileStream(path, seekable) : host::MakeMemoryStream(bytes.data(), bytes.size(), seekable);
      ASSERT_NE(stream, nullptr);
      void* handle = stream->record()->Handle;
      const MmfInputStreamOps* ops = stream->record()->Ops;
      Bytes peeked(600), read(20000);
      ASSERT_EQ(ops->Peek(handle, peeked.data(), 600), 600);
      ASSERT_EQ(ops->Read(handle, read.data(), 1000), 1000);
      EXPECT_EQ(peeked, Slice(bytes, 0, 600));  // the peek consumed nothing
      EXPECT_EQ(Slice(read, 0, 1000), Slice(bytes, 0, 1000));
      EXPECT_EQ(ops->Tell(handle), 1000);
      EXPECT_EQ(ops->Length(handle), seekable ? bytes.size() : 0u);
      EXPECT_EQ(ops->Seek(handle, 1000, 0), 1000);  // where it stands: always fine
      EXPECT_EQ(ops->Seek(handle, 5000, 0), seekable ? 5000 : -1);
      ASSERT_EQ(ops->Read(handle, read.data(), 1), 1);
      EXPECT_EQ(read[0], bytes[seekable ? 5000 : 1000]);
      EXPECT_EQ(ops->Read(handle, read.data(), read.size()), seekable ? 4999 : 8999);
      EXPECT_EQ(ops->Read(handle, read.data(), read.size()), 0);
      EXPECT_EQ(ops->Peek(handle, read.data(), 10), 0);
      if (seekable) {  // back into bytes already read
        EXPECT_EQ(ops->Seek(handle, 3, 0), 3);
        ASSERT_EQ(ops->Read(handle, read.data(), 2), 2);
        EXPECT_EQ(Slice(read, 0, 2), Slice(bytes, 3, 2));
        // A read alongside others leaves the stream where it stands.
        EXPECT_EQ(stream->ReadAtAlongside(9950, read.data(), 100), 50);
        EXPECT_EQ(Slice(read, 0, 50), Slice(bytes, 9950, 50));
        EXPECT_EQ(stream->ReadAtAlongside(10000, read.data(), 100), 0);
        ASSERT_EQ(ops->Read(handle, read.data(), 2), 2);
        EXPECT_EQ(Slice(read, 0, 2), Slice(bytes, 5, 2));
      } else {
        EXPECT_EQ(stream->ReadAtAlongside(0, read.data(), 100), -1);
      }
    }
  }
  std::remove(path);
  EXPECT_EQ(host::OpenFileStream("/nonexistent/kelvane.mkv", true), nullptr);
}

struct Delivered {
  bool has_marker = false;
  uint64_t marker = 0, offset = 0;
  Bytes bytes;
  bool in_pool_buffer = false;  // the element's bytes lie in its pool buffer, its only reference
  bool operator==(const Delivered&) const = default;
};

// A list maker that follows the framework protocol: asked without a previous
// entry it answers its current entry; asked with the current one it fills the
// next entry from its script (then length -1).
struct ScriptedListMaker {
  struct Step {
    uint64_t position, time;
    int32_t length;
  };
  std::vector<Step> script;
  size_t next = 0;
  MmfReadRequest requests[2]{};
  MmfReadListEntry entries[2]{{0, 1, 0, 0, &requests[0]}, {1, 1, 0, 0, &requests[1]}};
  MmfReadListEntry* current = nullptr;
  int wrong_previous = 0;

  void Advance() {
    current = current == &entries[0] ? &entries[1] : &entries[0];
    Step step = next < script.size() ? script[next++] : Step{0, 0, kMmfReadEndOfStream};
    *current->Request = {0, 0, step.position, step.time, step.length, 0};
    current->Ready = 1;
  }
  int Answer(MmfReadListEntry** out, MmfReadListEntry* previous) {
    if (previous && previous != current) ++wrong_previous;
    if (previous == current) Advance();
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

class FileStreamerTest : public testing::Test {
 protected:
  void Make(size_t size, uint32_t buffer_size, bool read_ahead = false) {
    streamer_.reset();  // it may read ahead from the source until it goes
    file_ = Pattern(size);
    source_ = host::MakeMemoryStream(file_.data(), file_.size(), true);
    const host::StreamerConfig config{buffer_size, 8, 0, read_ahead};
    streamer_ = std::make_unique<host::FileStreamer>(source_.get(), config);
  }
  void StartList(std::vector<ScriptedListMaker::Step> script) {
    maker_.script = std::move(script);
    maker_.next = 0;
    maker_.Advance();
    active_list_maker = &maker_;
    streamer_->ConnectListMaker(&kListMaker, &downstream_input);
  }
  // The next buffer: a leading time marker, the file offset and one buffer element.
  int Next(Delivered* out) {
    MmfMra* mra = nullptr;
    int result = host::FileStreamer::Ops()->NextBuffer(streamer_->output(), &mra);
    if (result != kMmfBufferDelivered) {
      EXPECT_EQ(mra, nullptr);
      return result;
    }
    *out = {};
    uint32_t kind = 0, type = 0, low = 0, size = 0;
    uint16_t high = 0;
    for (uint32_t i = 0; MmfGetMraElementType(mra, i, &kind) == 0; ++i) {
      MmfPoolBuffer* handle = nullptr;
      uint8_t* address = nullptr;
      if (MmfGetMraPropertyElement(mra, i, &type, &low, &high) == 0) {
        EXPECT_TRUE(type == kMmfPropFileOffset || (type == kMmfPropTimeMarker && i == 0)) << type << " at " << i;
        (type == kMmfPropTimeMarker ? out->marker : out->offset) = MmfPropertyValue(low, high);
        out->has_marker |= type == kMmfPropTimeMarker;
      } else {
        EXPECT_EQ(MmfGetMraBufferElement(mra, i, &handle, &address, &size), 0);
        out->bytes.assign(address, address + size);
        out->in_pool_buffer = address == handle->Data && host::BufferReferences(handle) == 1;
      }
    }
    EXPECT_EQ(MmfReleaseMra(mra), 0);
    return result;
  }
  // Everything up to the end of the stream.
  std::vector<Delivered> Rest() {
    std::vector<Delivered> out;
    for (Delivered d; Next(&d) == kMmfBufferDelivered;) out.push_back(d);
    Delivered none;
    EXPECT_EQ(Next(&none), kMmfEndOfStream);  // and it stays so
    return out;
  }
  Delivered At(uint64_t offset, size_t size, uint64_t marker = UINT64_MAX) {
    return {marker != UINT64_MAX, marker == UINT64_MAX ? 0 : marker, offset, Slice(file_, offset, size), true};
  }

  Bytes file_;
  std::unique_ptr<host::InputStream> source_;
  std::unique_ptr<host::FileStreamer> streamer_;
  ScriptedListMaker maker_;
};

TEST_F(FileStreamerTest, BufferAfterASeekStartsWithATimeMarkerAlsoAfterTheEnd) {
  Make(17000, 1000);
  Delivered first;
  ASSERT_EQ(Next(&first), kMmfBufferDelivered);
  EXPECT_EQ(source_->counters().bytes_read, 1000u);  // read once, straight into the delivered pool buffer
  const uint64_t kTime = 0x123456789ABull;  // needs all 48 bits
  EXPECT_EQ(streamer_->Seek(15500, kTime), 0);
  EXPECT_EQ(Rest(), (std::vector<Delivered>{At(15500, 1000, kTime), At(16500, 500)}));
  EXPECT_EQ(streamer_->Seek(0, 7), 0);
  ASSERT_EQ(Next(&first), kMmfBufferDelivered);
  EXPECT_EQ(first, At(0, 1000, 7));
}

TEST_F(FileStreamerTest, UnknownOutputChannelIsRefused) {
  Make(100, 10);
  MmfChannel other{};
  MmfMra* mra = nullptr;
  EXPECT_EQ(host::FileStreamer::Ops()->NextBuffer(&other, &mra), 22);
  EXPECT_EQ(host::FileStreamer::Ops()->NextBuffer(streamer_->output(), nullptr), 22);
  EXPECT_EQ(host::FileStreamer::OfOutput(streamer_->output()), streamer_.get());
}

TEST_F(FileStreamerTest, ListModeReadsOnlyTheRequestedRangesUntilLengthMinusOne) {
  Make(50000, 1000);
  EXPECT_EQ(streamer_->SetListMode(1), 4044);  // no list maker yet
  StartList({{1000, 1000000, 2500}, {30000, 6000000, 700}, {42000, 11000000, 1000}});
  Delivered first;
  ASSERT_EQ(Next(&first), kMmfBufferDelivered);  // normal streaming before the switch
  EXPECT_EQ(first.offset, 0u);
  ASSERT_EQ(streamer_->SetListMode(1), 0);
  EXPECT_EQ(Rest(), (std::vector<Delivered>{At(1000, 1000, 1000000), At(2000, 1000), At(3000, 500),
                                            At(30000, 700, 6000000), At(42000, 1000, 11000000)}));
  EXPECT_EQ(maker_.next, 3u);
  EXPECT_EQ(maker_.wrong_previous, 0);
  EXPECT_EQ(streamer_->bytes_read(), 1000u + 2500 + 700 + 1000);

  Make(5000, 1000);
  StartList({{0, 0, -1}});
  ASSERT_EQ(streamer_->SetListMode(1), 0);
  EXPECT_EQ(Rest(), std::vector<Delivered>{});
  EXPECT_EQ(streamer_->bytes_read(), 0u);
}

TEST_F(FileStreamerTest, ModeZeroStreamsOnFromTheCurrentRequest) {
  Make(20000, 1000);
  StartList({{4000, 2000000, 1000}, {9000, 4500000, 1000}});
  ASSERT_EQ(streamer_->SetListMode(1), 0);
  Delivered d;
  ASSERT_EQ(Next(&d), kMmfBufferDelivered);
  EXPECT_EQ(d, At(4000, 1000, 2000000));
  maker_.Advance();  // the scan ends: the current entry names where normal play resumes
  ASSERT_EQ(streamer_->SetListMode(0), 0);
  ASSERT_EQ(Next(&d), kMmfBufferDelivered);
  EXPECT_EQ(d, At(9000, 1000, 4500000));
  ASSERT_EQ(Next(&d), kMmfBufferDelivered);
  EXPECT_EQ(d, At(10000, 1000));
}

TEST_F(FileStreamerTest, ReadListSwitchesTheStreamerItsChannelIsConnectedTo) {
  Make(20000, 1000);
  StartList({{6000, 3000000, 1000}});
  MmfChannel input{};
  input.Kind = kMmfChannelKind;
  input.Direction = kMmfDirectionInput;
  MmfReadList* list = nullptr;
  ASSERT_EQ(MmfAllocateReadlist(&list, &input, 2, 2), 0);
  EXPECT_EQ(MmfStreamerSetListMode(list, 1), 4044);  // not connected to any streamer yet
  input.Peer = streamer_->output();
  ASSERT_EQ(MmfStreamerSetListMode(list, 1), 0);
  EXPECT_EQ(Rest(), std::vector<Delivered>{At(6000, 1000, 3000000)});
  EXPECT_EQ(MmfStreamerSetListMode(nullptr, 1), 22);
  MmfFreeReadlist(list);
}

// Streaming on reads the next buffers ahead; whatever is asked for instead
// must not be answered with the bytes read ahead.
TEST_F(FileStreamerTest, WhatFollowsAReadAheadGetsTheBytesItAsksFor) {
  enum Action { kStreamOn, kSeek, kListMode };
  struct Case {
    const char* name;
    Action action;
    uint64_t offset, time;
    int32_t length;  // list mode: the request
    std::vector<std::pair<uint64_t, size_t>> expected;  // offset and size of each buffer, the first with the marker
  };
  const Case cases[] = {
      {"streams on", kStreamOn, 0, 0, 0, {{3000, 1000}, {4000, 1000}}},
      {"seek back", kSeek, 1000, 5, 0, {{1000, 1000}, {2000, 1000}, {3000, 1000}, {4000, 1000}}},
      {"seek to the offset read ahead", kSeek, 3000, 6, 0, {{3000, 1000}, {4000, 1000}}},
      {"seek into the range read ahead", kSeek, 3500, 7, 0, {{3500, 1000}, {4500, 500}}},
      {"list request at the offset read ahead, shorter", kListMode, 3000, 8, 400, {{3000, 400}}},
      {"list request back", kListMode, 500, 9, 1000, {{500, 1000}}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    Make(5000, 1000, true);
    StartList({{c.offset, c.time, c.length}});
    Delivered d;
    for (int i = 0; i < 3; ++i) ASSERT_EQ(Next(&d), kMmfBufferDelivered);  // reading ahead from the second on
    const int answer = c.action == kSeek       ? streamer_->Seek(c.offset, c.time)
                       : c.action == kListMode ? streamer_->SetListMode(1)
                                               : 0;
    ASSERT_EQ(answer, 0);
    std::vector<Delivered> expected;
    uint64_t bytes = 3000;
    for (auto [offset, size] : c.expected) {
      expected.push_back(At(offset, size, expected.empty() && c.action != kStreamOn ? c.time : UINT64_MAX));
      bytes += size;
    }
    EXPECT_EQ(Rest(), expected);
    EXPECT_EQ(streamer_->bytes_read(), bytes);  // delivered bytes only
  }
}

// A long read ahead, with the caller reading alongside the reader whenever it
// catches up with it: every byte in order, and the end once, also while the
// caller holds most of the pool's buffers so that reads find none free.
TEST_F(FileStreamerTest, ReadingAheadDeliversEveryByteOnceInOrder) {
  struct Case {
    const char* name;
    bool file;
    size_t size;
    size_t held;  // buffers the caller keeps before giving the oldest back (the pool has 8)
  };
  const Case cases[] = {
      {"memory", false, 400'500, 0},  {"memory, pool nearly dry", false, 400'500, 7},
      {"file", true, 400'000, 0},     {"file, pool half held", true, 399'999, 4},
  };
  char path[] = "/tmp/kelvane-read-ahead-XXXXXX";
  const int fd = mkstemp(path);
  ASSERT_GE(fd, 0);
  close(fd);
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    Make(c.size, 1000, true);
    if (c.file) {
      FILE* out = std::fopen(path, "wb");
      ASSERT_EQ(std::fwrite(file_.data(), 1, file_.size(), out), file_.size());
      std::fclose(out);
      streamer_.reset();
      source_ = host::OpenFileStream(path, true);
      streamer_ = std::make_unique<host::FileStreamer>(source_.get(), host::StreamerConfig{1000, 8, 0, true});
    }
    std::vector<MmfMra*> held;
    uint64_t offset = 0;
    int result = 0;
    for (MmfMra* mra = nullptr; (result = host::FileStreamer::Ops()->NextBuffer(streamer_->output(), &mra)) ==
                                kMmfBufferDelivered;) {
      uint32_t kind = 0, size = 0;
      MmfPoolBuffer* handle = nullptr;
      uint8_t* address = nullptr;
      uint32_t i = 0;
      while (MmfGetMraElementType(mra, i, &kind) == 0 && MmfGetMraBufferElement(mra, i, &handle, &address, &size) != 0) ++i;
      ASSERT_NE(address, nullptr);
      ASSERT_LE(offset + size, file_.size());
      ASSERT_TRUE(std::equal(address, address + size, file_.begin() + static_cast<ptrdiff_t>(offset))) << "at " << offset;
      offset += size;
      held.push_back(mra);
      if (held.size() > c.held) {
        EXPECT_EQ(MmfReleaseMra(held.front()), 0);
        held.erase(held.begin());
      }
    }
    EXPECT_EQ(result, kMmfEndOfStream);
    EXPECT_EQ(offset, file_.size());
    for (MmfMra* mra : held) EXPECT_EQ(MmfReleaseMra(mra), 0);
  }
  std::remove(path);
}

TEST(GraphClockTest, ReportsTheMediaTimeConsumedOnTheAttachedGraph) {
  host::GraphClock clock;
  auto* graph = reinterpret_cast<MmfGraph*>(&clock);  // any distinct address names a graph
  MmfClock* handle = nullptr;
  const MmfClockOps* ops = nullptr;
  EXPECT_EQ(MmfGetGraphClock(graph, &handle, &ops), 4044);
  host::AttachGraphClock(graph, &clock);
  ASSERT_EQ(MmfGetGraphClock(graph, &handle, &ops), 0);
  clock.Consumed(7250000);
  EXPECT_EQ(ops->GetTime(handle, 0, 1, 0, 0, 0), 7250000u);
  host::AttachGraphClock(graph, nullptr);
  EXPECT_EQ(MmfGetGraphClock(graph, &handle, &ops), 4044);
  EXPECT_EQ(MmfGetGraphClock(nullptr, &handle, &ops), 22);
}

}  // namespace
