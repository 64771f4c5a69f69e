#pragma once

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <chrono>
#include <memory>
#include <string>

#include "host/base/operations.h"
#include "host/effects/session.h"
#include "host/pixels/world_operations.h"
#include "tests/contract/shaky_clip.h"

namespace calmframe::host {

// Indices of the plug-in's controls.
enum : std::int32_t {
  kAnalyze = 1,
  kCancel = 2,
  kGroup = 3,
  kSmoothness = 5,
  kMethod = 6,
  kFraming = 9,
  kAutoScale = 10,
  kMaximumScale = 11,
  kDetailedAnalysis = 17,
  kCropLessSmoothMore = 19,
  kHideBanner = 28
};

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

// Mean absolute difference of two frames' colours, in 255ths, over all but a margin of `margin`
// pixels; both at one size.
inline double Difference(const WorldBuffer& a, const WorldBuffer& b, int margin = 0) {
  const HX_World &first = a.world(), &second = b.world();
  EXPECT_EQ(first.width, second.width);
  EXPECT_EQ(first.height, second.height);
  WorldBuffer x(first.width, first.height, HX_FORMAT_ARGBF),
      y(first.width, first.height, HX_FORMAT_ARGBF);
  CopyWorld(first, x.world(), nullptr, nullptr);
  CopyWorld(second, y.world(), nullptr, nullptr);
  double sum = 0;
  int count = 0;
  for (int row = margin; row < first.height - margin; ++row) {
    for (int column = margin; column < first.width - margin; ++column, count += 3) {
      for (int c = 1; c < 4; ++c) {
        sum += std::abs(x.row<float>(row)[column * 4 + c] - y.row<float>(row)[column * 4 + c]);
      }
    }
  }
  return sum * 255 / count;
}

// The source's frame as the host hands it in.
inline std::shared_ptr<WorldBuffer> SourceFrame(Effect& effect, std::int64_t frame) {
  const PicturePtr picture =
      effect.shared()->layer()->state()->source->Fetch(frame, PixelKind::argb8);
  auto copy = std::make_shared<WorldBuffer>(picture->width(), picture->height(), HX_FORMAT_ARGB8);
  CopyWorld(WorldOf(*picture), copy->world(), nullptr, nullptr);
  return copy;
}

}  // namespace calmframe::host
