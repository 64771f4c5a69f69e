#include <gtest/gtest.h>

#include <atomic>
#include <boost/make_shared.hpp>
#include <chrono>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "platform/tessel/threads.h"

namespace tessel::threads {
namespace {

constexpr std::uint32_t kLongAfter = 3600 * 1000;  // ms
constexpr std::chrono::milliseconds kMoment(20);   // for what must not happen

class ExecutorTest : public ::testing::Test {
 protected:
  ~ExecutorTest() override {
    ReturnTemporarySingleThreadedExecutor(executor_);
    executor_.reset();
    Shutdown();
  }

  // Runs what is posted, the delayed tasks too, and waits for the last.
  void RunOut() {
    CompletionEvent last;
    executor_->Post([&] { last.Signal(); }, 2 * kLongAfter);
    executor_->EndQueue();
    last.Wait();
  }

  SingleThreadedExecutorPtr executor_ = BorrowTemporarySingleThreadedExecutor();
};

TEST_F(ExecutorTest, TasksRunByTimeThenByPosting) {
  std::string order;
  executor_->Pause();
  executor_->Post([&] { order += "D"; }, kLongAfter);
  executor_->Post([&] { order += "C"; }, kLongAfter / 2);
  executor_->Post([&] { order += "A"; }, 0);
  executor_->Post([&] { order += "B"; }, 0);
  std::this_thread::sleep_for(kMoment);
  EXPECT_EQ(order, "");
  RunOut();
  EXPECT_EQ(order, "ABCD");
}

TEST_F(ExecutorTest, ADelayedTaskDoesNotHoldUpOthersAndFallsDue) {
  CompletionEvent soon, now;
  executor_->Post([] {}, kLongAfter);
  executor_->Post([&] { soon.Signal(); }, 5);
  executor_->Post([&] { now.Signal(); }, 0);
  now.Wait();
  soon.Wait();
}

TEST_F(ExecutorTest, APausedExecutorHoldsTheTaskInFlightAtItsWaitPointAndBeginsNoOther) {
  CompletionEvent begun, go_on, passed, next;
  executor_->Post(
      [&] {
        begun.Signal();
        go_on.Wait();
        executor_->WaitPoint();
        passed.Signal();
      },
      0);
  executor_->Post([&] { next.Signal(); }, 0);
  begun.Wait();
  executor_->Pause();
  executor_->Pause();
  go_on.Signal();
  EXPECT_FALSE(passed.WaitFor(kMoment));
  executor_->Resume();  // pauses are not counted
  passed.Wait();
  next.Wait();
}

TEST_F(ExecutorTest, EndQueueFreesAWaitingTaskForGoodAndRunsWhatWasPosted) {
  CompletionEvent begun, done;
  executor_->Pause();
  executor_->Post(
      [&] {
        begun.Signal();
        executor_->WaitPoint();
        executor_->EndQueue();
        executor_->Pause();  // too late
        executor_->WaitPoint();
        EXPECT_FALSE(executor_->Post([] { ADD_FAILURE(); }, 0));
      },
      0);
  executor_->Post([&] { done.Signal(); }, kLongAfter);
  EXPECT_FALSE(begun.WaitFor(kMoment));
  executor_->Resume();
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
  std::thread::id ids[2];
  EXPECT_FALSE(executor_->IsOwnThread());
  executor_->Post(
      [&] {
        second.Wait();
        ids[0] = std::this_thread::get_id();
        EXPECT_TRUE(executor_->IsOwnThread());
        EXPECT_FALSE(other->IsOwnThread());
        first.Signal();
      },
      0);
  other->Post(
      [&] {
        ids[1] = std::this_thread::get_id();
        second.Signal();
      },
      0);
  first.Wait();
  EXPECT_NE(ids[0], ids[1]);
  ReturnTemporarySingleThreadedExecutor(other);
}

// What owns an executor, as a background job does; its last owner may be one of its own tasks.
struct Owner {
  Owner(SingleThreadedExecutorPtr e, std::atomic<int>* d) : executor(std::move(e)), dead(d) {}
  ~Owner() {
    ReturnTemporarySingleThreadedExecutor(executor);
    ++*dead;
  }
  SingleThreadedExecutorPtr executor;
  std::atomic<int>* dead;
};

TEST(ExecutorPoolTest, AnOwnerMayDieOnItsExecutorAndShutdownRunsWhatIsDelayed) {
  std::atomic<int> dead{0}, ran{0};
  for (int i = 0; i < 20; ++i) {
    auto owner = boost::make_shared<Owner>(BorrowTemporarySingleThreadedExecutor(), &dead);
    SingleThreadedExecutor& executor = *owner->executor;
    executor.Post([owner, &ran] { ++ran; }, i % 2 ? kLongAfter : 0);
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
  CompletionEvent begun;
  const auto remains = std::make_shared<int>();
  GetCPUBoundExecutor().Post([&begun, remains] {
    begun.Signal();
    std::this_thread::sleep_for(kMoment);
    *remains = 1;
  });
  begun.Wait();
  Shutdown();
  EXPECT_EQ(*remains, 1);
  EXPECT_EQ(remains.use_count(), 1);
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
  for (int round = 0; round < 50; ++round) {
    Gate gate;
    std::atomic<int> through{0};
    std::vector<std::thread> waiters;
    for (int i = 0; i < 4; ++i) {
      waiters.emplace_back([&] {
        gate.Wait();
        ++through;
      });
    }
    gate.Open();
    for (std::thread& waiter : waiters) waiter.join();
    EXPECT_EQ(through, 4);
  }
}

}  // namespace
}  // namespace tessel::threads
