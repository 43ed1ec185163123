// Replays fuzz inputs without libFuzzer, so that builds with any compiler
// (the 32-bit cross build among them) rerun what the fuzzers found. Each
// argument is a file or a directory whose regular files are replayed in name
// order. A failed check aborts, as it does under the fuzzer.

#include <dirent.h>
#include <sys/stat.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <string>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size);
extern "C" __attribute__((weak)) int LLVMFuzzerInitialize(int* argc, char*** argv);

namespace {

bool IsDirectory(const std::string& path) {
  struct stat info {};
  return stat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

std::vector<std::string> FilesOf(const std::string& directory) {
  std::vector<std::string> files;
  if (DIR* dir = opendir(directory.c_str())) {
    while (const dirent* entry = readdir(dir)) {
      const std::string path = directory + "/" + entry->d_name;
      struct stat info {};
      if (entry->d_name[0] != '.' && stat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode)) files.push_back(path);
    }
    closedir(dir);
  }
  std::sort(files.begin(), files.end());
  return files;
}

bool ReadFile(const std::string& path, std::vector<uint8_t>* bytes) {
  FILE* in = std::fopen(path.c_str(), "rb");
  if (!in) return false;
  uint8_t chunk[65536];
  size_t n = 0;
  while ((n = std::fread(chunk, 1, sizeof chunk, in)) > 0) bytes->insert(bytes->end(), chunk, chunk + n);
  std::fclose(in);
  return true;
}

}  // namespace

int main(int argc, char** argv) {
  if (LLVMFuzzerInitialize) LLVMFuzzerInitialize(&argc, &argv);
  size_t replayed = 0;
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    const std::vector<std::string> files = IsDirectory(arg) ? FilesOf(arg) : std::vector<std::string>{arg};
    for (const std::string& path : files) {
      std::vector<uint8_t> bytes;
      if (!ReadFile(path, &bytes)) {
        std::fprintf(stderr, "cannot read %s\n", path.c_str());
        return 1;
      }
      std::fprintf(stderr, "%s\n", path.c_str());
      LLVMFuzzerTestOneInput(bytes.data(), bytes.size());
      ++replayed;
    }
  }
  std::printf("replayed %zu inputs\n", replayed);
  return replayed > 0 ? 0 : 1;
}
