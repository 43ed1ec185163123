#include <gtest/gtest.h>

#include <cstring>
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

// One TrackEntry's payload handed straight to the handler, the way the walker
// does after reading the entry's header.
class EntryRun {
 public:
  explicit EntryRun(Bytes children, HeaderParseOptions options = {})
      : size_(children.size()), parse_(std::move(children), options) {}

  int Run() { return RunClaiming(size_); }
  // The entry's header claims `size` bytes, whatever the stream holds.
  int RunClaiming(uint64_t size) {
    uint32_t id = kTrackEntry;
    return mkv_track_handler(&parse_.info(), &parse_.stream(), &id, &size);
  }
  mkv_file_info& info() { return parse_.info(); }
  const mkv_track_info& track() { return parse_.info().tracks[0]; }
  uint64_t position() { return mkvvstream_tell(&parse_.stream()); }

 private:
  uint64_t size_;
  HeaderParse parse_;
};

Bytes file_with_entries(const std::vector<Bytes>& entries) {
  Bytes tracks;
  for (const Bytes& entry : entries) tracks.insert(tracks.end(), entry.begin(), entry.end());
  return cat({ebml_header(), master(kSegment, {master(kInfo, {}), element(kTracks, tracks)})});
}

// A child whose header announces `announced` bytes but the stream ends after `present`.
Bytes cut_child(uint32_t id, uint64_t announced, size_t present) {
  return cat({id_bytes(id), size_bytes(announced), filler(present, 0x41)});
}

bool logged_read_error(const LogRecorder& log) {
  for (const auto& [level, text] : log.messages()) {
    if (level == kAoLogNotice && text.rfind("Error Reading at line ", 0) == 0) return true;
  }
  return false;
}

TEST(TrackHandlerTest, EntryWithoutChildrenIsCountedWithDefaults) {
  EntryRun run({});
  ASSERT_EQ(run.Run(), kStatusOk);
  const mkv_track_info& t = run.track();
  EXPECT_EQ(run.info().track_count, 1u);
  EXPECT_TRUE(run.info().parse_flags & kMetTrackEntry);
  EXPECT_EQ(t.track_number, 0u);
  EXPECT_EQ(t.track_type, 0u);
  EXPECT_EQ(t.flag_enabled, 1);
  EXPECT_EQ(t.flag_default, 1);
  EXPECT_EQ(t.flag_lacing, 1);
  EXPECT_EQ(t.flag_forced, 0);
  EXPECT_EQ(t.track_timecode_scale, 1.0);
  EXPECT_EQ(t.sampling_frequency, 8000.0);
  EXPECT_EQ(t.channels, 1u);
  EXPECT_EQ(t.name, nullptr);
  EXPECT_EQ(t.codec_id, nullptr);
  EXPECT_EQ(t.codec_private, nullptr);
  EXPECT_EQ(t.content_encoding_count, 0u);
}

TEST(TrackHandlerTest, IntegerElementsLandInTheirFields) {
  const struct {
    Bytes child;
    uint64_t mkv_track_info::*field;
    uint64_t expected;
  } cases[] = {
      {uinteger(kTrackNumber, 0x0102030405060708), &mkv_track_info::track_number, 0x0102030405060708},
      {uinteger(kTrackUid, 0xFFFFFFFFFFFFFFFF), &mkv_track_info::track_uid, 0xFFFFFFFFFFFFFFFF},
      {uinteger(kMinCache, 3), &mkv_track_info::min_cache, 3},
      {uinteger(kMaxCache, 4), &mkv_track_info::max_cache, 4},
      {uinteger(kDefaultDuration, 41708333), &mkv_track_info::default_duration, 41708333},
      {uinteger(kMaxBlockAdditionId, 5), &mkv_track_info::max_block_addition_id, 5},
      {uinteger(kAttachmentLink, 6), &mkv_track_info::attachment_link, 6},
      {uinteger(kTrackOverlay, 7), &mkv_track_info::track_overlay, 7},
      {uinteger(kStereoMode, 8), &mkv_track_info::stereo_mode, 8},
      {uinteger(kPixelWidth, 1920), &mkv_track_info::pixel_width, 1920},
      {uinteger(kPixelHeight, 1080), &mkv_track_info::pixel_height, 1080},
      {uinteger(kPixelCropBottom, 9), &mkv_track_info::pixel_crop_bottom, 9},
      {uinteger(kPixelCropTop, 10), &mkv_track_info::pixel_crop_top, 10},
      {uinteger(kPixelCropLeft, 11), &mkv_track_info::pixel_crop_left, 11},
      {uinteger(kPixelCropRight, 12), &mkv_track_info::pixel_crop_right, 12},
      {uinteger(kDisplayWidth, 1440), &mkv_track_info::display_width, 1440},
      {uinteger(kDisplayHeight, 810), &mkv_track_info::display_height, 810},
      {uinteger(kDisplayUnit, 3), &mkv_track_info::display_unit, 3},
      {uinteger(kAspectRatioType, 2), &mkv_track_info::aspect_ratio_type, 2},
      {uinteger(kColourSpace, 0x59563132, 4), &mkv_track_info::colour_space, 0x59563132},
      {uinteger(kChannels, 6), &mkv_track_info::channels, 6},
      {uinteger(kBitDepth, 24), &mkv_track_info::bit_depth, 24},
      {element(kChannels, {}), &mkv_track_info::channels, 0},
      {uinteger(kTrackType, 17), &mkv_track_info::track_type, 17},
  };
  for (const auto& c : cases) {
    EntryRun run(c.child);
    ASSERT_EQ(run.Run(), kStatusOk) << testing::PrintToString(c.child);
    EXPECT_EQ(run.track().*c.field, c.expected) << testing::PrintToString(c.child);
  }
}

