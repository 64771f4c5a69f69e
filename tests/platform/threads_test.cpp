#include "platform/tessel/threads.h"

#include <gtest/gtest.h>

#include <atomic>
#include <boost/make_shared.hpp>
#include <stdexcept>
#include <thread>
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
  CompletionEvent first_may_end;
  CompletionEvent both_done[2];
  int result = 0;  // plain: the events order the accesses
  GetCPUBoundExecutor().Post([&] {
    first_may_end.Wait();
    both_done[0].Signal();
  });
  GetCPUBoundExecutor().Post([&] {
    result = 1;
    first_may_end.Signal();
    both_done[1].Signal();
  });
  both_done[0].Wait();
  both_done[1].Wait();
  both_done[1].Wait();  // manual reset: stays signalled
  EXPECT_TRUE(both_done[1].WaitFor(std::chrono::milliseconds(0)));
  EXPECT_FALSE(CompletionEvent().WaitFor(std::chrono::milliseconds(1)));
  EXPECT_EQ(result, 1);
}

TEST(ThreadsTest, AWaiterMayDestroyTheEvent) {
  for (int i = 0; i < 200; ++i) {
    auto event = std::make_unique<CompletionEvent>();
    GetCPUBoundExecutor().Post([&event = *event] { event.Signal(); });
    event->Wait();
  }
}

}  // namespace
}  // namespace tessel::threads
