// The output path's shortcut for unlaced blocks must leave the cluster record
// exactly as parse_mkvcluster does: walked both ways over one buffer, every
// block of the channel's track and the record at the end compare byte for
// byte, for every track as the channel's own.

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "core/cluster/unlaced_block.h"
#include "tests/cluster/cluster_harness.h"

namespace {

using cluster_testing::Bytes;
using cluster_testing::View;
using namespace ebml;

// The record with frame_sizes replaced by its one entry, or 0 when absent.
// Between blocks the lace table's working values (index, sum, entries past
// the count) are left over from whichever laced block the parser read last
// and are set afresh before any use: the shortcut, passing other tracks'
// laced blocks unread, may leave others.
Bytes Snapshot(const mkvcluster& c, uint64_t position) {
  mkvcluster copy = c;
  if (copy.resume.step == mkv_resume_step::none) {
    copy.resume.lace_index = 0;
    copy.resume.lace_sum = 0;
    for (size_t i = copy.resume.lace_count; i < kMaxLaceFrames; ++i) copy.resume.lace_sizes[i] = 0;
  }
  int64_t first = c.frame_sizes ? c.frame_sizes[0] : 0;
  copy.frame_sizes = nullptr;
  Bytes out(sizeof copy + sizeof first + sizeof position);
  std::memcpy(out.data(), &copy, sizeof copy);
  std::memcpy(out.data() + sizeof copy, &first, sizeof first);
  std::memcpy(out.data() + sizeof copy + sizeof first, &position, sizeof position);
  return out;
}

void Skip(mkvinbuff* in, uint64_t count) {
  auto n = static_cast<uint32_t>(count < in->buff_left ? count : in->buff_left);
  in->buff_pos += n;
  in->buff_left -= n;
}

// The own track's blocks (and the final record) of one walk; skipped blocks and
// the own track's frames are passed over as the output path does.
std::vector<Bytes> Walk(const Bytes& file, uint64_t own, bool shortcut) {
  std::vector<Bytes> seen;
  mkvcluster c{};
  mkvinbuff in = View(file, 0, file.size());
  while (in.buff_left) {
    destroy_mkvcluster(&c);
    uint64_t left = 0;
    auto taken = shortcut ? take_unlaced_block(&in, &c, own, &left) : unlaced_block_result::parse;
    if (taken == unlaced_block_result::other_track) {
      Skip(&in, left);
      continue;
    }
    if (taken == unlaced_block_result::parse) {
      uint64_t skip = 0;
      int result = parse_mkvcluster(&in, nullptr, &c, &skip);
      if (result == kClusterSkip) {
        Skip(&in, skip);
        continue;
      }
      if (result != kClusterBlockReady) break;
    }
    if (c.track_number == own) seen.push_back(Snapshot(c, in.buff_fileoff + in.buff_pos));
    Skip(&in, c.block_data_left > 0 ? static_cast<uint64_t>(c.block_data_left) : 0);
  }
  destroy_mkvcluster(&c);
  seen.push_back(Snapshot(c, in.buff_fileoff + in.buff_pos));
  return seen;
}

Bytes Group(std::initializer_list<Bytes> children) { return master(kBlockGroup, children); }

struct Case {
  std::string name;
  Bytes cluster_children;
  std::vector<uint64_t> tracks;
};

std::vector<Case> Cases() {
  const Frames one = numbered_frames(1, 40), big = numbered_frames(1, 300), laced = numbered_frames(4, 20);
  return {
      {"simple_blocks", cat({simple_block(1, 0, kKeyFrame, one), simple_block(2, 3, kKeyFrame, one),
                             simple_block(3, 5, 0, big), simple_block(2, -7, 0, one), simple_block(1, 9, 0x08, big),
                             simple_block(3, 11, 0, one)}),
       {1, 2, 3}},
      {"groups_with_values",
       cat({Group({block(1, 0, 0, one), uinteger(kReferenceBlock, 0xFF9C, 2)}),
            Group({block(2, 4, 0, big), uinteger(kBlockDuration, 24), uinteger(kReferencePriority, 3)}),
            Group({block(1, 8, 0, big)}), simple_block(3, 9, 0, one),
            Group({block(3, 12, 0, one), sinteger(kReferenceBlock, -40, 8)}), simple_block(2, 13, 0, one)}),
       {1, 2, 3}},
      // Runs of other tracks' groups passed whole, their values left under the SimpleBlocks after them.
      {"group_runs",
       cat({Group({block(2, 0, 0, big), sinteger(kReferenceBlock, -10, 1)}), simple_block(2, 1, 0, big),
            Group({block(3, 1, 0, big)}),
            simple_block(2, 2, 0, big), Group({block(1, 3, 0, big), uinteger(kReferenceBlock, 0x0102, 2)}),
            Group({block(2, 4, 0, big), uinteger(kBlockDuration, 7), uinteger(kReferencePriority, 2)}),
            Group({block(3, 5, 0, big), sinteger(kReferenceBlock, -3, 8)}), simple_block(3, 6, 0, big),
            simple_block(1, 7, 0, big), Group({block(2, 8, 0, big)}), Group({block(1, 9, 0, big)})}),
       {1, 2, 3}},
      // Other tracks' laced blocks passed by their sizes in a run, up to the own block, laced or not.
      {"laced_runs",
       cat({xiph_laced_block(2, 0, 0, numbered_frames(5, 300)), simple_block(3, 1, kFixedLacing, numbered_frames(4, 64)),
            ebml_laced_block(4, 2, 0, numbered_frames(3, 200)), simple_block(1, 3, 0, big),
            xiph_laced_block(1, 4, 0, numbered_frames(2, 150)), simple_block(2, 5, 0, big),
            ebml_laced_block(3, 6, 0, numbered_frames(6, 40)), simple_block(4, 7, 0, big)}),
       {1, 2, 3, 4}},
      // A Xiph lace table that runs past its block, and an EBML one with an invalid size: the parser's to read.
      {"bad_lace_tables",
       cat({simple_block(1, 0, 0, big), simple_block(3, 1, 0, big),
            element(kSimpleBlock, cat({Bytes{0x82, 0, 2, kXiphLacing, 2}, filler(150, 0xFF)})),
            simple_block(1, 3, 0, big), simple_block(3, 4, 0, big)}),
       {1, 3}},
      {"invalid_ebml_lace_size",
       cat({simple_block(1, 0, 0, big), simple_block(3, 1, 0, big),
            element(kSimpleBlock, cat({Bytes{0x82, 0, 2, kEbmlLacing, 1, 0x00}, filler(140)})),
            simple_block(1, 3, 0, big), simple_block(3, 4, 0, big)}),
       {1, 3}},
      {"needs_the_parser",
       cat({Group({uinteger(kBlockDuration, 5), block(1, 0, 0, one)}),
            Group({block(2, 1, 0, one), element(kDiscardPadding, Bytes{0x01}), uinteger(kReferenceBlock, 3)}),
            xiph_laced_block(3, 2, 0, laced), ebml_laced_block(1, 3, 0, laced), element(0xEC, filler(3)),
            simple_block(200, 4, 0, one), simple_block(2, 5, 0, one), Group({block(3, 6, 0, one)})}),
       {1, 2, 3, 200}},
  };
}

TEST(UnlacedBlockTest, LeavesTheRecordAsTheParserDoes) {
  for (const Case& test : Cases()) {
    Bytes file = cat({element(kCluster, cat({uinteger(kTimecode, 1000), test.cluster_children})),
                      element(kCluster, cat({uinteger(kTimecode, 2000), test.cluster_children}))});
    for (uint64_t own : test.tracks) {
      std::vector<Bytes> parsed = Walk(file, own, false);
      std::vector<Bytes> taken = Walk(file, own, true);
      EXPECT_GT(parsed.size(), 1u) << test.name << " track " << own;
      EXPECT_EQ(parsed, taken) << test.name << " track " << own;
    }
  }
}

}  // namespace
