// Whatever a project holds, a host can open it, draw a frame of it, save it and close it, and
// nothing of it is left.

#include <zlib.h>

#include <boost/make_shared.hpp>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <map>
#include <mutex>
#include <stdexcept>
#include <utility>

#include "analysis/src/job_registry.h"
#include "fuzz/project_input.h"
#include "host/base/operations.h"
#include "host/effects/session.h"
#include "platform/hx/hx_controls.h"
#include "stabilizer/effect/src/instance_handle.h"
#include "tests/support/linked_plugin.h"
#include "tests/support/shaky_clip.h"

namespace {

using namespace calmframe::host;
using kelp::effect::InstanceHandleHeader;

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

std::string Deflated(const std::string& bytes) {
  uLongf size = compressBound(bytes.size());
  std::string deflated(size, '\0');
  if (compress2(reinterpret_cast<Bytef*>(deflated.data()), &size,
                reinterpret_cast<const Bytef*>(bytes.data()), bytes.size(), 1) != Z_OK) {
    throw std::runtime_error("not deflated");
  }
  deflated.resize(size);
  return deflated;
}

std::vector<std::uint8_t> InstanceIn(const ProjectInput& input, std::string instance) {
  if (instance.size() >= sizeof(InstanceHandleHeader)) {
    InstanceHandleHeader header;
    std::memcpy(static_cast<void*>(&header), instance.data(), sizeof header);
    if (input.flags & kToBeDeflated) {
      const std::string payload = Deflated(instance.substr(sizeof header));
      header.raw = 0;
      header.payload_length = payload.size();
      instance.assign(reinterpret_cast<const char*>(&header), sizeof header);
      instance += payload;
    } else if (header.payload_length == kAllThatFollow) {
      header.payload_length = instance.size() - sizeof header;
      std::memcpy(instance.data(), &header, sizeof header);
    }
  }
  return {instance.begin(), instance.end()};
}

void Expect(bool holds, const char* what) {
  if (holds) return;
  std::cerr << what << '\n' << Ledger::Get().Report();
  std::abort();
}

// Until nothing is under way, by turns with the threads that do it.
void Settle(Stage& stage, Effect& effect) {
  constexpr int kMostTurns = 400;
  for (int turn = 0; turn < kMostTurns; ++turn) {
    if (!effect.Tick().ok()) return;
    if (turn > 2 && Session::WorkOf(effect) == Session::Work::none) return;
    stage.host.WaitForWake(std::chrono::milliseconds(1));
  }
}

}  // namespace

// What is freed waits in the quarantine while a run or two go on, and not in memory that is new to
// the processor.
extern "C" const char* __asan_default_options() {
  return "quarantine_size_mb=4:malloc_context_size=6";
}
// What the libraries keep is told in cmake/lsan.supp for the tests; here there are few.
extern "C" const char* __lsan_default_suppressions() {
  return "leak:libfontconfig\n";
}
extern "C" const char* __lsan_default_options() {
  return "print_suppressions=0";
}

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
  saved.instance = InstanceIn(
      input, Unpacked(reinterpret_cast<const char*>(data) + sizeof input, size - sizeof input));
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
  kelp::analysis::JobRegistry::Instance().CancelAll();
  Expect(stage.host.handles().count() == 1, "handles are left");  // the plug-in's global data
  Expect(stage.host.worlds().count() == 0, "frames are left");
  Expect(Ledger::Get().mistakes().empty(), "mistakes were made");
  return 0;
}
