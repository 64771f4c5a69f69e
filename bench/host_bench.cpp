#include <benchmark/benchmark.h>

#include <boost/make_shared.hpp>
#include <chrono>
#include <memory>

#include "host/base/operations.h"
#include "host/effects/session.h"

// What a host pays for an effect at rest, and for a frame beside its pixels.
namespace {

using namespace calmframe::host;

SourcePtr MovingRamps() {
  SourceInfo info;
  info.width = 192;
  info.height = 128;
  info.frame_count = 40;
  info.content = tessel::utility::Guid::FromText("moving ramps");
  return MakeDrawnSource(info, [](std::int64_t frame, Picture& picture) {
    FillPicture(picture, [frame](int x, int y) {
      const auto value = static_cast<float>((x + 2 * frame) % 31 * ((y + frame) % 23)) / 660.0f;
      return HX_PixelFloat{1.0f, value, value, value};
    });
  });
}

// The plug-in plays for the whole program: its host is made once.
struct Stage {
  Host host{CALMFRAME_PLUGIN};
  Session session{host};

  Effect& Settled() {
    if (session.effects().empty()) session.Apply(boost::make_shared<Layer>(MovingRamps()));
    session.TickUntilSettled(std::chrono::minutes(5));
    return *session.effects().front();
  }
};

Stage& TheStage() {
  static Stage stage;
  return stage;
}

void BM_Tick(benchmark::State& state) {
  Effect& effect = TheStage().Settled();
  const std::uint64_t before = Operations::Get().count();
  for (auto _ : state) benchmark::DoNotOptimize(effect.Tick().code);
  state.counters["operations"] = benchmark::Counter(
      static_cast<double>(Operations::Get().count() - before), benchmark::Counter::kAvgIterations);
}

void BM_Refresh(benchmark::State& state) {
  Effect& effect = TheStage().Settled();
  for (auto _ : state) benchmark::DoNotOptimize(effect.Refresh().code);
}

// Set-up of a small frame: what a render costs beside its pixels. Argument: the path.
void BM_SmallFrame(benchmark::State& state) {
  Effect& effect = TheStage().Settled();
  const auto renderer = effect.MakeRenderer();
  for (auto _ : state) {
    RenderRequest request{4, 8, {1, 8}};
    const RenderedFrame frame =
        state.range(0) ? renderer->Planned(request) : renderer->Direct(request);
    if (!frame.pixels) state.SkipWithError("no frame");
  }
}

BENCHMARK(BM_Tick)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_Refresh)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_SmallFrame)->Arg(0)->Arg(1)->Unit(benchmark::kMicrosecond);

}  // namespace
