#pragma once
// Results of the playback parser: parse_mkvcluster, start_newmkvblock and
// parse_mkvblockgroup. "Ran out" results leave the record able to resume: the
// next call with the bytes that follow goes on where this one stopped.

constexpr int kClusterBlockReady = 0;     // a block header was parsed; the read position is on its first frame byte
constexpr int kClusterChildShort = -1;    // ran out inside a Cluster child; also a bad BlockGroup child or skip
constexpr int kClusterHeaderFailed = -2;  // ran out, or met an invalid byte, in a header at Cluster or Segment level
constexpr int kClusterSkip = -3;          // the caller skips `skip` bytes from the read position and calls again
constexpr int kClusterInvalid = -4;       // a value longer than 8 bytes or an invalid block header
constexpr int kClusterNoMemory = -5;      // out of memory, or a CodecState too large
constexpr int kClusterGroupEnded = -6;    // a BlockGroup ended without a (further) Block; parse_mkvcluster moves on
