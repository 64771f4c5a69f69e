#pragma once

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <chrono>
#include <memory>
#include <string>

#include "host/base/operations.h"
#include "host/effects/session.h"
#include "tests/support/controls.h"
#include "tests/support/frame_difference.h"
#include "tests/support/shaky_clip.h"

namespace calmframe::host {

// The real plug-in in a host of its own; whatever a test leaves behind or does wrong fails it.
class PlayedPlugin : public testing::Test {
 protected:
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

  static boost::shared_ptr<Layer> MakeLayer(const ShakyClip& clip = {}) {
    return boost::make_shared<Layer>(MakeShakyClip(clip));
  }

  // Status once nothing is under way any more.
  int Settle(const Effect& effect) {
    EXPECT_EQ(session_->TickUntilSettled(std::chrono::minutes(5)), Session::Wait::settled);
    return Session::StatusOf(effect);
  }

  static bool Enabled(const Effect& effect, std::int32_t index) {
    return !(effect.Param(index)->ui_flags & HX_PARAM_UI_DISABLED);
  }

  // A cache that the clips of a tour outgrow.
  static HostSettings Settings() {
    HostSettings settings;
    settings.media.cache_bytes = std::size_t{16} << 20;
    return settings;
  }

  Host& host() { return *host_; }
  Session& session() { return *session_; }

 private:
  std::unique_ptr<Host> host_;
  std::unique_ptr<Session> session_;
};

}  // namespace calmframe::host
