// "MediaMetadataParser": parsing a stream into a caller-owned block, queries,
// freeing, and an instance's own block. Iteration over every entry, and parses
// with an allocation failing, are checked by the header parse fuzzer.

#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "core/metadata_list.h"
#include "filter/mkv_context.h"
#include "host/heap_control.h"
#include "tests/plugin/graph_harness.h"
#include "tests/support/fixtures.h"
#include "tests/support/log_recorder.h"

namespace {

using testing_support::LoadFixture;

const MmfMetadataParserOps& Ops() { return *plugin_test::HostPlugin().Get<MmfMetadataParserOps>("MediaMetadataParser"); }

// A block parsed from a fixture; freed with the plug-in's own operation.
struct ParsedBlock {
  explicit ParsedBlock(const std::string& name) : stream(host::OpenFileStream(plugin_test::FixtureFile(name), true)) {
    result = Ops().Parser_ParseMetadata(stream->record(), 0, &block);
  }
  ~ParsedBlock() {
    if (block) Ops().Parser_FreeMetadata(block);
  }
  std::unique_ptr<host::InputStream> stream;
  MmfMetadata* block = nullptr;
  int result = -1;
};

// Not Matroska (also WebM), an EBML header with nothing after it, and a
// stream that cannot go back to 0: no block, nothing leaked, the stream at 0.
TEST(ParserParseMetadataTest, RefusedInputLeavesNoBlock) {
  const std::vector<uint8_t> readme(4096, 'x'), tiny = testing_support::ReadFixtureBytes("tiny_avc");
  const std::vector<uint8_t> header(tiny.begin(), tiny.begin() + 5 + (tiny.at(4) & 0x7F));
  const std::vector<uint8_t> webm = testing_support::ReadFixtureBytes("webm_vp8_vorbis");
  const struct {
    const char* name;
    const std::vector<uint8_t>& bytes;
    bool seekable;
    int answer;
    const char* notice;
  } cases[] = {
      {"text", readme, true, 48, nullptr},
      {"webm", webm, true, 48, nullptr},
      {"short.mkv", header, true, 48, "kelvane:  Error -2 while parsing metadata for file short.mkv."},
      {"not seekable", tiny, false, 4002, nullptr},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    testing_support::LogRecorder log;
    const int64_t live_before = host::LiveBlockCount();
    auto stream = host::MakeMemoryStream(c.bytes.data(), c.bytes.size(), c.seekable, c.name);
    uint8_t first[16];
    ASSERT_TRUE(c.seekable || stream->Read(first, sizeof first) == 16);  // away from 0, and no way back
    auto* const untouched = reinterpret_cast<MmfMetadata*>(0x1234);
    MmfMetadata* block = untouched;
    EXPECT_EQ(Ops().Parser_ParseMetadata(stream->record(), 0, &block), c.answer);
    EXPECT_EQ(block, untouched);
    EXPECT_TRUE(!c.seekable || stream->Tell() == 0);
    EXPECT_TRUE(!c.notice || log.Contains(5, c.notice));
    stream.reset();
    EXPECT_EQ(host::LiveBlockCount(), live_before);
  }
}

TEST(ParserMetadataTest, NullArgumentsAnswer22AndAnInstanceNotRatedHasNoBlock) {
  ParsedBlock parsed("tags");
  auto* const untouched = reinterpret_cast<MmfMetadata*>(0x1234);
  MmfMetadata* block = untouched;
  MmfMetadataValue value{};
  int32_t index = 0;
  char* key = nullptr;
  MmfFilterHandle* handle = plugin_test::HostPlugin().filter()->Create();
  EXPECT_EQ(Ops().Parser_ParseMetadata(nullptr, 0, &block), 22);
  EXPECT_EQ(Ops().Parser_ParseMetadata(parsed.stream->record(), 0, nullptr), 22);
  EXPECT_EQ(Ops().Parser_QueryMetadata(nullptr, "Name", 0, &value), 22);
  EXPECT_EQ(Ops().Parser_QueryMetadata(parsed.block, nullptr, 0, &value), 22);
  EXPECT_EQ(Ops().Parser_QueryMetadata(parsed.block, "Name", 0, nullptr), 22);
  EXPECT_EQ(Ops().Parser_IterateMetadata(nullptr, &index, &key, &value), 22);
  EXPECT_EQ(Ops().Parser_IterateMetadata(parsed.block, nullptr, &key, &value), 22);
  EXPECT_EQ(Ops().Parser_IterateMetadata(parsed.block, &index, nullptr, &value), 22);
  EXPECT_EQ(Ops().Parser_IterateMetadata(parsed.block, &index, &key, nullptr), 22);
  EXPECT_EQ(Ops().Parser_GetMetadata(handle, nullptr), 22);
  EXPECT_EQ(Ops().Parser_GetMetadata(nullptr, &block), 22);
  Ops().Parser_FreeMetadata(nullptr);
  EXPECT_EQ(Ops().Parser_GetMetadata(handle, &block), 4044) << "an instance not rated has no block";
  EXPECT_EQ(block, untouched);
  plugin_test::HostPlugin().filter()->Destroy(handle);
}

// Keys match in any letter case; occurrences count per key; a track's picture
// size is answered only after a video MediaType.
TEST(ParserQueryMetadataTest, KeysOccurrencesAndPictureSize) {
  const testing_support::FixtureExpectation avc_aac = LoadFixture("avc_aac");  // a video track, then an audio track
  const auto& video = avc_aac.tracks.at(0);
  ASSERT_EQ(video.type, "video");
  const struct {
    const char* fixture;
    const char* key;
    uint32_t occurrence;
    int answer;
    uint64_t number;
  } cases[] = {
      {"avc_aac", "MediaType", 0, 1, 0x80000002}, {"avc_aac", "mediatype", 0, 1, 0x80000002},
      {"avc_aac", "mEdIaTyPe", 1, 1, 0x80000004}, {"avc_aac", "MediaType", 2, 0, 0},
      {"avc_aac", "MediaTypes", 0, 0, 0},         {"avc_aac", "Media", 0, 0, 0},
      {"avc_aac", "Width", 0, 1, video.width},    {"avc_aac", "wIDTH", 0, 1, video.width},
      {"avc_aac", "height", 0, 1, video.height},  {"avc_aac", "Height", 1, 0, 0},
      {"avc_aac", "Width", 1, 0, 0},              {"tags", "MediaType", 0, 1, 0x80000004},
      {"tags", "Width", 0, 0, 0},                 {"tags", "HEIGHT", 0, 0, 0},
      {"tags", "samplerate", 0, 1, 44100},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.fixture) + " " + c.key + " #" + std::to_string(c.occurrence));
    ParsedBlock parsed(c.fixture);
    ASSERT_EQ(parsed.result, 0);
    MmfMetadataValue value{};
    const int answer = Ops().Parser_QueryMetadata(parsed.block, c.key, c.occurrence, &value);
    EXPECT_EQ(answer, c.answer);
    uint32_t number = 0;
    if (answer == 1) {
      EXPECT_EQ(value.Type, uint32_t{kMmfMetadataNum4});
      EXPECT_EQ(value.Size, 4);
      std::memcpy(&number, MmfMetadataData(&value), sizeof number);
    }
    EXPECT_EQ(number, c.number);
  }
}

