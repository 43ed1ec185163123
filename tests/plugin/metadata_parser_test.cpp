#include <cstring>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "core/metadata_list.h"
#include "filter/mkv_context.h"
#include "filter/mkv_filter.h"
#include "host/heap_control.h"
#include "host/input_streams.h"
#include "tests/plugin/plugin_loader.h"
#include "tests/support/fixtures.h"
#include "tests/support/log_recorder.h"

namespace {

using plugin_test::LoadPlugin;
using testing_support::FixtureNames;
using testing_support::LoadFixture;

constexpr uint32_t kVideoMediaType = 0x80000002;
constexpr uint32_t kAudioMediaType = 0x80000004;

std::string FixturePath(const std::string& name) { return std::string(KELVANE_FIXTURE_DIR) + "/" + name + ".mkv"; }

const MmfMetadataParserOps& Ops() { return LoadPlugin().metadata(); }

// A block parsed from a fixture through the plug-in; freed with the plug-in's own operation.
class ParsedBlock {
 public:
  explicit ParsedBlock(const std::string& name) {
    stream_ = host::OpenFileStream(FixturePath(name), true);
    if (!stream_) {
      ADD_FAILURE() << "cannot open " << name;
      return;
    }
    result_ = Ops().Parser_ParseMetadata(stream_->record(), 0, &block_);
  }
  ~ParsedBlock() {
    if (block_) Ops().Parser_FreeMetadata(block_);
  }
  int result() const { return result_; }
  MmfMetadata* block() const { return block_; }
  const mkv_metadata_list* list() const { return reinterpret_cast<const mkv_metadata_list*>(block_); }
  host::InputStream* stream() const { return stream_.get(); }

