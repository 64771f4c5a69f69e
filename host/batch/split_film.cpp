#include "host/batch/split_film.h"

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <numeric>
#include <optional>
#include <set>
#include <utility>

#include "host/media/clip.h"
#include "host/project/project_join.h"

namespace calmframe::batch {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t kLeastFrames = 250;  // whose drawing outweighs a program's start
constexpr std::size_t kMostPieces = 400;   // of a film; each is a file until it is joined

// In frames of the film, the end left out.
struct Stretch {
  std::size_t first = 0, end = 0;
  std::size_t frames() const { return end - first; }
};

std::vector<std::string> FromTo(const Stretch& stretch) {
  return {"--from=" + std::to_string(stretch.first) + "f",
          "--to=" + std::to_string(stretch.end) + "f"};
}

// Told of a stage's tasks, tells of the film.
class StageWatcher final : public BatchWatcher {
 public:
  StageWatcher(std::size_t film, std::vector<double>& shares, BatchWatcher& watcher)
      : film_(film), shares_(shares), watcher_(watcher) {}

  void Begin(double from, double to) {
    from_ = from;
    to_ = to;
    results.clear();
  }

  std::vector<TaskResult> results;

  void Show(const std::vector<double>& shares, std::size_t working) override {
    const double done = std::accumulate(shares.begin(), shares.end(), 0.0) /
                        static_cast<double>(std::max<std::size_t>(shares.size(), 1));
    shares_[film_] = std::max(shares_[film_], from_ + (to_ - from_) * done);
    watcher_.Show(shares_, working);
  }
  void Ended(std::size_t, const TaskResult& result) override { results.push_back(result); }
  bool Stops() override { return watcher_.Stops(); }
  void Note(const std::string& line) override { watcher_.Note(line); }

 private:
  const std::size_t film_;
  std::vector<double>& shares_;
  BatchWatcher& watcher_;
  double from_ = 0, to_ = 0;
};

class SplitFilm {
 public:
  SplitFilm(const Plan& plan, std::size_t film, const SplitSettings& settings)
      : plan_(plan), film_(plan.tasks[film]), settings_(settings) {}

  Plan Looking() const {
    Plan stage = Stage();
    stage.tasks.push_back(Piece("shots.json", {"batch-shots", film_.source, kOutputWord},
                                settings_.looking, film_.cost));
    return stage;
  }

  // After Looking. Throws std::exception where that left nothing of use.
  void ReadShots() {
    const auto json = ReadObject(plan_.folder + "/" + Looking().tasks[0].output);
    if (!json) throw std::runtime_error("its shots were not found");
    // Of a process that reads what strangers made.
    bool is_a_film = true;
    for (const auto& shot : json->at("shots")) {
      const Stretch told{static_cast<std::size_t>(WholeOf(shot.at("first_frame"))),
                         static_cast<std::size_t>(WholeOf(shot.at("end_frame")))};
      is_a_film = is_a_film && told.first < told.end &&
                  told.end <= std::size_t{media::kMaximumFrames} &&
                  (shots_.empty() || told.first == shots_.back().end);
      shots_.push_back(told);
    }
    if (!is_a_film || shots_.empty()) throw std::runtime_error("its shots were not found");
  }

  Plan Analysis() const {
    Plan stage = Stage();
    for (std::size_t s = 0; s < shots_.size(); ++s) {
      std::vector<std::string> words = {"analyze", film_.source,
                                        "--project=" + std::string(kOutputWord), "--choose",
                                        "--shots=one"};
      const auto stretch = FromTo(shots_[s]);
      words.insert(words.end(), stretch.begin(), stretch.end());
      stage.tasks.push_back(
          Piece(Name("shot", s, ".calm"), words, settings_.analysis, CostOf(shots_[s])));
    }
    return stage;
  }

  // What the analyses left becomes the film's project. Throws host::ProjectFailure.
  void Gather() const {
    std::vector<host::NamedProject> parts;
    for (const Task& task : Analysis().tasks) {
      const std::string path = plan_.folder + "/" + task.output;
      parts.push_back({path, host::LoadProject(path)});
    }
    std::error_code ignored;
    fs::create_directories(fs::path(plan_.OutputOf(film_)).parent_path(), ignored);
    host::SaveProject(plan_.ProjectOf(film_), host::JoinProjects(std::move(parts)));
  }

  Plan Drawing() const {
    const std::size_t first = shots_.front().first, frames = shots_.back().end - first;
    std::size_t of_piece = settings_.frames_a_piece;
    if (of_piece == 0) of_piece = std::max(kLeastFrames, (frames + kMostPieces - 1) / kMostPieces);
    Plan stage = Stage();
    const std::string extension = fs::path(film_.output).extension();
    for (std::size_t from = first; from < first + frames; from += of_piece) {
      const Stretch stretch{from, std::min(from + of_piece, first + frames)};
      std::vector<std::string> words = {
          "render", kOutputWord, "--project=" + plan_.ProjectOf(film_), "--segment", "--overwrite"};
      const auto flags = FromTo(stretch);
      words.insert(words.end(), flags.begin(), flags.end());
      stage.tasks.push_back(Piece(Name("frames", stage.tasks.size(), extension), words,
                                  settings_.drawing, CostOf(stretch)));
    }
    return stage;
  }