TEST(ParserFreeMetadataTest, FreesOnlyBlocksOfACompleteParseThatNoInstanceOwns) {
  for (const auto& [owner_flags, freed] : {std::pair{1u, true}, {3u, false}, {2u, false}, {0u, false}}) {
    SCOPED_TRACE(owner_flags);
    auto stream = host::OpenFileStream(plugin_test::FixtureFile("tags"), true);
    const int64_t live_before = host::LiveBlockCount();
    MmfMetadata* block = nullptr;
    ASSERT_EQ(Ops().Parser_ParseMetadata(stream->record(), 0, &block), 0);
    auto* list = reinterpret_cast<mkv_metadata_list*>(block);
    EXPECT_EQ(list->owner_flags, 1u) << "a parse's block is the caller's";
    list->owner_flags = owner_flags;
    Ops().Parser_FreeMetadata(block);
    EXPECT_EQ(host::LiveBlockCount() == live_before, freed);
    if (!freed) FreeMetadata(list);
    EXPECT_EQ(host::LiveBlockCount(), live_before);
  }
}

// A rated instance hands out its own block, which Parser_FreeMetadata leaves
// to Destroy, whether or not the graph takes metadata from the stream (graph
// flag bit 0): a block freed twice would show in the live count (or to ASan).
TEST(ParserGetMetadataTest, InstanceBlockIsHandedOutAndSurvivesParserFree) {
  const int64_t live_before = host::LiveBlockCount();
  MmfMetadata* block = nullptr;
  for (uint32_t graph_flags : {0u, 1u}) {
    SCOPED_TRACE(graph_flags);
    {
      host::SetupOptions options;
      options.graph_flags = graph_flags;
      plugin_test::Connected c = plugin_test::ConnectFile("tags", true, options);
      ASSERT_EQ(Ops().Parser_GetMetadata(c.graph->handle(), &block), 0);
      EXPECT_EQ(c.context()->Metadata->source_stream, graph_flags ? c.stream->record() : nullptr);
      Ops().Parser_FreeMetadata(block);
      MmfMetadataValue name{};
      ASSERT_EQ(Ops().Parser_QueryMetadata(block, "name", 0, &name), 1);
      EXPECT_EQ(std::string(static_cast<const char*>(MmfMetadataData(&name)), size_t(name.Size)),
                LoadFixture("tags").tags.at(0).second);
    }
    EXPECT_EQ(host::LiveBlockCount(), live_before);
  }
}

}  // namespace
