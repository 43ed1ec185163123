// RateInputFormat: every fixture against what mkvinfo and ffprobe recorded
// for it; crafted files for the track set-up rules that the fixtures do not
// reach (Vorbis layouts, AAC, BITMAPINFOHEADER compression codes, encryption,
// frame rates) and for the cue table that the rating reads (scan steps, codec
// states, times past 48 bits; the byte-rate estimate and conversions without
// cues are checked against a model by the cue lookup fuzzer);
// and the rating as a lifecycle (queries, repeated requests, the seek test,
// failures that leave the instance for Destroy to free without a leak).

#include <cmath>
#include <cstring>
#include <functional>
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
using plugin_test::Connected;
using plugin_test::FixtureFile;
using plugin_test::HostPlugin;
using testing_support::ExpectedTrack;
using testing_support::FixtureExpectation;

uint32_t Fourcc(const std::string& code) {
  return uint32_t(code.at(0)) << 24 | uint32_t(code.at(1)) << 16 | uint32_t(code.at(2)) << 8 | uint32_t(code.at(3));
}

// Which channels are offered, in which order, with which code, picture size
// and sample rate is checked on every fixture through the tool (check_probe.sh).
void CheckChannel(const FixtureExpectation& fx, const ExpectedTrack& track, const MkvChannel& channel) {
  SCOPED_TRACE("track " + std::to_string(track.number) + " " + track.codec);
  const MmfMediaFormat& format = channel.Format;
  EXPECT_EQ(channel.State->Track->track_number, track.number);
  EXPECT_EQ(format.buffer_size, 65536u);
  if (track.type == "video") {
    EXPECT_STREQ(channel.Name, "EncodedVideoOut");
    EXPECT_EQ(format.stream_type, 0x80000002u);
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
    EXPECT_EQ(format.media.audio.bits_per_sample, 16u);
  }
  if (track.codec != "A_FLAC") return;
  // FLAC's STREAMINFO is unpacked into the format's own configuration record.
  ASSERT_EQ(format.extra_size, 48u);
  mkv_flac_config config;
  std::memcpy(&config, format.extra_ptr, sizeof config);
  EXPECT_EQ(config.sample_rate, track.flac_sample_rate);
  EXPECT_EQ(config.channels, track.flac_channels);
  EXPECT_EQ(config.bits_per_sample, track.flac_bits);
  EXPECT_EQ(channel.State->DecoderConfigCount, 1u);
}

TEST(RateInputFormatFixturesTest, OffersEverySupportedTrackWithItsFormat) {
  for (const std::string& name : testing_support::FixtureNames()) {
    SCOPED_TRACE(name);
    FixtureExpectation fx = testing_support::LoadFixture(name);
    Connected c = plugin_test::ConnectFile(name);
    ASSERT_TRUE(c.graph);
    const bool matroska = fx.doc_type == "matroska";
    EXPECT_EQ(c.graph->sniff(), matroska ? 80 : 0);
    EXPECT_EQ(c.graph->rating(), matroska ? 80 : 0);
    if (!matroska) continue;

    // A record counted for an encrypted track offers no format and is not acquired.
    const int32_t count = c.channel_count();
    ASSERT_EQ(c.graph->outputs().size(), size_t(count));
    bool has_video = false;
    for (int32_t k = 0; k < count; ++k) {
      const host::OutputChannelSetup& setup = c.graph->outputs()[k];
      const mkv_track_info* info = c.channel(k).State->Track;
      EXPECT_EQ(setup.channel, AsFrameworkChannel(&c.channel(k)));
      EXPECT_EQ(setup.formats_offered, info ? count : 0);
      if (!info) {
        EXPECT_EQ(setup.acquire_result, -1);
        EXPECT_NE(setup.not_set_up.find("has no track: track "), std::string::npos);
        continue;
      }
      EXPECT_EQ(setup.offered.buffer_count, 42u + uint32_t(c.context()->ExtraBufferCount));
      const ExpectedTrack& track = fx.tracks.at(size_t(info - c.context()->FileInfo.tracks));
      CheckChannel(fx, track, c.channel(k));
      has_video |= track.type == "video";
    }

    // "Duration" is the longest channel duration: microseconds for video,
    // the segment's ticks / 1000 for audio.
    double duration = has_video ? double(fx.duration_ns) / 1000 : double(fx.duration_ns) / double(fx.timecode_scale) / 1000;
    EXPECT_NEAR(double(c.context()->Duration), duration, 1.0);
    EXPECT_EQ(c.context()->RingSize, 40);
    EXPECT_EQ(c.context()->ControlState, 16u);

    // A seekable input is left at the first Cluster's ID.
    uint8_t id[4] = {};
    EXPECT_EQ(uint64_t(c.stream->Tell()), c.context()->FileInfo.first_cluster_position);
    EXPECT_TRUE(c.stream->Read(id, 4) == 4 && std::memcmp(id, "\x1F\x43\xB6\x75", 4) == 0);
  }
}


