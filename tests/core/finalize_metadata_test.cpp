// The metadata list: entries as add_metadata_entry takes them, and the list
// FinalizeMetadata builds from a file model filled by hand the way the
// handlers leave it. Real files' lists are compared in the fixture test.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <limits>
#include <memory>
#include <string>
#include <vector>

#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "host/heap_control.h"

namespace {

// Each entry as "Key NUM4 value", "Key NUM8 value" or "Key UTF8 text".
std::vector<std::string> describe(const mkv_metadata_list& list) {
  std::vector<std::string> out;
  for (int i = 0; i < list.entry_count; ++i) {
    std::string entry = std::string(list.key[i]) + " ";
    uint32_t num4 = 0;
    int64_t num8 = 0;
    if (list.value_type[i] == kMetadataTypeNum4 && list.value_size[i] == 4) {
      std::memcpy(&num4, list.value[i], 4);
      entry += "NUM4 " + std::to_string(num4);
    } else if (list.value_type[i] == kMetadataTypeNum8 && list.value_size[i] == 8) {
      std::memcpy(&num8, list.value[i], 8);
      entry += "NUM8 " + std::to_string(num8);
    } else if (list.value_type[i] == kMetadataTypeUtf8) {
      entry += "UTF8 " + std::string(static_cast<const char*>(list.value[i]), static_cast<size_t>(list.value_size[i]));
    } else {
      entry += "type " + std::to_string(list.value_type[i]) + " of " + std::to_string(list.value_size[i]) + " bytes";
    }
    out.push_back(entry);
  }
  return out;
}

TEST(AddMetadataEntryTest, ValueSizeDecidesWhetherTheEntryIsAdded) {
  static const uint8_t bytes[kMaxMetadataValueSize + 1] = {1, 2, 3};
  for (int32_t size : {-1, 0, kMaxMetadataValueSize, kMaxMetadataValueSize + 1}) {
    bool fits = size >= 0 && size <= kMaxMetadataValueSize;
    int64_t live = host::LiveBlockCount();
    auto* list = mem_new_zeroed<mkv_metadata_list>();
    ASSERT_NE(list, nullptr);
    EXPECT_EQ(add_metadata_entry(list, "NUM8", "Key", bytes, size), fits ? kStatusOk : kStatusNoMemory) << size;
    ASSERT_EQ(list->entry_count, fits ? 1 : 0) << size;
    if (fits) {
      EXPECT_STREQ(list->key[0], "Key");
      EXPECT_EQ(list->value_type[0], kMetadataTypeNum8);
      EXPECT_EQ(list->value_size[0], size);
      ASSERT_NE(list->value[0], nullptr);
      EXPECT_EQ(std::memcmp(list->value[0], bytes, static_cast<size_t>(size)), 0);
    } else {
      EXPECT_EQ(list->key[0], nullptr);
      EXPECT_EQ(list->value[0], nullptr);
    }
    FreeMetadata(list);
    EXPECT_EQ(host::LiveBlockCount(), live) << size;
  }
}

// A file model filled by hand, as the handlers would leave it, with a list to build.
class MetadataFile {
 public:
  MetadataFile() : info_(std::make_unique<mkv_file_info>()) {
    std::memset(info_.get(), 0, sizeof(mkv_file_info));
    info_->parse_limits = &limits_;
    info_->metadata = mem_new_zeroed<mkv_metadata_list>();
    info_->timecode_scale = 1000000;
  }
  ~MetadataFile() { FreeMetadata(info_->metadata); }

  mkv_file_info& info() { return *info_; }
  mkv_parse_limits& limits() { return limits_; }
  std::vector<std::string> Finalize() {
    EXPECT_EQ(FinalizeMetadata(info_.get()), kStatusOk);
    return describe(*info_->metadata);
  }
  // `length` defaults to the string's.
  void AddTag(const char* name, const char* text, int length = -1) {
    mkv_tag_entry& tag = info_->tags[info_->tag_count++];
    tag.name = const_cast<char*>(name);
    tag.string = const_cast<char*>(text);
    tag.length = length >= 0 ? uint32_t(length) : text ? static_cast<uint32_t>(std::strlen(text)) : 0;
  }
  mkv_track_info& AddTrack(uint64_t type, const char* codec_id = nullptr) {
    mkv_track_info& track = info_->tracks[info_->track_count++];
    track.track_type = type;
    track.codec_id = const_cast<char*>(codec_id);
    info_->video_track_count += type == 1;
    info_->audio_track_count += type == 2;
    return track;
  }

