#include "core/header/element_walker.h"

#include <gtest/gtest.h>

#include <string>

#include "core/status.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"
#include "tests/support/log_recorder.h"

namespace {

using namespace ebml;
using testing_support::HeaderParse;

Bytes info_with_title(std::string_view title) {
  return master(kInfo, {uinteger(kTimecodeScale, 1000000), str(kTitle, title)});
}

Bytes one_track() { return master(kTracks, {master(kTrackEntry, {uinteger(kTrackNumber, 1), uinteger(kTrackType, 2)})}); }

Bytes minimal_file(std::initializer_list<Bytes> segment_children) {
  return cat({ebml_header(), master(kSegment, segment_children)});
}

std::string title_of(HeaderParse& parse) { return parse.info().title ? parse.info().title : ""; }

Bytes nested_chapters(int depth, const Bytes& innermost) {
  Bytes inner = innermost;
  for (int i = 0; i < depth; ++i) inner = element(kChapters, inner);
  return inner;
}

TEST(ValidMkvTest, AcceptsExactlyTheMatroskaDocType) {
  const struct {
    const char* name;
    Bytes bytes;
    int status;
  } cases[] = {
      {"matroska", minimal_file({}), kStatusOk},
      {"webm", cat({ebml_header("webm"), master(kSegment, {})}), kStatusMalformed},
      {"capital M", cat({ebml_header("Matroska"), master(kSegment, {})}), kStatusMalformed},
      {"prefix", cat({ebml_header("matrosk"), master(kSegment, {})}), kStatusMalformed},
      {"segment first", cat({master(kSegment, {}), ebml_header()}), kStatusMalformed},
      {"zero first byte", cat({Bytes{0x00}, ebml_header()}), kStatusMalformed},
  };
  for (const auto& c : cases) {
    HeaderParse parse(c.bytes);
    ASSERT_TRUE(parse.stream_ready()) << c.name;
    EXPECT_EQ(parse.Validate(), c.status) << c.name;
  }
}

TEST(ParseMkvfileTest, ResultFollowsTheElementsMetAndHowTheWalkEnded) {
  const struct {
    const char* name;
    Bytes bytes;
    int result;
  } cases[] = {
      {"complete", minimal_file({info_with_title("t"), one_track()}), kParseSucceeded},
      {"no tracks", minimal_file({info_with_title("t")}), kParseIncomplete},
      {"no info", minimal_file({one_track()}), kParseIncomplete},
      {"no EBML header", master(kSegment, {info_with_title("t"), one_track()}), kParseIncomplete},
      {"malformed top-level element", cat({ebml_header(), Bytes{0x00, 0x81, 0x00}}), kParseMalformed},
      {"DocType of 31 bytes", cat({ebml_header(std::string(31, 'm')), master(kSegment, {info_with_title("t"), one_track()})}),
       kParseSucceeded},
      {"DocType of 32 bytes", cat({ebml_header(std::string(32, 'm')), master(kSegment, {info_with_title("t"), one_track()})}),
       kParseNoMemory},
      {"Info failing after tracks", minimal_file({one_track(), master(kInfo, {bin(kSegmentUid, filler(15))})}),
       kParseSucceeded},
      {"Info failing before tracks", minimal_file({master(kInfo, {bin(kSegmentUid, filler(15))}), one_track()}),
       kParseMalformed},
      // The Segment is level 1, so the Void inside n nested Chapters is at level n + 2.
      {"50 levels", minimal_file({nested_chapters(48, bin(kVoid, filler(1))), info_with_title("t"), one_track()}),
       kParseSucceeded},
      {"51 levels", minimal_file({nested_chapters(49, bin(kVoid, filler(1))), info_with_title("t"), one_track()}),
       kParseMalformed},
      {"5000 levels", minimal_file({nested_chapters(5000, {}), info_with_title("t"), one_track()}), kParseMalformed},
  };
  for (const auto& c : cases) {
    HeaderParse parse(c.bytes);
    ASSERT_TRUE(parse.stream_ready()) << c.name;
    EXPECT_EQ(parse.Parse(), c.result) << c.name;
  }
}

TEST(ParseElementTest, SkipsVoidCrcUnknownAndUnhandledElements) {
  Bytes file = minimal_file({
      bin(kVoid, filler(300)),
      bin(kCrc32, filler(4, 0xAB)),
      bin(0x4321, filler(10)),  // an ID nobody knows
      master(kAttachments, {bin(0x61A7, filler(700)), bin(kVoid, filler(3))}),
      master(kChapters, {bin(0x45B9, filler(20))}),
      master(kTracks, {bin(kVoid, filler(2)), master(kTrackEntry, {uinteger(kTrackNumber, 1)})}),
      info_with_title("after the skips"),
  });
  HeaderParse parse(file);
  EXPECT_EQ(parse.Parse(), kParseSucceeded);
  EXPECT_EQ(title_of(parse), "after the skips");
}

TEST(ParseElementTest, MalformedChildCostsOnlyTheRestOfItsParent) {
  // Inside Info: the handler stops quietly, the walker skips to Info's end and
  // the tracks behind it are still read.
  HeaderParse in_info(minimal_file({
      master(kInfo, {str(kTitle, "kept"), Bytes{0x0F, 0x81, 0x00}, str(kMuxingApp, "lost")}),
      one_track(),
  }));
  EXPECT_EQ(in_info.Parse(), kParseSucceeded);
  EXPECT_EQ(title_of(in_info), "kept");
  EXPECT_EQ(in_info.info().muxing_app, nullptr);

  // Inside the Segment: everything after the bad byte in the Segment is gone.
  HeaderParse in_segment(minimal_file({info_with_title("kept"), Bytes{0x00, 0x85}, one_track()}));
  EXPECT_EQ(in_segment.Parse(), kParseIncomplete);
  EXPECT_EQ(title_of(in_segment), "kept");
  EXPECT_EQ(in_segment.info().track_count, 0u);
}

TEST(ParseElementTest, UnknownSizeSegmentIsWalkedAndTheFirstClusterFound) {
  Bytes before = cat({ebml_header(), unknown_size(kSegment, {bin(kVoid, filler(600)), info_with_title("t"), one_track()})});
  HeaderParse parse(cat({before, master(kCluster, {uinteger(kTimecode, 0)}), master(kCluster, {uinteger(kTimecode, 5)})}));
  EXPECT_EQ(parse.Parse(), kParseSucceeded);
  EXPECT_EQ(parse.info().segment_data_position, ebml_header().size() + 4 + 8);
  EXPECT_EQ(parse.info().first_cluster_position, before.size());

  HeaderParse pipe(cat({ebml_header(), unknown_size(kSegment, {info_with_title("t"), one_track(),
                                                               unknown_size(kCluster, {filler(100)})})}),
                   {.seekable = false});
  EXPECT_EQ(pipe.Parse(), kParseSucceeded);
}

TEST(ParseElementTest, SecondEbmlHeaderEndsTheWalkAndTheFirstDocumentStands) {
  testing_support::LogRecorder log;
  Bytes first = minimal_file({info_with_title("first"), one_track()});
  HeaderParse parse(cat({first, minimal_file({info_with_title("second")})}));
  EXPECT_EQ(parse.Parse(), kParseSucceeded);
  EXPECT_EQ(title_of(parse), "first");
  EXPECT_TRUE(parse.info().parse_flags & kMetSecondEbmlHeader);
  EXPECT_TRUE(log.Contains(3, "vorlith:  Only single EBML document files supported."));
  EXPECT_TRUE(log.Contains(2, "Error parsing EBML Document Element."));
}

}  // namespace
