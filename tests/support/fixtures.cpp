#include "tests/support/fixtures.h"

#include <charconv>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string_view>
#include <system_error>

#include <gtest/gtest.h>

namespace testing_support {

std::string FixturePath(const std::string& file) {
  const char* dir = std::getenv("KELVANE_FIXTURES");
  return std::string(dir && *dir ? dir : KELVANE_FIXTURE_DIR) + "/" + file;
}

namespace {

// FILE's bytes; empty (with ADD_FAILURE) when it cannot be read.
std::string ReadTextOrFail(const std::string& file) {
  std::ifstream in(FixturePath(file), std::ios::binary);
  if (!in) ADD_FAILURE() << "cannot read fixture file " << FixturePath(file);
  return std::string(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

// Whole-token number parsers: a sign, trailing characters or an empty token fail.
template <typename T>
bool ParseNumber(std::string_view text, T* value, int base = 10) {
  if (text.empty()) return false;
  const char* end = text.data() + text.size();
  const std::from_chars_result r = std::from_chars(text.data(), end, *value, base);
  return r.ec == std::errc() && r.ptr == end;
}

std::vector<std::string_view> SplitOn(std::string_view text, char separator) {
  std::vector<std::string_view> parts;
  size_t start = 0;
  while (true) {
    size_t at = text.find(separator, start);
    parts.push_back(text.substr(start, at == std::string_view::npos ? std::string_view::npos : at - start));
    if (at == std::string_view::npos) return parts;
    start = at + 1;
  }
}

// An Adler-32 written in at most 8 hex digits.
struct Hex {
  uint32_t* value;
};
bool ParseNumber(std::string_view text, Hex hex) { return text.size() <= 8 && ParseNumber(text, hex.value, 16); }

// Exactly one whole number per part, in order.
template <typename... Values>
bool ParseFields(const std::vector<std::string_view>& parts, Values... values) {
  size_t i = 0;
  return parts.size() == sizeof...(Values) && (ParseNumber(parts[i++], values) && ...);
}

// Calls `parse_line(line)` for every line of FILE that is neither blank nor a
// `#` comment; a false result is reported as a malformed line.
template <typename ParseLine>
void ForEachLine(const std::string& file, ParseLine parse_line) {
  std::istringstream in(ReadTextOrFail(file));
  std::string line;
  for (int number = 1; std::getline(in, line); ++number) {
    if (!line.empty() && line.back() == '\r') line.pop_back();
    if (line.empty() || line[0] == '#') continue;
    if (!parse_line(std::string_view(line))) ADD_FAILURE() << file << ":" << number << ": malformed line: " << line;
  }
}

bool ParseTrackToken(std::string_view token, ExpectedTrack* track) {
  size_t eq = token.find('=');
  if (eq == std::string_view::npos || eq == 0) return false;
  std::string_view key = token.substr(0, eq);
  std::string_view value = token.substr(eq + 1);
  if (value.empty()) return false;
  bool ok = true;
  if (key == "number") ok = ParseNumber(value, &track->number);
  else if (key == "type") track->type = value;
  else if (key == "codec") track->codec = value;
  else if (key == "codec_private_size") ok = ParseNumber(value, &track->codec_private_size);
  else if (key == "width") ok = ParseNumber(value, &track->width);
  else if (key == "height") ok = ParseNumber(value, &track->height);
  else if (key == "default_duration") ok = ParseNumber(value, &track->default_duration);
  else if (key == "channels") ok = ParseNumber(value, &track->channels);
  else if (key == "flac_sample_rate") ok = ParseNumber(value, &track->flac_sample_rate);
  else if (key == "flac_channels") ok = ParseNumber(value, &track->flac_channels);
  else if (key == "flac_bits") ok = ParseNumber(value, &track->flac_bits);
  else if (key == "sar") ok = ParseFields(SplitOn(value, ':'), &track->sar_num, &track->sar_den);
  if (!ok) return false;
  return track->fields.emplace(std::string(key), std::string(value)).second;  // a repeated key is malformed
}

bool ParseExpectedLine(std::string_view line, FixtureExpectation* fx) {
  size_t space = line.find(' ');
  std::string_view key = line.substr(0, space);
  std::string_view rest = space == std::string_view::npos ? std::string_view() : line.substr(space + 1);
  if (key == "doc_type") fx->doc_type = rest;
  else if (key == "timecode_scale") return ParseNumber(rest, &fx->timecode_scale);
  else if (key == "file_size") return ParseNumber(rest, &fx->file_size);
  else if (key == "damaged_at") return ParseNumber(rest, &fx->damaged_at);
  else if (key == "duration_ns") return ParseNumber(rest, &fx->duration_ns);
  else if (key == "tag") {
    size_t name_end = rest.find(' ');
    std::string_view name = rest.substr(0, name_end);
    if (name.empty()) return false;
    std::string_view text = name_end == std::string_view::npos ? std::string_view() : rest.substr(name_end + 1);
    fx->tags.emplace_back(std::string(name), std::string(text));
  } else if (key == "tag_target" || key == "track_name" || key == "edition" || key == "chapter" ||
             key == "chapter_name" || key == "attachment" || key == "title" || key == "muxing_app" ||
             key == "writing_app" || key == "cue_points") {
    return true;  // read by the tool's checks (check_info.sh)
  } else if (key == "track") {
    ExpectedTrack& track = fx->tracks.emplace_back();
    for (std::string_view token : SplitOn(rest, ' ')) {
      if (!ParseTrackToken(token, &track)) return false;
    }
    if (track.fields.count("number") == 0 || track.type.empty()) return false;
  } else {
    return false;
  }
  return space != std::string_view::npos;
}

}  // namespace

std::vector<std::string> FixtureNames() {
  std::vector<std::string> names;
  ForEachLine("index.txt", [&](std::string_view line) {
    std::string_view name = line.substr(0, line.find_first_of(" \t"));
    if (!name.empty()) names.emplace_back(name);
    return !name.empty();
  });
  return names;
}

FixtureExpectation LoadFixture(const std::string& name) {
  FixtureExpectation fx;
  fx.name = name;
  ForEachLine(name + ".expected", [&](std::string_view line) { return ParseExpectedLine(line, &fx); });
  ForEachLine(name + ".cues", [&](std::string_view line) {
    ExpectedCue& cue = fx.cues.emplace_back();
    return ParseFields(SplitOn(line, ' '), &cue.time_ticks, &cue.track, &cue.cluster_position, &cue.block_number);
  });
  ForEachLine(name + ".blocks", [&](std::string_view line) {
    std::vector<std::string_view> parts = SplitOn(line, ' ');
    ExpectedBlock& block = fx.blocks.emplace_back();
    if (parts.size() != 5 || !ParseFields({parts[0], parts[1]}, &block.track, &block.ticks) ||
        (parts[2] != "S" && parts[2] != "B") || (parts[3] != "0" && parts[3] != "1")) {
      return false;
    }
    for (std::string_view entry : SplitOn(parts[4], ',')) {
      ExpectedFrame& frame = block.frames.emplace_back();
      if (!ParseFields(SplitOn(entry, ':'), &frame.size, Hex{&frame.adler32})) return false;
    }
    return true;
  });
  return fx;
}

std::vector<ExpectedBlock> LoadFullFrames(const std::string& name) {
  std::vector<ExpectedBlock> frames;
  ForEachLine(name + ".frames", [&](std::string_view line) {
    ExpectedBlock& block = frames.emplace_back();
    ExpectedFrame& frame = block.frames.emplace_back();
    return ParseFields(SplitOn(line, ' '), &block.track, &block.ticks, &frame.size, Hex{&frame.adler32});
  });
  return frames;
}

std::vector<uint8_t> ReadFixtureBytes(const std::string& name) {
  const std::string bytes = ReadTextOrFail(name + ".mkv");
  return std::vector<uint8_t>(bytes.begin(), bytes.end());
}

}  // namespace testing_support