 private:
  mkv_parse_limits limits_{kDefaultMaxStringSize, 1};
  std::unique_ptr<mkv_file_info> info_;
};

TEST(FinalizeMetadataTest, EntriesComeInTagThenFileThenTrackOrder) {
  MetadataFile file;
  file.AddTag("ARTIST", "Someone");
  file.AddTag("title", "lower case is not offered");
  file.AddTag("TITLE", "abcdef", 3);  // only the first three bytes were the TagString
  file.AddTag("GENRE", nullptr);       // a name without a string
  file.AddTag("ALBUM", "xy", 40);      // a longer TagBinary was read after the string
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
  EXPECT_EQ(file.Finalize(), (std::vector<std::string>{
                                 "Artist UTF8 Someone", "Name UTF8 abc", "Album UTF8 xy", "Comment UTF8 c", "Seekable NUM4 1",
                                 "TrackCount NUM4 2", "MediaType NUM4 2147483650", "Fourcc NUM4 1096172337", "Width NUM4 320",
                                 "Height NUM4 240", "PixelWidth NUM4 1", "PixelHeight NUM4 1", "Duration NUM8 5000000",
                                 "Channels NUM4 0", "SampleRate NUM4 24", "MediaType NUM4 2147483652", "Fourcc NUM4 1295270211",
                                 "Width NUM4 0", "Height NUM4 0", "PixelWidth NUM4 1", "PixelHeight NUM4 1",
                                 "Duration NUM8 5000000", "Channels NUM4 6", "SampleRate NUM4 44100",
                             }));
}

// Seekable needs a seekable input and cues. Frame rates from DefaultDuration
// round; sampling frequencies and durations truncate; whatever does not fit
// saturates or gives 0.
TEST(FinalizeMetadataTest, NumbersAreRoundedTruncatedAndClamped) {
  constexpr double kNan = std::numeric_limits<double>::quiet_NaN();
  constexpr uint64_t kNoTrack = 0;
  const struct {
    uint64_t track_type;
    uint64_t default_duration;
    double frequency;
    uint64_t timecode_scale;
    double duration;
    std::string entry;
    uint32_t input_seekable = 1, flags = 0;
    bool limits = true;
  } cases[] = {
      {kNoTrack, 0, 0, 1000000, 0, "Seekable NUM4 1", 1, kMetCues},
      {kNoTrack, 0, 0, 1000000, 0, "Seekable NUM4 0", 1, 0},
      {kNoTrack, 0, 0, 1000000, 0, "Seekable NUM4 0", 0, kMetCues},
      {kNoTrack, 0, 0, 1000000, 0, "Seekable NUM4 0", 1, kMetCues, false},
      {1, 41708333, 0, 1000000, 0, "SampleRate NUM4 24"},  // 23.976 rounds
      {1, 0, 0, 1000000, 0, "SampleRate NUM4 0"},
      {1, 1, 0, 1000000, 0, "SampleRate NUM4 1000000000"},
      {1, 1000000000000, 0, 1000000, 0, "SampleRate NUM4 0"},
      {2, 0, 22050.7, 1000000, 0, "SampleRate NUM4 22050"},
      {2, 0, -2.5, 1000000, 0, "SampleRate NUM4 " + std::to_string(uint32_t(-2))},
      {2, 0, kNan, 1000000, 0, "SampleRate NUM4 0"},
      {2, 0, 1e12, 1000000, 0, "SampleRate NUM4 " + std::to_string(INT32_MAX)},
      {2, 0, -1e12, 1000000, 0, "SampleRate NUM4 " + std::to_string(uint32_t{1} << 31)},
      {2, 0, 0, 1000, 2.5, "Duration NUM8 2"},
      {2, 0, 0, 1000000, kNan, "Duration NUM8 0"},
      {2, 0, 0, 1000000, 1e300, "Duration NUM8 " + std::to_string(INT64_MAX)},
      {2, 0, 0, 1000000, -1e300, "Duration NUM8 " + std::to_string(INT64_MIN)},
  };
  for (const auto& c : cases) {
    MetadataFile file;
    file.info().timecode_scale = c.timecode_scale;
    file.info().duration = c.duration;
    file.info().parse_flags = c.flags;
    file.limits().input_seekable = c.input_seekable;
    if (!c.limits) file.info().parse_limits = nullptr;
    if (c.track_type != kNoTrack) {
      mkv_track_info& track = file.AddTrack(c.track_type);
      track.default_duration = c.default_duration;
      track.sampling_frequency = c.frequency;
    }
    std::vector<std::string> entries = file.Finalize();
    std::string key = c.entry.substr(0, c.entry.find(' ') + 1);
    auto found = std::find_if(entries.begin(), entries.end(), [&](const std::string& e) { return e.starts_with(key); });
    EXPECT_EQ(found == entries.end() ? key + "missing" : *found, c.entry)
        << c.default_duration << " " << c.frequency << " " << c.timecode_scale << " x " << c.duration;
    EXPECT_EQ(entries.size(), c.track_type == kNoTrack ? 2u : 11u);
  }
}

}  // namespace
