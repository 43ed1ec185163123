// The header walk over crafted files: EBML numbers, the DocType check, the
// result of parse_mkvfile, what is skipped, what a malformed element costs,
// and the counts that fill up (tracks, seek lists, tags).

#include "core/header/element_walker.h"

#include <gtest/gtest.h>

#include <string>

#include "core/status.h"
#include "platform/ao_log.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"
#include "tests/support/log_recorder.h"

namespace {

using namespace ebml;
using testing_support::HeaderParse;
using testing_support::LogRecorder;

Bytes info_with_title(std::string_view title) { return master(kInfo, {uinteger(kTimecodeScale, 1000000), str(kTitle, title)}); }
Bytes entry(uint64_t number, uint64_t type = 2) {
  return master(kTrackEntry, {uinteger(kTrackNumber, number), uinteger(kTrackType, type)});
}
Bytes one_track() { return master(kTracks, {entry(1)}); }
Bytes file(std::initializer_list<Bytes> segment_children, std::string_view doc_type = "matroska") {
  return cat({ebml_header(doc_type), master(kSegment, segment_children)});
}
Bytes nested_chapters(int depth, const Bytes& innermost) {
  Bytes inner = innermost;
  for (int i = 0; i < depth; ++i) inner = element(kChapters, inner);
  return inner;
}
Bytes repeated(int count, Bytes (*make)(int)) {
  Bytes out;
  for (int i = 0; i < count; ++i) out = cat({out, make(i)});
  return out;
}
Bytes tracks(int count) {
  return element(kTracks, repeated(count, [](int i) { return master(kTrackEntry, {uinteger(kTrackNumber, uint64_t(i + 1))}); }));
}
Bytes seek_heads(int count) {
  return repeated(count, [](int i) {
    return master(kSeekHead, {master(kSeek, {element(kSeekId, id_bytes(kInfo)), uinteger(kSeekPosition, uint64_t(i))})});
  });
}
// What the walk left: tracks (video/audio, the last one's number), seek lists
// (the last one's first position), cue points, tags (the last name), title.
std::string summary(const mkv_file_info& i) {
  std::string out = "tracks " + std::to_string(i.track_count) + "/" + std::to_string(i.video_track_count) + "/" +
                    std::to_string(i.audio_track_count);
  if (i.track_count) out += " #" + std::to_string(i.tracks[i.track_count - 1].track_number);
  out += " seek heads " + std::to_string(i.seek_head_count);
  if (i.seek_head_count) {
    out += " @" + std::to_string(static_cast<const mkv_seek_entry*>(i.seek_lists[i.seek_head_count - 1].head->data)->seek_position);
  }
  out += " cues " + std::to_string(i.cue_points.count) + " tags " + std::to_string(i.tag_count);
  if (i.tag_count) out += " " + std::string(i.tags[i.tag_count - 1].name);
  return out + " title " + (i.title ? i.title : "-") + " mux " + (i.muxing_app ? i.muxing_app : "-");
}

TEST(ParseMkvfileTest, ResultAndWhatWasReadFollowTheElementsMet) {
  const std::string kTrackT = "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title t mux -";
  const struct {
    const char* name;
    Bytes bytes;
    int result;
    std::string summary;  // "": not compared
    const char* message = nullptr;  // logged at `level`
    int level = 3;
  } cases[] = {
      {"complete", file({info_with_title("t"), one_track()}), kParseSucceeded, kTrackT},
      {"no tracks", file({info_with_title("t")}), kParseIncomplete, "tracks 0/0/0 seek heads 0 cues 0 tags 0 title t mux -"},
      {"no info", file({one_track()}), kParseIncomplete, "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title - mux -"},
      {"no EBML header", master(kSegment, {info_with_title("t"), one_track()}), kParseIncomplete, ""},
      {"malformed top-level element", cat({ebml_header(), Bytes{0x00, 0x81, 0x00}}), kParseMalformed, ""},
      {"DocType of 31 bytes", file({info_with_title("t"), one_track()}, std::string(31, 'm')), kParseSucceeded, kTrackT},
      {"DocType of 32 bytes", file({info_with_title("t"), one_track()}, std::string(32, 'm')), kParseNoMemory, ""},
      {"Info failing after tracks", file({one_track(), master(kInfo, {bin(kSegmentUid, filler(15))})}), kParseSucceeded, ""},
      {"Info failing before tracks", file({master(kInfo, {bin(kSegmentUid, filler(15))}), one_track()}), kParseMalformed, "",
       "Error parsing Info Element.", 2},
      {"Info cut inside a child header", cat({ebml_header(), master(kSegment, {one_track()}), master_sized(kInfo, 8, {str(kTitle, "kept"), Bytes{0x7B}})}),
       kParseSucceeded, "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title kept mux -"},
      // The Segment is level 1, so the Void inside n nested Chapters is at level n + 2.
      {"50 levels", file({nested_chapters(48, bin(kVoid, filler(1))), info_with_title("t"), one_track()}), kParseSucceeded, kTrackT},
      {"51 levels", file({nested_chapters(49, bin(kVoid, filler(1))), info_with_title("t"), one_track()}), kParseMalformed, ""},
      {"Void, CRC-32, unknown and unhandled elements are skipped",
       file({bin(kVoid, filler(300)), bin(kCrc32, filler(4, 0xAB)), bin(0x4321, filler(10)),
             master(kAttachments, {bin(0x61A7, filler(700)), bin(kVoid, filler(3))}), master(kChapters, {bin(0x45B9, filler(20))}),
             master(kTracks, {bin(kVoid, filler(2)), master(kTrackEntry, {uinteger(kTrackNumber, 1)})}), info_with_title("t")}),
       kParseSucceeded, "tracks 1/0/0 #1 seek heads 0 cues 0 tags 0 title t mux -"},
      // Inside Info the handler stops quietly and the walker goes on behind Info;
      // inside the Segment everything after the bad byte is gone.
      {"malformed child of Info",
       file({master(kInfo, {str(kTitle, "t"), Bytes{0x0F, 0x81, 0x00}, str(kMuxingApp, "lost")}), one_track()}),
       kParseSucceeded, kTrackT},
      {"malformed child of the Segment", file({info_with_title("t"), Bytes{0x00, 0x85}, one_track()}), kParseIncomplete,
       "tracks 0/0/0 seek heads 0 cues 0 tags 0 title t mux -"},
      {"second EBML header ends the walk", cat({file({info_with_title("t"), one_track()}), file({info_with_title("second")})}),
       kParseSucceeded, kTrackT, "vorlith:  Only single EBML document files supported."},
      {"TrackType counts each time it is met",
       file({info_with_title("t"), master(kTracks, {entry(1), entry(2), master(kTrackEntry, {uinteger(kTrackType, 1), uinteger(kTrackType, 1)}),
                                                    entry(4, 3)})}),
       kParseSucceeded, "tracks 4/2/2 #4 seek heads 0 cues 0 tags 0 title t mux -"},
      {"the 101st track fails the parse", file({info_with_title("t"), tracks(101)}), kParseNoMemory,
       "tracks 100/0/0 #100 seek heads 0 cues 0 tags 0 title t mux -", "mkv_track_handler:  File contains too many tracks.", kAoLogFailure},
      {"50 seek lists are kept", file({seek_heads(52), info_with_title("t"), one_track()}), kParseSucceeded,
       "tracks 1/0/1 #1 seek heads 50 @49 cues 0 tags 0 title t mux -"},
      {"a second Info starts afresh",
       file({master(kInfo, {uinteger(kTimecodeScale, 500), str(kTitle, "one")}), master(kInfo, {str(kMuxingApp, "two")}), one_track()}),
       kParseSucceeded, "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title - mux two"},
  };
  for (const auto& c : cases) {
    LogRecorder log;
    HeaderParse parse(c.bytes);
    EXPECT_EQ(parse.Parse(), c.result) << c.name;
    EXPECT_EQ(c.summary.empty() ? "" : summary(parse.info()), c.summary) << c.name;
    EXPECT_EQ(c.message && log.Contains(c.level, c.message), c.message != nullptr) << c.name;
  }
}

TEST(ParseMkvfileTest, SecondEbmlHeaderIsFlaggedAndLogged) {
  LogRecorder log;
  HeaderParse parse(cat({file({info_with_title("first"), one_track()}), file({info_with_title("second")})}));
  EXPECT_EQ(parse.Parse(), kParseSucceeded);
  EXPECT_TRUE(parse.info().parse_flags & kMetSecondEbmlHeader);
  EXPECT_TRUE(log.Contains(2, "Error parsing EBML Document Element."));
}

TEST(ValidMkvTest, AcceptsExactlyTheMatroskaDocType) {
  const struct {
    Bytes bytes;
    int status;
  } cases[] = {
      {file({}), kStatusOk},
      {file({}, "webm"), kStatusMalformed},
      {file({}, "Matroska"), kStatusMalformed},
      {file({}, "matrosk"), kStatusMalformed},
      {cat({master(kSegment, {}), ebml_header()}), kStatusMalformed},
  };
  for (const auto& c : cases) {
    HeaderParse parse(c.bytes);
    EXPECT_EQ(parse.Validate(), c.status) << testing::PrintToString(c.bytes);
  }
}

TEST(ParseMkvfileTest, UnknownSizeSegmentIsWalkedAndTheFirstClusterFound) {
  Bytes before = cat({ebml_header(), unknown_size(kSegment, {bin(kVoid, filler(600)), info_with_title("t"), one_track()})});
  HeaderParse parse(cat({before, master(kCluster, {uinteger(kTimecode, 0)}), master(kCluster, {uinteger(kTimecode, 5)})}));
  EXPECT_EQ(parse.Parse(), kParseSucceeded);
  EXPECT_EQ(parse.info().segment_data_position, ebml_header().size() + 4 + 8);
  EXPECT_EQ(parse.info().first_cluster_position, before.size());
  HeaderParse pipe(cat({ebml_header(), unknown_size(kSegment, {info_with_title("t"), one_track(), unknown_size(kCluster, {filler(100)})})}),
                   {.seekable = false});
  EXPECT_EQ(pipe.Parse(), kParseSucceeded);
}

}  // namespace
