#include "host/graph_setup.h"

#include "host/log_control.h"
#include "platform/mmf_status.h"

namespace host {
namespace {

constexpr uint32_t kChannelAcquiredFlag = 1;  // bit 0 of a channel's Flags
constexpr uint32_t kFullRating = 1;

}  // namespace

FilterGraph::FilterGraph(const Plugin& plugin, InputStream& input, const SetupOptions& options) : plugin_(plugin) {
  graph_.Flags = options.graph_flags;
  if (const AoStreamInspectorOps* inspector = plugin.inspector()) sniff_ = inspector->SniffStream(input.record());

  const MmfMediaFilterOps* filter = plugin.filter();
  if (!filter || !(handle_ = filter->Create())) return;
  handle_->Graph = &graph_;
  MmfChannel* channel = handle_->InputChannel;
  channel->StreamLink = input.record();

  input_format_.buffer_size = options.buffer_size;
  input_format_.no_seek_test = input.seekable() ? 0 : 1;
  const MmfMediaInputOps* media_input = plugin.input();
  if (sniff_ != kMmfRatingAccepted || !media_input) return;
  uint32_t claim = 0;
  rating_ = media_input->RateInputFormat(channel, &input_format_, kFullRating, &claim);
  if (!rated()) return;

  ConfigureInput(options);
  ConfigureOutputs(options);
}

void FilterGraph::ConfigureInput(const SetupOptions& options) {
  const MmfMediaInputOps* media_input = plugin_.input();
  MmfChannel* channel = handle_->InputChannel;
  channel->Flags |= kChannelAcquiredFlag;  // the framework acquires the input channel
  input_format_result_ = media_input->SetInputFormat(channel, &input_format_);
  channel->Peer = options.upstream_output;
  if (options.upstream) media_output_result_ = media_input->SetMediaOutput(channel, options.upstream);
  if (options.upstream && options.input_pool && options.input_pool_param) {
    input_pool_result_ = media_input->SetInputChannelMemoryPool(channel, options.input_pool, options.input_pool_param);
  }
}

void FilterGraph::ConfigureOutputs(const SetupOptions& options) {
  const MmfMediaOutputOps* output = plugin_.output();
  if (!output) return;
  int32_t iterator = 0;
  while (MmfChannel* channel = output->IterateOutputChannels(handle_, &iterator)) {
    OutputChannelSetup setup;
    setup.channel = channel;
    int32_t formats = 0;
    MmfMediaFormat format{};
    ThreadLog log;
    while (output->IterateOutputFormats(channel, &format, &formats) == kMmfFormatMatch) {
      if (setup.formats_offered++ == 0) setup.offered = format;
    }
    if (setup.formats_offered == 0) setup.not_set_up = log.last();
    if (options.configure_outputs && setup.formats_offered > 0) {
      setup.acquire_result = output->AcquireOutputChannel(channel);
      setup.set_format_result = output->SetOutputFormat(channel, &setup.offered);
      if (options.output_pool && options.output_pool_param) {
        setup.pool_result = output->SetOutputChannelMemoryPool(channel, options.output_pool, options.output_pool_param);
      }
    }
    outputs_.push_back(setup);
  }
}

FilterGraph::~FilterGraph() {
  if (!handle_) return;
  const MmfMediaOutputOps* output = plugin_.output();
  for (const OutputChannelSetup& setup : outputs_) {
    if (setup.acquire_result >= 0 && output) (void)output->ReleaseOutputChannel(setup.channel);
  }
  plugin_.filter()->Destroy(handle_);
}

}  // namespace host
