#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "core/header/element_handlers.h"
#include "core/header/element_walker.h"
#include "core/status.h"
#include "host/heap_control.h"
#include "platform/ao_log.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"
#include "tests/support/log_recorder.h"

namespace {

using namespace ebml;
using testing_support::HeaderParse;
using testing_support::HeaderParseOptions;
using testing_support::LogRecorder;

// One TrackEntry's payload handed to the handler the way the walker does;
// the entry's header may claim more bytes than the stream holds.
class EntryRun {
 public:
  explicit EntryRun(Bytes children, HeaderParseOptions options = {})
      : size_(children.size()), parse_(std::move(children), options) {}
  int Run(int64_t size_adjustment = 0) {
    uint32_t id = kTrackEntry;
    uint64_t size = size_ + static_cast<uint64_t>(size_adjustment);
    return mkv_track_handler(&parse_.info(), &parse_.stream(), &id, &size);
  }
  mkv_file_info& info() { return parse_.info(); }
  const mkv_track_info& track() { return parse_.info().tracks[0]; }

 private:
  uint64_t size_;
  HeaderParse parse_;
};

Bytes file_with_entries(const std::vector<Bytes>& entries) {
  Bytes tracks;
  for (const Bytes& entry : entries) tracks.insert(tracks.end(), entry.begin(), entry.end());
  return cat({ebml_header(), master(kSegment, {master(kInfo, {}), element(kTracks, tracks)})});
}

// The fields the real fixtures do not exercise.
TEST(TrackHandlerTest, RareChildrenLandInTheirFields) {
  EntryRun run(cat({uinteger(kFlagLacing, 2), element(kFlagEnabled, {}), uinteger(kFlagForced, 3),
                    uinteger(kCodecDecodeAll, 1), uinteger(kMinCache, 3), uinteger(kMaxCache, 4),
                    uinteger(kMaxBlockAdditionId, 5), uinteger(kAttachmentLink, 6), uinteger(kTrackOverlay, 7),
                    element(kTrackTimecodeScale, {0x3F, 0x00, 0x00, 0x00}), str(kName, "first"), str(kName, "Commentary"),
                    str(kCodecName, "Vorbis"),
                    master(kVideo, {uinteger(kFlagInterlaced, 1), uinteger(kStereoMode, 8), uinteger(kPixelCropBottom, 9),
                                    uinteger(kPixelCropTop, 10), uinteger(kPixelCropLeft, 11),
                                    uinteger(kPixelCropRight, 12), uinteger(kAspectRatioType, 2),
                                    uinteger(kColourSpace, 0x49343230, 4), uinteger(kColourSpace, 0x5959, 2)}),
                    master(kAudio, {f64(kOutputSamplingFrequency, 96000.0)}), element(0x55B0, uinteger(kTrackNumber, 99)),
                    uinteger(kTrackNumber, 2)}));
  ASSERT_EQ(run.Run(), kStatusOk);
  const mkv_track_info& t = run.track();
  EXPECT_EQ(t.flag_lacing, 0);  // only the lowest bit counts
  EXPECT_EQ(t.flag_enabled, 0);
  EXPECT_EQ(t.flag_forced, 1);
  EXPECT_EQ(t.codec_decode_all, 1);
  EXPECT_EQ(t.flag_interlaced, 1);
  EXPECT_EQ(t.min_cache + t.max_cache + t.max_block_addition_id + t.attachment_link + t.track_overlay, 25u);
  EXPECT_EQ(t.stereo_mode, 8u);
  EXPECT_EQ(t.pixel_crop_bottom + t.pixel_crop_top * 100 + t.pixel_crop_left * 10000 + t.pixel_crop_right * 1000000,
            12111009u);
  EXPECT_EQ(t.aspect_ratio_type, 2u);
  EXPECT_EQ(t.colour_space, 0x49343230u);  // the 2-byte ColourSpace is skipped
  EXPECT_EQ(t.track_timecode_scale, 0.5);
  EXPECT_EQ(t.output_sampling_frequency, 96000.0);
  EXPECT_STREQ(t.name, "Commentary");
  EXPECT_STREQ(t.codec_name, "Vorbis");
  EXPECT_EQ(t.track_number, 2u);  // not the 99 inside the unknown 0x55B0
}

TEST(TrackHandlerTest, BadOrCutChildFailsTheEntryAndFreesIt) {
  auto cut = [](uint32_t id, uint64_t announced, size_t present) {
    return cat({id_bytes(id), size_bytes(announced), filler(present, 0x41)});
  };
  const struct {
    const char* name;
    Bytes child;
    int status;
  } cases[] = {
      {"integer of 9 bytes", element(kTrackNumber, filler(9, 1)), kStatusMalformed},
      {"flag of 9 bytes", element(kFlagDefault, filler(9, 1)), kStatusMalformed},
      {"float of 2 bytes", element(kTrackTimecodeScale, {0x3F, 0x00}), kStatusMalformed},
      {"integer cut short", cut(kPixelWidth, 4, 2), kStatusReadFailed},
      {"float cut short", cut(kSamplingFrequency, 8, 5), kStatusReadFailed},
      {"string cut short", cut(kCodecName, 20, 3), kStatusReadFailed},
      {"codec ID cut short", cut(kCodecId, 20, 3), kStatusReadFailed},
      {"encoding payload cut short", cut(kContentSigKeyId, 9, 1), kStatusReadFailed},
  };
  for (const auto& c : cases) {
    LogRecorder log;
    // Buffers the record already holds must be released with it.
    EntryRun run(cat({str(kName, "held"), bin(kCodecPrivate, {1, 2, 3}),
                      master(kContentEncoding, {bin(kContentCompSettings, {7})}), c.child}));
    int64_t live_before = host::LiveBlockCount();
    EXPECT_EQ(run.Run(64), c.status) << c.name;
    EXPECT_EQ(run.info().track_count, 0u) << c.name;
    EXPECT_EQ(host::LiveBlockCount(), live_before) << c.name;
    ASSERT_FALSE(log.messages().empty()) << c.name;
    EXPECT_EQ(log.messages().back().first, kAoLogNotice) << c.name;
    EXPECT_EQ(log.messages().back().second.rfind("Error Reading at line ", 0), 0u) << c.name;
  }
}

TEST(TrackHandlerTest, StringsAndPayloadsAreBounded) {
  const struct {
    const char* name;
    Bytes child;
    bool with_limits;
    int status;
  } cases[] = {
      {"Name at the limit", str(kName, std::string(8192, 'n')), true, kStatusOk},
      {"Name past the limit", str(kName, std::string(8193, 'n')), true, kStatusNoMemory},
      {"Name past the limit, no limits", str(kName, std::string(8193, 'n')), false, kStatusOk},
      {"CodecID one below the limit", str(kCodecId, std::string(8191, 'V')), true, kStatusOk},
      {"CodecID at the limit", str(kCodecId, std::string(8192, 'V')), true, kStatusNoMemory},
      {"CodecPrivate at the bound", bin(kCodecPrivate, filler(32768, 3)), true, kStatusOk},
      {"CodecPrivate past the bound, no limits", bin(kCodecPrivate, filler(32769, 3)), false, kStatusNoMemory},
      {"ContentCompSettings past the bound",
       cat({master(kContentEncoding, {}), bin(kContentCompSettings, filler(32769))}), true, kStatusNoMemory},
  };
  for (const auto& c : cases) {
    HeaderParseOptions options;
    options.with_limits = c.with_limits;
    EntryRun run(c.child, options);
    EXPECT_EQ(run.Run(), c.status) << c.name;
    EXPECT_EQ(run.info().track_count, c.status == kStatusOk ? 1u : 0u) << c.name;
  }
  EntryRun run(str(kCodecId, std::string(8191, 'V')));
  ASSERT_EQ(run.Run(), kStatusOk);
  EXPECT_EQ(std::string(run.track().codec_id), std::string(8191, 'V'));
}

TEST(TrackHandlerTest, TrackTypeCountsVideoAndAudioEachTimeItIsMet) {
  HeaderParse parse(file_with_entries(
      {master(kTrackEntry, {uinteger(kTrackType, 2)}), master(kTrackEntry, {uinteger(kTrackType, 2)}),
       master(kTrackEntry, {uinteger(kTrackType, 1), uinteger(kTrackType, 1)}),
       master(kTrackEntry, {uinteger(kTrackType, 3)})}));
  ASSERT_EQ(parse.Parse(), kParseSucceeded);
  EXPECT_EQ(parse.info().track_count, 4u);
  EXPECT_EQ(parse.info().video_track_count, 2u);
  EXPECT_EQ(parse.info().audio_track_count, 2u);
}

TEST(TrackHandlerTest, MastersAndEncodingsAreReadAsTheEntrysOwnChildren) {
  Bytes encodings;
  for (uint64_t order = 10; order < 16; ++order) {
    Bytes encoding = master(kContentEncoding, {uinteger(kContentEncodingOrder, order),
                                               master(kContentCompression, {bin(kContentCompSettings, {0x0F})})});
    encodings.insert(encodings.end(), encoding.begin(), encoding.end());
  }
  // The Video master claims one byte: its own size plays no part.
  EntryRun run(cat({uinteger(kContentEncodingOrder, 7), bin(kContentEncKeyId, {1}),  // no encoding open yet
                    master_sized(kVideo, 1, {uinteger(kPixelWidth, 640)}),
                    master(kContentEncodings, {master(kContentEncoding, {uinteger(kContentEncodingScope, 2),
                                                                         master(kContentEncryption, {})})}),
                    element(kContentEncodings, encodings)}));
  ASSERT_EQ(run.Run(), kStatusOk);
  const mkv_track_info& t = run.track();
  EXPECT_EQ(t.pixel_width, 640u);
  EXPECT_EQ(t.encrypted, 1);
  EXPECT_EQ(t.compressed, 1);
  ASSERT_EQ(t.content_encoding_count, 5u);
  EXPECT_EQ(t.content_encodings[0].order, 0u);
  EXPECT_EQ(t.content_encodings[0].enc_key_id, nullptr);
  EXPECT_EQ(t.content_encodings[0].scope, 2u);
  EXPECT_EQ(t.content_encodings[1].scope, 1u);
  EXPECT_EQ(t.content_encodings[3].order, 12u);
  EXPECT_EQ(t.content_encodings[4].order, 15u);  // the sixth encoding updates the fifth
  ASSERT_EQ(t.content_encodings[4].comp_settings_size, 1u);
  EXPECT_EQ(t.content_encodings[4].comp_settings[0], 0x0F);
}

TEST(TrackHandlerTest, EntryEndingEarlyIsCountedWithWhatWasRead) {
  const struct {
    const char* name;
    Bytes tail;
    int64_t size_adjustment;
  } cases[] = {
      {"ID byte 0x0F", cat({Bytes{0x0F, 0x81, 0x00}, uinteger(kChannels, 6)}), 0},
      {"size byte 0x00", cat({Bytes{0x9F, 0x00}, uinteger(kChannels, 6)}), 0},
      {"stream ends inside a size", Bytes{0x9F, 0x40}, 10},
      {"entry ends before the next child", uinteger(kChannels, 6), -3},
  };
  for (const auto& c : cases) {
    EntryRun run(cat({uinteger(kTrackNumber, 5), c.tail}));
    ASSERT_EQ(run.Run(c.size_adjustment), kStatusOk) << c.name;
    EXPECT_EQ(run.info().track_count, 1u) << c.name;
    EXPECT_EQ(run.track().track_number, 5u) << c.name;
    EXPECT_EQ(run.track().channels, 1u) << c.name;
  }
}

TEST(TrackHandlerTest, HundredTracksFitAndTheNextFailsTheParse) {
  for (uint64_t count : {100, 101}) {
    std::vector<Bytes> entries;
    for (uint64_t n = 1; n <= count; ++n) entries.push_back(master(kTrackEntry, {uinteger(kTrackNumber, n)}));
    LogRecorder log;
    HeaderParse parse(file_with_entries(entries));
    EXPECT_EQ(parse.Parse(), count == 100 ? kParseSucceeded : kParseNoMemory);
    EXPECT_EQ(parse.info().track_count, 100u);
    EXPECT_EQ(parse.info().tracks[99].track_number, 100u);
    EXPECT_EQ(log.Contains(kAoLogFailure, "mkv_track_handler:  File contains too many tracks."), count == 101);
  }
}

TEST(TrackHandlerTest, EveryFailedAllocationFailsTheEntryWithoutLeaking) {
  const Bytes children = cat(
      {str(kName, "name"), str(kLanguage, "eng"), str(kCodecId, "V_MPEG4/ISO/AVC"), bin(kCodecPrivate, {1, 2, 3}),
       str(kCodecName, "codec"),
       master(kContentEncoding, {bin(kContentCompSettings, {1}), bin(kContentEncKeyId, {2}),
                                 bin(kContentSignature, {3}), bin(kContentSigKeyId, {4})}),
       master(kContentEncoding, {bin(kContentCompSettings, {5})}), str(kName, "renamed")});
  constexpr uint64_t kAllocations = 11;
  for (uint64_t n = 1; n <= kAllocations + 1; ++n) {
    EntryRun run(children);
    int64_t live_before = host::LiveBlockCount();
    host::FailNthAllocation(n);
    int status = run.Run();
    host::FailNthAllocation(0);
    if (n > kAllocations) {
      ASSERT_EQ(status, kStatusOk);
      EXPECT_EQ(host::LiveBlockCount(), live_before + 10);  // the second Name replaced the first
      break;
    }
    EXPECT_EQ(status, kStatusNoMemory) << "allocation " << n;
    EXPECT_EQ(run.info().track_count, 0u) << "allocation " << n;
    EXPECT_EQ(host::LiveBlockCount(), live_before) << "allocation " << n;
  }
}

}  // namespace
