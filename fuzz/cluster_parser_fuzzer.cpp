// The playback parser over arbitrary bytes, fed as the output path feeds it:
// consecutive buffers whose sizes come from the input, skips applied, frames
// consumed by their sizes. The input format and every check are in
// tests/support/cluster_fuzz_input.h, which the regression test shares.
//
// Seeds: tests/fixtures/*.mkv behind a prefix such as "\x01\x07\x00" (group
// tails read, buffers of 7 bytes, no allocation failure). Dictionary:
// fuzz/cluster_parser.dict.

#include "fuzz/fuzz_input.h"
#include "tests/support/cluster_fuzz_input.h"

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  host::SetLogThreshold(0);
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string broken = testing_support::RunClusterFuzzInput(data, size);
  fuzz_input::Check(broken.empty(), broken.c_str());
  return 0;
}
