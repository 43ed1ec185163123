// What a filter asks the framework about its place in the graph: the input
// stream behind its input channel and the flags of its graph.

#include "host/graph.h"
#include "platform/channel.h"
#include "platform/mmf_status.h"

extern "C" int MmfGetInputStream(MmfChannel* channel, MmfInputStream** stream) {
  if (!channel || !stream) return kMmfInvalidArgument;
  if (!channel->StreamLink) return kMmfNotAvailable;
  *stream = static_cast<MmfInputStream*>(channel->StreamLink);
  return kMmfOk;
}

extern "C" int MmfGetGraphParams(MmfGraph* graph, uint32_t* flags) {
  if (!graph || !flags) return kMmfInvalidArgument;
  *flags = graph->Flags;
  return kMmfOk;
}
