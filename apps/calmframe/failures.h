#pragma once

#include <exception>
#include <stdexcept>

namespace calmframe {

// The user asked to stop.
class Interrupted : public std::exception {};

// The command line asks for what there is not; one line.
class UsageFailure : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// The clip could not be analysed or turned into a steady one; one line.
class SolveFailure : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// The clip holds other frames than its container promised: opened anew, it must be decoded first.
class BrokenPromise : public std::exception {};

}  // namespace calmframe
