#pragma once
// Input rating and stream set-up ("AOStreamInspector" and "MediaInput"):
// 80 when this filter can play the stream, 0 otherwise.

#include <cstdint>

#include "filter/mkv_filter.h"
#include "platform/input_stream.h"

constexpr int kRatingAccepted = 80;
constexpr int kRatingRefused = 0;

// A quick look at the EBML header only, through a peek-mode stream: nothing
// of the input is consumed and no state is kept.
[[nodiscard]] int SniffStream(const MmfInputStream* stream);

// Request 0 asks whether the stream was accepted. Otherwise parses the
// headers, makes one output channel per supported track, the input-buffer
// ring and the byte-rate estimate, and leaves a seekable input at the first
// Cluster. `claim` is the framework's word: set here, refused when already set.
[[nodiscard]] int RateInputFormat(MkvChannel* input, const MmfMediaFormat* format, uint32_t request,
                                  uint32_t* claim);

// The stream's bytes per second from the first and last cue points into
// ByteRate; 0 (with a level-3 message) when they span less than a second.
void CalcOverallByteRate(MkvFilter* filter);
