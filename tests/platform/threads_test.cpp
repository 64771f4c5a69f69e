#include "platform/tessel/threads.h"

#include <gtest/gtest.h>

#include <chrono>
#include <memory>
#include <stdexcept>
#include <vector>

namespace tessel::threads {
namespace {

TEST(ThreadsTest, EveryTaskRunsOnceAlsoWhenLoopsNest) {
  std::vector<int> runs(1000);  // plain: the loop's end must order the writes before the reads
  ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t i) {
        ExecuteCPUBoundTaskOnAllProcessors([&, i](std::size_t j) { runs[i * 10 + j] += 1; }, 10);
      },
      100);
  EXPECT_EQ(runs, std::vector<int>(1000, 1));
  ExecuteCPUBoundTaskOnAllProcessors([](std::size_t) { FAIL(); }, 0);
}

TEST(ThreadsTest, TheLoopHandsOnAnException) {
  EXPECT_THROW(ExecuteCPUBoundTaskOnAllProcessors(
                   [](std::size_t i) {
                     if (i == 3) throw std::runtime_error("third");
                   },
                   8),
               std::runtime_error);
}

TEST(ThreadsTest, PostedTasksDoNotWaitForEachOther) {
  for (int round = 0; round < 50; ++round) {
    int result = 0;  // plain: the events order the accesses
    auto second = std::make_unique<CompletionEvent>(), first = std::make_unique<CompletionEvent>();
    GetCPUBoundExecutor().Post([&, &event = *first] {
      second->Wait();
      second->Wait();  // manual reset: stays signalled
      EXPECT_TRUE(second->WaitFor(std::chrono::milliseconds(0)));
      event.Signal();
    });
    EXPECT_FALSE(first->WaitFor(std::chrono::milliseconds(0)));
    GetCPUBoundExecutor().Post([&] {
      result = 1;
      second->Signal();
    });
    first->Wait();
    first.reset();  // a waiter may destroy the event
    EXPECT_EQ(result, 1);
  }
}

}  // namespace
}  // namespace tessel::threads
