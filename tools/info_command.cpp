// `kelvane info FILE`: the file model after a header parse.

#include <cinttypes>
#include <cstdio>
#include <cstring>

#include "core/file_model.h"
#include "core/header/element_walker.h"
#include "core/status.h"
#include "host/input_streams.h"
#include "host/log_control.h"
#include "stream/mkvvstream.h"
#include "tools/commands.h"

namespace {

constexpr int64_t kHeaderBufferSize = 480;

const char* OrNone(const char* text) { return text ? text : "(none)"; }

void PrintHeader(const mkv_file_info& info) {
  std::printf("EBML header\n");
  std::printf("  EBMLVersion: %" PRIu64 "\n", info.ebml_version);
  std::printf("  EBMLReadVersion: %" PRIu64 "\n", info.ebml_read_version);
  std::printf("  EBMLMaxIDLength: %" PRIu64 "\n", info.ebml_max_id_length);
  std::printf("  EBMLMaxSizeLength: %" PRIu64 "\n", info.ebml_max_size_length);
  std::printf("  DocType: %s\n", info.doc_type);
  std::printf("  DocTypeVersion: %" PRIu64 "\n", info.doc_type_version);
  std::printf("  DocTypeReadVersion: %" PRIu64 "\n", info.doc_type_read_version);
}

void PrintSegmentInfo(const mkv_file_info& info) {
  std::printf("Segment Info\n");
  std::printf("  TimecodeScale: %" PRIu64 "\n", info.timecode_scale);
  std::printf("  Duration: %.6f\n", info.duration);
  std::printf("  DurationSeconds: %.6f\n", info.duration * static_cast<double>(info.timecode_scale) / 1e9);
  std::printf("  DateUTC: %" PRId64 "\n", info.date_utc);
  std::printf("  Title: %s\n", OrNone(info.title));
  std::printf("  MuxingApp: %s\n", OrNone(info.muxing_app));
  std::printf("  WritingApp: %s\n", OrNone(info.writing_app));
}

}  // namespace

int RunInfo(int argc, char** argv) {
  if (argc != 1 || !std::strcmp(argv[0], "--help")) {
    std::fprintf(argc == 1 ? stdout : stderr, "usage: kelvane info FILE   (FILE may be - for standard input)\n");
    return argc == 1 ? 0 : 2;
  }
  auto input = host::OpenFileStream(argv[0], true);
  if (!input) {
    std::fprintf(stderr, "kelvane: cannot open '%s'\n", argv[0]);
    return 1;
  }
  mkvvstream stream;
  if (mkvvstream_init(&stream, input->record(), kHeaderBufferSize, 1, kFillWithRead, input->seekable()) != 0) {
    std::fprintf(stderr, "kelvane: '%s' is too short to be a Matroska file\n", argv[0]);
    return 1;
  }
  static mkv_file_info info;  // large: keep it off the stack
  std::memset(&info, 0, sizeof info);
  mkv_parse_limits limits{kDefaultMaxStringSize, input->seekable() ? 1u : 0u};
  info.parse_limits = &limits;

  int result = parse_mkvfile(&info, &stream);
  if (info.parse_flags & kMetEbmlHeader) PrintHeader(info);
  if (info.parse_flags & kMetInfo) PrintSegmentInfo(info);
  int exit_code = 0;
  if (result != kParseSucceeded) {
    std::fprintf(stderr, "kelvane: '%s' is not a Matroska file kelvane can read (header parse answered %d)\n",
                 argv[0], result);
    exit_code = 1;
  }
  destroy_mkv_file_info(&info);
  mkvvstream_destroy(&stream);
  return exit_code;
}
