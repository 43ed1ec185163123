// Blocks per second through parse_mkvcluster, with the caller's side kept to
// the minimum: skips and each block's data passed over by arithmetic.

#include <benchmark/benchmark.h>

#include <algorithm>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <string>

#include "core/cluster/cluster_status.h"
#include "core/cluster/mkv_cluster.h"
#include "tests/support/block_builder.h"

namespace {

using ebml::Bytes;

// 500 Clusters of 200 small blocks: unlaced video-like frames and Xiph- and
// EBML-laced audio-like blocks of 8 frames, as a muxer writes them.
Bytes ManySmallBlocks() {
  Bytes file;
  for (int cluster = 0; cluster < 500; ++cluster) {
    Bytes children = ebml::uinteger(ebml::kTimecode, static_cast<uint64_t>(cluster) * 1000);
    for (int i = 0; i < 200; ++i) {
      auto tc = static_cast<int16_t>(i * 5);
      Bytes block = i % 3 == 0   ? ebml::simple_block(1, tc, ebml::kKeyFrame, {ebml::filler(24 + i % 7)})
                    : i % 3 == 1 ? ebml::xiph_laced_block(2, tc, 0x80, ebml::numbered_frames(8, 3 + i % 5))
                                 : ebml::ebml_laced_block(3, tc, 0x80, ebml::numbered_frames(8, 4 + i % 3));
      children.insert(children.end(), block.begin(), block.end());
    }
    Bytes element = ebml::element(ebml::kCluster, children);
    file.insert(file.end(), element.begin(), element.end());
  }
  return file;
}

Bytes FixtureFile(const char* name) {
  std::ifstream in(std::string(KELVANE_FIXTURE_DIR) + "/" + name, std::ios::binary);
  Bytes all((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
  if (all.empty()) std::abort();
  return all;
}

mkvinbuff ViewAt(const Bytes& file, uint64_t offset, size_t buffer) {
  size_t n = std::min(buffer, file.size() - static_cast<size_t>(offset));
  return mkvinbuff{file.data() + offset, static_cast<uint32_t>(n), 0, static_cast<uint32_t>(n), offset};
}

void Advance(mkvinbuff* view, uint64_t* skip_left) {
  uint32_t n = *skip_left < view->buff_left ? static_cast<uint32_t>(*skip_left) : view->buff_left;
  view->buff_pos += n;
  view->buff_left -= n;
  *skip_left -= n;
}

// Parses from `start` to the end in buffers of `buffer` bytes; the blocks found.
uint64_t ParseAll(const Bytes& file, uint64_t start, size_t buffer, mkvcluster* cluster) {
  *cluster = {};
  uint64_t blocks = 0, skip_left = 0, next = start;
  mkvinbuff in1 = ViewAt(file, next, buffer);
  next += in1.buff_size;
  mkvinbuff in2 = ViewAt(file, next, buffer);
  next += in2.buff_size;
  for (;;) {
    Advance(&in1, &skip_left);
    while (in1.buff_left) {
      destroy_mkvcluster(cluster);
      uint64_t skip = 0;
      int result = parse_mkvcluster(&in1, in2.buff_size ? &in2 : nullptr, cluster, &skip);
      if (result == kClusterBlockReady) {
        ++blocks;
        skip_left = cluster->block_data_left > 0 ? static_cast<uint64_t>(cluster->block_data_left) : 0;
      } else if (result == kClusterSkip) {
        skip_left = skip;
      } else if (in1.buff_left || in2.buff_left) {
        std::abort();
      }
      Advance(&in1, &skip_left);
    }
    if (!in2.buff_size) break;
    in1 = in2;
    in2 = ViewAt(file, next, buffer);
    next += in2.buff_size;
  }
  destroy_mkvcluster(cluster);
  return blocks;
}

void Run(benchmark::State& state, const Bytes& file, uint64_t start) {
  auto buffer = static_cast<size_t>(state.range(0));
  mkvcluster* cluster = new mkvcluster{};
  uint64_t blocks = 0;
  for (auto _ : state) {
    blocks += ParseAll(file, start, buffer == 0 ? file.size() : buffer, cluster);
    benchmark::ClobberMemory();
  }
  delete cluster;
  state.counters["blocks/s"] = benchmark::Counter(static_cast<double>(blocks), benchmark::Counter::kIsRate);
  state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * (file.size() - start)));
}

void BM_ManySmallBlocks(benchmark::State& state) {
  static const Bytes file = ManySmallBlocks();
  Run(state, file, 0);
}

// A real file: 25 s of AVC and MP3 in 50 Clusters, Cues and Tags after them.
void BM_LongCuesFixture(benchmark::State& state) {
  static const Bytes file = FixtureFile("long_cues.mkv");
  static const uint64_t start = [] {
    // The first Cluster ID in the file; the bytes before it are headers.
    const uint8_t id[] = {0x1F, 0x43, 0xB6, 0x75};
    return static_cast<uint64_t>(std::search(file.begin(), file.end(), id, id + 4) - file.begin());
  }();
  Run(state, file, start);
}

}  // namespace

// Buffer sizes: the whole file (0), and 4096 and 32768 bytes as the streamer delivers them.
BENCHMARK(BM_ManySmallBlocks)->Arg(0)->Arg(4096)->Arg(32768)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_LongCuesFixture)->Arg(0)->Arg(4096)->Unit(benchmark::kMicrosecond);

BENCHMARK_MAIN();
