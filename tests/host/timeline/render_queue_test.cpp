#include "host/timeline/render_queue.h"

#include <gmock/gmock.h>

#include <algorithm>
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

// By one thread, so that their order shows.
TEST(RenderQueue, CancelledRequestsOvertakeAndLateAnswersComeInTheOrderOfTheirTimes) {
  RenderQueue queue(1);
  CompletionEvent running, open;
  EXPECT_EQ(queue.Post([&](bool) {
    EXPECT_TRUE(queue.IsOwnThread());
    running.Signal();
    open.Wait();
  }),
            1);
  running.Wait();
  std::vector<std::string> order;
  CompletionEvent came[5];
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
  const std::int32_t id = post("gone", came[4]);
  for (const std::int32_t cancelled : {id, id, 12345}) queue.Cancel(cancelled);
  EXPECT_EQ(queue.outstanding(), 6u);
  EXPECT_FALSE(queue.IsOwnThread());
  open.Signal();
  came[2].Wait();
  came[3].Wait();
  queue.Close();
  const auto place = [&](const char* name) {
    return std::find(order.begin(), order.end(), name) - order.begin();
  };
  EXPECT_THAT(order, testing::UnorderedElementsAre("gone!", "soon!", "work", "late!", "latest!"));
  EXPECT_LT(place("gone!"), place("work"));
  EXPECT_EQ(place("late!"), 3);
  EXPECT_EQ(place("latest!"), 4);
  EXPECT_EQ(queue.outstanding(), 0u);
  EXPECT_EQ(queue.Post([](bool) { FAIL(); }), 0);
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
