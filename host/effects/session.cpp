#include "host/effects/session.h"

#include <algorithm>
#include <cmath>
#include <stdexcept>
#include <utility>

#include "platform/tessel/importer.h"

namespace calmframe::host {
namespace {

using namespace std::chrono_literals;

// Nothing wakes the loop when an analysis or a solve is through: what follows waits for a tick.
constexpr auto kTickPeriod = 10ms;
// Even when effects ask for more: an analysis asks several times a frame.
constexpr auto kShortestPeriod = 5ms;
constexpr int kTicksBeforeALook = 3;
// In a row, after which an effect is taken to make no headway: in want of memory, say.
constexpr int kFailedTicks = 5s / kTickPeriod;

// Whether a tick of an effect that has work left went well.
bool TickAll(std::mutex& mutex, std::vector<std::function<void()>>& posted,
             const std::vector<std::unique_ptr<Effect>>& effects) {
  std::vector<std::function<void()>> tasks;
  {
    std::lock_guard lock(mutex);
    tasks.swap(posted);
  }
  for (const auto& task : tasks) task();
  bool headway = false;
  for (const auto& effect : effects) {
    const bool well = effect->Tick().ok();
    headway |= well && Session::WorkOf(*effect) != Session::Work::none;
  }
  return headway;
}

}  // namespace

Session::Session(Host& host) : host_(host), thread_(std::this_thread::get_id()) {}

Session::~Session() = default;

void Session::CheckThread() const {
  if (std::this_thread::get_id() != thread_) {
    throw std::logic_error("a session belongs to the thread that made it");
  }
}

Effect& Session::Apply(const boost::shared_ptr<Layer>& layer, std::size_t position) {
  CheckThread();
  return *effects_.emplace_back(std::make_unique<Effect>(host_, layer, position));
}

Effect& Session::Load(const boost::shared_ptr<Layer>& layer, const SavedEffect& saved,
                      std::size_t position) {
  CheckThread();
  return *effects_.emplace_back(std::make_unique<Effect>(host_, layer, position, saved));
}

Effect* Session::Duplicate(Effect& effect, const boost::shared_ptr<Layer>& layer) {
  CheckThread();
  SavedEffect saved;
  if (!effect.Save(&saved).ok()) return nullptr;
  return &Load(layer, saved, layer->state()->effects.size());
}

void Session::Remove(Effect& effect) {
  CheckThread();
  std::erase_if(effects_, [&](const std::unique_ptr<Effect>& own) { return own.get() == &effect; });
}

void Session::Tick() {
  CheckThread();
  TickAll(posted_mutex_, posted_, effects_);
}

int Session::StatusOf(const Effect& effect) {
  const std::optional<HX_ParamDef> param = effect.Param(effect.IndexOf(kStatusDiskId));
  const std::optional<double> value = param ? ValueOf(*param) : std::nullopt;
  return value && *value >= 0 ? static_cast<int>(std::fmod(std::round(*value), 100.0)) : 0;
}

Session::Work Session::WorkOf(const Effect& effect) {
  const int status = StatusOf(effect);
  if (status == 4) return Work::analysing;
  return status >= 5 && status <= 7 ? Work::solving : Work::none;
}

Session::Wait Session::TickUntilSettled(std::chrono::milliseconds timeout,
                                        const std::function<bool()>& stop) {
  using Clock = std::chrono::steady_clock;
  const Clock::time_point end = Clock::now() + timeout;
  CheckThread();
  for (int ticks = 1, failed = 0;; ++ticks) {
    const Clock::time_point begin = Clock::now();
    failed = TickAll(posted_mutex_, posted_, effects_) ? 0 : failed + 1;
    if (failed == kFailedTicks) return Wait::settled;
    if (stop && stop()) return Wait::stopped;
    if (ticks >= kTicksBeforeALook) {
      if (std::all_of(effects_.begin(), effects_.end(), [](const std::unique_ptr<Effect>& effect) {
            return WorkOf(*effect) == Work::none;
          })) {
        return Wait::settled;
      }
      host_.wake()->Wait(kTickPeriod);
      const auto spent =
          std::chrono::duration_cast<std::chrono::milliseconds>(Clock::now() - begin);
      if (spent < kShortestPeriod) std::this_thread::sleep_for(kShortestPeriod - spent);
    }
    if (Clock::now() >= end) return Wait::timed_out;
  }
}

void Session::Post(std::function<void()> task) {
  {
    std::lock_guard lock(posted_mutex_);
    posted_.push_back(std::move(task));
  }
  host_.wake()->Wake();
}

void Session::PauseBackgroundWork(bool pause) {
  tessel::importer::PauseBackgroundWork(pause);
}

}  // namespace calmframe::host
