#include <cstdlib>
#include <map>
#include <random>
#include <string>

#include "tests/contract/failing_memory.h"
#include "tests/contract/short_tour.h"

// A tour in a process whose memory runs out.

namespace calmframe::host {
namespace {

class TourMemory : public ShortTour {
 protected:
  // What a command without memory answers: that it has none, with what the user is told unless
  // there was no call or the host's own operation had none; or it succeeds. Where several
  // allocations fail, that of the text may be one of them.
  void ExpectClear(const CommandResult& result) const {
    static const std::map<HX_Err, std::string> kTold = {
        {HX_ERR_NONE, "Calmframe out of memory on frame ."},
        {HX_ERR_MEMORY, "Calmframe out of memory on frame ."},
        {HX_ERR_UNKNOWN, "unknown exception on frame  in Calmframe."},
        {HX_ERR_NO_INSTANCE, "Not enough memory to allocate stabilizer data."}};
    std::string told = result.message;
    std::erase_if(told, [](char c) { return c >= '0' && c <= '9'; });
    const auto found = kTold.find(result.code);
    ASSERT_NE(found, kTold.end()) << result.code << ": " << result.message;
    const bool needs_text = result.code == HX_ERR_UNKNOWN || result.code == HX_ERR_NO_INSTANCE;
    if (!told.empty() || (needs_text && count_ == 1)) {
      EXPECT_EQ(told, found->second) << result.code;
    }
  }

  void PlayWithoutMemory() {
    const auto layer = ShortLayer();
    FailingMemory::Arm(first_, count_);
    Play(layer);
    allocations_ = FailingMemory::Disarm();
    for (const CommandResult& result : results_) ExpectClear(result);
    if (session().effects().empty()) session().Apply(layer);
  }

  // With memory again the effect works as if nothing had been: its frames.
  Frames Recover() {
    while (session().effects().size() > 1) session().Remove(*session().effects().back());
    Effect& effect = *session().effects().front();
    session().TickUntilSettled(kPatience);
    effect.SetParam(kFraming, 4);
    const Frames frames = FramesOf(effect);
    session().Remove(effect);
    ExpectNothingHeld();
    return frames;
  }

  std::int64_t first_ = 0, count_ = 0, allocations_ = 0;
};

// Each allocation and each thread's start in turn, and twenty together; those between are left out,
// as many as a seed tells, unless the environment wants all of them.
TEST_F(TourMemory, AFailedAllocationIsSurvivedWhicheverItIs) {
  Frames undisturbed;
  for (int i = 0; i < 2; ++i) {  // what is made once for a process is there
    PlayWithoutMemory();
    undisturbed = Recover();
  }
  const std::int64_t all = allocations_;
  EXPECT_GT(all, 3000);
  const std::int64_t last = Setting("CALMFRAME_LAST_FAULT", static_cast<int>(all));
  std::mt19937 random(Setting("CALMFRAME_SEED", 1));
  for (const int burst : {1, 20}) {
    count_ = burst;
    const std::int64_t most_left_out =
        std::getenv("CALMFRAME_ALL_FAULTS") ? 0 : all / (burst == 1 ? 60 : 20);
    for (std::int64_t n = Setting("CALMFRAME_FIRST_FAULT", 1); n <= last;
         n += 1 + static_cast<std::int64_t>(random()) % (most_left_out + 1)) {
      SCOPED_TRACE(std::to_string(burst) + " from " + std::to_string(n));
      first_ = n;
      PlayWithoutMemory();
      ExpectSame(Recover(), undisturbed);
      if (HasFailure()) return;
    }
  }
}

}  // namespace
}  // namespace calmframe::host
