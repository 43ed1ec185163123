#pragma once
// The plug-in the tests drive, loaded once per test binary from the path the
// build gives (KELVANE_PLUGIN_PATH) through the host's loader.

#include <memory>
#include <string>

#include <gtest/gtest.h>

#include "host/plugin_loader.h"

namespace plugin_test {

inline const host::Plugin& HostPlugin() {
  static const std::unique_ptr<host::Plugin> plugin = [] {
    std::string error;
    auto loaded = host::Plugin::Load(KELVANE_PLUGIN_PATH, &error);
    if (!loaded) ADD_FAILURE() << error;
    return loaded;
  }();
  return *plugin;
}

}  // namespace plugin_test
