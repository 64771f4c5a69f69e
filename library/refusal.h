#pragma once

#include <stdexcept>
#include <string>

#include "library/calmframe.h"

namespace calmframe::library {

// What a call ends with, and its line.
class Refusal : public std::runtime_error {
 public:
  Refusal(calmframe_result result, const std::string& line)
      : std::runtime_error(line), code(result) {}
  const calmframe_result code;
};

// The code and line of the exception that is being handled. `line`: at least one byte; nothing is
// allocated.
calmframe_result TellException(char* line, std::size_t size) noexcept;

}  // namespace calmframe::library
