#include "platform/tessel/threads.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <boost/function.hpp>
#include <boost/shared_ptr.hpp>
#include <chrono>
#include <filesystem>
#include <iterator>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

namespace tessel::threads {
namespace {

constexpr std::uint32_t kLongAfter = 3600 * 1000;  // ms
// Of cases that a fault fails in most rounds, not in all.
constexpr int kRounds = 100;

class ExecutorTest : public ::testing::Test {
 protected:
  ~ExecutorTest() override {
    ReturnTemporarySingleThreadedExecutor(executor_);
    executor_.reset();
    Shutdown();
  }

  void PostAfter(std::uint32_t delay_ms, boost::function<void()> task) {
    EXPECT_TRUE(executor_->Post(std::move(task), delay_ms));
  }
  void Post(boost::function<void()> task) { PostAfter(0, std::move(task)); }

  SingleThreadedExecutorPtr executor_ = BorrowTemporarySingleThreadedExecutor();
};

TEST_F(ExecutorTest, TasksRunByTimeThenByPostingAndADelayedOneHoldsUpNone) {
  std::string order;
  CompletionEvent soon, now, last;
  executor_->Pause();
  PostAfter(2 * kLongAfter, [&] { last.Signal(); });
  PostAfter(kLongAfter, [&] { order += "F"; });
  PostAfter(kLongAfter / 2, [&] { order += "E"; });
  PostAfter(5, [&] {
    order += "C";
    soon.Signal();
  });
  Post([&] { order += "A"; });
  Post([&] { order += "B"; });
  executor_->Resume();
  soon.Wait();
  Post([&] {
    order += "D";
    now.Signal();
  });
  now.Wait();
  executor_->EndQueue();
  last.Wait();
  EXPECT_EQ(order, "ABCDEF");
}

TEST_F(ExecutorTest, APausedExecutorBeginsNoTaskAndHoldsTheOneInFlightAtItsWaitPoint) {
  for (int round = 0; round < kRounds; ++round) {
    CompletionEvent begun, go_on, passed, next;
    std::atomic<int> resumed{0};
    Post([&] {
      begun.Signal();
      go_on.Wait();
      executor_->WaitPoint();
      EXPECT_EQ(resumed, 1) << "went past its wait point";
      passed.Signal();
    });
    begun.Wait();
    executor_->Pause();
    executor_->Pause();
    go_on.Signal();
    std::this_thread::yield();
    resumed = 1;
    executor_->Resume();  // pauses are not counted
    passed.Wait();
    executor_->Pause();
    Post([&] {
      EXPECT_EQ(resumed, 2) << "began";
      next.Signal();
    });
    std::this_thread::yield();
    resumed = 2;
    executor_->Resume();
    next.Wait();
  }
}

TEST_F(ExecutorTest, EndQueueFreesAWaitingTaskForGoodAndRunsWhatWasPosted) {
  CompletionEvent begun, done;
  PostAfter(kLongAfter, [&] { done.Signal(); });  // first, as the other may end the queue at once
  Post([&] {
    begun.Signal();
    executor_->WaitPoint();
    executor_->EndQueue();
    executor_->Pause();  // too late
    executor_->WaitPoint();
    EXPECT_FALSE(executor_->Post([] { ADD_FAILURE(); }, 0));
  });
  begun.Wait();
  executor_->Pause();
  executor_->EndQueue();
  done.Wait();
  const auto kept = std::make_shared<int>();
  EXPECT_FALSE(executor_->Post([kept] {}, 0));
  EXPECT_EQ(kept.use_count(), 1);
}

TEST_F(ExecutorTest, EachHasAThreadOfItsOwn) {
  const SingleThreadedExecutorPtr other = BorrowTemporarySingleThreadedExecutor();
  CompletionEvent first, second;
  EXPECT_FALSE(executor_->IsOwnThread());
  Post([&] {
    second.Wait();
    EXPECT_TRUE(executor_->IsOwnThread());
    EXPECT_FALSE(other->IsOwnThread());
    first.Signal();
  });
  other->Post([&] { second.Signal(); }, 0);
  first.Wait();
  ReturnTemporarySingleThreadedExecutor(other);
}

// A background job owns its executor, and the job's last owner may be one of the executor's tasks.
TEST(ExecutorPoolTest, AnOwnerMayDieOnItsExecutorAndShutdownRunsWhatIsDelayed) {
  std::atomic<int> dead{0}, ran{0};
  for (int i = 0; i < 20; ++i) {
    const SingleThreadedExecutorPtr executor = BorrowTemporarySingleThreadedExecutor();
    const boost::shared_ptr<int> owner(new int, [executor, &dead](int* owned) {
      ReturnTemporarySingleThreadedExecutor(executor);
      delete owned;
      ++dead;
    });
    executor->Post([owner, &ran] { ++ran; }, i % 2 ? kLongAfter : 0);
  }
  Shutdown();
  EXPECT_EQ(ran, 20);
  EXPECT_EQ(dead, 20);
}

TEST(ExecutorPoolTest, AReturnedExecutorRunsItsTasksAndTakesNoMore) {
  for (int i = 0; i < 100; ++i) {
    const SingleThreadedExecutorPtr executor = BorrowTemporarySingleThreadedExecutor();
    CompletionEvent done;
    int runs = 0;
    executor->Pause();
    executor->Post([&] { ++runs; }, 0);
    executor->Post([&] { done.Signal(); }, i % 10 ? 0 : 2);
    ReturnTemporarySingleThreadedExecutor(executor);
    EXPECT_FALSE(executor->Post([] {}, 0));
    done.Wait();
    EXPECT_EQ(runs, 1);
  }
  Shutdown();
}

TEST(ExecutorPoolTest, ShutdownWaitsForLongComputationsAndForTheirRemains) {
  for (int round = 0; round < kRounds; ++round) {
    CompletionEvent begun, go_on;
    const auto remains = std::make_shared<int>();
    GetCPUBoundExecutor().Post([&begun, &go_on, remains] {
      begun.Signal();
      go_on.Wait();
      *remains = 1;
    });
    begun.Wait();
    go_on.Signal();
    Shutdown();
    ASSERT_EQ(*remains, 1);
    ASSERT_EQ(remains.use_count(), 1);
  }
}

// A library whose code they could still be in may be unloaded then.
TEST(LoopThreadsTest, ShutdownLeavesNoneAndTheNextLoopRuns) {
  const auto threads = [] {
    const std::filesystem::directory_iterator begin("/proc/self/task");
    return std::distance(begin, {});
  };
  std::thread([] {}).join();  // with the first one a sanitizer starts one of its own
  auto before = threads();
  for (int wait = 0; wait < 50; ++wait) {  // the joined one is listed a moment longer
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
    before = std::min(before, threads());
  }
  for (int round = 0; round < kRounds; ++round) {
    std::atomic<int> runs = 0;
    ExecuteCPUBoundTaskOnAllProcessors([&](std::size_t) { ++runs; }, 100);
    ASSERT_EQ(runs, 100);
    Shutdown();
    for (int wait = 0; threads() > before && wait < 5000; ++wait) {
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    ASSERT_EQ(threads(), before);
  }
}

TEST(GateTest, FramesHandedOverBetweenTwoThreads) {
  Gate wanted, arrived;
  int frame = 0;  // plain: the gates order the accesses
  std::thread source([&] {
    for (int i = 1; i <= 1000; ++i) {
      wanted.Wait();
      wanted.Close();
      frame = i;
      arrived.Open();
    }
  });
  for (int i = 1; i <= 1000; ++i) {
    arrived.Close();
    wanted.Open();
    arrived.Wait();
    ASSERT_EQ(frame, i);
  }
  source.join();
  arrived.Wait();  // manual reset: stays open
}

TEST(GateTest, OneOpeningLetsEveryWaiterThrough) {
  for (int round = 0; round < kRounds; ++round) {
    Gate gate;
    std::vector<std::thread> waiters;
    for (int i = 0; i < 4; ++i) waiters.emplace_back([&] { gate.Wait(); });
    gate.Open();
    for (std::thread& waiter : waiters) waiter.join();
  }
}

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
  Shutdown();  // both tasks have signalled, and may be at work yet
}

}  // namespace
}  // namespace tessel::threads
