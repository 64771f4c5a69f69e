#include "apps/calmframe/plugin_path.h"

#include <cstdlib>
#include <filesystem>

namespace calmframe {

std::string PluginPath() {
  namespace fs = std::filesystem;
  if (const char* named = std::getenv("CALMFRAME_PLUGIN"); named && *named) return named;
  constexpr char kLibrary[] = "calmframe.hxp";
  std::error_code error;
  const fs::path folder = fs::read_symlink("/proc/self/exe", error).parent_path();
  const fs::path installed = folder / CALMFRAME_INSTALLED_PLUGIN_DIR / kLibrary;
  return fs::exists(folder / kLibrary, error) ? folder / kLibrary : installed.lexically_normal();
}

}  // namespace calmframe