 private:
  std::unique_ptr<host::InputStream> stream_;
  MmfMetadata* block_ = nullptr;
  int result_ = -1;
};

std::string Text(const MmfMetadataValue& value) {
  return std::string(static_cast<const char*>(MmfMetadataData(&value)), static_cast<size_t>(value.Size));
}

uint32_t Num4(const MmfMetadataValue& value) {
  uint32_t number = 0;
  EXPECT_EQ(value.Size, 4);
  std::memcpy(&number, MmfMetadataData(&value), sizeof number);
  return number;
}

// Answer of a query, and the value when it found one.
struct QueryResult {
  int answer;
  MmfMetadataValue value;
};

QueryResult Query(MmfMetadata* block, const char* key, uint32_t occurrence) {
  QueryResult result{};
  result.answer = Ops().Parser_QueryMetadata(block, key, occurrence, &result.value);
  return result;
}

bool IsMatroska(const std::string& name) { return LoadFixture(name).doc_type == "matroska"; }

TEST(ParserParseMetadataTest, TagValuesEqualTheFixtureTags) {
  const std::map<std::string, std::string> key_of_tag = {
      {"TITLE", "Name"}, {"ARTIST", "Artist"}, {"GENRE", "Genre"}, {"ALBUM", "Album"}, {"COMMENT", "Comment"}};
  int compared = 0;
  for (const std::string& name : FixtureNames()) {
    if (!IsMatroska(name)) continue;
    SCOPED_TRACE(name);
    ParsedBlock parsed(name);
    ASSERT_EQ(parsed.result(), 0);
    std::map<std::string, int> seen;
    for (const auto& [tag, string] : LoadFixture(name).tags) {
      auto key = key_of_tag.find(tag);
      if (key == key_of_tag.end()) continue;
      QueryResult found = Query(parsed.block(), key->second.c_str(), seen[tag]++);
      ASSERT_EQ(found.answer, 1) << key->second;
      EXPECT_EQ(found.value.Type, uint32_t{kMmfMetadataUtf8});
      EXPECT_EQ(Text(found.value), string) << key->second;
      ++compared;
    }
  }
  EXPECT_GE(compared, 5);
}

TEST(ParserParseMetadataTest, TagsFixtureOffersItsFiveTags) {
  ParsedBlock parsed("tags");
  ASSERT_EQ(parsed.result(), 0);
  const std::pair<const char*, const char*> expected[] = {
      {"Name", "Fixture Tag Title"},  {"Artist", "Kelvane Test Artist"}, {"Genre", "Test Tones"},
      {"Album", "Café Müller Sessions"}, {"Comment", "A 440 Hz tone for parser tests"},
  };
  for (const auto& [key, text] : expected) {
    QueryResult found = Query(parsed.block(), key, 0);
    ASSERT_EQ(found.answer, 1) << key;
    EXPECT_EQ(Text(found.value), text) << key;
    EXPECT_EQ(Query(parsed.block(), key, 1).answer, 0) << key;
  }
}

TEST(ParserParseMetadataTest, BlockFromAParseIsOwnedByTheCallerAndLeavesTheStreamAtZero) {
  ParsedBlock parsed("avc_aac");
  ASSERT_EQ(parsed.result(), 0);
  EXPECT_EQ(parsed.list()->owner_flags, 1u);
  EXPECT_EQ(parsed.list()->source_stream, nullptr);
  EXPECT_EQ(parsed.list()->event_posted, 0u);
  EXPECT_EQ(parsed.stream()->Tell(), 0);
}

TEST(ParserParseMetadataTest, InputThatIsNotMatroskaAnswers48AndLeavesNoBlock) {
  const char* const inputs[] = {KELVANE_SOURCE_DIR "/README.md", KELVANE_FIXTURE_DIR "/webm_vp8_vorbis.mkv"};
  for (const char* path : inputs) {
    SCOPED_TRACE(path);
    int64_t live_before = host::LiveBlockCount();
    auto stream = host::OpenFileStream(path, true);
    ASSERT_NE(stream, nullptr);
    auto* untouched = reinterpret_cast<MmfMetadata*>(0x1234);
    MmfMetadata* block = untouched;
    EXPECT_EQ(Ops().Parser_ParseMetadata(stream->record(), 0, &block), 48);
    EXPECT_EQ(block, untouched);
    EXPECT_EQ(stream->Tell(), 0);
    EXPECT_EQ(host::LiveBlockCount(), live_before);
  }
}

TEST(ParserParseMetadataTest, HeaderWithoutTracksAnswers48WithTheNotice) {
  std::vector<uint8_t> bytes = testing_support::ReadFixtureBytes("tiny_avc");
  ASSERT_GT(bytes.size(), 64u);
  // The EBML header alone: a valid start, but no Info and no tracks follow.
  uint8_t header_size = bytes[4] & 0x7F;
  bytes.resize(5 + header_size);
  auto stream = host::MakeMemoryStream(bytes.data(), bytes.size(), true, "short.mkv");
  testing_support::LogRecorder log;
  MmfMetadata* block = nullptr;
  EXPECT_EQ(Ops().Parser_ParseMetadata(stream->record(), 0, &block), 48);
  EXPECT_EQ(block, nullptr);
  EXPECT_TRUE(log.Contains(5, "kelvane:  Error -2 while parsing metadata for file short.mkv."));
  EXPECT_EQ(stream->Tell(), 0);
}

TEST(ParserParseMetadataTest, StreamThatCannotSeekAnswers4002) {
  std::vector<uint8_t> bytes = testing_support::ReadFixtureBytes("tiny_avc");
  auto stream = host::MakeMemoryStream(bytes.data(), bytes.size(), false);
  uint8_t first[16];
  ASSERT_EQ(stream->Read(first, sizeof first), 16);  // away from 0, and no way back
  MmfMetadata* block = nullptr;
  EXPECT_EQ(Ops().Parser_ParseMetadata(stream->record(), 0, &block), 4002);
  EXPECT_EQ(block, nullptr);
}

TEST(ParserParseMetadataTest, EachFailedAllocationFailsCleanly) {
  auto stream = host::OpenFileStream(FixturePath("avc_aac"), true);
  ASSERT_NE(stream, nullptr);
  int64_t live_before = host::LiveBlockCount();
  MmfMetadata* block = nullptr;
  int result = -1;
  int failures = 0;
  for (uint64_t n = 1; n < 2000 && result != 0; ++n) {
    host::FailNthAllocation(n);
    result = Ops().Parser_ParseMetadata(stream->record(), 0, &block);
    host::FailNthAllocation(0);
    EXPECT_EQ(stream->Tell(), 0);
    if (result != 0) {
      ++failures;
      EXPECT_TRUE(result == 12 || result == 48) << "allocation " << n << ": " << result;
      EXPECT_EQ(host::LiveBlockCount(), live_before) << "allocation " << n;
    }
  }
  ASSERT_EQ(result, 0);
  EXPECT_GE(failures, 2);
  Ops().Parser_FreeMetadata(block);
  EXPECT_EQ(host::LiveBlockCount(), live_before);
}

TEST(ParserParseMetadataTest, NullArgumentsAnswer22) {
  auto stream = host::OpenFileStream(FixturePath("tags"), true);
  MmfMetadata* block = nullptr;
  EXPECT_EQ(Ops().Parser_ParseMetadata(nullptr, 0, &block), 22);
  EXPECT_EQ(Ops().Parser_ParseMetadata(stream->record(), 0, nullptr), 22);
}

TEST(ParserQueryMetadataTest, KeyMatchesInAnyLetterCaseWithOccurrences) {
  ParsedBlock parsed("avc_aac");  // a video track, then an audio track
  ASSERT_EQ(parsed.result(), 0);
  const struct {
    const char* key;
    uint32_t occurrence;
    int answer;
    uint32_t media_type;
  } cases[] = {
      {"MediaType", 0, 1, kVideoMediaType}, {"mediatype", 0, 1, kVideoMediaType},
      {"MEDIATYPE", 0, 1, kVideoMediaType}, {"mEdIaTyPe", 1, 1, kAudioMediaType},
      {"MediaType", 2, 0, 0},               {"MediaTypes", 0, 0, 0},
      {"Media", 0, 0, 0},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.key) + " #" + std::to_string(c.occurrence));
    QueryResult found = Query(parsed.block(), c.key, c.occurrence);
    EXPECT_EQ(found.answer, c.answer);
    if (found.answer == 1) {
      EXPECT_EQ(found.value.Type, uint32_t{kMmfMetadataNum4});
      EXPECT_EQ(Num4(found.value), c.media_type);
    }
  }
}

