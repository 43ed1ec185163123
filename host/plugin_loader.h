#pragma once
// Loading a filter plug-in as the framework does: dlopen by path, then find
// its function tables by name in the exported `interfaces` rows.

#include <memory>
#include <string>

#include "platform/interfaces.h"

namespace host {

class Plugin {
 public:
  // Null, with the reason in *error, when the library cannot be loaded or has no `interfaces`.
  static std::unique_ptr<Plugin> Load(const std::string& path, std::string* error);

  // The plug-in stays loaded for the rest of the process: instances may
  // outlive this object, and its instance counter must keep counting.
  ~Plugin() = default;
  Plugin(const Plugin&) = delete;
  Plugin& operator=(const Plugin&) = delete;

  // The interface of the row with this name, or null.
  const void* Table(const char* name) const;
  template <typename T>
  const T* Get(const char* name) const {
    return static_cast<const T*>(Table(name));
  }

  const MmfMediaFilterOps* filter() const { return Get<MmfMediaFilterOps>("MediaFilter"); }
  const MmfMediaInputOps* input() const { return Get<MmfMediaInputOps>("MediaInput"); }
  const MmfMediaOutputOps* output() const { return Get<MmfMediaOutputOps>("MediaOutput"); }
  const MmfTimeConverterOps* converter() const { return Get<MmfTimeConverterOps>("MediaTimeConverter"); }
  const MmfSeekerOps* seeker() const { return Get<MmfSeekerOps>("MediaSeeker"); }
  const AoStreamInspectorOps* inspector() const { return Get<AoStreamInspectorOps>("AOStreamInspector"); }
  const AoResourceAccessOps* resources() const { return Get<AoResourceAccessOps>("AOResourceAccess"); }

 private:
  explicit Plugin(const AoInterface* rows) : rows_(rows) {}
  const AoInterface* rows_;
};

// kelvane.so in the directory of the running executable (where the build puts it).
std::string PluginBesideExecutable();

}  // namespace host