constexpr uint64_t kVideo = 1;
constexpr uint64_t kAudio = 2;

Bytes Track(uint64_t number, uint64_t type, std::string_view codec, const Bytes& children = {}) {
  return element(kTrackEntry, cat({uinteger(kTrackNumber, number), uinteger(kTrackType, type), str(kCodecId, codec),
                                   children}));
}

Bytes Cue(uint64_t ticks, uint64_t track, uint64_t position, const Bytes& more = {}) {
  return master(kCuePoint, {uinteger(kCueTime, ticks), master(kCueTrackPositions, {
      uinteger(kCueTrack, track), uinteger(kCueClusterPosition, position), more})});
}

// Ticks of 1 ms, a 10 s segment, the given tracks and cues, one empty Cluster.
Bytes File(const Bytes& tracks, const Bytes& cues = {}) {
  const Bytes info = master(kInfo, {uinteger(kTimecodeScale, 1000000), f64(kDuration, 10000)});
  const Bytes cluster = master(kCluster, {uinteger(kTimecode, 0)});
  return cat({ebml_header(), master(kSegment, {info, element(kTracks, tracks), cues, cluster})});
}

// A Vorbis track whose CodecPrivate is a packet count byte, Xiph lace bytes and `payload` bytes.
Bytes Vorbis(uint8_t count_byte, const Bytes& laces, size_t payload) {
  const Bytes codec_private = cat({Bytes{count_byte}, laces, filler(payload, 0x55)});
  return File(Track(1, kAudio, "A_VORBIS", bin(kCodecPrivate, codec_private)));
}

Bytes Bitmap(size_t size, const char* compression) {
  Bytes header = filler(size);
  for (int i = 0; i < 4; ++i) header[16 + i] = uint8_t(compression[i]);
  return File(Track(1, kVideo, "V_MS/VFW/FOURCC", bin(kCodecPrivate, header)));
}

struct Case {
  const char* name;
  Bytes file;
  std::function<void(const Connected&, const MkvChannelState&, const MmfMediaFormat&)> check;
  int level = 0;              // with `log`: a message logged at that level
  const char* log = nullptr;
};

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

Bytes EncryptedTrack(uint64_t number, const Bytes& encryption) {
  return Track(number, kAudio, "A_AAC", master(kContentEncodings, {master(kContentEncoding, {
      uinteger(kContentEncodingType, 1), master(kContentEncryption, {encryption})})}));
}

