// The rating as a lifecycle: queries, repeated requests, and failures that
// leave the instance for Destroy to free without a leak.

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/heap_control.h"
#include "tests/plugin/graph_harness.h"
#include "tests/support/ebml_builder.h"

namespace {

using plugin_test::FixtureFile;
using plugin_test::HostPlugin;

// An instance whose input channel is fed by `stream`, rated by hand.
struct Instance {
  explicit Instance(host::InputStream& stream) : handle(HostPlugin().filter()->Create()) {
    if (handle) handle->InputChannel->StreamLink = stream.record();
    format.buffer_size = 65536;
  }
  ~Instance() {
    if (handle) HostPlugin().filter()->Destroy(handle);
  }
  int Rate(uint32_t request, uint32_t* claim) {
    return HostPlugin().input()->RateInputFormat(handle->InputChannel, &format, request, claim);
  }
  MmfFilterHandle* handle;
  MmfMediaFormat format{};
};

TEST(RateInputFormatLifecycleTest, QueryAnswersWhetherAFullRequestAccepted) {
  auto stream = host::OpenFileStream(FixtureFile("avc_aac"), true);
  Instance instance(*stream);
  uint32_t claim = 0;
  EXPECT_EQ(instance.Rate(0, &claim), 0);
  EXPECT_EQ(claim, 0u);
  EXPECT_EQ(instance.Rate(1, &claim), 80);
  EXPECT_EQ(claim, 1u);
  EXPECT_EQ(instance.Rate(0, &claim), 80);

  // A second full request changes nothing but the claim word, whatever it held.
  MkvFilter* filter = AsMkvFilter(instance.handle);
  MkvChannel* channels = filter->OutputChannels;
  EXPECT_EQ(instance.Rate(1, &claim), 0);
  claim = 0;
  EXPECT_EQ(instance.Rate(1, &claim), 0);
  EXPECT_EQ(claim, 1u);
  EXPECT_EQ(filter->OutputChannels, channels);
  EXPECT_EQ(filter->Context->Rated, 1u);
}

TEST(RateInputFormatLifecycleTest, RefusedStreamLeavesNothingAfterDestroy) {
  using namespace ebml;
  // Opus only: parsed, but no supported track.
  const Bytes file = cat({ebml_header(), master(kSegment, {master(kInfo, {uinteger(kTimecodeScale, 1000000)}),
                                                           master(kTracks, {master(kTrackEntry, {uinteger(kTrackNumber, 1),
                                                                                                 uinteger(kTrackType, 2),
                                                                                                 str(kCodecId, "A_OPUS")})})})});
  for (const std::string& name : {std::string("crafted opus"), std::string("README")}) {
    SCOPED_TRACE(name);
    std::vector<uint8_t> readme(4096, 'x');
    const std::vector<uint8_t>& bytes = name == "README" ? readme : file;
    auto stream = host::MakeMemoryStream(bytes.data(), bytes.size(), true);
    int64_t live = host::LiveBlockCount();
    {
      Instance instance(*stream);
      uint32_t claim = 0;
      EXPECT_EQ(instance.Rate(1, &claim), 0);
      EXPECT_EQ(instance.Rate(0, &claim), 0);
    }
    EXPECT_EQ(host::LiveBlockCount(), live);
  }
}

// The header parse does not look at the metadata list's own result, so a
// failed metadata entry only shortens the list; every other failure refuses.
TEST(RateInputFormatLifecycleTest, EveryFailedAllocationRefusesTheStreamWithoutLeaking) {
  for (const char* name : {"theora_vorbis", "flac", "multi_audio"}) {
    SCOPED_TRACE(name);
    auto stream = host::OpenFileStream(FixtureFile(name), true);
    int32_t full_entries = 0;
    {
      Instance instance(*stream);
      uint32_t claim = 0;
      ASSERT_EQ(instance.Rate(1, &claim), 80);
      full_entries = AsMkvFilter(instance.handle)->Context->Metadata->entry_count;
    }
    bool reached_end = false;
    for (uint64_t n = 1; !reached_end && n < 5000; ++n) {
        int64_t live = host::LiveBlockCount();
      {
        Instance instance(*stream);
        ASSERT_NE(instance.handle, nullptr);
        uint32_t claim = 0;
        uint64_t before = host::AllocationCount();
        host::FailNthAllocation(n);
        int rating = instance.Rate(1, &claim);
        host::FailNthAllocation(0);
        reached_end = host::AllocationCount() - before < n;
        const mkv_metadata_list* metadata = AsMkvFilter(instance.handle)->Context->Metadata;
        if (reached_end) {
          EXPECT_EQ(rating, 80);
        } else if (rating != 0) {
          EXPECT_EQ(rating, 80) << "allocation " << n;
          ASSERT_NE(metadata, nullptr);
          EXPECT_LT(metadata->entry_count, full_entries) << "allocation " << n;
        }
      }
      EXPECT_EQ(host::LiveBlockCount(), live) << "allocation " << n;
    }
    EXPECT_TRUE(reached_end);
  }
}

}  // namespace
