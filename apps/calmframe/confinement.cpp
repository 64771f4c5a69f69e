#include "apps/calmframe/confinement.h"

#include <dlfcn.h>

#include <CLI/CLI.hpp>
#include <cstdlib>
#include <filesystem>
#include <system_error>

#include "apps/calmframe/plugin_path.h"
#include "host/base/sandbox.h"
#include "host/media/clip_files.h"

namespace calmframe {
namespace {

namespace fs = std::filesystem;

// Runs that this one starts learn it by this.
constexpr char kSwitch[] = "CALMFRAME_NO_SANDBOX";

// A clip's name, which may stand for a pipe or for pictures in a folder.
void AllowClip(const std::string& name, host::Sandbox& sandbox) {
  std::error_code error;
  fs::path place = name;
  if (name == "-" || fs::is_fifo(place, error)) {
    // What comes through is kept in a file without a name, now, while that can be made.
    for (const std::string& kept : media::FilesOf(name).paths) sandbox.AllowReading(kept);
    return;
  }
  while (!place.empty() && !fs::exists(place, error)) place = place.parent_path();
  sandbox.AllowReading(place.empty() ? fs::path(".") : place);
}

}  // namespace

void Confinement::Begin() const {
  if (const char* const off = std::getenv(kSwitch); off && *off) return;
  host::Sandbox sandbox;
  for (const std::string& name : read) {
    if (!name.empty()) AllowClip(name, sandbox);
  }
  for (const std::string& name : written) {
    if (!name.empty() && name != "-") sandbox.AllowWriting(name);
  }
  for (const std::string& folder : folders) sandbox.AllowWritingIn(folder);
  // What the plug-in is linked to may lie anywhere: it is there before the border is. One that
  // can't be loaded is told of by whoever needs it.
  const std::string plugin = PluginPath();
  sandbox.AllowReading(plugin);
  dlopen(plugin.c_str(), RTLD_NOW | RTLD_LOCAL);
  sandbox.Enter();
}

void AddSandboxFlag(CLI::App& command) {
  command
      .add_flag_callback(
          "--no-sandbox", [] { setenv(kSwitch, "1", 1); },
          "Don't keep what reads clips to the files of its work, where the system could")
      ->group("Running");
}

}  // namespace calmframe