std::vector<Case> Cases() {
  const Bytes mpeg2 = Track(1, kVideo, "V_MPEG2");
  return {
      {"vorbis headers of 30, 271 and 100 bytes", Vorbis(2, {0x1E, 0xFF, 0x10}, 401),
       [](auto&, auto& s, auto& f) {
         ASSERT_EQ(s.DecoderConfigCount, 3u);
         EXPECT_EQ(std::vector<uint32_t>(s.DecoderConfigSize, s.DecoderConfigSize + 3),
                   (std::vector<uint32_t>{30, 271, 100}));
         EXPECT_EQ(s.DecoderConfigData[0], f.extra_ptr + 4);
         EXPECT_EQ(f.extra_size, 405u);
       }},
      {"vorbis packet count 3", Vorbis(3, {0x1E, 0x10}, 100),
       [](auto&, auto& s, auto&) {
         EXPECT_EQ(s.DecoderConfigCount, 0u);
         EXPECT_EQ(s.DecoderConfigData[0], nullptr);
       }, 3, "kelvane: Vorbis header has wrong packet count = 3"},
      {"vorbis private of 3 bytes", Vorbis(2, {1, 1}, 0),
       [](auto&, auto& s, auto&) { EXPECT_EQ(s.DecoderConfigCount, 0u); }},
      {"vorbis setup header empty", Vorbis(2, {0x05, 0x05}, 10),
       [](auto&, auto& s, auto&) { EXPECT_EQ(s.DecoderConfigCount, 0u); },
       3, "kelvane: Vorbis config too small."},
      {"MPEG-2 AAC", File(Track(1, kAudio, "A_AAC/MPEG2/LC")),
       [](auto&, auto&, auto& f) {
         EXPECT_EQ(f.fourcc, Fourcc("M2AC"));
         EXPECT_EQ(f.stream_type, 0x80000004u);
         EXPECT_EQ(f.media.bytes[20], 2);  // byte 28 of the record
         EXPECT_EQ(f.media.bytes[21], 0);
         EXPECT_EQ(f.word_1104, 2u);
       }},
      {"BITMAPINFOHEADER of 40 bytes naming WVC1", Bitmap(40, "WVC1"),
       [](auto&, auto& s, auto& f) {
         EXPECT_EQ(f.fourcc, Fourcc("WVC1"));
         EXPECT_EQ(f.extra_size, 40u);
         EXPECT_EQ(f.extra_ptr, s.DecoderConfigData[0]);
       }},
      {"BITMAPINFOHEADER of 50 bytes naming WVC1", Bitmap(50, "WVC1"),
       [](auto&, auto& s, auto& f) {
         EXPECT_EQ(f.extra_size, 10u);
         EXPECT_EQ(f.extra_ptr, s.DecoderConfigData[0] + 40);
       }},
      {"encrypted AAC beside MPEG-2 video",
       File(cat({EncryptedTrack(1, uinteger(kContentEncAlgo, 5)), Track(2, kVideo, "V_MPEG2")})),
       [](auto& c, auto&, auto& f) {
         ASSERT_EQ(c.channel_count(), 2);
         EXPECT_EQ(f.fourcc, Fourcc("MP2V"));
         EXPECT_STREQ(c.channel(0).Name, "EncodedVideoOut");
         EXPECT_EQ(c.channel(1).Name, nullptr);
         EXPECT_EQ(c.channel(1).Format.fourcc, 0u);
       }, 5, "kelvane:  track 0 is encrypted.  Encryption not supported."},
      {"an encrypted track in the last of the 100 track slots",
       File(cat({[] { Bytes opus; for (uint64_t i = 1; i < 100; ++i) opus = cat({opus, Track(i, kAudio, "A_OPUS")}); return opus; }(),
                 EncryptedTrack(100, {})})),
       [](auto& c, auto&, auto&) {
         ASSERT_EQ(c.channel_count(), 1);
         EXPECT_EQ(HostPlugin().output()->AcquireOutputChannel(AsFrameworkChannel(&c.channel(0))), 4044);
       }, 2, "kelvane: AcquireOutputChannel channel 0 has no track: track 100 is encrypted."},
      {"DefaultDuration of 33366667 ns", File(Track(1, kVideo, "V_MPEG2", uinteger(kDefaultDuration, 33366667))),
       [](auto&, auto&, auto& f) { EXPECT_EQ(f.media.video.frame_rate, 30u); }},
      {"no DefaultDuration", File(mpeg2),
       [](auto&, auto&, auto& f) { EXPECT_EQ(f.media.video.frame_rate, 24u); },
       5, "kelvane:  No default duration, frame rate is inaccurate."},
      {"cue points past 2^48 us",
       File(mpeg2, master(kCues, {Cue(kPast48Bits, 1, 100), Cue(kPast48Bits + 1000, 1, 900)})),
       [](auto& c, auto&, auto&) {
         EXPECT_EQ(c.context()->ByteRate, 800);
         uint64_t position = 0, time = 0;
         const MmfTimeConverterOps& converter = *HostPlugin().converter();
         EXPECT_EQ(converter.ConvertToPosition(c.graph->handle(), 0, kPast48Bits * 1000 + 1000001, &position), 0);
         EXPECT_EQ(position, InFile(c, 900));
         EXPECT_EQ(converter.ConvertToTime(c.graph->handle(), 0, position, &time), 0);
         EXPECT_EQ(time, (kPast48Bits + 1000) * 1000);
       }},
      {"a seek to a cue position with a codec state",
       File(mpeg2, master(kCues, {Cue(0, 1, 100, uinteger(kCueCodecState, 3))})),
       [](auto& c, auto&, auto&) {
         EXPECT_EQ(HostPlugin().seeker()->Seek(c.graph->handle(), 0, 0, InFile(c, 100)), 0);
       }, 5, "kelvane: Non-zero codec state on cue = 3"},
      {"a scan step onto cue points that share the Cluster it read",
       File(mpeg2, master(kCues, {Cue(0, 1, 100), Cue(1000, 1, 100), Cue(1500, 1, 100), Cue(5000, 1, 900)})),
       [](auto& c, auto&, auto&) {
         const MmfReadRequest& next = NextScanRequest(c);
         EXPECT_EQ(next.Time, 5000000u);
         EXPECT_EQ(next.Position, InFile(c, 900));
         EXPECT_EQ(next.Length, 1024);
       }},
      {"a scan step onto cue points that share the last Cluster",
       File(mpeg2, master(kCues, {Cue(0, 1, 100), Cue(1000, 1, 100)})),
       [](auto& c, auto&, auto&) { EXPECT_EQ(NextScanRequest(c).Length, -1); },
       5, "kelvane: GetNextReadList detected EOS internally. time = 1000000"},
  };
}

