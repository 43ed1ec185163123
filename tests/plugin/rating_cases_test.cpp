// RateInputFormat on crafted files: the track set-up rules that the real
// fixtures do not reach (Vorbis layouts, PCM byte order, AAC, BITMAPINFOHEADER
// compression codes, encryption, frame rates, the byte-rate estimate).

#include <functional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "tests/plugin/graph_harness.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/log_recorder.h"

namespace {

using namespace ebml;
using plugin_test::ConnectBytes;
using plugin_test::Connected;
using testing_support::LogRecorder;

constexpr uint64_t kVideo = 1;
constexpr uint64_t kAudio = 2;

Bytes Track(uint64_t number, uint64_t type, std::string_view codec, const Bytes& children = {}) {
  return element(kTrackEntry, cat({uinteger(kTrackNumber, number), uinteger(kTrackType, type), str(kCodecId, codec),
                                   children}));
}

Bytes Cue(uint64_t ticks, uint64_t track, uint64_t position) {
  return master(kCuePoint, {uinteger(kCueTime, ticks), master(kCueTrackPositions, {uinteger(kCueTrack, track),
                                                                                    uinteger(kCueClusterPosition, position)})});
}

// Ticks of 1 ms, a 10 s segment, the given tracks and cues, one empty Cluster.
Bytes File(const Bytes& tracks, const Bytes& cues = {}) {
  return cat({ebml_header(), master(kSegment, {master(kInfo, {uinteger(kTimecodeScale, 1000000), f64(kDuration, 10000)}),
                                               element(kTracks, tracks), cues,
                                               master(kCluster, {uinteger(kTimecode, 0)})})});
}

Bytes Vorbis(const Bytes& codec_private) {
  return File(Track(1, kAudio, "A_VORBIS", bin(kCodecPrivate, codec_private)));
}

Bytes VorbisPrivate(uint8_t count_byte, const Bytes& laces, size_t payload) {
  return cat({Bytes{count_byte}, laces, filler(payload, 0x55)});
}

Bytes Bitmap(size_t size, const char* compression) {
  Bytes header = filler(size);
  for (int i = 0; i < 4; ++i) header[16 + i] = uint8_t(compression[i]);
  return File(Track(1, kVideo, "V_MS/VFW/FOURCC", bin(kCodecPrivate, header)));
}

constexpr uint32_t Code(const char (&c)[5]) {
  return uint32_t(uint8_t(c[0])) << 24 | uint32_t(uint8_t(c[1])) << 16 | uint32_t(uint8_t(c[2])) << 8 | uint8_t(c[3]);
}

struct Case {
  const char* name;
  Bytes file;
  std::function<void(const Connected&, const LogRecorder&)> check;
};

const MkvChannel& First(const Connected& c) { return c.channel(0); }
const MkvChannelState& State(const Connected& c) { return *c.channel(0).State; }

std::vector<Case> Cases() {
  return {
      {"vorbis headers of 30, 271 and 100 bytes", Vorbis(VorbisPrivate(2, {0x1E, 0xFF, 0x10}, 401)),
       [](const Connected& c, const LogRecorder&) {
         ASSERT_EQ(State(c).DecoderConfigCount, 3u);
         EXPECT_EQ(State(c).DecoderConfigSize[0], 30u);
         EXPECT_EQ(State(c).DecoderConfigSize[1], 271u);
         EXPECT_EQ(State(c).DecoderConfigSize[2], 100u);
         EXPECT_EQ(State(c).DecoderConfigData[0], First(c).Format.extra_ptr + 4);
         EXPECT_EQ(First(c).Format.extra_size, 405u);
       }},
      {"vorbis packet count 3", Vorbis(VorbisPrivate(3, {0x1E, 0x10}, 100)),
       [](const Connected& c, const LogRecorder& log) {
         EXPECT_EQ(State(c).DecoderConfigCount, 0u);
         EXPECT_EQ(State(c).DecoderConfigData[0], nullptr);
         EXPECT_TRUE(log.Contains(3, "kelvane: Vorbis header has wrong packet count = 3"));
       }},
      {"vorbis private of 3 bytes", Vorbis({2, 1, 1}),
       [](const Connected& c, const LogRecorder& log) {
         EXPECT_EQ(State(c).DecoderConfigCount, 0u);
         for (const auto& [level, text] : log.messages()) EXPECT_EQ(text.find("Vorbis"), std::string::npos) << text;
       }},
      {"vorbis setup header empty", Vorbis(VorbisPrivate(2, {0x05, 0x05}, 10)),
       [](const Connected& c, const LogRecorder& log) {
         EXPECT_EQ(State(c).DecoderConfigCount, 0u);
         EXPECT_TRUE(log.Contains(3, "kelvane: Vorbis config too small."));
       }},
      {"little-endian PCM", File(Track(1, kAudio, "A_PCM/INT/LIT")),
       [](const Connected& c, const LogRecorder&) {
         EXPECT_EQ(First(c).Format.stream_type, 4u);
         EXPECT_EQ(First(c).Format.pcm_byte_order, 1u);
       }},
      {"big-endian PCM", File(Track(1, kAudio, "A_PCM/INT/BIG")),
       [](const Connected& c, const LogRecorder&) { EXPECT_EQ(First(c).Format.pcm_byte_order, 2u); }},
      {"MPEG-2 AAC", File(Track(1, kAudio, "A_AAC/MPEG2/LC")),
       [](const Connected& c, const LogRecorder&) {
         const MmfMediaFormat& format = First(c).Format;
         EXPECT_EQ(format.fourcc, Code("M2AC"));
         EXPECT_EQ(format.stream_type, 0x80000004u);
         EXPECT_EQ(format.media.bytes[20], 2);  // byte 28 of the record
         EXPECT_EQ(format.media.bytes[21], 0);
         EXPECT_EQ(format.word_1104, 2u);
       }},
      {"BITMAPINFOHEADER of 40 bytes naming WVC1", Bitmap(40, "WVC1"),
       [](const Connected& c, const LogRecorder&) {
         EXPECT_EQ(First(c).Format.fourcc, Code("WVC1"));
         EXPECT_EQ(First(c).Format.extra_size, 40u);
         EXPECT_EQ(First(c).Format.extra_ptr, State(c).DecoderConfigData[0]);
       }},
      {"BITMAPINFOHEADER of 50 bytes naming WVC1", Bitmap(50, "WVC1"),
       [](const Connected& c, const LogRecorder&) {
         EXPECT_EQ(First(c).Format.extra_size, 10u);
         EXPECT_EQ(First(c).Format.extra_ptr, State(c).DecoderConfigData[0] + 40);
       }},
      {"BITMAPINFOHEADER naming DIV3", Bitmap(40, "DIV3"),
       [](const Connected& c, const LogRecorder&) { EXPECT_EQ(First(c).Format.fourcc, Code("DIV3")); }},
      {"encrypted AAC beside MPEG-2 video",
       File(cat({Track(1, kAudio, "A_AAC",
                       master(kContentEncodings,
                              {master(kContentEncoding, {uinteger(kContentEncodingType, 1),
                                                         master(kContentEncryption, {uinteger(kContentEncAlgo, 5)})})})),
                 Track(2, kVideo, "V_MPEG2")})),
       [](const Connected& c, const LogRecorder& log) {
         ASSERT_EQ(c.channel_count(), 2);
         EXPECT_EQ(First(c).Format.fourcc, Code("MP2V"));
         EXPECT_STREQ(First(c).Name, "EncodedVideoOut");
         EXPECT_EQ(c.channel(1).Name, nullptr);
         EXPECT_EQ(c.channel(1).Format.fourcc, 0u);
         EXPECT_TRUE(log.Contains(5, "kelvane:  track 0 is encrypted.  Encryption not supported."));
       }},
      {"vorbis, AVC and a subtitle track",
       File(cat({Track(1, kAudio, "A_VORBIS"), Track(2, kVideo, "V_MPEG4/ISO/AVC"), Track(3, 17, "S_TEXT/UTF8")})),
       [](const Connected& c, const LogRecorder&) {
         ASSERT_EQ(c.channel_count(), 2);
         EXPECT_STREQ(First(c).Name, "EncodedAudioOut");
         EXPECT_EQ(First(c).Format.fourcc, Code("VRBS"));
         EXPECT_STREQ(c.channel(1).Name, "EncodedVideoOut");
         EXPECT_EQ(c.channel(1).Format.fourcc, Code("AVC1"));
       }},
      {"DefaultDuration of 33366667 ns", File(Track(1, kVideo, "V_MPEG2", uinteger(kDefaultDuration, 33366667))),
       [](const Connected& c, const LogRecorder&) { EXPECT_EQ(First(c).Format.media.video.frame_rate, 30u); }},
      {"no DefaultDuration", File(Track(1, kVideo, "V_MPEG2")),
       [](const Connected& c, const LogRecorder& log) {
         EXPECT_EQ(First(c).Format.media.video.frame_rate, 24u);
         EXPECT_TRUE(log.Contains(5, "kelvane:  No default duration, frame rate is inaccurate."));
       }},
      {"cues 10 s and 500000 bytes apart",
       File(Track(1, kVideo, "V_MPEG2"), master(kCues, {Cue(0, 1, 1000), Cue(10000, 1, 501000)})),
       [](const Connected& c, const LogRecorder&) { EXPECT_EQ(c.context()->ByteRate, 50000); }},
      {"cues spanning 0.5 s", File(Track(1, kVideo, "V_MPEG2"), master(kCues, {Cue(0, 1, 1000), Cue(500, 1, 501000)})),
       [](const Connected& c, const LogRecorder& log) {
         EXPECT_EQ(c.context()->ByteRate, 0);
         EXPECT_TRUE(
             log.Contains(3, "kelvane: CalcOverallByteRate cueing points weren't enough to estimate the bytes per second."));
       }},
  };
}

TEST(RateInputFormatCasesTest, TrackSetUpFollowsTheCodecRules) {
  for (const Case& test : Cases()) {
    SCOPED_TRACE(test.name);
    LogRecorder log;
    Connected c = ConnectBytes(test.file);
    ASSERT_EQ(c.graph->rating(), 80);
    ASSERT_GE(c.channel_count(), 1);
    test.check(c, log);
  }
}

}  // namespace