TEST(ParserQueryMetadataTest, PictureSizeOnlyAfterAVideoMediaType) {
  ParsedBlock parsed("avc_aac");
  ASSERT_EQ(parsed.result(), 0);
  testing_support::FixtureExpectation expected = LoadFixture("avc_aac");
  ASSERT_EQ(expected.tracks.at(0).type, "video");
  for (const char* key : {"Width", "width", "WIDTH", "Height", "height", "hEIGHT"}) {
    SCOPED_TRACE(key);
    QueryResult video = Query(parsed.block(), key, 0);
    ASSERT_EQ(video.answer, 1);
    bool width = (key[0] | 0x20) == 'w';
    EXPECT_EQ(Num4(video.value), width ? expected.tracks[0].width : expected.tracks[0].height);
    // The audio track's entry comes after an audio MediaType: withheld.
    EXPECT_EQ(Query(parsed.block(), key, 1).answer, 0);
  }
}

TEST(ParserQueryMetadataTest, AudioOnlyFileWithholdsWidthAndHeight) {
  ParsedBlock parsed("tags");
  ASSERT_EQ(parsed.result(), 0);
  EXPECT_EQ(Query(parsed.block(), "MediaType", 0).answer, 1);
  for (const char* key : {"Width", "width", "Height", "HEIGHT"}) EXPECT_EQ(Query(parsed.block(), key, 0).answer, 0);
  // Other per-track entries of the same track are answered.
  QueryResult rate = Query(parsed.block(), "samplerate", 0);
  ASSERT_EQ(rate.answer, 1);
  EXPECT_EQ(Num4(rate.value), 44100u);
}

TEST(ParserQueryMetadataTest, NullArgumentsAnswer22) {
  ParsedBlock parsed("tags");
  MmfMetadataValue value{};
  EXPECT_EQ(Ops().Parser_QueryMetadata(nullptr, "Name", 0, &value), 22);
  EXPECT_EQ(Ops().Parser_QueryMetadata(parsed.block(), nullptr, 0, &value), 22);
  EXPECT_EQ(Ops().Parser_QueryMetadata(parsed.block(), "Name", 0, nullptr), 22);
}

TEST(ParserIterateMetadataTest, WalksEveryEntryInOrderThenAnswers0) {
  ParsedBlock parsed("avc_aac");
  ASSERT_EQ(parsed.result(), 0);
  const mkv_metadata_list* list = parsed.list();
  ASSERT_GT(list->entry_count, 3);
  int32_t index = 0;
  char* key = nullptr;
  MmfMetadataValue value{};
  for (int32_t i = 0; i < list->entry_count; ++i) {
    ASSERT_EQ(Ops().Parser_IterateMetadata(parsed.block(), &index, &key, &value), 1);
    EXPECT_EQ(index, i + 1);
    EXPECT_STREQ(key, list->key[i]);
    EXPECT_EQ(value.Type, list->value_type[i]);
    EXPECT_EQ(value.Size, list->value_size[i]);
    EXPECT_EQ(MmfMetadataData(&value), list->value[i]);
  }
  EXPECT_EQ(Ops().Parser_IterateMetadata(parsed.block(), &index, &key, &value), 0);
  EXPECT_EQ(index, list->entry_count);
  index = -1;
  EXPECT_EQ(Ops().Parser_IterateMetadata(parsed.block(), &index, &key, &value), 0);
  EXPECT_EQ(index, -1);
}

