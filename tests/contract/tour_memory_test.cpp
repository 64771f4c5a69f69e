#include <cstdlib>
#include <map>
#include <memory>
#include <new>
#include <random>
#include <string>
#include <system_error>
#include <vector>

#include "tests/contract/failing_memory.h"
#include "tests/contract/played_plugin.h"

// A tour in a process whose memory runs out.

namespace calmframe::host {
namespace {

constexpr auto kPatience = 1000ms;
const ShakyClip kClip{96, 64, 6, "short clip"};

int Setting(const char* name, int unless_set) {
  const char* const text = std::getenv(name);
  return text ? std::atoi(text) : unless_set;
}

class TourMemory : public PlayedPlugin {
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

  // Whatever is asked of a host may be more than its memory.
  template <class Step>
  static void Try(const Step& step) {
    try {
      step();
    } catch (const std::bad_alloc&) {
    } catch (const std::system_error&) {  // no thread
    }
  }

  // Once everything that an effect is asked for.
  void Play() {
    const auto layer = MakeLayer(kClip);
    Effect* effect = nullptr;
    std::vector<CommandResult> results;
    results.reserve(100);
    const auto keep = [&](CommandResult result) { results.push_back(std::move(result)); };
    FailingMemory::Arm(first_, count_);
    Try([&] {
      effect = &session().Apply(layer);
      keep(effect->creation());
    });
    if (effect) {
      const auto settle = [&] { Try([&] { session().TickUntilSettled(kPatience); }); };
      const auto render = [&](Effect& of) {
        Try([&] {
          const auto renderer = of.MakeRenderer();
          keep(renderer->result());
          keep(renderer->Direct({3}).result);
          keep(renderer->Planned({3, 16}).result);
        });
      };
      render(*effect);  // a banner
      settle();
      Try([&] { keep(effect->SetParam(kFraming, 4)); });
      settle();
      render(*effect);
      SavedEffect saved;
      Try([&] { keep(effect->Save(&saved)); });
      Try([&] {
        if (saved.match_name.empty()) return;
        Effect& loaded = session().Load(layer, saved);
        keep(loaded.creation());
        keep(loaded.Tick());
        render(loaded);
        session().Remove(loaded);
      });
      Try([&] { keep(effect->SetParam(kSmoothness, 20)); });
      settle();
    }
    allocations_ = FailingMemory::Disarm();
    for (const CommandResult& result : results) ExpectClear(result);
    while (session().effects().size() > 1) session().Remove(*session().effects().back());
    if (session().effects().empty()) session().Apply(layer);
  }

  // With memory again the effect works as if nothing had been: its frames.
  std::vector<std::shared_ptr<WorldBuffer>> Recover() {
    Effect& effect = *session().effects().front();
    session().TickUntilSettled(kPatience);
    effect.SetParam(kFraming, 4);
    effect.SetParam(kSmoothness, 22);  // a solve that failed is tried again with other controls
    Bring(effect);
    // Tracks are rounded as they are saved: those of all solves from here on are.
    SavedEffect saved;
    EXPECT_TRUE(effect.Save(&saved).ok());
    effect.SetParam(kSmoothness, 21);
    EXPECT_EQ(Settle(effect), kReady);
    std::vector<std::shared_ptr<WorldBuffer>> frames;
    {
      const auto renderer = effect.MakeRenderer();
      frames.push_back(renderer->Direct({2}).OnLayer());
      frames.push_back(renderer->Planned({3, 16}).OnLayer());
    }
    session().Remove(effect);
    ExpectNothingHeld();
    return frames;
  }

  std::int64_t first_ = 0, count_ = 0, allocations_ = 0;
};

// Each allocation and each thread's start in turn, and twenty together; those between are left out,
// as many as a seed tells, unless the environment wants all of them.
TEST_F(TourMemory, AFailedAllocationIsSurvivedWhicheverItIs) {
  std::vector<std::shared_ptr<WorldBuffer>> undisturbed;
  for (int i = 0; i < 2; ++i) {  // what is made once for a process is there
    Play();
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
      Play();
      const auto frames = Recover();
      for (std::size_t i = 0; i < frames.size(); ++i) {
        EXPECT_EQ(Difference(*frames[i], *undisturbed[i]), 0);
      }
      if (HasFailure()) return;
    }
  }
}

}  // namespace
}  // namespace calmframe::host
