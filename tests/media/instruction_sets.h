#pragma once

#include <gtest/gtest.h>

#define HWY_BROKEN_EMU128 0  // as the kernels have it
#include <hwy/highway.h>

namespace calmframe::media {

// With each that this processor and the kernels have.
void OnEachInstructionSet(const auto& check) {
  const std::int64_t supported = hwy::SupportedTargets() & HWY_TARGETS;
  for (std::int64_t left = supported; left != 0; left &= left - 1) {
    SCOPED_TRACE(hwy::TargetName(left & -left));
    hwy::SetSupportedTargetsForTest(left & -left);
    hwy::GetChosenTarget().Update(left & -left);
    check();
  }
  hwy::SetSupportedTargetsForTest(0);
  hwy::GetChosenTarget().Update(hwy::SupportedTargets());
}

}  // namespace calmframe::media
