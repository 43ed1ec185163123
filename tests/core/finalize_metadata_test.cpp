#include <gtest/gtest.h>

#include <cstring>
#include <limits>
#include <memory>
#include <string>
#include <vector>

#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"

namespace {

// One entry as "Key NUM4 value", "Key NUM8 value" or "Key UTF8 text".
std::string describe_entry(const mkv_metadata_list& list, int i) {
  std::string out = std::string(list.key[i]) + " ";
  switch (list.value_type[i]) {
    case kMetadataTypeNum4: {
      uint32_t value;
      EXPECT_EQ(list.value_size[i], 4);
      std::memcpy(&value, list.value[i], 4);
      return out + "NUM4 " + std::to_string(value);
    }
    case kMetadataTypeNum8: {
      int64_t value;
      EXPECT_EQ(list.value_size[i], 8);
      std::memcpy(&value, list.value[i], 8);
      return out + "NUM8 " + std::to_string(value);
    }
    case kMetadataTypeUtf8:
      return out + "UTF8 " + std::string(static_cast<const char*>(list.value[i]), static_cast<size_t>(list.value_size[i]));
    default:
      return out + "?";
  }
}

std::vector<std::string> describe(const mkv_metadata_list& list) {
  std::vector<std::string> out;
  for (int i = 0; i < list.entry_count; ++i) out.push_back(describe_entry(list, i));
  return out;
}

// A file model filled by hand, as the handlers would leave it, with a list to build.
class MetadataFixture {
 public:
  MetadataFixture() : info_(std::make_unique<mkv_file_info>()) {
    std::memset(info_.get(), 0, sizeof(mkv_file_info));
    info_->parse_limits = &limits_;
    info_->metadata = mem_new_zeroed<mkv_metadata_list>();
    info_->timecode_scale = 1000000;
  }
  ~MetadataFixture() { FreeMetadata(info_->metadata); }

  mkv_file_info& info() { return *info_; }
  mkv_parse_limits& limits() { return limits_; }
  mkv_metadata_list& list() { return *info_->metadata; }

  void AddTag(const char* name, const char* text) {
    mkv_tag_entry& tag = info_->tags[info_->tag_count++];
    tag.name = const_cast<char*>(name);
    tag.string = const_cast<char*>(text);
    tag.length = text ? static_cast<uint32_t>(std::strlen(text)) : 0;
  }
  mkv_track_info& AddTrack(uint64_t type, const char* codec_id = nullptr) {
    mkv_track_info& track = info_->tracks[info_->track_count++];
    track.track_type = type;
    track.codec_id = const_cast<char*>(codec_id);
    if (type == 1) ++info_->video_track_count;
    if (type == 2) ++info_->audio_track_count;
    return track;
  }

