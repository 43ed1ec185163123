// The playback parser over arbitrary bytes, fed as the output path feeds it:
// consecutive buffers whose sizes come from the input, skips applied, frames
// consumed by their sizes. The input format and every check are in
// tests/support/cluster_fuzz_input.h, which the regression test shares.
//
// Seeds: tests/fixtures/*.mkv behind a prefix such as "\x01\x07\x00" (group
// tails read, buffers of 7 bytes, no allocation failure). Dictionary:
// fuzz/cluster_parser.dict.

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "host/log_control.h"
#include "tests/support/cluster_fuzz_input.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const bool quiet = (host::SetLogThreshold(0), true);
  (void)quiet;
  std::string broken = testing_support::RunClusterFuzzInput(data, size);
  if (!broken.empty()) {
    std::fprintf(stderr, "cluster parser: %s\n", broken.c_str());
    std::abort();
  }
  return 0;
}
