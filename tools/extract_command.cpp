// `kelvane extract FILE [-t TRACK...] -o DIR`: plays the file through the
// plug-in and writes each selected channel as a file players open.

#include <cstdio>
#include <cstring>

#include "tools/commands.h"

namespace {

constexpr char kExtractHelp[] =
    "usage: kelvane extract FILE [-t TRACK]... -o DIR\n";

}  // namespace

int RunExtract(int argc, char** argv) {
  for (int i = 0; i < argc; ++i) {
    if (!std::strcmp(argv[i], "--help") || !std::strcmp(argv[i], "-h")) {
      std::fputs(kExtractHelp, stdout);
      return 0;
    }
  }
  std::fprintf(stderr, "kelvane extract: not available yet\ntry 'kelvane extract --help'\n");
  return 2;
}
