// Output assembly on crafted input: what lies between Clusters, and an input
// buffer with more properties than an output buffer has room for.

#include <cstdio>
#include <fstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/graph_runner.h"
#include "host/memory_pools.h"
#include "platform/mmf_status.h"
#include "platform/mra_pool.h"
#include "tests/plugin/graph_harness.h"
#include "tests/support/block_builder.h"
#include "tests/support/cluster_driver.h"
#include "tests/support/fixtures.h"

namespace {

using ebml::Bytes;

// One MP3 track; each Cluster holds one block of one frame per entry of `frames`.
Bytes AudioFile(const std::vector<Bytes>& between) {
  Bytes tracks = ebml::master(ebml::kTracks, {ebml::master(ebml::kTrackEntry, {
      ebml::uinteger(ebml::kTrackNumber, 1), ebml::uinteger(ebml::kTrackUid, 1), ebml::uinteger(ebml::kTrackType, 2),
      ebml::str(ebml::kCodecId, "A_MPEG/L3"),
      ebml::master(ebml::kAudio, {ebml::f64(ebml::kSamplingFrequency, 44100), ebml::uinteger(ebml::kChannels, 1)})})});
  Bytes segment = ebml::cat({ebml::master(ebml::kInfo, {ebml::uinteger(ebml::kTimecodeScale, 1000000)}), tracks});
  for (size_t i = 0; i <= between.size(); ++i) {
    Bytes frame(100 + i, static_cast<uint8_t>(i + 1));
    segment = ebml::cat({segment, ebml::master(ebml::kCluster, {ebml::uinteger(ebml::kTimecode, 100 * i),
                                                                ebml::simple_block(1, 0, ebml::kKeyFrame, {frame})})});
    if (i < between.size()) segment = ebml::cat({segment, between[i]});
  }
  return ebml::cat({ebml::ebml_header(), ebml::element(ebml::kSegment, segment)});
}

std::string WriteTemp(const Bytes& bytes, const std::string& name) {
  std::string path = testing::TempDir() + name;
  std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  return path;
}

struct Trace {
  std::vector<uint32_t> types;  // property types, 0 for a buffer element
  uint32_t largest = 0;         // most elements in one output buffer
};

void Record(void* user, int32_t, MmfMra* mra) {
  auto* trace = static_cast<Trace*>(user);
  uint32_t kind = 0, i = 0;
  for (; MmfGetMraElementType(mra, i, &kind) == 0; ++i) {
    uint32_t type = 0, low = 0;
    uint16_t high = 0;
    if (kind == kMmfElementProperty && MmfGetMraPropertyElement(mra, i, &type, &low, &high) == 0) {
      trace->types.push_back(type);
    } else {
      trace->types.push_back(0);
    }
  }
  trace->largest = std::max(trace->largest, i);
}

// Skip marks (37) and runs of buffer elements (0), in order.
std::vector<uint32_t> SkipMarksAndFrames(const Trace& trace) {
  std::vector<uint32_t> seen;
  for (uint32_t type : trace.types) {
    if ((type == kMmfPropSkipMark || type == 0) && (seen.empty() || seen.back() != type || type != 0)) {
      seen.push_back(type);
    }
  }
  return seen;
}

TEST(PlaybackCasesTest, ElementsBetweenClustersMarkTheNextBlockAsSkippedAfter) {
  const Bytes tags = ebml::master(ebml::kTags, {ebml::master(ebml::kTag, {ebml::master(ebml::kSimpleTag, {
      ebml::str(ebml::kTagName, "TITLE"), ebml::str(ebml::kTagString, "between")})})});
  const Bytes cues = ebml::master(ebml::kCues, {ebml::master(ebml::kCuePoint, {ebml::uinteger(ebml::kCueTime, 0)})});
  const Bytes void_element = ebml::element(ebml::kVoid, ebml::filler(3000));
  const std::string path = WriteTemp(AudioFile({tags, cues, void_element}), "between_clusters.mkv");
  for (uint32_t size : {100u, 1000u, 32768u}) {
    SCOPED_TRACE(size);
    Trace trace;
    host::RunnerOptions options;
    options.input_buffer_size = size;
    options.on_buffer = Record;
    options.user = &trace;
    host::RunResult result = host::RunGraph(plugin_test::HostPlugin(), path, options);
    ASSERT_TRUE(result.ok) << result.error;
    ASSERT_EQ(result.channels.size(), 1u);
    EXPECT_EQ(result.channels[0].frames.size(), 4u);
    EXPECT_EQ(result.channels[0].skip_marks, 3u);
    EXPECT_EQ(SkipMarksAndFrames(trace), (std::vector<uint32_t>{0, kMmfPropSkipMark, 0, kMmfPropSkipMark, 0,
                                                                 kMmfPropSkipMark, 0}))
        << "each block after a skipped element comes after one skip mark";
  }
}

// An upstream that delivers a whole file, from its first Cluster, in one input
// buffer headed by `properties` file-offset properties.
class PropertyHeavyUpstream {
 public:
  PropertyHeavyUpstream(const std::vector<uint8_t>& file, uint32_t properties)
      : bytes_(static_cast<uint32_t>(file.size()), 1), mras_(host::MakeMraPool(1, properties + 1)) {
    output_.Kind = kMmfChannelKind;
    output_.Direction = kMmfDirectionOutput;
    output_.State = this;
    const uint64_t start = testing_support::FirstClusterOffset(file.data(), file.size());
    MmfPoolBuffer* buffer = bytes_.AcquireWaiting(std::chrono::milliseconds(100));
    std::copy(file.begin() + static_cast<ptrdiff_t>(start), file.end(), buffer->Data);
    EXPECT_EQ(MmfAcquireMra(mras_, &mra_, 0), 0);
    for (uint32_t i = 0; i < properties; ++i) {
      EXPECT_EQ(MmfSetMraPropertyElement(mra_, i, kMmfPropFileOffset, static_cast<uint32_t>(start), 0), 0);
    }
    EXPECT_EQ(MmfSetMraBufferElement(mra_, properties, buffer, buffer->Data,
                                     static_cast<uint32_t>(file.size() - start)), 0);
    host::MemoryPool::Ops()->ReleaseBuffer(buffer);
  }
  ~PropertyHeavyUpstream() {
    if (mra_) MmfReleaseMra(mra_);
    MmfFreeMraPool(mras_);
  }

