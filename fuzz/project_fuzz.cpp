// Whatever a project holds, a host can open it, draw a frame of it, save it and close it, and
// nothing of it is left.

#include <boost/make_shared.hpp>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <map>
#include <mutex>
#include <utility>

#include "analysis/src/job_registry.h"
#include "fuzz/project_input.h"
#include "host/base/operations.h"
#include "host/effects/session.h"
#include "platform/hx/hx_controls.h"
#include "tests/support/linked_plugin.h"
#include "tests/support/shaky_clip.h"

namespace {

using namespace calmframe::host;

// Each frame is drawn once for all projects.
class KeptSource final : public Source {
 public:
  explicit KeptSource(const ShakyClip& clip) : drawn_(MakeShakyClip(clip)) {}

  const SourceInfo& info() const override { return drawn_->info(); }
  PicturePtr Fetch(std::int64_t frame, PixelKind kind) override {
    if (frame < 0 || frame >= info().frame_count) return nullptr;
    const std::lock_guard lock(mutex_);
    PicturePtr& picture = kept_[{frame, kind}];
    if (!picture) picture = drawn_->Fetch(frame, kind);
    return picture;
  }

 private:
  const SourcePtr drawn_;
  std::mutex mutex_;
  std::map<std::pair<std::int64_t, PixelKind>, PicturePtr> kept_;  // guarded by mutex_
};

SourcePtr SourceFor(std::uint8_t flags) {
  static std::map<int, SourcePtr> sources;
  SourcePtr& source = sources[flags & (kOnePixel | kWidePixels)];
  if (!source) {
    // As large as the samples' frames, and one frame more than they go to.
    ShakyClip clip{.width = 64, .height = 36, .frames = 10};
    if (flags & kOnePixel) clip.width = clip.height = 1;
    if (flags & kWidePixels) clip.aspect = {2, 1};
    source = boost::make_shared<KeptSource>(clip);
  }
  return source;
}

HostSettings SmallCache() {
  HostSettings settings;
  settings.media.cache_bytes = std::size_t{1} << 20;
  return settings;
}

struct Stage {
  Host host{LinkedPlugin(), SmallCache()};
  Session session{host};
};

void Expect(bool holds, const char* what) {
  if (holds) return;
  std::cerr << what << '\n' << Ledger::Get().Report();
  std::abort();
}

HX_Handle GlobalData(Host& host) {
  HX_InData in{};
  HX_OutData out{};
  host.Command(HX_CMD_ABOUT, in, out);
  return in.global_data;
}

// Until nothing is under way, by turns with the threads that do it.
void Settle(Stage& stage, Effect& effect) {
  constexpr int kMostTurns = 400;
  for (int turn = 0; turn < kMostTurns; ++turn) {
    if (!effect.Tick().ok()) return;
    if (turn > 2 && Session::WorkOf(effect) == Session::Work::none) return;
    stage.host.wake()->Wait(std::chrono::milliseconds(1));
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static Stage& stage = *new Stage;
  ProjectInput input;
  if (size < sizeof input) return 0;
  std::memcpy(static_cast<void*>(&input), data, sizeof input);

  const std::vector<HX_ParamDef>& declared = stage.host.declarations();
  SavedEffect saved;
  saved.match_name = stage.host.library().properties().match_name;
  saved.values[declared[1 + input.control % (declared.size() - 1)].disk_id] = input.value;
  saved.values[HX_FRAMING.disk_id] = 1 + input.framing % 4;
  if (!(input.flags & kBanner)) saved.values[HX_HIDE_WARNING_BANNER.disk_id] = 1;
  saved.instance =
      InstanceIn(Unpacked(reinterpret_cast<const char*>(data) + sizeof input, size - sizeof input),
                 (input.flags & kToBeDeflated) != 0);
  const auto layer = boost::make_shared<Layer>(SourceFor(input.flags));
  layer->Change([&input](LayerState& state) {
    state.start_frame = input.start_frame;
    state.length = input.length % kMostFrames;
    state.ticks_per_frame = static_cast<std::int64_t>(1 + input.ticks_per_frame % kMostTicks);
    if (input.flags & kFields) state.field_type = HX_FIELD_FIRST_ORDER;
  });

  Effect& effect = stage.session.Load(layer, saved);
  if (input.work == kSettles) {
    Settle(stage, effect);
  } else if (input.work == kBegins) {
    effect.Tick();
  }
  RenderRequest request;
  request.frame = input.frame;
  request.bit_depth = input.flags & kDeeply ? 16 : 8;
  if (!(input.flags & kWhole)) request.downsample = {1, 4};  // most of the time goes by the pixel
  {
    const auto renderer = effect.MakeRenderer();
    if (input.flags & kDirectly) {
      renderer->Direct(request);
    } else {
      renderer->Planned(request);
    }
  }
  SavedEffect again;
  effect.Save(&again);
  stage.session.Remove(effect);
  // What has ended waits half a minute for others that want it.
  kelp::analysis::JobRegistry::Instance().CancelAll(GlobalData(stage.host));
  Expect(stage.host.handles().count() == 1, "handles are left");  // the plug-in's global data
  Expect(stage.host.worlds().count() == 0, "frames are left");
  Expect(Ledger::Get().mistakes().empty(), "mistakes were made");
  return 0;
}
