#pragma once

namespace calmframe {

enum ExitCode {
  kDone = 0,
  kUsage = 2,
  kInput = 3,
  kOutput = 4,
  kSolveFailed = 5,
  kClipsFailed = 6,
  kInterrupted = 130,
};

}  // namespace calmframe
