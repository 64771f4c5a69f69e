#include "library/plugin_place.h"

#include <dlfcn.h>

#include <cstdlib>
#include <filesystem>

namespace calmframe::library {

namespace {

namespace fs = std::filesystem;

fs::path OwnFolder() {
  Dl_info info{};
  std::error_code error;
  if (dladdr(reinterpret_cast<const void*>(&PluginPlace), &info) == 0 || !info.dli_fname)
    return "/";
  const fs::path own = fs::canonical(info.dli_fname, error);
  return error ? "/" : own.parent_path();
}

// Known as the library is loaded: it may have been by a path from the folder of then.
const fs::path own_folder = OwnFolder();

}  // namespace

std::string PluginPlace() {
  // Not of a program that runs with more rights than whoever started it.
  if (const char* named = secure_getenv("CALMFRAME_PLUGIN"); named && *named) return named;
  constexpr char kLibrary[] = "calmframe.hxp";
  std::error_code error;
  const fs::path& folder = own_folder;
  const fs::path installed = folder / CALMFRAME_INSTALLED_PLUGIN_DIR / kLibrary;
  return fs::exists(folder / kLibrary, error) ? folder / kLibrary : installed.lexically_normal();
}

}  // namespace calmframe::library
