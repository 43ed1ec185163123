#include <gtest/gtest.h>

#include <string>

#include "core/header/element_walker.h"
#include "core/status.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"
#include "tests/support/log_recorder.h"

namespace {

using namespace ebml;
using testing_support::HeaderParse;

Bytes file_with_info(std::initializer_list<Bytes> info_children) {
  // Tracks first, so a failing Info still leaves a usable file and the values
  // it stored can be inspected.
  return cat({ebml_header(),
              master(kSegment, {master(kTracks, {master(kTrackEntry, {uinteger(kTrackNumber, 1)})}),
                                master(kInfo, info_children)})});
}

TEST(InfoHandlerTest, StoresTheValuesAsEncoded) {
  const struct {
    const char* name;
    Bytes info;
    uint64_t timecode_scale;
    double duration;
    int64_t date_utc;
  } cases[] = {
      {"no TimecodeScale: default", {}, 1000000, 0.0, 0},
      {"TimecodeScale of length 0", element(kTimecodeScale, {}), 0, 0.0, 0},
      {"TimecodeScale not a multiple of 1000", uinteger(kTimecodeScale, 22675), 22675, 0.0, 0},
      {"Duration as single", element(kDuration, {0x45, 0xFA, 0x00, 0x00}), 1000000, 8000.0, 0},
      {"Duration as double", f64(kDuration, 1234.5678), 1000000, 1234.5678, 0},
      {"DateUTC of one byte 0xFF", element(kDateUtc, {0xFF}), 1000000, 0.0, -1},
      {"DateUTC of eight bytes", sinteger(kDateUtc, -1234567890123, 8), 1000000, 0.0, -1234567890123},
      {"DateUTC positive", sinteger(kDateUtc, 0x7F00, 2), 1000000, 0.0, 0x7F00},
  };
  for (const auto& c : cases) {
    HeaderParse parse(file_with_info({c.info}));
    EXPECT_EQ(parse.Parse(), kParseSucceeded) << c.name;
    EXPECT_EQ(parse.info().timecode_scale, c.timecode_scale) << c.name;
    EXPECT_EQ(parse.info().duration, c.duration) << c.name;
    EXPECT_EQ(parse.info().date_utc, c.date_utc) << c.name;
    EXPECT_TRUE(parse.info().parse_flags & kMetInfo) << c.name;
  }
}

// Title and the apps of real files are compared in the fixture test.
TEST(InfoHandlerTest, SegmentUidFilenameAndALaterTitle) {
  Bytes uid = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16};
  HeaderParse parse(file_with_info({bin(kSegmentUid, uid), str(kTitle, "A title"), str(kSegmentFilename, "name.mkv"),
                                    str(kTitle, "Replaced title")}));
  ASSERT_EQ(parse.Parse(), kParseSucceeded);
  EXPECT_EQ(Bytes(parse.info().segment_uid, parse.info().segment_uid + 16), uid);
  EXPECT_STREQ(parse.info().title, "Replaced title");
  EXPECT_STREQ(parse.info().segment_filename, "name.mkv");
}

TEST(InfoHandlerTest, WrongSizesFailTheInfoElement) {
  const struct {
    const char* name;
    Bytes child;
    int result_without_tracks;
  } cases[] = {
      {"UID of 15 bytes", bin(kSegmentUid, filler(15)), kParseMalformed},
      {"Duration of 2 bytes", element(kDuration, {0x45, 0xFA}), kParseMalformed},
      {"TimecodeScale of 9 bytes", element(kTimecodeScale, filler(9, 1)), kParseMalformed},
      {"DateUTC of 9 bytes", element(kDateUtc, filler(9, 1)), kParseMalformed},
      {"Title above the limit", str(kTitle, std::string(8193, 't')), kParseNoMemory},
  };
  for (const auto& c : cases) {
    testing_support::LogRecorder log;
    HeaderParse parse(cat({ebml_header(), master(kSegment, {master(kInfo, {c.child})})}));
    EXPECT_EQ(parse.Parse(), c.result_without_tracks) << c.name;
    EXPECT_TRUE(log.Contains(2, "Error parsing Info Element.")) << c.name;
  }
}

TEST(InfoHandlerTest, InfoCutInsideAChildHeaderEndsQuietly) {
  Bytes title = str(kTitle, "before the cut");
  Bytes cut = master_sized(kInfo, title.size() + 1, {title, Bytes{0x7B}});  // the first byte of a Title ID
  HeaderParse parse(cat({ebml_header(), master(kSegment, {master(kTracks, {master(kTrackEntry, {})})}), cut}));
  EXPECT_EQ(parse.Parse(), kParseSucceeded);
  EXPECT_STREQ(parse.info().title, "before the cut");
}

TEST(InfoHandlerTest, SecondInfoStartsAfresh) {
  HeaderParse parse(cat({ebml_header(), master(kSegment, {master(kInfo, {uinteger(kTimecodeScale, 500), str(kTitle, "one")}),
                                                          master(kInfo, {str(kMuxingApp, "two")}),
                                                          master(kTracks, {master(kTrackEntry, {})})})}));
  ASSERT_EQ(parse.Parse(), kParseSucceeded);
  EXPECT_EQ(parse.info().timecode_scale, 1000000u);
  EXPECT_EQ(parse.info().title, nullptr);
  EXPECT_STREQ(parse.info().muxing_app, "two");
}

}  // namespace
