#include <benchmark/benchmark.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <vector>

#include "host/batch/child.h"
#include "host/media/clip.h"
#include "synthetic/scene.h"

// A folder of clips by `calmframe batch`, and turn by turn by a loop of `calmframe stabilize`, each
// of which may use every processor. Counters are medians over the turns.
namespace {

namespace fs = std::filesystem;
using calmframe::batch::Child;

constexpr int kTurns = 3;

double SecondsOf(const std::vector<std::vector<std::string>>& runs) {
  const auto start = std::chrono::steady_clock::now();
  for (const std::vector<std::string>& words : runs) {
    Child child(words);
    std::string line;
    while (child.Next(line, 1000) != Child::Said::end) {
    }
    if (child.Wait() != 0) throw std::runtime_error(words[1] + " failed: " + line);
  }
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

void MakeClip(const fs::path& path, int width, int height, int frames) {
  using namespace calmframe;
  media::ClipInfo info;
  info.width = width;
  info.height = height;
  info.frame_rate = {30, 1};
  info.frame_count = static_cast<std::size_t>(frames);
  synthetic::scene_options options;
  options.width = width;
  options.height = height;
  options.frame_count = frames;
  const synthetic::scene scene(synthetic::street(1), synthetic::handheld_path({}), options);
  const auto writer = media::ClipWriter::Create(path, info, width, height, {});
  std::vector<HX_Pixel8> pixels(static_cast<std::size_t>(width) * height);
  for (int f = 0; f < frames; ++f) {
    scene.render(f, pixels.data(), width);
    writer->Write(f, pixels.data(), width * static_cast<std::ptrdiff_t>(sizeof(HX_Pixel8)));
  }
  writer->Finish();
}

double Median(std::vector<double> values) {
  std::sort(values.begin(), values.end());
  return values[values.size() / 2];
}

void Folder(benchmark::State& state) {
  const auto clips = static_cast<int>(state.range(0));
  const auto width = static_cast<int>(state.range(1));
  std::string name = (fs::temp_directory_path() / "calmframe-bench-XXXXXX").string();
  const fs::path folder = mkdtemp(name.data());
  fs::create_directory(folder / "clips");
  std::vector<std::vector<std::string>> loop;
  for (int c = 0; c < clips; ++c) {
    const fs::path clip = folder / "clips" / (std::to_string(c) + ".mp4");
    MakeClip(clip, width, width * 9 / 16, 40 + 10 * (c % 5));
    loop.push_back({CALMFRAME_PROGRAM, "stabilize", clip, folder / "out.mp4", "--overwrite"});
  }
  std::vector<double> ratios, batch, alone;
  for (auto _ : state) {
    for (int turn = 0; turn < kTurns; ++turn) {
      fs::remove_all(folder / "steady");
      const std::vector<std::vector<std::string>> whole = {
          {CALMFRAME_PROGRAM, "batch", folder / "clips", "--to", folder / "steady"}};
      // Whoever comes first has it no better.
      const bool loop_first = turn % 2 == 0;
      if (loop_first) alone.push_back(SecondsOf(loop));
      batch.push_back(SecondsOf(whole));
      if (!loop_first) alone.push_back(SecondsOf(loop));
      ratios.push_back(batch.back() / alone.back());
    }
    state.SetIterationTime(Median(batch));
  }
  fs::remove_all(folder);
  state.counters["loop_s"] = Median(alone);
  state.counters["batch_s"] = Median(batch);
  state.counters["ratio"] = Median(ratios);
  state.counters["least"] = *std::min_element(ratios.begin(), ratios.end());
  state.counters["most"] = *std::max_element(ratios.begin(), ratios.end());
  state.counters["limit"] = 1 / 1.3;
}
BENCHMARK(Folder)->Args({20, 640})->Iterations(1)->UseManualTime()->Unit(benchmark::kSecond);

}  // namespace
