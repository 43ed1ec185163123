#pragma once
// A file (or bytes) connected to the plug-in through the host's graph set-up,
// with the instance's records in view for the checks; or a file behind a file
// streamer wired to the input channel as the framework wires it.

#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "filter/mkv_context.h"
#include "filter/mkv_filter.h"
#include "host/file_streamer.h"
#include "host/graph_setup.h"
#include "host/input_streams.h"
#include "tests/support/fixtures.h"
#include "tests/support/plugin_under_test.h"

namespace plugin_test {

inline std::string FixtureFile(const std::string& name) { return testing_support::FixturePath(name + ".mkv"); }

struct Connected {
  std::unique_ptr<host::InputStream> source;  // the streamer's, when there is one
  std::unique_ptr<host::FileStreamer> streamer;
  std::vector<uint8_t> bytes;  // kept alive for a memory stream
  std::unique_ptr<host::InputStream> stream;
  std::unique_ptr<host::FilterGraph> graph;

  MkvFilter* filter() const { return AsMkvFilter(graph->handle()); }
  MkvContext* context() const { return filter()->Context; }
  int32_t channel_count() const { return context()->OutputChannelCount; }
  MkvChannel& channel(int32_t k) const { return filter()->OutputChannels[k]; }
};

inline Connected ConnectFile(const std::string& name, bool seekable = true, host::SetupOptions options = {}) {
  Connected c;
  c.stream = host::OpenFileStream(FixtureFile(name), seekable);
  if (!c.stream) {
    ADD_FAILURE() << "cannot open " << name;
    return c;
  }
  c.graph = std::make_unique<host::FilterGraph>(HostPlugin(), *c.stream, options);
  return c;
}

inline Connected ConnectBytes(std::vector<uint8_t> bytes, host::SetupOptions options = {}) {
  Connected c;
  c.bytes = std::move(bytes);
  c.stream = host::MakeMemoryStream(c.bytes.data(), c.bytes.size(), true);
  c.graph = std::make_unique<host::FilterGraph>(HostPlugin(), *c.stream, options);
  return c;
}

// The streamer (of `config`) is the input channel's Peer, its list mode asks
// the plug-in's list maker, and it reads on from where the rating left the input.
inline Connected ConnectStreamed(const std::string& name, host::StreamerConfig config, host::SetupOptions options) {
  auto source = host::OpenFileStream(FixtureFile(name), true);
  auto streamer = std::make_unique<host::FileStreamer>(source.get(), config);
  options.upstream_output = streamer->output();
  Connected c = ConnectFile(name, true, options);
  c.source = std::move(source);
  c.streamer = std::move(streamer);
  c.streamer->ConnectListMaker(HostPlugin().Get<MmfListMakerOps>("MediaListMaker"), c.graph->handle()->InputChannel);
  EXPECT_EQ(c.streamer->Seek(static_cast<uint64_t>(c.stream->Tell()), 0), 0);
  return c;
}

}  // namespace plugin_test
