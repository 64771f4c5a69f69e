#pragma once

#include <gtest/gtest.h>
#include <hwy/highway.h>

#include <cstdint>

namespace tests {

// Runs `check` with every instruction set that this processor has.
template <class Check>
void OnEachInstructionSet(Check check) {
  const std::int64_t supported = hwy::SupportedTargets() & HWY_TARGETS;
  for (std::int64_t left = supported; left != 0; left &= left - 1) {
    hwy::SetSupportedTargetsForTest(left & -left);
    hwy::GetChosenTarget().Update(left & -left);
    SCOPED_TRACE(hwy::TargetName(left & -left));
    check();
  }
  hwy::SetSupportedTargetsForTest(0);
  hwy::GetChosenTarget().Update(hwy::SupportedTargets());
}

}  // namespace tests
