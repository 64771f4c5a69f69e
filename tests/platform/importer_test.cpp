#include "platform/tessel/importer.h"

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <thread>
#include <vector>

#include "platform/tessel/threads.h"

namespace tessel::importer {
namespace {

TEST(ImporterTest, CallbacksHearOfPausesAndOfOneThatIsOn) {
  std::vector<bool> early, late;
  const utility::Guid first = RegisterPauseCallback([&](bool pause) { early.push_back(pause); });
  PauseBackgroundWork(true);
  const utility::Guid second = RegisterPauseCallback([&](bool pause) { late.push_back(pause); });
  EXPECT_NE(first, second);
  EXPECT_EQ(late, std::vector<bool>({true}));
  UnregisterPauseCallback(first);
  PauseBackgroundWork(false);
  UnregisterPauseCallback(second);
  UnregisterPauseCallback(second);
  PauseBackgroundWork(true);
  PauseBackgroundWork(false);
  EXPECT_EQ(early, std::vector<bool>({true}));
  EXPECT_EQ(late, std::vector<bool>({true, false}));
}

TEST(ImporterTest, UnregisteringWaitsForARunningCallback) {
  for (int round = 0; round < 50; ++round) {
    threads::CompletionEvent running, leaving;
    bool ended = false;  // plain: unregistering orders the accesses
    const utility::Guid id = RegisterPauseCallback([&](bool pause) {
      if (!pause) return;
      running.Signal();
      leaving.Wait();
      ended = true;
    });
    std::thread host([] { PauseBackgroundWork(true); });
    running.Wait();
    leaving.Signal();
    UnregisterPauseCallback(id);
    EXPECT_TRUE(ended);
    host.join();
    PauseBackgroundWork(false);
  }
}

TEST(ImporterTest, ACallbackMayDropTheLastOwnerOfAnother) {
  std::atomic<int> calls{0};
  std::vector<std::shared_ptr<void>> owners;
  for (int i = 0; i < 4; ++i) {
    const utility::Guid id = RegisterPauseCallback([&](bool) {
      ++calls;
      owners.clear();
    });
    owners.emplace_back(nullptr, [id](void*) { UnregisterPauseCallback(id); });
  }
  PauseBackgroundWork(true);
  PauseBackgroundWork(false);
  EXPECT_EQ(calls, 1);
}

}  // namespace
}  // namespace tessel::importer
