#pragma once
// A file (or bytes) connected to the plug-in through the host's graph set-up,
// with the instance's records in view for the checks.

#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "filter/mkv_context.h"
#include "filter/mkv_filter.h"
#include "host/graph_setup.h"
#include "host/input_streams.h"
#include "tests/support/fixtures.h"
#include "tests/support/plugin_under_test.h"

namespace plugin_test {

inline std::string FixtureFile(const std::string& name) { return testing_support::FixturePath(name + ".mkv"); }

struct Connected {
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

}  // namespace plugin_test
