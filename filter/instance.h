#pragma once
// Making and taking down a filter instance.

#include "filter/mkv_filter.h"

// A new instance named "kelvane<n>", n counting every Create of the process
// from 0 (also those that fail after the handle was allocated); null when any
// allocation or lock fails, with everything made so far undone.
[[nodiscard]] MkvFilter* Create();

// Frees the channels, the metadata, the ring, the file model, the locks and
// the instance. Always 0; the caller has checked the handle.
int Destroy(MkvFilter* filter);

// Frees the output channel records with their states and names; the instance
// is left with none.
void FreeOutputChannels(MkvFilter* filter);