TEST(TrackHandlerTest, FlagsKeepOnlyTheLowestBit) {
  const struct {
    Bytes child;
    uint8_t mkv_track_info::*field;
    uint8_t expected;
  } cases[] = {
      {uinteger(kFlagEnabled, 0), &mkv_track_info::flag_enabled, 0},
      {element(kFlagDefault, {}), &mkv_track_info::flag_default, 0},
      {uinteger(kFlagLacing, 2), &mkv_track_info::flag_lacing, 0},
      {uinteger(kFlagForced, 3), &mkv_track_info::flag_forced, 1},
      {uinteger(kFlagForced, 0x0101, 2), &mkv_track_info::flag_forced, 1},
      {uinteger(kCodecDecodeAll, 1), &mkv_track_info::codec_decode_all, 1},
      {uinteger(kFlagInterlaced, 1), &mkv_track_info::flag_interlaced, 1},
  };
  for (const auto& c : cases) {
    EntryRun run(c.child);
    ASSERT_EQ(run.Run(), kStatusOk) << testing::PrintToString(c.child);
    EXPECT_EQ(run.track().*c.field, c.expected) << testing::PrintToString(c.child);
  }
}

TEST(TrackHandlerTest, FloatsAreReadAsSingleOrDouble) {
  const struct {
    Bytes child;
    double mkv_track_info::*field;
    double expected;
  } cases[] = {
      {element(kTrackTimecodeScale, {0x3F, 0x00, 0x00, 0x00}), &mkv_track_info::track_timecode_scale, 0.5},
      {f64(kTrackTimecodeScale, 1.000001), &mkv_track_info::track_timecode_scale, 1.000001},
      {f32(kSamplingFrequency, 44100.0f), &mkv_track_info::sampling_frequency, 44100.0},
      {f64(kSamplingFrequency, 48000.0), &mkv_track_info::sampling_frequency, 48000.0},
      {f64(kOutputSamplingFrequency, 96000.0), &mkv_track_info::output_sampling_frequency, 96000.0},
  };
  for (const auto& c : cases) {
    EntryRun run(c.child);
    ASSERT_EQ(run.Run(), kStatusOk) << testing::PrintToString(c.child);
    EXPECT_EQ(run.track().*c.field, c.expected) << testing::PrintToString(c.child);
  }
}

TEST(TrackHandlerTest, StringsAndPayloadsAreCopiedAndRepeatsReplace) {
  EntryRun run(cat({str(kName, "first"), str(kLanguage, "ger"), str(kCodecId, "A_VORBIS"),
                    str(kCodecName, "Vorbis"), bin(kCodecPrivate, {0x02, 0x00, 0xFF, 0x10}),
                    str(kName, "Commentary"), bin(kCodecPrivate, {0xAA, 0xBB}), str(kLanguage, "")}));
  ASSERT_EQ(run.Run(), kStatusOk);
  const mkv_track_info& t = run.track();
  EXPECT_STREQ(t.name, "Commentary");
  EXPECT_STREQ(t.language, "");
  EXPECT_STREQ(t.codec_id, "A_VORBIS");
  EXPECT_STREQ(t.codec_name, "Vorbis");
  ASSERT_EQ(t.codec_private_size, 2u);
  EXPECT_EQ(t.codec_private[0], 0xAA);
  EXPECT_EQ(t.codec_private[1], 0xBB);
}

