#pragma once

#include <gtest/gtest.h>

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "host/base/operations.h"
#include "host/effects/session.h"
#include "stabilizer/effect/src/state_format/saved_state.h"
#include "tests/support/controls.h"
#include "tests/support/held_work.h"
#include "tests/support/kept_state.h"
#include "tests/support/shaky_clip.h"

namespace kelp::effect {
class StabilizerEffect;
}

namespace calmframe::host {

struct HostedSettings {
  calmframe::host::PayloadForm saves_as = calmframe::host::PayloadForm::deflated;
  // The host has a parameter, behind the effect's own, for the track points that the user deleted.
  bool keeps_deletions = false;
};

enum class Path { planned, direct };

// A clip that is quickly analysed.
inline ShakyClip SmallClip(const std::string& name = "small clip", std::int64_t frames = 8) {
  return {96, 64, frames, name, 0.3};
}

// The plug-in's effect, linked into the test program, on a layer of the real host. It knows no more
// of the plug-in than a host does, but for Inside and Altered. At its end everything is taken apart
// and the plug-in is stopped; what is left behind or was done wrong fails the test. One at a time.
class HostedEffect {
 public:
  explicit HostedEffect(const ShakyClip& clip = {}, const HostedSettings& settings = {});
  explicit HostedEffect(const SourcePtr& source, const HostedSettings& settings = {});
  ~HostedEffect();
  HostedEffect(const HostedEffect&) = delete;
  HostedEffect& operator=(const HostedEffect&) = delete;

  Host& host() { return *host_; }
  Session& session() { return *session_; }
  Layer& layer() { return *layer_; }
  // The one that was applied or opened last; there must be one.
  Effect& effect() { return *effect_; }

  // -- What a user does --
  // Onto the layer; its analysis waits for the first tick.
  Effect& Apply();
  CommandResult Tick() { return effect_->Tick(); }
  // Ticks until nothing is under way any more; the status then.
  int Settle();
  // The stages that a solve runs until it is settled and well.
  std::string Runs() {
    EXPECT_EQ(Settle(), 8);
    return stages_.Take();
  }
  // Of a change, and all that it leads to.
  std::string RunsFor(std::int32_t index, double value) {
    EXPECT_TRUE(Set(index, value).ok());
    return Runs();
  }
  // Applied, analysed and solved; the status then.
  int Analyse() {
    EXPECT_TRUE(Apply().creation().ok());
    return Settle();
  }
  CommandResult Set(std::int32_t index, double value) { return effect_->SetParam(index, value); }
  CommandResult Press(std::int32_t button) { return effect_->Press(button); }
  // The effect lives on.
  SavedEffect Save() {
    SavedEffect saved;
    EXPECT_TRUE(effect_->Save(&saved).ok());
    return saved;
  }
  // The effect goes, and one out of a project takes its place.
  Effect& Open(const SavedEffect& saved);
  void Reopen() { Open(Save()); }
  void Remove();
  // What the layer shows of the source's frames.
  void Place(std::int32_t start_frame, std::int32_t length);
  // The layer; not any more, for an empty text.
  void Refuse(const std::string& why) {
    layer_->Change([&](LayerState& state) { state.refusal = why; });
  }

  // -- What they see --
  RenderedFrame Render(const RenderRequest& request, Path path = Path::planned);
  RenderedFrame Render(std::int64_t frame, int bit_depth = 8, Path path = Path::planned) {
    return Render(RenderRequest{frame, bit_depth}, path);
  }
  int Status() const { return Session::StatusOf(*effect_); }
  bool Enabled(std::int32_t index) const {
    return (effect_->Param(index)->ui_flags & HX_PARAM_UI_DISABLED) == 0;
  }
  std::string Name(std::int32_t index) const { return effect_->Param(index)->name; }
  double Value(std::int32_t index) const { return *ValueOf(*effect_->Param(index)); }
  std::vector<std::string> Messages() { return effect_->TakeMessages(); }
  // The two lines of the information panel.
  std::pair<std::string, std::string> Info() { return host_->user_interface().info(); }
  // Rises with each re-render that the effect asks for.
  std::uint64_t Generation() const { return effect_->shared()->generation(); }
  // The host's operations, by name, that `act` calls for.
  static std::vector<std::string> OperationsOf(const std::function<void()>& act);

