#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "core/header/element_handlers.h"
#include "core/status.h"
#include "host/heap_control.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"

namespace {

using namespace ebml;
using testing_support::HeaderParse;

// A cue list written out flat: "time:track/cluster/block/state[ref,ref];track/..." per point, "|" between points.
std::string describe(const mkv_queue& points) {
  std::string out;
  mkv_queue_node* point_node = points.head;
  for (uint32_t p = 0; p < points.count; ++p, point_node = point_node->next) {
    const auto* point = static_cast<const mkv_cue_point*>(point_node->data);
    if (p) out += "|";
    out += std::to_string(point->cue_time) + ":";
    mkv_queue_node* position_node = point->track_positions.head;
    for (uint32_t t = 0; t < point->track_positions.count; ++t, position_node = position_node->next) {
      const auto* position = static_cast<const mkv_cue_track_position*>(position_node->data);
      if (t) out += ";";
      out += std::to_string(position->cue_track) + "/" + std::to_string(position->cue_cluster_position) + "/" +
             std::to_string(position->cue_block_number) + "/" + std::to_string(position->cue_codec_state) + "[";
      mkv_queue_node* ref_node = position->references.head;
      for (uint32_t r = 0; r < position->references.count; ++r, ref_node = ref_node->next) {
        if (r) out += ",";
        out += std::to_string(static_cast<const mkv_cue_reference*>(ref_node->data)->cue_ref_time);
      }
      out += "]";
    }
  }
  return out;
}

int run_handler(HeaderParse& parse, const Bytes& payload) {
  uint32_t id = kCues;
  uint64_t size = payload.size();
  return mkv_cue_handler(&parse.info(), &parse.stream(), &id, &size);
}

Bytes point(uint64_t time, std::initializer_list<Bytes> positions) {
  Bytes children = cat({uinteger(kCueTime, time)});
  for (const Bytes& p : positions) children.insert(children.end(), p.begin(), p.end());
  return element(kCuePoint, children);
}
Bytes position(uint64_t track, uint64_t cluster, std::initializer_list<Bytes> more = {}) {
  Bytes children = cat({uinteger(kCueTrack, track), uinteger(kCueClusterPosition, cluster)});
  for (const Bytes& m : more) children.insert(children.end(), m.begin(), m.end());
  return element(kCueTrackPositions, children);
}

// Plain cue tables of real files are compared in the fixture test. The Cues
// flag stands exactly when a CuePoint was met, whatever ended the element.
TEST(CueHandlerTest, CuePointsKeepFileOrderWithTheirPositionsAndReferences) {
  const struct {
    const char* name;
    Bytes payload;
    int status;
    std::string cues;
  } cases[] = {
      {"CueBlockNumber", point(7, {position(2, 99, {uinteger(kCueBlockNumber, 12)})}), kStatusOk, "7:2/99/12/0[]"},
      {"CueBlockNumber of length 0", point(7, {position(2, 99, {element(kCueBlockNumber, {})})}), kStatusOk,
       "7:2/99/0/0[]"},
      {"audio and video positions", point(5, {position(1, 10), position(2, 10, {uinteger(kCueCodecState, 3)})}),
       kStatusOk, "5:1/10/1/0[];2/10/1/3[]"},
      {"references", point(9, {position(1, 20, {master(kCueReference, {uinteger(kCueRefTime, 4)}),
                                                master(kCueReference, {uinteger(kCueRefTime, 6), uinteger(0x97, 1)})})}),
       kStatusOk, "9:1/20/1/0[4,6]"},
      {"file order, not time order", cat({point(30, {position(1, 300)}), point(10, {position(1, 100)})}), kStatusOk,
       "30:1/300/1/0[]|10:1/100/1/0[]"},
      {"64-bit values", point(0xFFFFFFFFFFFFFFFFull, {position(1, 0x123456789Aull)}), kStatusOk,
       "18446744073709551615:1/78187493530/1/0[]"},
      // Children that come before their master have no record to fill.
      {"orphans before the first CuePoint",
       cat({uinteger(kCueTime, 8), uinteger(kCueTrack, 3), master(kCueTrackPositions, {uinteger(kCueTrack, 4)}),
            master(kCueReference, {uinteger(kCueRefTime, 2)}), point(1, {position(1, 2)})}),
       kStatusOk, "1:1/2/1/0[]"},
      // The handler reads one flat sequence: a new CuePoint keeps the track
      // position created last, so a stray CueTrack lands there.
      {"current position survives a new CuePoint",
       cat({point(1, {position(1, 2)}), element(kCuePoint, {}), uinteger(kCueTrack, 9)}), kStatusOk, "1:9/2/1/0[]|0:"},
      {"empty", {}, kStatusOk, ""},
      {"only unknown children", cat({bin(kVoid, filler(4)), uinteger(kCueTime, 3)}), kStatusOk, ""},
      {"first CueTime of 9 bytes", element(kCuePoint, element(kCueTime, filler(9))), kStatusMalformed, "0:"},
      {"malformed header before any point", cat({Bytes{0x00, 0x81}, point(1, {position(1, 2)})}), kStatusMalformed, ""},
      {"malformed header after a point", cat({point(1, {position(1, 2)}), Bytes{0xBB, 0x00}}), kStatusMalformed,
       "1:1/2/1/0[]"},
      {"value cut by the end of the file",
       cat({id_bytes(kCuePoint), size_bytes(5), id_bytes(kCueTime), size_bytes(4), Bytes{1}}), kStatusReadFailed, "0:"},
      {"header cut by the end of the file", cat({point(1, {position(1, 2)}), Bytes{0x53}}), kStatusReadFailed,
       "1:1/2/1/0[]"},
  };
  for (const auto& c : cases) {
    HeaderParse parse(c.payload);
    parse.info().parse_flags = kMetInfo;
    // The element claims more than the file holds where a read must fail.
    Bytes claimed = c.payload;
    if (c.status == kStatusReadFailed) claimed.resize(claimed.size() + 16);
    EXPECT_EQ(run_handler(parse, claimed), c.status) << c.name;
    EXPECT_EQ(describe(parse.info().cue_points), c.cues) << c.name;
    EXPECT_EQ((parse.info().parse_flags & kMetCues) != 0, !c.cues.empty()) << c.name;
    EXPECT_TRUE(parse.info().parse_flags & kMetInfo) << c.name;
  }
}

TEST(CueHandlerTest, SecondCuesElementReplacesTheFirstWithoutLeaking) {
  Bytes first = point(1, {position(1, 10, {master(kCueReference, {uinteger(kCueRefTime, 4)})}), position(2, 10)});
  Bytes second = point(2, {position(1, 20)});
  int64_t live = host::LiveBlockCount();
  {
    HeaderParse parse(cat({first, second}));
    ASSERT_EQ(run_handler(parse, first), kStatusOk);
    ASSERT_EQ(parse.info().cue_points.count, 1u);
    ASSERT_EQ(run_handler(parse, second), kStatusOk);
    EXPECT_EQ(describe(parse.info().cue_points), "2:1/20/1/0[]");
    EXPECT_EQ(host::LiveBlockCount(), live + 1 /* stream buffer */ + 4 /* point, position and their nodes */);

    // An empty Cues element empties the list and clears the flag.
    Bytes none;
    ASSERT_EQ(run_handler(parse, none), kStatusOk);
    EXPECT_EQ(parse.info().cue_points.count, 0u);
    EXPECT_FALSE(parse.info().parse_flags & kMetCues);
  }
  EXPECT_EQ(host::LiveBlockCount(), live);
}

}  // namespace
