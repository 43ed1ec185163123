#include "tools/control_options.h"

#include <cmath>
#include <cstdlib>
#include <cstring>

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
