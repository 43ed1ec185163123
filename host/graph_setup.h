#pragma once
// The framework's side of connecting a parser filter: sniff and rate the
// input through the plug-in's tables, attach the input stream to the input
// channel and configure it, then list every output channel, and acquire and
// configure each one that offers a format (as a framework connects only the
// pins that have one). The object owns the instance: its destructor releases
// the acquired outputs and destroys the instance.

#include <cstdint>
#include <string>
#include <vector>

#include "host/graph.h"
#include "host/input_streams.h"
#include "host/plugin_loader.h"

namespace host {

struct SetupOptions {
  uint32_t graph_flags = 0;      // MmfGetGraphParams answers these
  uint32_t buffer_size = 65536;  // the read unit announced in the input format
  bool configure_outputs = true;  // acquire and configure the output channels
  // Each step below is skipped while its argument is null.
  const MmfMediaOutputOps* upstream = nullptr;  // SetMediaOutput
  MmfChannel* upstream_output = nullptr;        // the input channel's Peer
  const MmfMemoryPoolOps* input_pool = nullptr;
  MmfMemoryPool* input_pool_param = nullptr;
  const MmfMemoryPoolOps* output_pool = nullptr;
  MmfMemoryPool* output_pool_param = nullptr;
};

struct OutputChannelSetup {
  MmfChannel* channel = nullptr;
  MmfMediaFormat offered{};  // the first format IterateOutputFormats offered
  int formats_offered = 0;   // how many times it answered 100; 0: not set up, never acquired
  std::string not_set_up;    // then: what the plug-in logged when asked for its formats
  int acquire_result = -1;   // -1: not attempted
  int set_format_result = -1;
  int pool_result = -1;
};

class FilterGraph {
 public:
  FilterGraph(const Plugin& plugin, InputStream& input, const SetupOptions& options = {});
  ~FilterGraph();
  FilterGraph(const FilterGraph&) = delete;
  FilterGraph& operator=(const FilterGraph&) = delete;

  int sniff() const { return sniff_; }
  // 0 when the sniff refused the stream: a framework rates only what it sniffed.
  int rating() const { return rating_; }
  bool rated() const { return rating_ == 80; }
  MmfFilterHandle* handle() const { return handle_; }
  const MmfMediaFormat& input_format() const { return input_format_; }
  // The input channel's set-up answers; -1 for a step not taken.
  int input_format_result() const { return input_format_result_; }
  int media_output_result() const { return media_output_result_; }
  int input_pool_result() const { return input_pool_result_; }
  const std::vector<OutputChannelSetup>& outputs() const { return outputs_; }

 private:
  void ConfigureInput(const SetupOptions& options);
  void ConfigureOutputs(const SetupOptions& options);

  const Plugin& plugin_;
  MmfGraph graph_;
  MmfFilterHandle* handle_ = nullptr;
  MmfMediaFormat input_format_{};
  int sniff_ = 0;
  int rating_ = 0;
  int input_format_result_ = -1;
  int media_output_result_ = -1;
  int input_pool_result_ = -1;
  std::vector<OutputChannelSetup> outputs_;
};

}  // namespace host
