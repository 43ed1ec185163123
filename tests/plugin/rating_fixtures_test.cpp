// Every fixture connected through the host's graph set-up (kelvane.so loaded
// with dlopen), checked against what mkvinfo and ffprobe recorded for it.

#include <cmath>
#include <cstring>
#include <map>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "core/flac_config.h"
#include "tests/plugin/graph_harness.h"
#include "tests/support/fixtures.h"

namespace {

using plugin_test::ConnectFile;
using plugin_test::Connected;
using testing_support::ExpectedTrack;
using testing_support::FixtureExpectation;

// The fixtures' codec IDs that the plug-in offers, and the four-character
// code each one must get; any other codec ID is left out.
const std::map<std::string, std::string> kOfferedCodecs = {
    {"V_MPEG4/ISO/AVC", "AVC1"}, {"V_MPEG4/ISO/ASP", "MP4V"}, {"V_MPEG4/MS/V3", "MP43"}, {"V_MPEG1", "MP1V"},
    {"V_MPEG2", "MP2V"},         {"V_THEORA", "THEO"},        {"A_MPEG/L3", "M2A3"},     {"A_MPEG/L2", "M2A2"},
    {"A_PCM/INT/LIT", "RAWA"},   {"A_PCM/INT/BIG", "RAWA"},   {"A_DTS", "DTSA"},         {"A_VORBIS", "VRBS"},
    {"A_FLAC", "FLAC"},          {"A_AAC", "M4AC"},           {"A_AC3", "AC3A"},
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
  EXPECT_EQ(format.fourcc, Fourcc(kOfferedCodecs.at(track.codec)));
  EXPECT_EQ(format.buffer_size, 65536u);
  if (track.type == "video") {
    EXPECT_STREQ(channel.Name, "EncodedVideoOut");
    EXPECT_EQ(format.stream_type, 0x80000002u);
    EXPECT_EQ(format.media.video.width, track.width);
    EXPECT_EQ(format.media.video.height, track.height);
    uint32_t rate = track.default_duration ? uint32_t(std::lround(1e9 / double(track.default_duration))) : 24;
    EXPECT_EQ(format.media.video.frame_rate, rate);
    EXPECT_NEAR(format.media.video.duration, double(fx.duration_ns) / 1000, 1.0);
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

    std::vector<const ExpectedTrack*> offered;
    for (const ExpectedTrack& track : fx.tracks) {
      if (kOfferedCodecs.count(track.codec)) offered.push_back(&track);
    }
    ASSERT_EQ(c.channel_count(), int32_t(offered.size()));
    ASSERT_EQ(c.graph->outputs().size(), offered.size());
    bool has_video = false;
    for (size_t k = 0; k < offered.size(); ++k) {
      const host::OutputChannelSetup& setup = c.graph->outputs()[k];
      EXPECT_EQ(setup.channel, AsFrameworkChannel(&c.channel(int32_t(k))));
      EXPECT_EQ(setup.formats_offered, int(offered.size()));
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

}  // namespace