  // The film's own task.
  Plan Joining() const {
    Plan stage = Stage();
    stage.reports = plan_.reports;
    Task join = film_;
    join.words = {"join", kOutputWord};
    for (const Task& piece : Drawing().tasks) {
      join.words.push_back(plan_.folder + "/" + piece.output);
    }
    join.words.push_back("--project=" + plan_.ProjectOf(film_));
    join.words.push_back("--overwrite");
    stage.tasks.push_back(std::move(join));
    return stage;
  }

  // Nobody needs the pieces any more.
  void Clear() const {
    std::error_code ignored;
    for (const Plan& stage : {Looking(), Analysis(), Drawing()}) {
      for (const Task& task : stage.tasks) fs::remove_all(stage.FolderOf(task).path(), ignored);
    }
    fs::remove_all(plan_.folder + "/" + Folder(), ignored);
  }

 private:
  std::string Folder() const {
    return std::string(kRecordsFolder) + "/" + TaskId(film_.output) + "/pieces";
  }

  Plan Stage() const {
    Plan stage = plan_;
    stage.tasks.clear();
    stage.reports = false;
    return stage;
  }

  static std::string Name(const char* kind, std::size_t number, const std::string& extension) {
    char name[40];
    std::snprintf(name, sizeof name, "%s-%06zu", kind, number + 1);
    return name + extension;
  }

  double CostOf(const Stretch& stretch) const {
    const auto frames = static_cast<double>(shots_.back().end - shots_.front().first);
    return film_.cost * static_cast<double>(stretch.frames()) / std::max(frames, 1.0);
  }

  Task Piece(const std::string& name, std::vector<std::string> words,
             const std::vector<std::string>& flags, double cost) const {
    Task task = film_;
    words.insert(words.end(), flags.begin(), flags.end());
    task.words = std::move(words);
    task.is_piece = true;
    task.output = Folder() + "/" + name;
    task.cost = cost;
    return task;
  }

  const Plan& plan_;
  const Task& film_;
  const SplitSettings& settings_;
  std::vector<Stretch> shots_;
};

}  // namespace

void SteadyInPieces(const Plan& plan, std::size_t film, const SplitSettings& settings,
                    const RunStage& run, std::vector<double>& shares, BatchWatcher& watcher) {
  const auto began = std::chrono::steady_clock::now();
  const auto end = [&](TaskResult result) {
    shares[film] = 1;
    watcher.Ended(film, result);
  };
  const auto fail = [&](const std::string& line, int code) {
    TaskResult result;
    result.record.source = plan.tasks[film].source;
    result.record.output = plan.tasks[film].output;
    result.record.error = line;
    result.record.exit_code = code;
    end(std::move(result));
  };
  const Task& task = plan.tasks[film];
  if (!task.refused.empty()) return fail(task.refused, task.refused_code);
  if (std::optional<Record> done = DoneRecord(plan, task)) {
    return end({TaskResult::State::unchanged, *std::move(done)});
  }
  SplitFilm split(plan, film, settings);
  StageWatcher stage(film, shares, watcher);
  // False where the film has ended, or is to.
  const auto pass = [&](const Plan& tasks, double from, double to) {
    stage.Begin(from, to);
    run(tasks, stage);
    for (const TaskResult& result : stage.results) {
      if (result.state != TaskResult::State::failed) continue;
      fail(result.record.error, result.record.exit_code);
      return false;
    }
    return stage.results.size() == tasks.tasks.size();
  };
  std::set<std::string> warnings;
  const auto keep_warnings = [&] {
    for (const TaskResult& result : stage.results) {
      warnings.insert(result.record.warnings.begin(), result.record.warnings.end());
    }
  };
  try {
    if (!pass(split.Looking(), 0, 0.05)) return;
    split.ReadShots();
    if (!pass(split.Analysis(), 0.05, 0.5)) return;
    keep_warnings();
    split.Gather();
    if (!pass(split.Drawing(), 0.5, 0.97)) return;
    keep_warnings();
  } catch (const host::ProjectFailure& failure) {
    return fail(failure.what(), kOutputCode);
  } catch (const std::exception& error) {
    return fail(error.what(), kWorkCode);
  }
  if (!pass(split.Joining(), 0.97, 1)) return;
  TaskResult result = stage.results[0];
  warnings.insert(result.record.warnings.begin(), result.record.warnings.end());
  result.record.warnings.assign(warnings.begin(), warnings.end());
  result.record.seconds =
      std::chrono::duration<double>(std::chrono::steady_clock::now() - began).count();
  WriteWhole(plan.FolderOf(task).record(), TextOf(result.record));
  split.Clear();
  end(std::move(result));
}

}  // namespace calmframe::batch
