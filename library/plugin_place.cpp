#include "library/plugin_place.h"

#include <dlfcn.h>

#include <cstdlib>
#include <filesystem>

namespace calmframe::library {

std::string PluginPlace() {
  namespace fs = std::filesystem;
  if (const char* named = std::getenv("CALMFRAME_PLUGIN"); named && *named) return named;
  constexpr char kLibrary[] = "calmframe.hxp";
  Dl_info info{};
  std::error_code error;
  fs::path folder;
  if (dladdr(reinterpret_cast<const void*>(&PluginPlace), &info) != 0 && info.dli_fname) {
    folder = fs::canonical(info.dli_fname, error).parent_path();
  }
  const fs::path installed = folder / CALMFRAME_INSTALLED_PLUGIN_DIR / kLibrary;
  return fs::exists(folder / kLibrary, error) ? folder / kLibrary : installed.lexically_normal();
}

}  // namespace calmframe::library
