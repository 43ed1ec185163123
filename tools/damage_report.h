#pragma once
// What `packets` and `extract` say on standard error after playing a damaged
// file, one line each: a gap in a channel's frames (the runner went on past
// damage), a channel that stopped before the end (where, and after which
// byte), a file that ends inside a Cluster. Frames delivered are kept either
// way; a damaged file makes the command exit 1.

#include <cstdint>
#include <vector>

#include "host/graph_runner.h"

// `tracks` gives each channel index its track number. True when anything was reported.
bool ReportDamage(const char* command, const char* file, const host::RunResult& result,
                  const std::vector<uint64_t>& tracks);

// Whether the file ends inside a Cluster (its size claims more bytes than
// the file has), walking the elements from `first_cluster` on: then the
// Cluster's offset and the file's size.
bool EndsInsideCluster(const char* path, uint64_t first_cluster, uint64_t* cluster, uint64_t* size);
