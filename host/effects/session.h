#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "host/effects/effect.h"
#include "host/effects/host.h"

namespace calmframe::host {

// The user's side of a host: the effects on its layers and the loop that serves them. Belongs to
// the thread that made it; other threads use Post. A call on a wrong thread throws
// std::logic_error.
class Session {
 public:
  explicit Session(Host& host);
  ~Session();  // removes all effects
  Session(const Session&) = delete;
  Session& operator=(const Session&) = delete;

  // New effects stand next to the source unless told otherwise. See Effect::creation.
  Effect& Apply(const boost::shared_ptr<Layer>& layer, std::size_t position = 0);
  Effect& Load(const boost::shared_ptr<Layer>& layer, const SavedEffect& saved,
               std::size_t position = 0);
  // On another layer or the same, above the effects that are there. Null when `effect` can't be
  // saved.
  Effect* Duplicate(Effect& effect, const boost::shared_ptr<Layer>& layer);
  void Remove(Effect& effect);
  const std::vector<std::unique_ptr<Effect>>& effects() const { return effects_; }

  // Runs what was posted, then ticks each effect once.
  void Tick();

  // Work of an effect, from its status parameter.
  enum class Work { none, analysing, solving };
  // Disk id of the parameter in which the plug-in counts its changes of status: hundreds count, the
  // last two digits are the status.
  static constexpr std::int32_t kStatusDiskId = 302;
  // Last two digits; 0 without such a parameter.
  static int StatusOf(const Effect& effect);
  static Work WorkOf(const Effect& effect);

  enum class Wait { settled, stopped, timed_out };
  // Ticks all effects, some 20 times a second and whenever one wants a re-render, until none has
  // work left, or the ticks of those that have keep failing. Looks first after three ticks, since
  // work begins in ticks. `stop` is asked after each round; may be null.
  Wait TickUntilSettled(std::chrono::milliseconds timeout, const std::function<bool()>& stop = {});

  // Runs the task on the session's thread, in its next tick; wakes TickUntilSettled. Any thread.
  void Post(std::function<void()> task);

  // Pauses and resumes the plug-in's background work. Any thread.
  static void PauseBackgroundWork(bool pause);

 private:
  void CheckThread() const;

  Host& host_;
  const std::thread::id thread_;
  std::vector<std::unique_ptr<Effect>> effects_;
  std::mutex posted_mutex_;
  std::vector<std::function<void()>> posted_;  // guarded by posted_mutex_
};

}  // namespace calmframe::host