TEST(ParserIterateMetadataTest, SeesTheSameEntriesAsQuery) {
  ParsedBlock parsed("tags");
  ASSERT_EQ(parsed.result(), 0);
  int32_t index = 0;
  char* key = nullptr;
  MmfMetadataValue value{};
  int withheld_entries = 0;
  std::map<std::string, uint32_t> occurrences;
  int entries = 0;
  while (Ops().Parser_IterateMetadata(parsed.block(), &index, &key, &value) == 1) {
    ++entries;
    QueryResult found = Query(parsed.block(), key, occurrences[key]++);
    // An audio-only file: its picture size entries exist but are withheld.
    bool withheld = std::string(key) == "Width" || std::string(key) == "Height";
    ASSERT_EQ(found.answer, withheld ? 0 : 1) << key;
    if (withheld) {
      ++withheld_entries;
    } else {
      EXPECT_EQ(found.value.Data, value.Data) << key;
    }
  }
  EXPECT_EQ(entries, parsed.list()->entry_count);
  EXPECT_EQ(withheld_entries, 2);
}

TEST(ParserIterateMetadataTest, NullArgumentsAnswer22) {
  ParsedBlock parsed("tags");
  int32_t index = 0;
  char* key = nullptr;
  MmfMetadataValue value{};
  EXPECT_EQ(Ops().Parser_IterateMetadata(nullptr, &index, &key, &value), 22);
  EXPECT_EQ(Ops().Parser_IterateMetadata(parsed.block(), nullptr, &key, &value), 22);
  EXPECT_EQ(Ops().Parser_IterateMetadata(parsed.block(), &index, nullptr, &value), 22);
  EXPECT_EQ(Ops().Parser_IterateMetadata(parsed.block(), &index, &key, nullptr), 22);
}

TEST(ParserFreeMetadataTest, FreesOnlyBlocksOfACompleteParseThatNoInstanceOwns) {
  const struct {
    uint32_t owner_flags;
    bool freed;
  } cases[] = {{1, true}, {3, false}, {2, false}, {0, false}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.owner_flags);
    auto stream = host::OpenFileStream(FixturePath("tags"), true);
    int64_t live_before = host::LiveBlockCount();
    MmfMetadata* block = nullptr;
    ASSERT_EQ(Ops().Parser_ParseMetadata(stream->record(), 0, &block), 0);
    auto* list = reinterpret_cast<mkv_metadata_list*>(block);
    list->owner_flags = c.owner_flags;
    Ops().Parser_FreeMetadata(block);
    if (c.freed) {
      EXPECT_EQ(host::LiveBlockCount(), live_before);
    } else {
      EXPECT_GT(host::LiveBlockCount(), live_before);
      FreeMetadata(list);
      EXPECT_EQ(host::LiveBlockCount(), live_before);
    }
  }
  Ops().Parser_FreeMetadata(nullptr);
}

TEST(ParserGetMetadataTest, InstanceWithoutABlockAnswers4044) {
  MmfFilterHandle* handle = LoadPlugin().filter().Create();
  ASSERT_NE(handle, nullptr);
  auto* untouched = reinterpret_cast<MmfMetadata*>(0x1234);
  MmfMetadata* block = untouched;
  EXPECT_EQ(Ops().Parser_GetMetadata(handle, &block), 4044);
  EXPECT_EQ(block, untouched);
  EXPECT_EQ(Ops().Parser_GetMetadata(handle, nullptr), 22);
  EXPECT_EQ(Ops().Parser_GetMetadata(nullptr, &block), 22);
  LoadPlugin().filter().Destroy(handle);
}

TEST(ParserGetMetadataTest, InstanceBlockIsHandedOutAndSurvivesParserFree) {
  int64_t live_before = host::LiveBlockCount();
  MmfFilterHandle* handle = LoadPlugin().filter().Create();
  ASSERT_NE(handle, nullptr);
  auto stream = host::OpenFileStream(FixturePath("tags"), true);
  MmfMetadata* parsed = nullptr;
  ASSERT_EQ(Ops().Parser_ParseMetadata(stream->record(), 0, &parsed), 0);
  // As a rated instance holds it: marked as the instance's.
  auto* list = reinterpret_cast<mkv_metadata_list*>(parsed);
  list->owner_flags = 3;
  AsMkvFilter(handle)->Context->Metadata = list;

  MmfMetadata* block = nullptr;
  EXPECT_EQ(Ops().Parser_GetMetadata(handle, &block), 0);
  EXPECT_EQ(block, parsed);
  Ops().Parser_FreeMetadata(block);
  QueryResult name = Query(block, "name", 0);
  ASSERT_EQ(name.answer, 1);
  EXPECT_EQ(Text(name.value), "Fixture Tag Title");
  EXPECT_EQ(LoadPlugin().filter().Destroy(handle), 0);
  EXPECT_EQ(host::LiveBlockCount(), live_before);
}

}  // namespace
