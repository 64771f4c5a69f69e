#pragma once

#include <exception>
#include <stdexcept>

namespace calmframe::host {

// The watcher stopped the work.
class Interrupted : public std::exception {};

// The clip could not be analysed or turned into a steady one; one line.
class SolveFailure : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// The clip holds other frames than its container promised: opened anew, it must be decoded first.
class BrokenPromise : public std::exception {};

}  // namespace calmframe::host
