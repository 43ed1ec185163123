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

std::string TempFile(const Bytes& bytes) {
  char path[] = "/tmp/kelvane-stream-XXXXXX";
  const int fd = mkstemp(path);
  EXPECT_EQ(write(fd, bytes.data(), bytes.size()), ssize_t(bytes.size()));
  close(fd);
  return path;
}

TEST(HostInputStreamTest, PeekReadSeekAndLengthFollowTheKind) {
  const Bytes bytes = Pattern(10000);
  const std::string path = TempFile(bytes);
  for (bool file : {true, false}) {
    for (bool seekable : {true, false}) {
      SCOPED_TRACE(std::string(file ? "file" : "memory") + (seekable ? ", seekable" : ", pipe-like"));
      auto stream = file ? host::OpenFileStream(path.c_str(), seekable) : host::MakeMemoryStream(bytes.data(), bytes.size(), seekable);
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
  std::remove(path.c_str());
  EXPECT_EQ(host::OpenFileStream("/nonexistent/kelvane.mkv", true), nullptr);
}

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
};

ScriptedListMaker* active_list_maker = nullptr;
MmfChannel downstream_input{};
int GetNextReadList(MmfChannel* input, MmfReadListEntry** entry, MmfReadListEntry* previous) {
  ScriptedListMaker& maker = *active_list_maker;
  EXPECT_EQ(input, &downstream_input);
  if (previous && previous != maker.current) ++maker.wrong_previous;
  if (previous == maker.current) maker.Advance();
  *entry = maker.current;
  return 0;
}
const MmfListMakerOps kListMaker = {.GetNextReadList = GetNextReadList};

// The next buffer as "offset+size", "@time" for a leading time marker, "end"
// at the end of the stream; its bytes must be the file's, read straight into
// the pool buffer it holds the only reference of.
std::string Next(host::FileStreamer& streamer, const Bytes& file) {
  MmfMra* mra = nullptr;
  const int result = host::FileStreamer::Ops()->NextBuffer(streamer.output(), &mra);
  if (result != kMmfBufferDelivered) return result == kMmfEndOfStream && !mra ? "end" : "result " + std::to_string(result);
  std::string out, marker;
  uint32_t kind = 0, type = 0, low = 0, size = 0;
  uint16_t high = 0;
  for (uint32_t i = 0; MmfGetMraElementType(mra, i, &kind) == 0; ++i) {
    MmfPoolBuffer* handle = nullptr;
    uint8_t* address = nullptr;
    if (MmfGetMraPropertyElement(mra, i, &type, &low, &high) == 0) {
      EXPECT_TRUE(type == kMmfPropFileOffset || (type == kMmfPropTimeMarker && i == 0)) << type << " at " << i;
      (type == kMmfPropTimeMarker ? marker : out) = std::to_string(MmfPropertyValue(low, high));
    } else if (MmfGetMraBufferElement(mra, i, &handle, &address, &size) == 0) {
      const uint64_t offset = std::stoull(out);
      EXPECT_TRUE(offset + size <= file.size() && std::equal(address, address + size, file.begin() + ptrdiff_t(offset))) << out;
      EXPECT_TRUE(address == handle->Data && host::BufferReferences(handle) == 1) << out;
      out += "+" + std::to_string(size);
    }
  }
  EXPECT_EQ(MmfReleaseMra(mra), 0);
  return out + (marker.empty() ? "" : "@" + marker);
}

// Buffers of 1000 bytes, normally and in list mode, after seeks and switches,
// also while the streamer reads ahead: what each step delivers or answers.
TEST(FileStreamerTest, DeliversTheBytesAskedForWithTheirMarkers) {
  struct Step {
    char op;  // n: next buffer; e: buffers to the end; s: seek; l: list mode; c: connect the list maker; a: it moves on
    uint64_t offset = 0, time = 0;  // l: the mode
  };
  const uint64_t kTime = 0x123456789ABull;  // needs all 48 bits
  const std::vector<Step> three = {{'c'}, {'n'}, {'n'}, {'n'}};  // reading ahead from the second on
  auto then = [](std::vector<Step> steps, std::initializer_list<Step> more) { return steps.insert(steps.end(), more), steps; };
  const struct {
    const char* name;
    size_t size;
    bool read_ahead;
    std::vector<ScriptedListMaker::Step> list;
    std::vector<Step> steps;
    std::string want;  // what each step gave, space-separated
    uint64_t read;     // bytes read from the source
  } rows[] = {
      {"after a seek, also after the end, a time marker", 17000, false, {}, {{'n'}, {'s', 15500, kTime}, {'e'}, {'s', 0, 7}, {'n'}},
       "0+1000 15500+1000@1250999896491 16500+500 end 0+1000@7", 3500},
      {"list mode reads the requested ranges until length -1", 50000, false,
       {{1000, 1000000, 2500}, {30000, 6000000, 700}, {42000, 11000000, 1000}}, {{'l', 1}, {'c'}, {'n'}, {'l', 1}, {'e'}},
       "4044 0+1000 1000+1000@1000000 2000+1000 3000+500 30000+700@6000000 42000+1000@11000000 end", 1000 + 2500 + 700 + 1000},
      {"list mode that ends at once", 5000, false, {{0, 0, -1}}, {{'c'}, {'l', 1}, {'e'}}, "end", 0},
      {"mode 0 streams on from the current request", 20000, false, {{4000, 2000000, 1000}, {9000, 4500000, 1000}},
       {{'c'}, {'l', 1}, {'n'}, {'a'}, {'l', 0}, {'n'}, {'n'}}, "4000+1000@2000000 9000+1000@4500000 10000+1000", 3000},
      // Whatever follows a read ahead must not be answered with the bytes read ahead.
      {"read ahead, streaming on", 5000, true, {}, then(three, {{'e'}}), "0+1000 1000+1000 2000+1000 3000+1000 4000+1000 end", 5000},
      {"read ahead, seek back", 5000, true, {}, then(three, {{'s', 1000, 5}, {'e'}}),
       "0+1000 1000+1000 2000+1000 1000+1000@5 2000+1000 3000+1000 4000+1000 end", 7000},
      {"read ahead, seek to the offset read ahead", 5000, true, {}, then(three, {{'s', 3000, 6}, {'e'}}),
       "0+1000 1000+1000 2000+1000 3000+1000@6 4000+1000 end", 5000},
      {"read ahead, seek into the range read ahead", 5000, true, {}, then(three, {{'s', 3500, 7}, {'e'}}),
       "0+1000 1000+1000 2000+1000 3500+1000@7 4500+500 end", 4500},
      {"read ahead, shorter list request at its offset", 5000, true, {{3000, 8, 400}}, then(three, {{'l', 1}, {'e'}}),
       "0+1000 1000+1000 2000+1000 3000+400@8 end", 3400},
      {"read ahead, list request back", 5000, true, {{500, 9, 1000}}, then(three, {{'l', 1}, {'e'}}),
       "0+1000 1000+1000 2000+1000 500+1000@9 end", 4000},
  };
  for (const auto& c : rows) {
    SCOPED_TRACE(c.name);
    Bytes file = Pattern(c.size);
    auto source = host::MakeMemoryStream(file.data(), file.size(), true);
    ScriptedListMaker maker{c.list};
    active_list_maker = &maker;
    maker.Advance();
    std::string got;
    {
      host::FileStreamer streamer(source.get(), {1000, 8, 0, c.read_ahead});
      for (const Step& step : c.steps) {
        std::string out;
        if (step.op == 'n') out = Next(streamer, file);
        if (step.op == 'e') {
          for (std::string next; next != "end";) out += (out.empty() ? "" : " ") + (next = Next(streamer, file));
          EXPECT_EQ(Next(streamer, file), "end");  // and it stays so
        }
        const int result = step.op == 's' ? streamer.Seek(step.offset, step.time) : step.op == 'l' ? streamer.SetListMode(uint32_t(step.offset)) : 0;
        if (result != 0) out = std::to_string(result);
        if (step.op == 'c') streamer.ConnectListMaker(&kListMaker, &downstream_input);
        if (step.op == 'a') maker.Advance();
        got += (got.empty() || out.empty() ? "" : " ") + out;
      }
      EXPECT_EQ(streamer.bytes_read(), c.read);
    }
    EXPECT_EQ(got, c.want);
    EXPECT_EQ(maker.wrong_previous, 0);
    EXPECT_TRUE(c.read_ahead || source->counters().bytes_read == c.read);  // each byte read once
  }
}

// A read list switches the streamer its channel is connected to.
TEST(FileStreamerTest, ReadListSwitchesTheConnectedStreamer) {
  Bytes file = Pattern(20000);
  auto source = host::MakeMemoryStream(file.data(), file.size(), true);
  host::FileStreamer streamer(source.get(), {1000, 8});
  ScriptedListMaker maker{{{6000, 3000000, 1000}}};
  active_list_maker = &maker;
  maker.Advance();
  streamer.ConnectListMaker(&kListMaker, &downstream_input);
  MmfChannel input{};
  input.Kind = kMmfChannelKind;
  input.Direction = kMmfDirectionInput;
  input.Peer = streamer.output();
  MmfReadList* list = nullptr;
  ASSERT_EQ(MmfAllocateReadlist(&list, &input, 2, 2), 0);
  ASSERT_EQ(MmfStreamerSetListMode(list, 1), 0);
  EXPECT_EQ(Next(streamer, file), "6000+1000@3000000");
  EXPECT_EQ(Next(streamer, file), "end");
  MmfFreeReadlist(list);
}

// A long read ahead, with the caller reading alongside the reader whenever it
// catches up with it: every byte in order, and the end once, also while the
// caller holds most of the pool's buffers so that reads find none free.
TEST(FileStreamerTest, ReadingAheadDeliversEveryByteOnceInOrder) {
  const struct {
    const char* name;
    bool file;
    size_t size;
    size_t held;  // buffers the caller keeps before giving the oldest back (the pool has 8)
  } cases[] = {
      {"memory", false, 400'500, 0},  {"memory, pool nearly dry", false, 400'500, 7},
      {"file", true, 400'000, 0},     {"file, pool half held", true, 399'999, 4},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    const Bytes file = Pattern(c.size);
    const std::string path = c.file ? TempFile(file) : "";
    auto source = c.file ? host::OpenFileStream(path.c_str(), true) : host::MakeMemoryStream(file.data(), file.size(), true);
    host::FileStreamer streamer(source.get(), {1000, 8, 0, true});
    std::vector<MmfMra*> held;
    uint64_t offset = 0;
    int result = 0;
    for (MmfMra* mra = nullptr; (result = host::FileStreamer::Ops()->NextBuffer(streamer.output(), &mra)) == kMmfBufferDelivered;) {
      uint32_t kind = 0, size = 0;
      MmfPoolBuffer* handle = nullptr;
      uint8_t* address = nullptr;
      for (uint32_t i = 0; MmfGetMraElementType(mra, i, &kind) == 0 && MmfGetMraBufferElement(mra, i, &handle, &address, &size) != 0;) ++i;
      ASSERT_NE(address, nullptr);
      ASSERT_LE(offset + size, file.size());
      ASSERT_TRUE(std::equal(address, address + size, file.begin() + static_cast<ptrdiff_t>(offset))) << "at " << offset;
      offset += size;
      held.push_back(mra);
      if (held.size() > c.held) {
        EXPECT_EQ(MmfReleaseMra(held.front()), 0);
        held.erase(held.begin());
      }
    }
    EXPECT_EQ(result, kMmfEndOfStream);
    EXPECT_EQ(offset, file.size());
    for (MmfMra* mra : held) EXPECT_EQ(MmfReleaseMra(mra), 0);
    if (c.file) std::remove(path.c_str());
  }
}

}  // namespace