TEST(RateInputFormatCasesTest, TrackSetUpFollowsTheCodecRules) {
  for (const Case& test : Cases()) {
    SCOPED_TRACE(test.name);
    testing_support::LogRecorder log;
    Connected c = plugin_test::ConnectBytes(test.file);
    ASSERT_EQ(c.graph->rating(), 80);
    ASSERT_GE(c.channel_count(), 1);
    test.check(c, *c.channel(0).State, c.channel(0).Format);
    if (test.log) {
      EXPECT_TRUE(log.Contains(test.level, test.log));
    }
    for (const auto& [level, text] : log.messages()) {
      EXPECT_TRUE(text.find("Vorbis") == std::string::npos || test.log) << "logged " << text;
    }
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
  int Rate(uint32_t request) {
    return HostPlugin().input()->RateInputFormat(handle->InputChannel, &format, request, &claim);
  }
  MmfFilterHandle* handle;
  MmfMediaFormat format{};
  uint32_t claim = 0;
};

TEST(RateInputFormatLifecycleTest, QueryAnswersWhetherAFullRequestAccepted) {
  auto stream = host::OpenFileStream(FixtureFile("avc_aac"), true);
  Instance instance(*stream);
  EXPECT_EQ(instance.Rate(0), 0);
  EXPECT_EQ(instance.claim, 0u);
  EXPECT_EQ(instance.Rate(1), 80);
  EXPECT_EQ(instance.claim, 1u);
  EXPECT_EQ(instance.Rate(0), 80);

  // A second full request changes nothing but the claim word, whatever it held.
  MkvFilter* filter = AsMkvFilter(instance.handle);
  MkvChannel* channels = filter->OutputChannels;
  EXPECT_EQ(instance.Rate(1), 0);
  instance.claim = 0;
  EXPECT_EQ(instance.Rate(1), 0);
  EXPECT_EQ(instance.claim, 1u);
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
    uint8_t first = 0;
    if (row.rating == 0) stream->Read(&first, 1);  // the pipe is no longer at 0
    EXPECT_EQ(instance.Rate(1), row.rating);
    EXPECT_EQ(HostPlugin().seeker()->SeekQuery(instance.handle), row.seek_query);
    reads.push_back(stream->counters().reads);
  }
  EXPECT_EQ(reads[1], reads[0]);
  EXPECT_LT(reads[2], reads[1]);
  EXPECT_EQ(reads[4], 1u) << "refused at the seek to 0";
}

TEST(RateInputFormatLifecycleTest, RefusedStreamLeavesNothingAfterDestroy) {
  const Bytes opus = File(Track(1, kAudio, "A_OPUS")), readme(4096, 'x');  // no supported track; not Matroska
  for (const Bytes* bytes : {&opus, &readme}) {
    auto stream = host::MakeMemoryStream(bytes->data(), bytes->size(), true);
    const int64_t live = host::LiveBlockCount();
    {
      Instance instance(*stream);
      EXPECT_EQ(instance.Rate(1), 0);
      EXPECT_EQ(instance.Rate(0), 0);
    }
    EXPECT_EQ(host::LiveBlockCount(), live) << (bytes == &opus ? "opus" : "README");
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
      ASSERT_EQ(instance.Rate(1), 80);
      full_entries = AsMkvFilter(instance.handle)->Context->Metadata->entry_count;
    }
    EXPECT_GT(testing_support::EachAllocationFailing([&](uint64_t n) {
      Instance instance(*stream);
      testing_support::FailingAllocation failing(n);
      const int rating = instance.Rate(1);
      const bool reached = failing.Reached();
      EXPECT_TRUE(rating == 80 || (reached && rating == 0)) << "allocation " << n << ": " << rating;
      const mkv_metadata_list* metadata = AsMkvFilter(instance.handle)->Context->Metadata;
      EXPECT_TRUE(rating == 0 || !reached || (metadata && metadata->entry_count < full_entries)) << "allocation " << n;
      return reached;
    }), 10u);
  }
}

}  // namespace
