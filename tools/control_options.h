#pragma once
// The playback-control options that `kelvane packets` takes, turned into the
// graph runner's control actions. Times are seconds (fractions allowed); AT
// is the media time of playback at which the action is taken (0: at once).
//   --seek TIME[@AT]   seek to TIME (repeatable)
//   --ff SPEED[@AT]    fast forward; --rew SPEED[@AT] rewind
//   --scan-end AT      back to normal playback
//   --preroll          the "EnablePreroll" resource
//   --trick-time MS    the "TrickTime" resource

#include <string>
#include <vector>

#include "host/graph_runner.h"

// The options' lines for a command's help text.
extern const char kControlUsage[];

// 1 when argv[*i] (and the value it takes) was a control option, with *i on
// its last word; 0 when it is none; -1 when its value is missing or
// malformed, with *error naming the option and what it takes.
int ParseControlOption(int argc, char** argv, int* i, host::RunnerOptions* run, std::string* error);

// After playback, on standard error: each action the plug-in refused, and
// each seek past the end of `file` (the plug-in then goes on from its last
// cue point), in words; the plug-in's answers only with KELVANE_LOG.
void ReportControlResults(const char* command, const char* file, const std::vector<host::ControlAction>& actions,
                          const std::vector<int>& results);
