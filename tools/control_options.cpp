#include "tools/control_options.h"

#include <cmath>
#include <cstdlib>
#include <cstdio>
#include <cstring>

#include "tools/command_line.h"
#include "tools/media_words.h"
#include "tools/reading/header_reading.h"

const char kControlUsage[] =
    "  --seek TIME[@AT]    seek to TIME seconds once playback reaches AT seconds (repeatable;\n"
    "                      without @AT: AT is 0)\n"
    "  --ff SPEED[@AT]     fast forward from AT; SPEED in percent (400: skip 4 x TrickTime per jump)\n"
    "  --rew SPEED[@AT]    rewind likewise\n"
    "  --scan-end AT       end the scan once playback reaches AT seconds\n"
    "  --preroll           deliver the blocks before a seek's time, marked (EnablePreroll)\n"
    "  --trick-time MS     milliseconds of media delivered at each trick-play jump (TrickTime)\n";

namespace {

constexpr double kMaxSeconds = 1e9;

bool Seconds(const char* text, const char** end, uint64_t* us) {
  char* stop = nullptr;
  double seconds = std::strtod(text, &stop);
  if (stop == text || !(seconds >= 0) || seconds > kMaxSeconds) return false;
  *us = static_cast<uint64_t>(std::llround(seconds * 1e6));
  *end = stop;
  return true;
}

bool Unsigned(const char* text, const char** end, uint32_t* value) {
  char* stop = nullptr;
  unsigned long parsed = std::strtoul(text, &stop, 10);
  if (stop == text || text[0] == '-' || parsed > 0xFFFFFFFFul) return false;
  *value = static_cast<uint32_t>(parsed);
  *end = stop;
  return true;
}

// "[@AT]" then the end of the word.
bool At(const char* text, uint64_t* at_us) {
  *at_us = 0;
  if (*text == '@' && !Seconds(text + 1, &text, at_us)) return false;
  return *text == '\0';
}

}  // namespace

int ParseControlOption(int argc, char** argv, int* i, host::RunnerOptions* run, std::string* error) {
  const char* arg = argv[*i];
  if (!std::strcmp(arg, "--preroll")) {
    run->preroll = true;
    return 1;
  }
  const char* form = !std::strcmp(arg, "--seek")                              ? "TIME[@AT], seconds (12.5 or 12.5@2)"
                     : !std::strcmp(arg, "--ff") || !std::strcmp(arg, "--rew") ? "SPEED[@AT], a percentage (400 or 400@2)"
                     : !std::strcmp(arg, "--scan-end")                        ? "AT, seconds"
                     : !std::strcmp(arg, "--trick-time") ? "MS, milliseconds from 1 to 2147483647"
                                                         : nullptr;
  if (!form) return 0;
  if (*i + 1 >= argc) {
    *error = std::string(arg) + " needs a value: " + form;
    return -1;
  }
  const char* value = argv[++*i];
  const char* rest = nullptr;
  host::ControlAction action;
  bool valid = true;
  if (!std::strcmp(arg, "--seek")) {
    action.kind = host::ControlAction::kSeek;
    valid = Seconds(value, &rest, &action.time_us) && At(rest, &action.at_us);
  } else if (!std::strcmp(arg, "--ff") || !std::strcmp(arg, "--rew")) {
    action.kind = arg[2] == 'f' ? host::ControlAction::kScanForward : host::ControlAction::kScanBackward;
    valid = Unsigned(value, &rest, &action.speed) && At(rest, &action.at_us);
  } else if (!std::strcmp(arg, "--scan-end")) {
    action.kind = host::ControlAction::kScanEnd;
    valid = Seconds(value, &rest, &action.at_us) && !*rest;
  } else {
    uint32_t ms = 0;
    valid = Unsigned(value, &rest, &ms) && !*rest && ms != 0 && ms <= 0x7FFFFFFF;
    if (valid) run->trick_time_ms = static_cast<int32_t>(ms);
  }
  if (!valid) {
    *error = std::string(arg) + ": '" + value + "' is not " + form;
    return -1;
  }
  if (std::strcmp(arg, "--trick-time") != 0) run->actions.push_back(action);
  return 1;
}

namespace {

std::string Seconds(uint64_t us) {
  char text[32];
  std::snprintf(text, sizeof text, "%g", static_cast<double>(us) / 1e6);
  return text;
}

// The action as its option was written: "--seek 10@2".
std::string OptionOf(const host::ControlAction& action) {
  const std::string at = action.at_us ? "@" + Seconds(action.at_us) : "";
  switch (action.kind) {
    case host::ControlAction::kSeek: return "--seek " + Seconds(action.time_us) + at;
    case host::ControlAction::kScanForward: return "--ff " + std::to_string(action.speed) + at;
    case host::ControlAction::kScanBackward: return "--rew " + std::to_string(action.speed) + at;
    case host::ControlAction::kScanEnd: return "--scan-end " + Seconds(action.at_us);
  }
  return {};
}

}  // namespace

void ReportControlResults(const char* command, const char* file, const std::vector<host::ControlAction>& actions,
                          const std::vector<int>& results) {
  std::optional<uint64_t> duration_ns;
  for (size_t k = 0; k < actions.size(); ++k) {
    const host::ControlAction& action = actions[k];
    const std::string option = OptionOf(action);
    if (k < results.size() && results[k] != 0) {
      if (LogRequested()) {
        std::fprintf(stderr, "kelvane %s: the plug-in refused %s (it answered %d)\n", command, option.c_str(), results[k]);
      } else {
        std::fprintf(stderr, "kelvane %s: the plug-in refused %s\n", command, option.c_str());
      }
      continue;
    }
    if (action.kind != host::ControlAction::kSeek) continue;
    if (!duration_ns) duration_ns = reading::ReadHeaders(file, {true, false}).facts.info.DurationNs().value_or(0);
    if (*duration_ns && action.time_us * 1000 >= *duration_ns) {
      std::fprintf(stderr, "kelvane %s: %s is past the end of %s (duration %s): playback went on from its last cue point\n",
                   command, option.c_str(), file, ClockTime(*duration_ns).c_str());
    }
  }
}