  // What a renderer outside of the plug-in sees: the frame's warp, x and y of each vertex, empty
  // without one; and whether it may draw.
  std::vector<double> Warp(std::int32_t frame);
  bool AllowsOutside() {
    return host_->library().exports().allow_cuda_rendering(effect_->opaque_data()) != 0;
  }

  // -- Work that stands still --
  // The analysis, where it wants that frame of the source.
  void HoldAtFrame(std::int64_t frame);
  // The next solve, where it says `line`; see SolveStages.
  void HoldSolve(const std::string& line = "Begin - RunFactorization()");
  // Ticks until it stands there.
  void TickUntilHeld();
  void Release();
  // In a moment, from another thread; see Hold.
  std::jthread ReleaseSoon() { return hold_->ReleaseSoon(); }
  SolveStages& stages() { return stages_; }

  // -- Track points that the user deleted, as a host keeps them: frame above slot --
  void SetDeletions(const std::vector<std::uint64_t>& keys);
  std::vector<std::uint64_t> Deletions() {
    return DeletionsIn(effect_->Param(deletions_index())->u.arb_d.value);
  }
  std::int32_t deletions_index() const {
    return static_cast<std::int32_t>(host_->declarations().size()) - 1;
  }
  // HX_CMD_CUSTOM_DATA_OP on the parameter, for values that the caller disposes of.
  static HX_CustomDataExtra DataExtra(std::int32_t op, HX_Handle a = nullptr, HX_Handle b = nullptr,
                                      std::vector<std::uint64_t>* keys = nullptr);
  CommandResult DataOp(HX_CustomDataExtra& extra);
  HX_CustomDataExtra DataOp(std::int32_t op, HX_Handle a = nullptr, HX_Handle b = nullptr,
                            std::vector<std::uint64_t>* keys = nullptr);
  HX_Handle MakeDeletions(std::vector<std::uint64_t> keys) {
    return DataOp(HX_DATA_UNFLATTEN, nullptr, nullptr, &keys).out;
  }
  std::vector<std::uint64_t> DeletionsIn(HX_Handle value);

  // -- Past the host --
  // Runs `look` in place of the effect's next tick, in a call of the host's own.
  CommandResult Inside(const std::function<void(kelp::effect::StabilizerEffect& effect)>& look);
  // The project with a change in what the plug-in keeps.
  SavedEffect Altered(const SavedEffect& saved,
                      const std::function<void(kelp::effect::SavedState& state)>& change);

 private:
  explicit HostedEffect(const HostedSettings& settings);
  void DisposeOfDeletions();

  SolveStages stages_;
  // Used by the clip, which is drawn until the host has stopped.
  static constexpr std::int64_t kNoFrame = -1;
  std::mutex hold_mutex_;
  std::int64_t held_frame_ = kNoFrame;  // guarded by hold_mutex_
  std::shared_ptr<Hold> hold_;          // guarded by hold_mutex_
  std::unique_ptr<Host> host_;
  std::unique_ptr<Session> session_;
  boost::shared_ptr<Layer> layer_;
  Effect* effect_ = nullptr;
  std::unique_ptr<Renderer> renderer_;
  std::vector<HX_Handle> deletions_;  // values that were given to the effect
};

// One channel of a pixel at a place in layer coordinates, 0 to 1: 0 alpha, 1 red, 2 green, 3 blue.
double ChannelAt(const WorldBuffer& pixels, int x, int y, int channel);

}  // namespace calmframe::host
