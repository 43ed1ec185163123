#pragma once
// Status numbers of the format core. They are fixed values that the framework
// and the filter compare against, whatever the host's own error numbering.

constexpr int kStatusOk = 0;
constexpr int kStatusReadFailed = 5;    // a read or seek failed; also the normal end of a stream
constexpr int kStatusNoMemory = 12;     // out of memory, or a size limit exceeded
constexpr int kStatusInvalidArgument = 22;
constexpr int kStatusMalformed = 48;    // malformed or unsupported data

// Results of parse_mkvfile.
constexpr int kParseSucceeded = 1;
constexpr int kParseMalformed = -1;     // the walk ended on malformed data
constexpr int kParseIncomplete = -2;    // required elements missing
constexpr int kParseNoMemory = -4;      // out of memory or a limit exceeded
