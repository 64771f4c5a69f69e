#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <nlohmann/json.hpp>
#include <opencv2/videostab.hpp>
#include <set>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "host/media/clip.h"
#include "synthetic/scene.h"

// The whole program as a person starts it, without an encoder: decoded, analysed, solved, rendered
// to a null device. Beside it, turn by turn in the same run: ffmpeg's vidstabdetect and
// vidstabtransform, each with its decode, by their defaults, and OpenCV's stabilizer of two passes.
// All may use every processor. Counters are medians over the turns.
namespace {

namespace fs = std::filesystem;

// A folder that is gone with the process.
const fs::path& Folder() {
  struct Made {
    fs::path path;
    Made() {
      std::string name = (fs::temp_directory_path() / "calmframe-bench-XXXXXX").string();
      path = mkdtemp(name.data());
    }
    ~Made() { fs::remove_all(path); }
  };
  static const Made made;
  return made.path;
}

// Starts a program, its output thrown away, what it says too unless there is a file for it. Throws
// where it can't be started.
pid_t Start(const std::vector<std::string>& words, const std::string& says = "/dev/null") {
  std::vector<char*> arguments;
  for (const std::string& word : words) arguments.push_back(const_cast<char*>(word.c_str()));
  arguments.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  for (const int stream : {0, 1}) {
    posix_spawn_file_actions_addopen(&actions, stream, "/dev/null", O_RDWR, 0);
  }
  posix_spawn_file_actions_addopen(&actions, 2, says.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
  pid_t child = 0;
  const int failed =
      posix_spawnp(&child, arguments[0], &actions, nullptr, arguments.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  if (failed != 0) throw std::runtime_error(words[0] + " can't be started");
  return child;
}

void CheckEnd(int status) {
  if (status != 0) throw std::runtime_error("a program failed");
}

// The seconds that a program took. Throws where it fails.
double RunProcess(const std::vector<std::string>& words, const std::string& says = "/dev/null") {
  const auto start = std::chrono::steady_clock::now();
  int status = -1;
  waitpid(Start(words, says), &status, 0);
  CheckEnd(status);
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

// The most memory that a program had at once, read while it runs: what the system tells at its end
// (ru_maxrss) counts what this process had when it started it.
double PeakMebibytes(const std::vector<std::string>& words) {
  const pid_t child = Start(words);
  const std::string status_path = "/proc/" + std::to_string(child) + "/status";
  const std::string mark = "VmHWM:";
  double peak = 0;
  int status = -1;
  while (waitpid(child, &status, WNOHANG) == 0) {
    std::ifstream lines(status_path);
    for (std::string line; std::getline(lines, line);) {
      if (line.rfind(mark, 0) == 0) peak = std::max(peak, std::stod(line.substr(mark.size())));
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
  CheckEnd(status);
  return peak / 1024;
}

// A walk down a street, camera in hand; longer ones repeat the first 300 frames.
std::string Clip(int width, int height, int frames) {
  constexpr int kDrawn = 300;
  const std::string path =
      Folder() / (std::to_string(height) + "-" + std::to_string(frames) + ".mp4");
  if (fs::exists(path)) return path;
  if (frames > kDrawn) {
    RunProcess({"ffmpeg", "-stream_loop", std::to_string(frames / kDrawn - 1), "-i",
                Clip(width, height, kDrawn), "-c", "copy", path});
    return path;
  }
  calmframe::media::ClipInfo info;
  info.width = width;
  info.height = height;
  info.frame_rate = {30, 1};
  info.frame_count = static_cast<std::size_t>(frames);
  const auto writer = calmframe::media::ClipWriter::Create(path, info, width, height, {});
  synthetic::scene_options options;
  options.width = width;
  options.height = height;
  options.frame_count = frames;
  const synthetic::scene scene(synthetic::street(1), synthetic::handheld_path({}), options);
  std::vector<HX_Pixel8> pixels(static_cast<std::size_t>(width) * static_cast<std::size_t>(height));
  for (int f = 0; f < frames; ++f) {
    scene.render(f, pixels.data(), static_cast<std::size_t>(width));
    writer->Write(static_cast<std::size_t>(f), pixels.data(),
                  width * static_cast<std::ptrdiff_t>(sizeof(HX_Pixel8)));
  }
  writer->Finish();
  return path;
}

std::string ClipOf(const benchmark::State& state) {
  return Clip(static_cast<int>(state.range(0)), static_cast<int>(state.range(1)),
              static_cast<int>(state.range(2)));
}

double Vidstab(const std::string& clip) {
  const std::string motions = Folder() / "motions.trf";
  const auto pass = [&](const std::string& filter) {
    return RunProcess({"ffmpeg", "-i", clip, "-vf", filter, "-f", "null", "-"});
  };
  return pass("vidstabdetect=result=" + motions) + pass("vidstabtransform=input=" + motions);
}

double OpencvTwoPass(const std::string& clip) {
  const auto start = std::chrono::steady_clock::now();
  cv::videostab::TwoPassStabilizer stabilizer;
  stabilizer.setLog(cv::makePtr<cv::videostab::NullLog>());
  stabilizer.setFrameSource(cv::makePtr<cv::videostab::VideoFileSource>(clip));
  while (!stabilizer.nextFrame().empty()) {
  }
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

double Median(std::vector<double> values) {
  std::nth_element(values.begin(), values.begin() + values.size() / 2, values.end());
  return values[values.size() / 2];
}

// Named figures of each turn, given out as medians.
class Medians {
 public:
  explicit Medians(benchmark::State& state) : state_(state) {}
  ~Medians() {
    for (const auto& [name, values] : values_) state_.counters[name] = Median(values);
  }
  void Add(const std::string& name, double value) { values_[name].push_back(value); }

 private:
  benchmark::State& state_;
  std::map<std::string, std::vector<double>> values_;
};

const std::string kProgram = CALMFRAME_PROGRAM;

using Words = std::vector<std::string>;
using Peer = double (*)(const std::string& clip);

// Ours to a peer; `ratio` should not exceed `limit`. `flags` stand behind the clip.
void Beside(benchmark::State& state, double limit, const std::string& clip, const Words& flags,
            Peer peer) {
  Medians medians(state);
  Words ours_is = {kProgram, "stabilize", clip};
  ours_is.insert(ours_is.end(), flags.begin(), flags.end());
  for (auto _ : state) {
    const double ours = RunProcess(ours_is);
    state.SetIterationTime(ours);
    medians.Add("frames_per_s", static_cast<double>(state.range(2)) / ours);
    medians.Add("ratio", ours / peer(clip));
  }
  state.counters["limit"] = limit;
}

// As it comes, which chooses for the clip.
void BesideVidstab(benchmark::State& state) {
  Beside(state, 0.7, ClipOf(state), {"-"}, Vidstab);
}

void AsSetBesideVidstab(benchmark::State& state) {
  Beside(state, 0.5, ClipOf(state), {"-", "--as-set"}, Vidstab);
}

// The same clip in another kind of file; `how` are ffmpeg's words that make it.
void FromBesideVidstab(benchmark::State& state, const std::string& extension, const Words& how) {
  const std::string clip = Folder() / ("from-" + std::to_string(state.range(1)) + extension);
  if (!fs::exists(clip)) {
    Words make = {"ffmpeg", "-i", ClipOf(state)};
    make.insert(make.end(), how.begin(), how.end());
    make.push_back(clip);
    RunProcess(make);
  }
  Beside(state, 0.75, clip, {"-", "--as-set"}, Vidstab);
}

// Two decodes and an encode, the least that a job of two passes can do.
double DecodeTwiceAndEncode(const std::string& clip) {
  const std::string out = Folder() / "encoded.mp4";
  return RunProcess({"ffmpeg", "-i", clip, "-f", "null", "-"}) +
         RunProcess({"ffmpeg", "-y", "-i", clip, "-c:v", "libx264", "-crf", "18", out});
}

void EncodedBesideTwoDecodesAndAnEncode(benchmark::State& state) {
  Beside(state, 1.1, ClipOf(state), {Folder() / "steady.mp4", "--as-set", "--overwrite"},
         DecodeTwiceAndEncode);
}

void BesideOpencvTwoPass(benchmark::State& state) {
  Beside(state, 1.0 / 3, ClipOf(state), {"-"}, OpencvTwoPass);
}

void PeakMemory(benchmark::State& state) {
  const std::string clip = ClipOf(state);
  for (auto _ : state) {
    const auto start = std::chrono::steady_clock::now();
    state.counters["MiB"] = PeakMebibytes({kProgram, "stabilize", clip, "-"});
    state.SetIterationTime(
        std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count());
  }
  state.counters["limit"] = state.range(2) > 300 ? 1200 : 450;
}

// Seconds that stages of a run took, by the progress that it wrote for programs.
double StageSeconds(const std::string& progress_path, const std::set<std::string>& stages) {
  std::ifstream lines(progress_path);
  double seconds = 0;
  for (std::string line; std::getline(lines, line);) {
    const nlohmann::json told = nlohmann::json::parse(line);
    if (told.contains("ended") && stages.count(told["stage"])) {
      seconds += told["elapsed"].get<double>();
    }
  }
  return seconds;
}

// Another Smoothness on saved work against what the same run spent on its solve and render.
// `to_first`: against the run that had to analyse.
void AnotherSmoothness(benchmark::State& state) {
  const std::string clip = ClipOf(state);
  const std::string project = Folder() / "saved.calm";
  const std::string progress = Folder() / "progress";
  Medians medians(state);
  int smoothness = 20;
  for (auto _ : state) {
    fs::remove(project);
    const double first = RunProcess({kProgram, "stabilize", clip, "-", "--project", project});
    const double again = RunProcess({kProgram, "stabilize", clip, "-", "--json", "--project",
                                     project, "--smoothness", std::to_string(++smoothness)},
                                    progress);
    state.SetIterationTime(again);
    medians.Add("to_first", again / first);
    medians.Add("ratio", again / StageSeconds(progress, {"solving", "rendering"}));
  }
  // What is left is to start, to load the work, and to save what changed.
  state.counters["limit"] = 1.25;
}

// As it comes, which chooses for the clip, against the same with nothing chosen.
void Choosing(benchmark::State& state) {
  const std::string clip = ClipOf(state);
  Medians medians(state);
  for (auto _ : state) {
    const double chosen = RunProcess({kProgram, "stabilize", clip, "-"});
    state.SetIterationTime(chosen);
    medians.Add("ratio", chosen / RunProcess({kProgram, "stabilize", clip, "-", "--as-set"}));
  }
  state.counters["limit"] = 1.35;
}

void Help(benchmark::State& state) {
  Medians medians(state);
  for (auto _ : state) {
    const double seconds = RunProcess({kProgram, "--help"});
    state.SetIterationTime(seconds);
    medians.Add("ms", 1000 * seconds);
  }
  state.counters["limit"] = 50;
}

void Turns(benchmark::internal::Benchmark* benchmark) {
  benchmark->Iterations(5)->UseManualTime()->Unit(benchmark::kSecond);
}
void Once(benchmark::internal::Benchmark* benchmark) {
  benchmark->Iterations(1)->UseManualTime()->Unit(benchmark::kSecond);
}

BENCHMARK(BesideVidstab)->Args({1280, 720, 300})->Args({1920, 1080, 300})->Apply(Turns);
BENCHMARK(AsSetBesideVidstab)->Args({1280, 720, 300})->Args({1920, 1080, 300})->Apply(Turns);
BENCHMARK_CAPTURE(FromBesideVidstab, mkv, ".mkv", {"-c", "copy"})
    ->Args({1280, 720, 300})
    ->Apply(Turns);
BENCHMARK_CAPTURE(FromBesideVidstab, ts, ".ts", {"-c", "copy"})
    ->Args({1280, 720, 300})
    ->Apply(Turns);
BENCHMARK_CAPTURE(FromBesideVidstab, webm, ".webm",
                  {"-c:v", "libvpx-vp9", "-deadline", "realtime", "-cpu-used", "8", "-crf", "20",
                   "-b:v", "0"})
    ->Args({1280, 720, 300})
    ->Apply(Turns);
BENCHMARK_CAPTURE(FromBesideVidstab, avi, ".avi", {"-c:v", "mpeg4", "-q:v", "3"})
    ->Args({1280, 720, 300})
    ->Apply(Turns);
BENCHMARK(EncodedBesideTwoDecodesAndAnEncode)->Args({1280, 720, 300})->Apply(Turns);
BENCHMARK(BesideOpencvTwoPass)->Args({1280, 720, 300})->Args({1920, 1080, 300})->Apply(Turns);
BENCHMARK(Choosing)->Args({1280, 720, 300})->Args({1920, 1080, 300})->Apply(Turns);
BENCHMARK(AnotherSmoothness)->Args({1280, 720, 300})->Args({1920, 1080, 300})->Apply(Turns);
BENCHMARK(PeakMemory)->Args({1920, 1080, 300})->Args({1920, 1080, 3000})->Apply(Once);
BENCHMARK(Help)->Iterations(25)->UseManualTime()->Unit(benchmark::kMillisecond);

}  // namespace
