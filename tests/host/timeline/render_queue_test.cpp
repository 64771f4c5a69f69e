#include "host/timeline/render_queue.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

using std::chrono::hours;
using std::chrono::milliseconds;
using tessel::threads::CompletionEvent;

// Holds both threads of a queue of two until they are let go.
class Plug {
 public:
  explicit Plug(RenderQueue& queue) {
    for (int i = 0; i < 2; ++i) {
      queue.Post([this, i](bool) {
        running_[i].Signal();
        open_[i].Wait();
      });
    }
    for (CompletionEvent& running : running_) running.Wait();
  }
  void LetOneGo() { open_[0].Signal(); }
  void LetGo() {
    for (CompletionEvent& open : open_) open.Signal();
  }

 private:
  CompletionEvent running_[2];
  CompletionEvent open_[2];
};

TEST(RenderQueue, ACancelledRequestOvertakesThoseThatWait) {
  RenderQueue queue(2);
  Plug plug(queue);
  std::vector<std::string> order;  // of one thread's requests
  CompletionEvent last;
  EXPECT_EQ(queue.Post([&](bool cancelled) { order.push_back(cancelled ? "first!" : "first"); }),
            3);
  const std::int32_t id = queue.Post([&](bool cancelled) {
    EXPECT_TRUE(queue.IsOwnThread());
    order.push_back(cancelled ? "second!" : "second");
  });
  queue.Post([&](bool) { last.Signal(); });
  queue.Cancel(id);
  queue.Cancel(id);
  queue.Cancel(12345);
  EXPECT_EQ(queue.outstanding(), 5u);
  EXPECT_FALSE(queue.IsOwnThread());
  plug.LetOneGo();
  last.Wait();
  EXPECT_THAT(order, testing::ElementsAre("second!", "first"));
  plug.LetGo();
  queue.Close();
  EXPECT_EQ(queue.outstanding(), 0u);
  EXPECT_EQ(queue.Post([](bool) { FAIL(); }), 0);
}

// By one thread, so that their order shows.
TEST(RenderQueue, LateAnswersHoldNothingUpAndComeInTheOrderOfTheirTimes) {
  RenderQueue queue(1);
  CompletionEvent open;
  queue.Post([&](bool) { open.Wait(); });
  std::vector<std::string> order;
  CompletionEvent came[4];
  const auto post = [&](const char* name, CompletionEvent& told) {
    return queue.Post([&order, &told, name](bool cancelled) {
      order.push_back(name + std::string(cancelled ? "!" : ""));
      told.Signal();
    });
  };
  queue.Cancel(post("latest", came[0]), hours(2));
  queue.Cancel(post("late", came[1]), hours(1));
  queue.Cancel(post("soon", came[2]), milliseconds(1));
  post("work", came[3]);
  open.Signal();
  came[2].Wait();
  came[3].Wait();
  queue.Close();
  ASSERT_EQ(order.size(), 4u);
  EXPECT_THAT(std::vector(order.begin(), order.begin() + 2),
              testing::UnorderedElementsAre("soon!", "work"));
  EXPECT_EQ(order[2], "late!");
  EXPECT_EQ(order[3], "latest!");
}

TEST(RenderQueue, EveryRequestRunsExactlyOnceWhateverHappensAround) {
  constexpr int kPosters = 3, kEach = 400;
  std::vector<std::atomic<int>> runs(kPosters * kEach);
  std::atomic<int> accepted = 0;
  RenderQueue queue(2);
  std::vector<std::thread> posters;
  for (int p = 0; p < kPosters; ++p) {
    posters.emplace_back([&, p] {
      std::mt19937 random(static_cast<unsigned>(p));
      for (int i = 0; i < kEach; ++i) {
        std::atomic<int>& run = runs[static_cast<std::size_t>(p * kEach + i)];
        const std::int32_t id = queue.Post([&run](bool) { ++run; });
        if (id == 0) {
          run = 1;
          continue;
        }
        ++accepted;
        if (random() % 2) queue.Cancel(id, milliseconds(random() % 3));
        if (random() % 4 == 0) queue.Cancel(static_cast<std::int32_t>(random() % 1000));
      }
    });
  }
  while (accepted < kPosters * kEach / 2) std::this_thread::yield();
  queue.Close();
  for (std::thread& poster : posters) poster.join();
  for (const std::atomic<int>& run : runs) EXPECT_EQ(run, 1);
}

}  // namespace
}  // namespace calmframe::host
