// RateInputFormat: every fixture against what mkvinfo and ffprobe recorded
// for it; crafted files for the track set-up rules that the fixtures do not
// reach (Vorbis layouts, PCM byte order, AAC, BITMAPINFOHEADER compression
// codes, encryption, frame rates, the byte-rate estimate) and for the cue
// table that the rating reads (scan steps, codec states, times past 48 bits);
// and the rating as a lifecycle (queries, repeated requests, the seek test,
// failures that leave the instance for Destroy to free without a leak).

#include <cmath>
#include <cstring>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "core/flac_config.h"
#include "host/heap_control.h"
#include "tests/plugin/graph_harness.h"
#include "tests/support/allocation_failures.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/fixtures.h"
#include "tests/support/log_recorder.h"

namespace {

using namespace ebml;
using plugin_test::ConnectBytes;
using plugin_test::ConnectFile;
using plugin_test::Connected;
using plugin_test::FixtureFile;
using plugin_test::HostPlugin;
using testing_support::ExpectedTrack;
using testing_support::FixtureExpectation;
using testing_support::LogRecorder;


// The fixtures' codec IDs that the plug-in offers, and the four-character
// code each one must get; any other codec ID is left out.
const std::map<std::string, std::string> kOfferedCodecs = {
    {"V_MPEG4/ISO/AVC", "AVC1"}, {"V_MPEG4/ISO/ASP", "MP4V"}, {"V_MPEG4/MS/V3", "MP43"}, {"V_MPEG1", "MP1V"},
    {"V_MPEG2", "MP2V"},         {"V_THEORA", "THEO"},        {"A_MPEG/L3", "M2A3"},     {"A_MPEG/L2", "M2A2"},
    {"A_PCM/INT/LIT", "RAWA"},   {"A_PCM/INT/BIG", "RAWA"},   {"A_DTS", "DTSA"},         {"A_VORBIS", "VRBS"},
    {"A_FLAC", "FLAC"},          {"A_AAC", "M4AC"},           {"A_AC3", "AC3A"},
    {"V_MS/VFW/FOURCC", ""},  // offered under the BITMAPINFOHEADER's code, which mkvinfo shows
};

uint32_t Fourcc(const std::string& code) {
  return uint32_t(uint8_t(code[0])) << 24 | uint32_t(uint8_t(code[1])) << 16 | uint32_t(uint8_t(code[2])) << 8 |
         uint8_t(code[3]);
}

// Packet sizes of a Xiph-laced block: a count byte (packets - 1), the laced
// sizes of all packets but the last, then the packets.
std::vector<uint32_t> XiphPacketSizes(const uint8_t* bytes, uint32_t size) {
  std::vector<uint32_t> sizes;
  if (size == 0) return sizes;
  uint32_t packets = bytes[0] + 1u;
  uint32_t at = 1;
  uint32_t laced_total = 0;
  while (sizes.size() + 1 < packets && at < size) {
    uint32_t value = 0;
    while (at < size && bytes[at] == 255) value += bytes[at++];
    if (at < size) value += bytes[at++];
    sizes.push_back(value);
    laced_total += value;
  }
  sizes.push_back(size - at - laced_total);
  return sizes;
}

// Bytes per second between the first and the last cue point: the earliest
// cluster of an offered track in each, over the whole seconds between their times.
int32_t ExpectedByteRate(const FixtureExpectation& fx, const std::vector<const ExpectedTrack*>& offered) {
  auto counts = [&](uint64_t track) {
    for (const ExpectedTrack* t : offered) if (t->number == track) return true;
    return false;
  };
  if (fx.cues.empty()) return 0;
  uint64_t first_ticks = fx.cues.front().time_ticks;
  uint64_t last_ticks = fx.cues.back().time_ticks;
  uint64_t first_position = UINT64_MAX;
  uint64_t last_position = UINT64_MAX;
  for (const auto& cue : fx.cues) {
    if (!counts(cue.track)) continue;
    if (cue.time_ticks == first_ticks) first_position = std::min(first_position, cue.cluster_position);
    if (cue.time_ticks == last_ticks) last_position = std::min(last_position, cue.cluster_position);
  }
  int64_t seconds = int64_t((last_ticks - first_ticks) * (fx.timecode_scale / 1000) / 1000000);
  if (seconds <= 0 || last_position == UINT64_MAX || last_position <= first_position) return 0;
  return int32_t((last_position - first_position) / uint64_t(seconds));
}

void CheckDecoderConfig(const ExpectedTrack& track, const MkvChannel& channel) {
  const MkvChannelState& state = *channel.State;
  const MmfMediaFormat& format = channel.Format;
  if (track.codec == "A_FLAC") {
    ASSERT_EQ(format.extra_size, 48u);
    mkv_flac_config config;
    std::memcpy(&config, format.extra_ptr, sizeof config);
    EXPECT_EQ(config.sample_rate, track.flac_sample_rate);
    EXPECT_EQ(config.channels, track.flac_channels);
    EXPECT_EQ(config.bits_per_sample, track.flac_bits);
    EXPECT_EQ(state.DecoderConfigCount, 1u);
    return;
  }
  ASSERT_EQ(format.extra_size, track.codec_private_size);
  if (track.codec_private_size == 0) {
    EXPECT_EQ(state.DecoderConfigCount, 0u);
    return;
  }
  if (track.codec == "A_VORBIS") {
    std::vector<uint32_t> sizes = XiphPacketSizes(format.extra_ptr, format.extra_size);
    ASSERT_EQ(sizes.size(), 3u);
    ASSERT_EQ(state.DecoderConfigCount, 3u);
    const uint8_t* next = format.extra_ptr + format.extra_size - sizes[0] - sizes[1] - sizes[2];
    for (int j = 0; j < 3; ++j) {
      EXPECT_EQ(state.DecoderConfigSize[j], sizes[j]) << "header " << j;
      EXPECT_EQ(state.DecoderConfigData[j], next) << "header " << j;
      next += sizes[j];
    }
    return;
  }
  EXPECT_EQ(state.DecoderConfigCount, 1u);
  EXPECT_EQ(state.DecoderConfigSize[0], track.codec_private_size);
  EXPECT_EQ(state.DecoderConfigData[0], format.extra_ptr);
}

void CheckChannel(const FixtureExpectation& fx, const ExpectedTrack& track, const MkvChannel& channel) {
  SCOPED_TRACE("track " + std::to_string(track.number) + " " + track.codec);
  const MmfMediaFormat& format = channel.Format;
  ASSERT_NE(channel.State, nullptr);
  ASSERT_NE(channel.State->Track, nullptr);
  EXPECT_EQ(channel.State->Track->track_number, track.number);
  const std::string& code = kOfferedCodecs.at(track.codec);
  EXPECT_EQ(format.fourcc, Fourcc(code.empty() ? track.fields.at("vfw_fourcc") : code));
  EXPECT_EQ(format.buffer_size, 65536u);
  if (track.type == "video") {
    EXPECT_STREQ(channel.Name, "EncodedVideoOut");
    EXPECT_EQ(format.stream_type, 0x80000002u);
    EXPECT_EQ(format.media.video.width, track.width);
    EXPECT_EQ(format.media.video.height, track.height);
    uint32_t rate = track.default_duration ? uint32_t(std::lround(1e9 / double(track.default_duration))) : 24;
    EXPECT_EQ(format.media.video.frame_rate, rate);
    EXPECT_NEAR(format.media.video.duration, double(fx.duration_ns) / 1000, 1.0);
    // The bitstream's pixel aspect, which ffprobe reports unless display sizes in pixels override it.
    if (track.fields.count("display_unit") || !track.fields.count("display_width") ||
        track.fields.at("display_width") == std::to_string(track.width)) {
      EXPECT_EQ(format.media.video.pixel_aspect_width, track.sar_num);
      EXPECT_EQ(format.media.video.pixel_aspect_height, track.sar_den);
    }
  } else {
    EXPECT_STREQ(channel.Name, "EncodedAudioOut");
    bool pcm = track.codec.rfind("A_PCM/", 0) == 0;
    EXPECT_EQ(format.stream_type, pcm ? 4u : 0x80000004u);
    EXPECT_EQ(format.pcm_byte_order, !pcm ? 0u : track.codec.find("/LIT") != std::string::npos ? 1u : 2u);
    EXPECT_EQ(format.media.audio.channels, track.channels ? track.channels : 1);
    EXPECT_EQ(format.media.audio.sample_rate, uint32_t(track.sampling_frequency));
    EXPECT_EQ(format.media.audio.bits_per_sample, 16u);
  }
  CheckDecoderConfig(track, channel);
}

TEST(RateInputFormatFixturesTest, OffersEverySupportedTrackInFileOrderWithItsFormat) {
  for (const std::string& name : testing_support::FixtureNames()) {
    SCOPED_TRACE(name);
    FixtureExpectation fx = testing_support::LoadFixture(name);
    Connected c = ConnectFile(name);
    ASSERT_TRUE(c.graph);
    const bool matroska = fx.doc_type == "matroska";
    EXPECT_EQ(c.graph->sniff(), matroska ? 80 : 0);
    EXPECT_EQ(c.graph->rating(), matroska ? 80 : 0);
    if (!matroska) continue;

    // An encrypted track is counted but set up in no channel: the channels
    // after the set-up ones offer no format and are not acquired.
    std::vector<const ExpectedTrack*> offered;
    size_t counted = 0;
    for (const ExpectedTrack& track : fx.tracks) {
      counted += kOfferedCodecs.count(track.codec);
      if (kOfferedCodecs.count(track.codec) && !track.fields.count("encryption")) offered.push_back(&track);
    }
    ASSERT_EQ(c.channel_count(), int32_t(counted));
    ASSERT_EQ(c.graph->outputs().size(), counted);
    for (size_t k = offered.size(); k < counted; ++k) {
      EXPECT_EQ(c.graph->outputs()[k].formats_offered, 0);
      EXPECT_EQ(c.graph->outputs()[k].acquire_result, -1);
      EXPECT_NE(c.graph->outputs()[k].not_set_up.find("has no track: track "), std::string::npos);
      EXPECT_EQ(c.channel(int32_t(k)).State->Track, nullptr);
    }
    bool has_video = false;
    for (size_t k = 0; k < offered.size(); ++k) {
      const host::OutputChannelSetup& setup = c.graph->outputs()[k];
      EXPECT_EQ(setup.channel, AsFrameworkChannel(&c.channel(int32_t(k))));
      EXPECT_EQ(setup.formats_offered, int(counted));
      EXPECT_EQ(setup.offered.buffer_count, 42u + uint32_t(c.context()->ExtraBufferCount));
      CheckChannel(fx, *offered[k], c.channel(int32_t(k)));
      has_video |= offered[k]->type == "video";
    }

    // "Duration" is the longest channel duration: microseconds for video,
    // the segment's ticks / 1000 for audio.
    double duration = has_video ? double(fx.duration_ns) / 1000 : double(fx.duration_ns) / double(fx.timecode_scale) / 1000;
    EXPECT_NEAR(double(c.context()->Duration), duration, 1.0);
    EXPECT_EQ(c.context()->ByteRate, ExpectedByteRate(fx, offered));
    EXPECT_EQ(c.context()->RingSize, 40);
    EXPECT_EQ(c.context()->ControlState, 16u);

    // A seekable input is left at the first Cluster's ID.
    uint8_t id[4] = {};
    uint64_t cluster = c.context()->FileInfo.first_cluster_position;
    EXPECT_EQ(uint64_t(c.stream->Tell()), cluster);
    ASSERT_EQ(c.stream->Read(id, 4), 4);
    EXPECT_EQ(std::memcmp(id, "\x1F\x43\xB6\x75", 4), 0);
  }
}



constexpr uint64_t kVideo = 1;
constexpr uint64_t kAudio = 2;

Bytes Track(uint64_t number, uint64_t type, std::string_view codec, const Bytes& children = {}) {
  return element(kTrackEntry, cat({uinteger(kTrackNumber, number), uinteger(kTrackType, type), str(kCodecId, codec),
                                   children}));
}

Bytes Cue(uint64_t ticks, uint64_t track, uint64_t position, const Bytes& more = {}) {
  return master(kCuePoint, {uinteger(kCueTime, ticks), master(kCueTrackPositions, {uinteger(kCueTrack, track),
                                                                                    uinteger(kCueClusterPosition, position),
                                                                                    more})});
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


struct Case {
  const char* name;
  Bytes file;
  std::function<void(const Connected&, const LogRecorder&)> check;
};

const MkvChannel& First(const Connected& c) { return c.channel(0); }
const MkvChannelState& State(const Connected& c) { return *c.channel(0).State; }
uint64_t InFile(const Connected& c, uint64_t cue_position) {
  return c.context()->FileInfo.segment_data_position + cue_position;
}

// The request after one that a forward scan (speed 0) read at 0 s from the Cluster at cue position 100.
const MmfReadRequest& NextScanRequest(const Connected& c) {
  MkvContext& context = *c.context();
  EXPECT_EQ(MmfAcquireReadList(context.ReadList, &context.CurrentReadList), 0);
  MmfReadListEntry* previous = context.CurrentReadList;
  previous->Request->Position = InFile(c, 100);
  previous->Request->Length = 1024;
  context.TrickMode = 512;
  context.ByteRate = 2000;
  MmfReadListEntry* next = previous;
  const auto* list_maker = HostPlugin().Get<MmfListMakerOps>("MediaListMaker");
  EXPECT_EQ(list_maker->GetNextReadList(c.graph->handle()->InputChannel, &next, previous), 0);
  return *next->Request;
}

constexpr uint64_t kPast48Bits = 281474977000;  // ms: 2^48 us and a bit

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
         EXPECT_EQ(format.fourcc, Fourcc("M2AC"));
         EXPECT_EQ(format.stream_type, 0x80000004u);
         EXPECT_EQ(format.media.bytes[20], 2);  // byte 28 of the record
         EXPECT_EQ(format.media.bytes[21], 0);
         EXPECT_EQ(format.word_1104, 2u);
       }},
      {"BITMAPINFOHEADER of 40 bytes naming WVC1", Bitmap(40, "WVC1"),
       [](const Connected& c, const LogRecorder&) {
         EXPECT_EQ(First(c).Format.fourcc, Fourcc("WVC1"));
         EXPECT_EQ(First(c).Format.extra_size, 40u);
         EXPECT_EQ(First(c).Format.extra_ptr, State(c).DecoderConfigData[0]);
       }},
      {"BITMAPINFOHEADER of 50 bytes naming WVC1", Bitmap(50, "WVC1"),
       [](const Connected& c, const LogRecorder&) {
         EXPECT_EQ(First(c).Format.extra_size, 10u);
         EXPECT_EQ(First(c).Format.extra_ptr, State(c).DecoderConfigData[0] + 40);
       }},
      {"BITMAPINFOHEADER naming DIV3", Bitmap(40, "DIV3"),
       [](const Connected& c, const LogRecorder&) { EXPECT_EQ(First(c).Format.fourcc, Fourcc("DIV3")); }},
      {"encrypted AAC beside MPEG-2 video",
       File(cat({Track(1, kAudio, "A_AAC",
                       master(kContentEncodings,
                              {master(kContentEncoding, {uinteger(kContentEncodingType, 1),
                                                         master(kContentEncryption, {uinteger(kContentEncAlgo, 5)})})})),
                 Track(2, kVideo, "V_MPEG2")})),
       [](const Connected& c, const LogRecorder& log) {
         ASSERT_EQ(c.channel_count(), 2);
         EXPECT_EQ(First(c).Format.fourcc, Fourcc("MP2V"));
         EXPECT_STREQ(First(c).Name, "EncodedVideoOut");
         EXPECT_EQ(c.channel(1).Name, nullptr);
         EXPECT_EQ(c.channel(1).Format.fourcc, 0u);
         EXPECT_TRUE(log.Contains(5, "kelvane:  track 0 is encrypted.  Encryption not supported."));
       }},
      {"an encrypted track in the last of the 100 track slots",
       File(cat({[] { Bytes opus; for (uint64_t i = 1; i < 100; ++i) opus = cat({opus, Track(i, kAudio, "A_OPUS")}); return opus; }(),
                 Track(100, kAudio, "A_AAC",
                       master(kContentEncodings, {master(kContentEncoding, {uinteger(kContentEncodingType, 1),
                                                                            master(kContentEncryption, {})})}))})),
       [](const Connected& c, const LogRecorder& log) {
         ASSERT_EQ(c.channel_count(), 1);
         EXPECT_EQ(HostPlugin().output()->AcquireOutputChannel(AsFrameworkChannel(&c.channel(0))), 4044);
         EXPECT_TRUE(log.Contains(2, "kelvane: AcquireOutputChannel channel 0 has no track: track 100 is encrypted."));
       }},
      {"vorbis, AVC and a subtitle track",
       File(cat({Track(1, kAudio, "A_VORBIS"), Track(2, kVideo, "V_MPEG4/ISO/AVC"), Track(3, 17, "S_TEXT/UTF8")})),
       [](const Connected& c, const LogRecorder&) {
         ASSERT_EQ(c.channel_count(), 2);
         EXPECT_STREQ(First(c).Name, "EncodedAudioOut");
         EXPECT_EQ(First(c).Format.fourcc, Fourcc("VRBS"));
         EXPECT_STREQ(c.channel(1).Name, "EncodedVideoOut");
         EXPECT_EQ(c.channel(1).Format.fourcc, Fourcc("AVC1"));
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
      {"cue points past 2^48 us",
       File(Track(1, kVideo, "V_MPEG2"), master(kCues, {Cue(kPast48Bits, 1, 100), Cue(kPast48Bits + 1000, 1, 900)})),
       [](const Connected& c, const LogRecorder&) {
         EXPECT_EQ(c.context()->ByteRate, 800);
         uint64_t position = 0, time = 0;
         const MmfTimeConverterOps& converter = *HostPlugin().converter();
         EXPECT_EQ(converter.ConvertToPosition(c.graph->handle(), 0, kPast48Bits * 1000 + 1000001, &position), 0);
         EXPECT_EQ(position, InFile(c, 900));
         EXPECT_EQ(converter.ConvertToTime(c.graph->handle(), 0, position, &time), 0);
         EXPECT_EQ(time, (kPast48Bits + 1000) * 1000);
       }},
      {"a seek to a cue position with a codec state",
       File(Track(1, kVideo, "V_MPEG2"), master(kCues, {Cue(0, 1, 100, uinteger(kCueCodecState, 3))})),
       [](const Connected& c, const LogRecorder& log) {
         EXPECT_EQ(HostPlugin().seeker()->Seek(c.graph->handle(), 0, 0, InFile(c, 100)), 0);
         EXPECT_TRUE(log.Contains(5, "kelvane: Non-zero codec state on cue = 3"));
       }},
      {"a scan step onto cue points that share the Cluster it read",
       File(Track(1, kVideo, "V_MPEG2"),
            master(kCues, {Cue(0, 1, 100), Cue(1000, 1, 100), Cue(1500, 1, 100), Cue(5000, 1, 900)})),
       [](const Connected& c, const LogRecorder&) {
         const MmfReadRequest& next = NextScanRequest(c);
         EXPECT_EQ(next.Time, 5000000u);
         EXPECT_EQ(next.Position, InFile(c, 900));
         EXPECT_EQ(next.Length, 1024);
       }},
      {"a scan step onto cue points that share the last Cluster",
       File(Track(1, kVideo, "V_MPEG2"), master(kCues, {Cue(0, 1, 100), Cue(1000, 1, 100)})),
       [](const Connected& c, const LogRecorder& log) {
         EXPECT_EQ(NextScanRequest(c).Length, -1);
         EXPECT_TRUE(log.Contains(5, "kelvane: GetNextReadList detected EOS internally. time = 1000000"));
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

// An input that cannot seek is rated only when the input format (word 1096)
// spares it the seek to 0 (which a pipe already read from fails); SeekQuery
// then answers that it cannot seek. Above a data rate (word 1108) of 50000
// the headers go through the larger buffer: in fewer reads.
TEST(RateInputFormatLifecycleTest, SeekTestAndHeaderBufferFollowTheInputFormat) {
  struct Row {
    bool seekable;
    uint32_t no_seek_test, data_rate;
    int rating, seek_query;
  };
  const Row rows[] = {{true, 0, 0, 80, 2},  {true, 0, 50000, 80, 2}, {true, 0, 50001, 80, 2},
                      {true, 1, 0, 80, 1},  {false, 0, 0, 0, 1},     {false, 1, 0, 80, 1}};
  std::vector<uint64_t> reads;
  for (const Row& row : rows) {
    SCOPED_TRACE(reads.size());
    auto stream = host::OpenFileStream(FixtureFile("avc_aac"), row.seekable);
    Instance instance(*stream);
    instance.format.no_seek_test = row.no_seek_test;
    instance.format.data_rate = row.data_rate;
    uint32_t claim = 0;
    uint8_t first = 0;
    if (row.rating == 0) stream->Read(&first, 1);  // the pipe is no longer at 0
    EXPECT_EQ(instance.Rate(1, &claim), row.rating);
    EXPECT_EQ(HostPlugin().seeker()->SeekQuery(instance.handle), row.seek_query);
    reads.push_back(stream->counters().reads);
  }
  EXPECT_EQ(reads[1], reads[0]);
  EXPECT_LT(reads[2], reads[1]);
  EXPECT_EQ(reads[4], 1u) << "refused at the seek to 0";
}

TEST(RateInputFormatLifecycleTest, RefusedStreamLeavesNothingAfterDestroy) {
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
    EXPECT_GT(testing_support::EachAllocationFailing([&](uint64_t n) {
      Instance instance(*stream);
      uint32_t claim = 0;
      testing_support::FailingAllocation failing(n);
      const int rating = instance.Rate(1, &claim);
      const bool reached = failing.Reached();
      EXPECT_TRUE(rating == 80 || (reached && rating == 0)) << "allocation " << n << ": " << rating;
      const mkv_metadata_list* metadata = AsMkvFilter(instance.handle)->Context->Metadata;
      EXPECT_TRUE(rating == 0 || !reached || (metadata && metadata->entry_count < full_entries)) << "allocation " << n;
      return reached;
    }), 10u);
  }
}

}  // namespace
