#include "host/plugin_loader.h"

#include <dlfcn.h>
#include <unistd.h>

#include <cstring>

namespace host {

std::unique_ptr<Plugin> Plugin::Load(const std::string& path, std::string* error) {
  void* library = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
  if (!library) {
    if (error) *error = dlerror();
    return nullptr;
  }
  const auto* rows = static_cast<const AoInterface*>(dlsym(library, AO_INTERFACES_SYMBOL));
  if (!rows) {
    if (error) *error = path + " has no symbol " AO_INTERFACES_SYMBOL;
    return nullptr;
  }
  return std::unique_ptr<Plugin>(new Plugin(rows));
}

const void* Plugin::Table(const char* name) const {
  for (const AoInterface* row = rows_; row->Name; ++row) {
    if (std::strcmp(row->Name, name) == 0) return row->Interface;
  }
  return nullptr;
}

std::string PluginBesideExecutable() {
  char self[4096];
  ssize_t length = readlink("/proc/self/exe", self, sizeof self - 1);
  if (length <= 0) return "kelvane.so";
  std::string path(self, static_cast<size_t>(length));
  size_t slash = path.rfind('/');
  return (slash == std::string::npos ? std::string(".") : path.substr(0, slash)) + "/kelvane.so";
}

}  // namespace host
