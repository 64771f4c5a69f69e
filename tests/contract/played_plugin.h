#pragma once

#include <gtest/gtest.h>

#include <array>
#include <boost/make_shared.hpp>
#include <chrono>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include "host/base/operations.h"
#include "host/effects/session.h"
#include "tests/support/controls.h"
#include "tests/support/frame_difference.h"
#include "tests/support/shaky_clip.h"

namespace calmframe::host {

using namespace std::chrono_literals;

// A number that the environment may set.
inline int Setting(const char* name, int unless_set) {
  const char* const text = std::getenv(name);
  return text ? std::atoi(text) : unless_set;
}

// The real plug-in in a host of its own; whatever a test leaves behind or does wrong fails it.
class PlayedPlugin : public testing::Test {
 protected:
  static constexpr char kMatchName[] = "KLPX SubspaceStabilizer";
  static constexpr int kReady = 8;  // of the last two digits of the status

  PlayedPlugin()
      : host_(std::make_unique<Host>(CALMFRAME_PLUGIN, Settings())),
        session_(std::make_unique<Session>(*host_)) {
    host_->handles().MoveOnUnlock(true);
    host_->worlds().SetRowPadding(16);
  }

  void TearDown() override {
    Operations::Get().FailNone();
    session_.reset();
    EXPECT_TRUE(host_->Stop().ok());
    EXPECT_EQ(host_->LeakReport(), "");
  }

  // A cache that the clips of a tour outgrow.
  static HostSettings Settings() {
    HostSettings settings;
    settings.media.cache_bytes = std::size_t{16} << 20;
    return settings;
  }

  static boost::shared_ptr<Layer> MakeLayer(const ShakyClip& clip = {}) {
    return boost::make_shared<Layer>(MakeShakyClip(clip));
  }

  // Status once nothing is under way any more.
  int Settle(const Effect& effect) {
    EXPECT_EQ(session_->TickUntilSettled(5min), Session::Wait::settled);
    return Session::StatusOf(effect);
  }

  // An effect on the clip whose work is done.
  Effect& Steady(const ShakyClip& clip = {}) {
    Effect& effect = session_->Apply(MakeLayer(clip));
    EXPECT_EQ(Settle(effect), kReady);
    return effect;
  }

  static SavedEffect Saved(Effect& effect) {
    SavedEffect saved;
    EXPECT_TRUE(effect.Save(&saved).ok());
    EXPECT_EQ(saved.match_name, kMatchName);
    EXPECT_FALSE(saved.instance.empty());
    return saved;
  }

  // Whatever was done to it, the effect comes to steadied frames by its button. `patience`: for
  // work that a host takes to be under way for ever, since its status could not be told.
  void Bring(Effect& effect, std::chrono::milliseconds patience = 5min) {
    session_->TickUntilSettled(patience);
    const auto press = [&] { EXPECT_TRUE(effect.Press(kAnalyze).ok()); };
    if (Enabled(effect, kAnalyze)) press();
    // An analysis that outlived the patience is of what stood beneath the effect when it began.
    if (Settle(effect) != kReady && Enabled(effect, kAnalyze)) press();
    EXPECT_EQ(Settle(effect), kReady);
    EXPECT_TRUE(effect.MakeRenderer()->Planned({3}).pixels);
  }

  using Frames = std::vector<std::shared_ptr<WorldBuffer>>;

  // By both paths, of an effect whatever was done to it. Its tracks are rounded, as they are in a
  // saved one, and it is solved anew.
  Frames FramesOf(Effect& effect) {
    effect.SetParam(kSmoothness, 30);  // a solve that failed is tried again with other controls
    Bring(effect, 2s);
    Saved(effect);
    effect.SetParam(kSmoothness, 31);
    EXPECT_EQ(Settle(effect), kReady);
    const auto renderer = effect.MakeRenderer();
    return {renderer->Planned({3, 16}).OnLayer(), renderer->Direct({2}).OnLayer()};
  }
  static void ExpectSame(const Frames& a, const Frames& b) {
    for (std::size_t i = 0; i < a.size(); ++i) EXPECT_EQ(Difference(*a[i], *b[i]), 0);
  }

  // Of effects that are gone. A job whose effect went in the middle may hold suites yet.
  void ExpectNothingHeld() {
    EXPECT_EQ(host_->handles().count(), 1u);  // the plug-in's global data
    EXPECT_EQ(host_->worlds().count(), 0u);
    EXPECT_EQ(host_->opaque_data().uses(), 0u);
    EXPECT_EQ(Ledger::Get().mistakes(), std::vector<std::string>());
  }

  static bool Enabled(const Effect& effect, std::int32_t index) {
    return !(effect.Param(index)->ui_flags & HX_PARAM_UI_DISABLED);
  }

  // What the layer shows of the source, as the effect comes to know it.
  void Trim(Layer& layer, std::int32_t start, std::int32_t length) {
    layer.Change([=](LayerState& state) {
      state.start_frame = start;
      state.length = length;
    });
    session_->Tick();
  }
  static void Refuse(Layer& layer, const std::string& why) {
    layer.Change([&](LayerState& state) { state.refusal = why; });
  }
  static EffectOperator OtherEffect() {
    EffectOperator other;
    other.runtime_id = NewRuntimeId();
    other.match_name = "Other";
    return other;
  }

  // Frames that analyses got so far.
  std::uint64_t Analysed() const { return host_->media().counts().delivered; }

  static RenderedFrame Render(Renderer& renderer, bool direct, const RenderRequest& request) {
    return direct ? renderer.Direct(request) : renderer.Planned(request);
  }

  const PluginExports& exports() const { return host_->library().exports(); }
  // What get_stabilizer_data tells of a block, zeros for nothing: frames, the first one, columns
  // and rows of a warp, width and height of the crop and of the source.
  std::array<std::int32_t, 8> DataOf(const void* block) const {
    std::array<std::int32_t, 8> n{};
    float bounds[4];
    const bool told =
        exports().get_stabilizer_data(block, &n[0], &n[1], &n[2], &n[3], &n[4], &n[5], &bounds[0],
                                      &bounds[1], &bounds[2], &bounds[3], &n[6], &n[7]);
    return told ? n : std::array<std::int32_t, 8>{};
  }

  Host& host() { return *host_; }
  Session& session() { return *session_; }

 private:
  std::unique_ptr<Host> host_;
  std::unique_ptr<Session> session_;
};

}  // namespace calmframe::host