 private:
  mkv_parse_limits limits_{kDefaultMaxStringSize, 1};
  std::unique_ptr<mkv_file_info> info_;
};

TEST(FinalizeMetadataTest, EntriesComeInTagThenFileThenTrackOrder) {
  MetadataFixture file;
  file.AddTag("ARTIST", "Someone");
  file.AddTag("title", "lower case is not offered");
  file.AddTag("TITLE", "abc");
  file.AddTag("GENRE", nullptr);  // a name without a string
  file.AddTag("ALBUM", "Album");
  file.AddTag("COMMENT", "c");
  file.AddTag("ENCODER", "not offered");
  file.info().duration = 5000.0;
  file.info().parse_flags = kMetCues;
  mkv_track_info& video = file.AddTrack(1, "V_MPEG4/ISO/AVC");
  video.pixel_width = 0x100000140;  // only the low 32 bits are offered
  video.pixel_height = 240;
  video.default_duration = 41708333;
  video.channels = 2;  // not offered for video
  file.AddTrack(17, "S_TEXT/UTF8");
  mkv_track_info& audio = file.AddTrack(2, "A_AAC/MPEG4/LC/SBR");
  audio.sampling_frequency = 44100.0;
  audio.channels = 6;
  audio.pixel_width = 9;  // not offered for audio

  EXPECT_EQ(FinalizeMetadata(&file.info()), kStatusOk);
  EXPECT_EQ(describe(file.list()), (std::vector<std::string>{
                                       "Artist UTF8 Someone", "Name UTF8 abc", "Album UTF8 Album", "Comment UTF8 c",
                                       "Seekable NUM4 1", "TrackCount NUM4 2",
                                       "MediaType NUM4 2147483650", "Fourcc NUM4 1096172337", "Width NUM4 320",
                                       "Height NUM4 240", "PixelWidth NUM4 1", "PixelHeight NUM4 1",
                                       "Duration NUM8 5000000", "Channels NUM4 0", "SampleRate NUM4 24",
                                       "MediaType NUM4 2147483652", "Fourcc NUM4 1295270211", "Width NUM4 0",
                                       "Height NUM4 0", "PixelWidth NUM4 1", "PixelHeight NUM4 1",
                                       "Duration NUM8 5000000", "Channels NUM4 6", "SampleRate NUM4 44100",
                                   }));
}

TEST(FinalizeMetadataTest, TagValueStopsAtItsLengthAndAtItsTerminator) {
  MetadataFixture file;
  file.AddTag("TITLE", "abcdef");
  file.info().tags[0].length = 3;  // only the first three bytes were the TagString
  file.AddTag("ARTIST", "xy");
  file.info().tags[1].length = 40;  // a longer TagBinary was read after the string
  ASSERT_EQ(FinalizeMetadata(&file.info()), kStatusOk);
  EXPECT_EQ(describe_entry(file.list(), 0), "Name UTF8 abc");
  EXPECT_EQ(describe_entry(file.list(), 1), "Artist UTF8 xy");
}

TEST(FinalizeMetadataTest, SeekableNeedsASeekableInputAndCues) {
  const struct {
    bool limits;
    uint32_t input_seekable;
    uint32_t flags;
    uint32_t seekable;
  } cases[] = {
      {true, 1, kMetCues, 1}, {true, 1, 0, 0}, {true, 0, kMetCues, 0}, {false, 1, kMetCues, 0},
  };
  for (const auto& c : cases) {
    MetadataFixture file;
    file.limits().input_seekable = c.input_seekable;
    if (!c.limits) file.info().parse_limits = nullptr;
    file.info().parse_flags = c.flags;
    ASSERT_EQ(FinalizeMetadata(&file.info()), kStatusOk);
    EXPECT_EQ(describe(file.list()), (std::vector<std::string>{"Seekable NUM4 " + std::to_string(c.seekable),
                                                               "TrackCount NUM4 0"}));
  }
}

// The number of the track's first entry under `key`, from its description.
std::string value_of(const mkv_metadata_list& list, const std::string& key) {
  for (const std::string& entry : describe(list)) {
    if (entry.rfind(key + " ", 0) == 0) return entry.substr(entry.rfind(' ') + 1);
  }
  return key + " missing";
}

// Frame rates from DefaultDuration round; sampling frequencies and durations
// truncate; whatever does not fit saturates or gives 0.
TEST(FinalizeMetadataTest, NumbersAreRoundedTruncatedAndClamped) {
  constexpr double kNan = std::numeric_limits<double>::quiet_NaN();
  constexpr double kInf = std::numeric_limits<double>::infinity();
  const struct {
    uint64_t track_type;
    uint64_t default_duration;
    double frequency;
    uint64_t timecode_scale;
    double duration;
    const char* key;
    std::string value;
  } cases[] = {
      {1, 41708333, 0, 1000000, 0, "SampleRate", "24"},
      {1, 0, 0, 1000000, 0, "SampleRate", "0"},
      {1, 1, 0, 1000000, 0, "SampleRate", "1000000000"},
      {1, 1000000000000, 0, 1000000, 0, "SampleRate", "0"},
      {1, UINT64_MAX, 0, 1000000, 0, "SampleRate", "0"},
      {2, 0, 22050.7, 1000000, 0, "SampleRate", "22050"},
      {2, 0, -2.5, 1000000, 0, "SampleRate", std::to_string(uint32_t(-2))},
      {2, 0, kNan, 1000000, 0, "SampleRate", "0"},
      {2, 0, 1e12, 1000000, 0, "SampleRate", std::to_string(INT32_MAX)},
      {2, 0, -1e12, 1000000, 0, "SampleRate", std::to_string(uint32_t{1} << 31)},
      {2, 0, kInf, 1000000, 0, "SampleRate", std::to_string(INT32_MAX)},
      {2, 0, 0, 1000, 2.5, "Duration", "2"},
      {2, 0, 0, 22675, 44100.0, "Duration", "999967"},
      {2, 0, 0, 1000000, kNan, "Duration", "0"},
      {2, 0, 0, 1000000, 1e300, "Duration", std::to_string(INT64_MAX)},
      {2, 0, 0, 1000000, -1e300, "Duration", std::to_string(INT64_MIN)},
  };
  for (const auto& c : cases) {
    MetadataFixture file;
    file.info().timecode_scale = c.timecode_scale;
    file.info().duration = c.duration;
    mkv_track_info& track = file.AddTrack(c.track_type);
    track.default_duration = c.default_duration;
    track.sampling_frequency = c.frequency;
    ASSERT_EQ(FinalizeMetadata(&file.info()), kStatusOk);
    EXPECT_EQ(value_of(file.list(), c.key), c.value)
        << c.default_duration << " " << c.frequency << " " << c.timecode_scale << " x " << c.duration;
  }
}

}  // namespace
