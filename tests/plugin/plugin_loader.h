#pragma once
// The built kelvane.so, loaded with dlopen exactly as a framework loads it,
// and its tables found by name in `interfaces`.

#include <dlfcn.h>

#include <cstring>

#include <gtest/gtest.h>

#include "platform/interfaces.h"

namespace plugin_test {

struct Plugin {
  void* library = nullptr;
  const AoInterface* interfaces = nullptr;

  const AoInterface* Row(const char* name) const {
    for (const AoInterface* row = interfaces; row && row->Name; ++row) {
      if (std::strcmp(row->Name, name) == 0) return row;
    }
    return nullptr;
  }

  template <typename Table>
  const Table& Get(const char* name) const {
    const AoInterface* row = Row(name);
    if (!row || !row->Interface) {
      ADD_FAILURE() << "no table " << name;
      static const Table empty{};
      return empty;
    }
    return *static_cast<const Table*>(row->Interface);
  }

  const MmfMediaFilterOps& filter() const { return Get<MmfMediaFilterOps>("MediaFilter"); }
  const AoResourceAccessOps& resources() const { return Get<AoResourceAccessOps>("AOResourceAccess"); }
  const MmfEventProducerOps& events() const { return Get<MmfEventProducerOps>("MediaEventProducer"); }
  const MmfMetadataParserOps& metadata() const { return Get<MmfMetadataParserOps>("MediaMetadataParser"); }
};

// Loaded once per process and never unloaded: the instance counter lives in it.
inline const Plugin& LoadPlugin() {
  static const Plugin plugin = [] {
    Plugin loaded;
    loaded.library = dlopen(KELVANE_PLUGIN_PATH, RTLD_NOW | RTLD_LOCAL);
    if (!loaded.library) {
      ADD_FAILURE() << "dlopen " << KELVANE_PLUGIN_PATH << ": " << dlerror();
      return loaded;
    }
    loaded.interfaces = static_cast<const AoInterface*>(dlsym(loaded.library, AO_INTERFACES_SYMBOL));
    if (!loaded.interfaces) ADD_FAILURE() << "no symbol interfaces";
    return loaded;
  }();
  return plugin;
}

}  // namespace plugin_test