TEST(TrackHandlerTest, MalformedOrCutChildFailsTheEntryAndFreesIt) {
  const struct {
    const char* name;
    Bytes child;
    int status;
  } cases[] = {
      {"integer of 9 bytes", element(kTrackNumber, filler(9, 1)), kStatusMalformed},
      {"flag of 9 bytes", element(kFlagDefault, filler(9, 1)), kStatusMalformed},
      {"encoding integer of 9 bytes", cat({master(kContentEncoding, {}), element(kContentEncodingOrder, filler(9))}),
       kStatusMalformed},
      {"float of 2 bytes", element(kTrackTimecodeScale, {0x3F, 0x00}), kStatusMalformed},
      {"float of 5 bytes", element(kSamplingFrequency, filler(5)), kStatusMalformed},
      {"integer cut short", cut_child(kPixelWidth, 4, 2), kStatusReadFailed},
      {"float cut short", cut_child(kSamplingFrequency, 8, 5), kStatusReadFailed},
      {"string cut short", cut_child(kCodecName, 20, 3), kStatusReadFailed},
      {"codec ID cut short", cut_child(kCodecId, 20, 3), kStatusReadFailed},
      {"payload cut short", cut_child(kCodecPrivate, 40, 39), kStatusReadFailed},
      {"encoding payload cut short", cat({master(kContentEncoding, {}), cut_child(kContentSigKeyId, 9, 1)}),
       kStatusReadFailed},
  };
  for (const auto& c : cases) {
    LogRecorder log;
    int64_t live_before = host::LiveBlockCount();
    {
      // Buffers the record already holds must be released with it.
      Bytes children = cat({str(kName, "held"), bin(kCodecPrivate, {1, 2, 3}),
                            master(kContentEncoding, {bin(kContentCompSettings, {7})}), c.child});
      EntryRun run(children);
      live_before = host::LiveBlockCount();
      EXPECT_EQ(run.RunClaiming(children.size() + 64), c.status) << c.name;
      EXPECT_EQ(run.info().track_count, 0u) << c.name;
      EXPECT_EQ(host::LiveBlockCount(), live_before) << c.name;
    }
    EXPECT_TRUE(logged_read_error(log)) << c.name;
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
      {"Name past the limit without limits", str(kName, std::string(8193, 'n')), false, kStatusOk},
      {"Language past the limit", str(kLanguage, std::string(8193, 'l')), true, kStatusNoMemory},
      {"CodecName past the limit", str(kCodecName, std::string(8193, 'c')), true, kStatusNoMemory},
      {"CodecID one below the limit", str(kCodecId, std::string(8191, 'V')), true, kStatusOk},
      {"CodecID at the limit", str(kCodecId, std::string(8192, 'V')), true, kStatusNoMemory},
      {"CodecID at the limit without limits", str(kCodecId, std::string(8192, 'V')), false, kStatusOk},
      {"CodecPrivate at the bound", bin(kCodecPrivate, filler(32768, 3)), true, kStatusOk},
      {"CodecPrivate past the bound", bin(kCodecPrivate, filler(32769, 3)), true, kStatusNoMemory},
      {"CodecPrivate past the bound without limits", bin(kCodecPrivate, filler(32769, 3)), false, kStatusNoMemory},
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
}

TEST(TrackHandlerTest, LongStringsKeepTheirBytesAndTerminator) {
  std::string codec_id(8191, 'V');
  codec_id[8190] = 'Z';
  EntryRun run(cat({str(kCodecId, codec_id), bin(kCodecPrivate, filler(32768, 0x5A))}));
  ASSERT_EQ(run.Run(), kStatusOk);
  EXPECT_EQ(std::string(run.track().codec_id), codec_id);
  EXPECT_EQ(run.track().codec_private_size, 32768u);
  EXPECT_EQ(run.track().codec_private[32767], 0x5A);
}

TEST(TrackHandlerTest, TrackTypeCountsVideoAndAudioTracks) {
  const struct {
    const char* name;
    std::vector<Bytes> entries;
    uint32_t video;
    uint32_t audio;
  } cases[] = {
      {"two audio entries",
       {master(kTrackEntry, {uinteger(kTrackType, 2)}), master(kTrackEntry, {uinteger(kTrackType, 2)})}, 0, 2},
      {"video and audio",
       {master(kTrackEntry, {uinteger(kTrackType, 1)}), master(kTrackEntry, {uinteger(kTrackType, 2)})}, 1, 1},
      {"TrackType twice in one entry", {master(kTrackEntry, {uinteger(kTrackType, 1), uinteger(kTrackType, 1)})}, 2,
       0},
      {"subtitle type", {master(kTrackEntry, {uinteger(kTrackType, 0x11)})}, 0, 0},
      {"type 3", {master(kTrackEntry, {uinteger(kTrackType, 3)})}, 0, 0},
      {"no type", {master(kTrackEntry, {uinteger(kTrackNumber, 1)})}, 0, 0},
  };
  for (const auto& c : cases) {
    HeaderParse parse(file_with_entries(c.entries));
    ASSERT_EQ(parse.Parse(), kParseSucceeded) << c.name;
    EXPECT_EQ(parse.info().track_count, c.entries.size()) << c.name;
    EXPECT_EQ(parse.info().video_track_count, c.video) << c.name;
    EXPECT_EQ(parse.info().audio_track_count, c.audio) << c.name;
  }
}

TEST(TrackHandlerTest, MastersDoNotHideTheirChildren) {
  // The Video master claims one byte only: its own size plays no part.
  EntryRun run(cat({master_sized(kVideo, 1, {uinteger(kPixelWidth, 640), uinteger(kPixelHeight, 360)}),
                    master(kAudio, {uinteger(kChannels, 2), f64(kSamplingFrequency, 22050.0)}),
                    master(kContentEncodings,
                           {master(kContentEncoding, {uinteger(kContentEncodingOrder, 0),
                                                      master(kContentCompression, {uinteger(kContentCompAlgo, 3)})})}),
                    uinteger(kTrackNumber, 9)}));
  ASSERT_EQ(run.Run(), kStatusOk);
  const mkv_track_info& t = run.track();
  EXPECT_EQ(t.pixel_width, 640u);
  EXPECT_EQ(t.pixel_height, 360u);
  EXPECT_EQ(t.channels, 2u);
  EXPECT_EQ(t.sampling_frequency, 22050.0);
  EXPECT_EQ(t.content_encoding_count, 1u);
  EXPECT_EQ(t.content_encodings[0].comp_algo, 3u);
  EXPECT_EQ(t.compressed, 1);
  EXPECT_EQ(t.track_number, 9u);
}

TEST(TrackHandlerTest, ContentEncodingsFillTheirOwnRecords) {
  EntryRun run(master(
      kContentEncodings,
      {master(kContentEncoding, {uinteger(kContentEncodingOrder, 0), uinteger(kContentEncodingType, 0),
                                 master(kContentCompression, {uinteger(kContentCompAlgo, 3),
                                                              bin(kContentCompSettings, {0x00, 0x00, 0x01})})}),
       master(kContentEncoding,
              {uinteger(kContentEncodingOrder, 1), uinteger(kContentEncodingScope, 2), uinteger(kContentEncodingType, 1),
               master(kContentEncryption,
                      {uinteger(kContentEncAlgo, 5), bin(kContentEncKeyId, {0x11, 0x22}), bin(kContentSignature, {0x33}),
                       bin(kContentSigKeyId, {0x44, 0x55, 0x66}), uinteger(kContentSigAlgo, 1),
                       uinteger(kContentSigHashAlgo, 2)})})}));
  ASSERT_EQ(run.Run(), kStatusOk);
  const mkv_track_info& t = run.track();
  ASSERT_EQ(t.content_encoding_count, 2u);
  const mkv_content_encoding& first = t.content_encodings[0];
  EXPECT_EQ(first.scope, 1u);
  EXPECT_EQ(first.comp_algo, 3u);
  ASSERT_EQ(first.comp_settings_size, 3u);
  EXPECT_EQ(first.comp_settings[2], 0x01);
  const mkv_content_encoding& second = t.content_encodings[1];
  EXPECT_EQ(second.order, 1u);
  EXPECT_EQ(second.scope, 2u);
  EXPECT_EQ(second.type, 1u);
  EXPECT_EQ(second.enc_algo, 5u);
  ASSERT_EQ(second.enc_key_id_size, 2u);
  EXPECT_EQ(second.enc_key_id[1], 0x22);
  ASSERT_EQ(second.signature_size, 1u);
  EXPECT_EQ(second.signature[0], 0x33);
  ASSERT_EQ(second.sig_key_id_size, 3u);
  EXPECT_EQ(second.sig_key_id[2], 0x66);
  EXPECT_EQ(second.sig_algo, 1u);
  EXPECT_EQ(second.sig_hash_algo, 2u);
  EXPECT_EQ(t.encrypted, 1);
  EXPECT_EQ(t.compressed, 1);
}

TEST(TrackHandlerTest, EncodingsBeyondTheFifthUpdateTheFifth) {
  std::vector<Bytes> encodings;
  Bytes children;
  for (uint64_t order = 10; order < 16; ++order) {
    Bytes encoding = master(kContentEncoding, {uinteger(kContentEncodingOrder, order),
                                               master(kContentCompression, {bin(kContentCompSettings, {0x0F})})});
    children.insert(children.end(), encoding.begin(), encoding.end());
  }
  EntryRun run(element(kContentEncodings, children));
  ASSERT_EQ(run.Run(), kStatusOk);
  const mkv_track_info& t = run.track();
  EXPECT_EQ(t.content_encoding_count, 5u);
  EXPECT_EQ(t.content_encodings[3].order, 13u);
  EXPECT_EQ(t.content_encodings[4].order, 15u);  // the sixth encoding's
}

TEST(TrackHandlerTest, EncodingChildrenOutsideAnEncodingAreSkipped) {
  EntryRun run(cat({uinteger(kContentEncodingOrder, 7), bin(kContentCompSettings, {1, 2}),
                    uinteger(kContentEncAlgo, 5), master(kContentEncoding, {}), uinteger(kTrackNumber, 4)}));
  ASSERT_EQ(run.Run(), kStatusOk);
  const mkv_track_info& t = run.track();
  EXPECT_EQ(t.content_encoding_count, 1u);
  EXPECT_EQ(t.content_encodings[0].order, 0u);
  EXPECT_EQ(t.content_encodings[0].comp_settings, nullptr);
  EXPECT_EQ(t.content_encodings[0].enc_algo, 0u);
  EXPECT_EQ(t.content_encodings[0].scope, 1u);
  EXPECT_EQ(t.track_number, 4u);
}

TEST(TrackHandlerTest, EncryptionAndCompressionAreNotedEvenWhenEmpty) {
  const struct {
    Bytes child;
    uint8_t encrypted;
    uint8_t compressed;
  } cases[] = {
      {master(kContentEncryption, {}), 1, 0},
      {master(kContentCompression, {}), 0, 1},
      {master(kContentEncoding, {master(kContentEncryption, {}), master(kContentCompression, {})}), 1, 1},
      {master(kContentEncodings, {master(kContentEncoding, {})}), 0, 0},
  };
  for (const auto& c : cases) {
    EntryRun run(c.child);
    ASSERT_EQ(run.Run(), kStatusOk);
    EXPECT_EQ(run.track().encrypted, c.encrypted) << testing::PrintToString(c.child);
    EXPECT_EQ(run.track().compressed, c.compressed) << testing::PrintToString(c.child);
  }
}

TEST(TrackHandlerTest, ColourSpaceOfAnotherSizeIsSkipped) {
  const struct {
    const char* name;
    Bytes children;
    uint64_t colour_space;
  } cases[] = {
      {"four bytes", uinteger(kColourSpace, 0x00000102, 4), 0x102},
      {"two bytes", uinteger(kColourSpace, 0x5959, 2), 0},
      {"eight bytes", uinteger(kColourSpace, 0x0102030405060708, 8), 0},
      {"two bytes after four", cat({uinteger(kColourSpace, 0x49343230, 4), uinteger(kColourSpace, 0x5959, 2)}),
       0x49343230},
  };
  for (const auto& c : cases) {
    EntryRun run(cat({c.children, uinteger(kTrackNumber, 3)}));
    ASSERT_EQ(run.Run(), kStatusOk) << c.name;
    EXPECT_EQ(run.track().colour_space, c.colour_space) << c.name;
    EXPECT_EQ(run.track().track_number, 3u) << c.name;
  }
}

TEST(TrackHandlerTest, UnknownChildIsSkippedBySize) {
  // The unknown element's payload looks like a TrackNumber of 99; it must not be read as one.
  EntryRun run(cat({element(0x55B0, uinteger(kTrackNumber, 99)), uinteger(kTrackNumber, 2)}));
  ASSERT_EQ(run.Run(), kStatusOk);
  EXPECT_EQ(run.track().track_number, 2u);
}

TEST(TrackHandlerTest, EntryEndingEarlyIsCountedWithWhatWasRead) {
  const struct {
    const char* name;
    Bytes children;
    uint64_t claimed_extra;
  } cases[] = {
      {"ID byte 0x00", cat({uinteger(kTrackNumber, 5), Bytes{0x00}, uinteger(kChannels, 6)}), 0},
      {"ID byte 0x0F", cat({uinteger(kTrackNumber, 5), Bytes{0x0F, 0x81, 0x00}, uinteger(kChannels, 6)}), 0},
      {"size byte 0x00", cat({uinteger(kTrackNumber, 5), Bytes{0x9F, 0x00}, uinteger(kChannels, 6)}), 0},
      {"stream ends inside an ID", cat({uinteger(kTrackNumber, 5), Bytes{0x23, 0xE3}}), 10},
      {"stream ends inside a size", cat({uinteger(kTrackNumber, 5), Bytes{0x9F, 0x40}}), 10},
  };
  for (const auto& c : cases) {
    EntryRun run(c.children);
    ASSERT_EQ(run.RunClaiming(c.children.size() + c.claimed_extra), kStatusOk) << c.name;
    EXPECT_EQ(run.info().track_count, 1u) << c.name;
    EXPECT_EQ(run.track().track_number, 5u) << c.name;
    EXPECT_EQ(run.track().channels, 1u) << c.name;
  }
}

TEST(TrackHandlerTest, EntryStopsAtItsEnd) {
  // Bytes behind the entry belong to the next element.
  Bytes children = cat({uinteger(kTrackNumber, 5), uinteger(kChannels, 6)});
  EntryRun run(children);
  ASSERT_EQ(run.RunClaiming(children.size() - 3), kStatusOk);
  EXPECT_EQ(run.track().channels, 1u);
  EXPECT_EQ(run.position(), children.size() - 3);
}

std::vector<Bytes> numbered_entries(uint64_t count) {
  std::vector<Bytes> entries;
  for (uint64_t n = 1; n <= count; ++n) entries.push_back(master(kTrackEntry, {uinteger(kTrackNumber, n)}));
  return entries;
}

TEST(TrackHandlerTest, HundredTracksFitAndTheNextIsRefused) {
  {
    HeaderParse parse(file_with_entries(numbered_entries(100)));
    ASSERT_EQ(parse.Parse(), kParseSucceeded);
    EXPECT_EQ(parse.info().track_count, 100u);
    EXPECT_EQ(parse.info().tracks[99].track_number, 100u);
  }
  LogRecorder log;
  HeaderParse parse(file_with_entries(numbered_entries(101)));
  EXPECT_EQ(parse.Parse(), kParseNoMemory);
  EXPECT_EQ(parse.info().track_count, 100u);
  EXPECT_TRUE(log.Contains(kAoLogFailure, "mkv_track_handler:  File contains too many tracks."));
  EXPECT_TRUE(log.Contains(kAoLogFailure, "Error parsing TrackEntry Element."));
}

TEST(TrackHandlerTest, EveryFailedAllocationFailsTheEntryWithoutLeaking) {
  const Bytes children = cat(
      {str(kName, "name"), str(kLanguage, "eng"), str(kCodecId, "V_MPEG4/ISO/AVC"), bin(kCodecPrivate, {1, 2, 3}),
       str(kCodecName, "codec"),
       master(kContentEncoding, {bin(kContentCompSettings, {1}), bin(kContentEncKeyId, {2}),
                                 bin(kContentSignature, {3}), bin(kContentSigKeyId, {4})}),
       master(kContentEncoding, {bin(kContentCompSettings, {5})}), str(kName, "renamed")});
  constexpr uint64_t kAllocations = 11;
  uint64_t failures = 0;
  for (uint64_t n = 1; n <= kAllocations + 1; ++n) {
    EntryRun run(children);
    int64_t live_before = host::LiveBlockCount();
    host::FailNthAllocation(n);
    int status = run.Run();
    host::FailNthAllocation(0);
    if (n > kAllocations) {
      EXPECT_EQ(status, kStatusOk);
      EXPECT_EQ(host::LiveBlockCount(), live_before + 10);  // the repeated Name replaced the first
      break;
    }
    ++failures;
    EXPECT_EQ(status, kStatusNoMemory) << "allocation " << n;
    EXPECT_EQ(run.info().track_count, 0u) << "allocation " << n;
    EXPECT_EQ(host::LiveBlockCount(), live_before) << "allocation " << n;
  }
  EXPECT_EQ(failures, kAllocations);
}

}  // namespace
