// `kelvane info [--json] [--tree] FILE`: the file's headers as the demuxer
// reads them — EBML header, Segment Info, every track, cues, chapters,
// attachments, tags by target, the metadata list — or, with --tree, every
// element with its offset and sizes. The framework has no operation that
// hands out the file model, so this command reads the file through the
// tool's header reading (tools/reading), which runs the demuxer's own header
// parse: it shows what the plug-in reads, including tracks it does not offer.

#include <cstdio>
#include <cstring>

#include "tools/command_line.h"
#include "tools/commands.h"
#include "tools/info_output.h"
#include "tools/reading/header_reading.h"

const char kInfoHelp[] =
    "usage: kelvane info [--json] [--tree] FILE\n"
    "\n"
    "Reads the headers of a Matroska file and prints what they say: the EBML header, the\n"
    "Segment Info (title, duration, date, applications, file size and overall bit rate),\n"
    "every track (codec in words and its CodecID, the four-character code the plug-in\n"
    "offers it under or \"not offered\", name, language, default/enabled/forced flags,\n"
    "picture or sound, statistics such as bytes and bit rate where the file has them),\n"
    "the first and last cue point, the chapters, the attachments, the tags grouped by what\n"
    "they apply to (file, track N, chapter, attachment) and the metadata list. The file is\n"
    "read with the demuxer's own header parser, linked into this program: the framework\n"
    "has no operation that hands out this model, so unlike probe and packets this command\n"
    "does not go through the loaded plug-in.\n"
    "\n"
    "With --tree it lists every element instead, one line each: its byte offset, the size\n"
    "of its ID and size fields, the size of its data, its name (indented by depth) and a\n"
    "leaf's value. On a damaged file it lists all it could read and names the byte where\n"
    "it stopped (exit code 1).\n"
    "\n"
    "FILE may be - for standard input, or a pipe: it is then read once, front to back, so\n"
    "chapters, attachments and the tags' targets (read by a second pass) are not shown,\n"
    "and --tree needs a regular file.\n"
    "\n"
    "options:\n"
    "  --json           one JSON document instead of text (docs/json.md, section info)\n"
    "  --tree           every element with its offset and sizes (with --json: a list)\n"
    "  -h, --help       this text\n"
    "\n"
    "exit codes: 0 ok; 1 the file cannot be read or is not Matroska the parser accepts; 2 usage\n"
    "\n"
    "examples:\n"
    "  kelvane info movie.mkv\n"
    "  kelvane info --json movie.mkv | jq '.tracks[] | {number, codec, language, name}'\n"
    "  kelvane info --tree movie.mkv | less\n"
    "  cat movie.mkv | kelvane info -\n";

int RunInfo(int argc, char** argv) {
  const char* file = nullptr;
  bool json = false;
  bool tree = false;
  for (int i = 0; i < argc; ++i) {
    const char* arg = argv[i];
    if (IsHelpOption(arg)) return PrintHelp(kInfoHelp);
    if (!std::strcmp(arg, "--json")) {
      json = true;
    } else if (!std::strcmp(arg, "--tree")) {
      tree = true;
    } else if (int code = TakeFile("info", arg, &file); code != kExitOk) {
      return code;
    }
  }
  if (!file) return UsageError("info", "no FILE given");
  bool stream = false;
  if (int code = CheckInput("info", file, tree ? InputUse::kTwice : InputUse::kOnce, &stream); code != kExitOk) {
    return code;
  }
  if (tree) return PrintElementTree(file, json);

  reading::HeaderReading reading = reading::ReadHeaders(file, {!stream, true});
  if (!reading.ok) {
    if (!json) PrintPartialInfoText(reading.facts, reading.read_ebml_header, reading.read_segment_info);
    if (LogRequested()) return Failure("info", "%s: %s (header parse answer %d)", file, reading.failure.c_str(),
                                       reading.parse_answer);
    return Failure("info", "%s: %s", file, reading.failure.c_str());
  }
  json ? WriteInfoJson(file, reading.facts) : PrintInfoText(reading.facts);
  return kExitOk;
}
