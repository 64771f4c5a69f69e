#pragma once

#include <string>
#include <vector>

namespace CLI {
class App;
}

namespace calmframe {

// What a command reads and writes, by names as they are given on the command line; empty ones stand
// for none.
struct Confinement {
  std::vector<std::string> read = {};
  std::vector<std::string> written = {};
  std::vector<std::string> folders = {};  // with all below them read and written

  // The process reaches nothing else from now on, see host::Sandbox; before any clip is opened and
  // any thread started. A pipe among what is read is read to its end. Without effect where
  // --no-sandbox was given, here or to the program that has started this one. Throws as
  // media::FilesOf of a pipe.
  void Begin() const;
};

// Adds --no-sandbox.
void AddSandboxFlag(CLI::App& command);

}  // namespace calmframe
