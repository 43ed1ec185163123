// Clusters built to walk the unlaced-block shortcut beside the parser, run
// with the cluster fuzz target's own checks (tests/support/cluster_fuzz_input.h);
// the inputs the target found are replayed from its corpus.

#include <gtest/gtest.h>

#include "tests/support/block_builder.h"
#include "tests/support/cluster_fuzz_input.h"

namespace {

using namespace ebml;

Bytes Group(std::initializer_list<Bytes> children) { return master(kBlockGroup, children); }

// Two Clusters of these blocks, with group tails read, from byte 0, in buffers of 7 bytes.
Bytes Clusters(std::initializer_list<Bytes> blocks) {
  const Bytes children = cat(blocks);
  return cat({Bytes{0x03, 0x07, 0x00}, element(kCluster, cat({uinteger(kTimecode, 1000), children})),
              element(kCluster, cat({uinteger(kTimecode, 2000), children}))});
}

TEST(ClusterFuzzRegressionTest, InputsPassEveryCheckOfTheFuzzTarget) {
  const Frames one = numbered_frames(1, 40), big = numbered_frames(1, 300), laced = numbered_frames(4, 20);
  const struct { const char* name; Bytes input; } rows[] = {
      // Built: every track's blocks walked by the unlaced-block shortcut beside the parser.
      // Last, an empty frame, whose header ends at the Cluster's end: the parser reads on from there.
      {"simple_blocks", Clusters({simple_block(1, 0, kKeyFrame, one), simple_block(2, 3, kKeyFrame, one),
                                  simple_block(3, 5, 0, big), simple_block(2, -7, 0, one),
                                  simple_block(1, 9, 0x08, big), simple_block(3, 11, 0, one),
                                  simple_block(1, 12, 0, numbered_frames(1, 0))})},
      {"groups_with_values",
       Clusters({Group({block(1, 0, 0, one), uinteger(kReferenceBlock, 0xFF9C, 2)}),
                 Group({block(2, 4, 0, big), uinteger(kBlockDuration, 24), uinteger(kReferencePriority, 3)}),
                 Group({block(1, 8, 0, big)}), simple_block(3, 9, 0, one),
                 Group({block(3, 12, 0, one), sinteger(kReferenceBlock, -40, 8)}), simple_block(2, 13, 0, one)})},
      // Runs of other tracks' groups passed whole, their values left under the SimpleBlocks after them.
      {"group_runs",
       Clusters({Group({block(2, 0, 0, big), sinteger(kReferenceBlock, -10, 1)}), simple_block(2, 1, 0, big),
                 Group({block(3, 1, 0, big)}), simple_block(2, 2, 0, big),
                 Group({block(1, 3, 0, big), uinteger(kReferenceBlock, 0x0102, 2)}),
                 Group({block(2, 4, 0, big), uinteger(kBlockDuration, 7), uinteger(kReferencePriority, 2)}),
                 Group({block(3, 5, 0, big), sinteger(kReferenceBlock, -3, 8)}), simple_block(3, 6, 0, big),
                 simple_block(1, 7, 0, big), Group({block(2, 8, 0, big)}), Group({block(1, 9, 0, big)})})},
      // Other tracks' laced blocks passed by their sizes in a run, up to the own block, laced or not; after
      // the last Cluster, a block outside any Cluster that a run must not take.
      {"laced_runs",
       cat({Clusters({xiph_laced_block(2, 0, 0, numbered_frames(5, 300)),
                      simple_block(3, 1, kFixedLacing, numbered_frames(4, 64)),
                      ebml_laced_block(4, 2, 0, numbered_frames(3, 200)), simple_block(1, 3, 0, big),
                      xiph_laced_block(1, 4, 0, numbered_frames(2, 150)), simple_block(2, 5, 0, big),
                      ebml_laced_block(3, 6, 0, numbered_frames(6, 40)), simple_block(4, 7, 0, big)}),
            simple_block(4, 8, 0, big)})},
      // A Xiph lace table that runs past its block, and an EBML one with an invalid size: the parser's to read.
      {"bad_lace_tables",
       Clusters({simple_block(1, 0, 0, big), simple_block(3, 1, 0, big),
                 element(kSimpleBlock, cat({Bytes{0x82, 0, 2, kXiphLacing, 2}, filler(150, 0xFF)})),
                 simple_block(1, 3, 0, big), simple_block(3, 4, 0, big)})},
      {"invalid_ebml_lace_size",
       Clusters({simple_block(1, 0, 0, big), simple_block(3, 1, 0, big),
                 element(kSimpleBlock, cat({Bytes{0x82, 0, 2, kEbmlLacing, 1, 0x00}, filler(140)})),
                 simple_block(1, 3, 0, big), simple_block(3, 4, 0, big)})},
      {"needs_the_parser",
       Clusters({Group({uinteger(kBlockDuration, 5), block(1, 0, 0, one)}),
                 Group({block(2, 1, 0, one), element(kDiscardPadding, Bytes{0x01}), uinteger(kReferenceBlock, 3)}),
                 xiph_laced_block(3, 2, 0, laced), ebml_laced_block(1, 3, 0, laced), element(0xEC, filler(3)),
                 simple_block(200, 4, 0, one), simple_block(2, 5, 0, one), Group({block(3, 6, 0, one)}),
                 element(kVoid, filler(40, 0x80))})},  // which would pass for a block, were it one
  };
  for (const auto& row : rows) {
    EXPECT_EQ(testing_support::RunClusterFuzzInput(row.input.data(), row.input.size()), "") << row.name;
  }
}

}  // namespace
