#include <gtest/gtest.h>

#include "platform/tessel/debug.h"

// A process shows them from its start or never.
namespace {

class ExperimentalParameters : public ::testing::Environment {
  void SetUp() override {
    tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 1);
  }
};
const auto* const environment = ::testing::AddGlobalTestEnvironment(new ExperimentalParameters);

}  // namespace