  MmfChannel* output() { return &output_; }
  static const MmfMediaOutputOps* Ops() {
    static const MmfMediaOutputOps ops = [] {
      MmfMediaOutputOps table{};
      table.NextBuffer = NextBuffer;
      return table;
    }();
    return &ops;
  }

 private:
  static int NextBuffer(MmfChannel* output, MmfMra** buffer) {
    auto* self = static_cast<PropertyHeavyUpstream*>(output->State);
    *buffer = self->mra_;
    self->mra_ = nullptr;
    return *buffer ? kMmfBufferDelivered : kMmfEndOfStream;
  }

  host::MemoryPool bytes_;
  MmfMraPool* mras_;
  MmfMra* mra_ = nullptr;
  MmfChannel output_{};
};

TEST(PlaybackCasesTest, InputWithMorePropertiesThanRoomResumesAtTheSameElement) {
  const std::string name = "tiny_avc";
  PropertyHeavyUpstream upstream(testing_support::ReadFixtureBytes(name), 1500);
  Trace trace;
  host::RunnerOptions options;
  options.upstream = PropertyHeavyUpstream::Ops();
  options.upstream_output = upstream.output();
  options.on_buffer = Record;
  options.user = &trace;
  host::RunResult result = host::RunGraph(plugin_test::HostPlugin(), plugin_test::FixtureFile(name), options);
  ASSERT_TRUE(result.ok) << result.error;
  size_t copied = std::count(trace.types.begin(), trace.types.end(), kMmfPropFileOffset);
  EXPECT_EQ(copied, 1500u) << "every input property is copied once: none lost, none repeated";
  EXPECT_GE(result.channels[0].buffers, 4u) << "1500 properties need three output buffers besides the configuration";
  const testing_support::FixtureExpectation fixture = testing_support::LoadFixture(name);
  size_t expected_frames = 0;
  for (const auto& block : fixture.blocks) expected_frames += block.frames.size();
  EXPECT_EQ(result.channels[0].frames.size(), expected_frames);
}

}  // namespace
