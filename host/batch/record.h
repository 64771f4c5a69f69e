#pragma once

#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

#include "host/batch/files.h"

namespace calmframe::batch {

// What became of a clip, in a file of its own that every run and every machine reads.
struct Record {
  // begun -> done | failed; each run begins anew. One that was killed stays begun.
  enum class State { begun, failed, done } state = State::begun;
  std::string run = {};     // which one wrote it; see Plan
  std::string source = {};  // absolute
  FileIdentity source_identity = {};
  std::vector<std::string> settings = {};  // words of the command line, in their order by name
  std::string output = {};                 // to the batch's folder
  // Of the last output that was whole. What lies under the output's name is the batch's own while
  // it is this.
  std::optional<FileIdentity> output_identity = {};
  std::string error = {};                  // of a failed one, in one line
  int exit_code = 0;                       // of the program; 128 + the signal that ended it
  double seconds = 0;                      // that it took
  nlohmann::ordered_json outcome = {};     // as `stabilize --json` ends with; null: none
  std::vector<std::string> warnings = {};  // a line each
};

std::string TextOf(const Record& record);
// None of what is no whole record.
std::optional<Record> ReadRecord(const std::string& path);

}  // namespace calmframe::batch
