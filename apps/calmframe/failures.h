#pragma once

#include <stdexcept>

#include "host/stabilize/failures.h"

namespace calmframe {

using host::BrokenPromise;
using host::Interrupted;
using host::SolveFailure;

// The command line asks for what there is not; one line.
class UsageFailure : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// Of a batch, clips that failed, each told by itself; one line that counts them.
class ClipsFailed : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

}  // namespace calmframe
