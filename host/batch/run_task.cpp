#include "host/batch/run_task.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <new>
#include <nlohmann/json.hpp>
#include <set>
#include <system_error>
#include <utility>

#include "host/base/json_bounds.h"
#include "host/base/shown_text.h"
#include "host/batch/child.h"
#include "host/media/clip.h"
#include "host/media/output_file.h"
#include "host/project/project_file.h"
#include "host/timeline/source.h"

namespace calmframe::batch {
namespace {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;

// Of what a program says of its clip, which may have taken it over.
constexpr std::size_t kMostWarnings = 200, kLongestSaid = 4000;

// Why a task can't go on; one line.
struct Failed {
  std::string line;
  int code;
};
struct Stopped {};

// What a flag sets: its name, of --param the parameter's too.
std::set<std::string> FlagsOf(const std::vector<std::string>& settings) {
  std::set<std::string> names;
  for (const std::string& word : settings) {
    const std::size_t name = word.starts_with("--param=") ? word.find('=') + 1 : 0;
    names.insert(word.substr(0, word.find('=', name)));
  }
  return names;
}

// A project keeps the controls that it was made with, so one of flags that are no longer given
// would set them still.
bool SetsAllOf(const std::vector<std::string>& settings, const std::vector<std::string>& before) {
  const auto now = FlagsOf(settings), then = FlagsOf(before);
  return std::includes(now.begin(), now.end(), then.begin(), then.end());
}

// How far the program is, by its stages; a film goes through them shot by shot.
double ShareOf(const std::string& stage, double share) {
  struct Stage {
    const char* name;
    double begin, end;
  };
  constexpr Stage kStages[] = {{"analyzing", 0, 0.4},
                               {"solving", 0.4, 0.45},
                               {"choosing", 0.45, 0.5},
                               {"rendering", 0.5, 1}};
  for (const Stage& one : kStages) {
    if (stage == one.name) return one.begin + share * (one.end - one.begin);
  }
  return 0;
}

void ReplaceAll(std::string& text, const std::string& from, const std::string& to) {
  for (std::size_t at = 0; (at = text.find(from, at)) != std::string::npos; at += to.size()) {
    text.replace(at, from.size(), to);
  }
}

class Run {
 public:
  Run(const Plan& plan, const Task& task, int threads, TaskWatcher& watcher, int lock)
      : plan_(plan),
        task_(task),
        threads_(threads),
        watcher_(watcher),
        lock_(lock),
        folder_(plan.FolderOf(task)),
        written_(folder_.output(fs::path(task.output).extension())),
        progress_(folder_.progress()) {}
  ~Run() {
    unlink(written_.c_str());
    unlink(progress_.c_str());
  }
  Run(const Run&) = delete;
  Run& operator=(const Run&) = delete;

  Record record;

  // All but what is done already.
  void Steady() {
    const auto began = Clock::now();
    const std::optional<Record> before = ReadRecord(folder_.record());
    record.run = plan_.run;
    record.source = task_.source;
    record.settings = plan_.SettingsOf(task_);
    record.output = task_.output;
    if (before) record.output_identity = before->output_identity;
    const bool replaces = MayReplace();
    const auto identity = IdentityOf(task_.source);
    if (!identity) throw Failed{"is gone, or no file any more", kInputCode};
    record.source_identity = *identity;
    if (task_.words.empty()) DropStale(before);
    Save();

    MakeFolder();
    Program(Words());
    record.seconds = std::chrono::duration<double>(Clock::now() - began).count();
    if (IdentityOf(task_.source) != identity) {
      std::error_code ignored;
      fs::remove(plan_.ProjectOf(task_), ignored);  // of two clips, then
      throw Failed{"changed while it was worked", kInputCode};
    }
    GiveName(replaces);
  }

  // What is made of an output beside it.
  void Describe() {
    if (task_.is_piece) return;
    if (plan_.reports) {
      const std::vector<std::string> warnings = record.warnings;  // of the output, which hold here
      try {
        Program({plan_.program, "report", plan_.ProjectOf(task_), plan_.ReportOf(task_),
                 "--overwrite", "--json", "--threads=" + std::to_string(threads_)});
        record.warnings = warnings;
      } catch (const Failed& failed) {
        record.warnings = warnings;
        record.warnings.push_back("no report: " + failed.line);
      }
      Save();
    }
    if (pictures_.empty()) {  // of an output that was joined, or is from a run before
      try {
        Program({plan_.program, "batch-pictures", task_.source, plan_.OutputOf(task_)});
      } catch (const Failed&) {  // the page goes without
      }
    }
    if (!pictures_.empty()) WriteWhole(folder_.pictures(), pictures_);
  }

  void Save() {
    if (!WriteWhole(folder_.record(), TextOf(record))) {
      throw Failed{Shown(folder_.record()) + ": can't be written: " + std::strerror(errno),
                   kOutputCode};
    }
  }

 private:
  std::vector<std::string> Words() const {
    std::vector<std::string> words = {plan_.program};
    if (task_.words.empty()) {
      words.insert(words.end(),
                   {"stabilize", task_.source, written_, "--project=" + plan_.ProjectOf(task_),
                    "--overwrite", "--thumbnails"});
      words.insert(words.end(), plan_.settings.begin(), plan_.settings.end());
    } else {
      std::error_code ignored;
      fs::remove(written_, ignored);  // of one that was killed
      words.insert(words.end(), task_.words.begin(), task_.words.end());
      for (std::string& word : words) ReplaceAll(word, kOutputWord, written_);
    }
    words.insert(words.end(), {"--json", "--threads=" + std::to_string(threads_)});
    return words;
  }

  // Nothing of others is written over, unless that was asked for.
  bool MayReplace() const {
    const auto there = IdentityOf(plan_.OutputOf(task_));
    std::error_code error;
    if (!there && !fs::exists(plan_.OutputOf(task_), error)) return plan_.overwrites;
    if (there && (plan_.overwrites || there == record.output_identity)) return true;
    throw Failed{ShownOutput() + (there ? ": exists already (--overwrite replaces it)"
                                        : ": is not a file on disk"),
                 kOutputCode};
  }

  // Saved work of the clip as it was, or of other settings.
  void DropStale(const std::optional<Record>& before) const {
    const std::string project = plan_.ProjectOf(task_);
    std::error_code error;
    if (!before || before->source != task_.source || !fs::exists(project, error)) return;
    bool is_stale = !SetsAllOf(plan_.settings, before->settings);
    if (before->source_identity != record.source_identity) {
      try {
        is_stale =
            is_stale || host::LoadProject(project).clip_content != host::ContentOf(task_.source);
      } catch (const std::exception&) {  // the program tells
      }
    }
    if (is_stale) fs::remove(project, error);
  }

  void MakeFolder() const {
    try {
      media::MakeFolders(fs::path(plan_.OutputOf(task_)).parent_path().string());
    } catch (const std::system_error& error) {
      throw Failed{ShownOutput() + ": " + error.code().message(), kOutputCode};
    }
  }

  void Program(const std::vector<std::string>& words) {
    error_.clear();
    error_code_ = 0;
    bool stops = false;
    int code = 0;
    try {
      Child child(words, lock_);
      std::string line;
      for (Child::Said said; (said = child.Next(line, 100)) != Child::Said::end;) {
        if (said == Child::Said::line) Hear(line);
        if (!stops && watcher_.Stops()) {
          stops = true;
          child.AskToEnd();
        }
      }
      code = child.Wait();
    } catch (const std::system_error& error) {
      throw Failed{std::string("no program can be started: ") + error.what(), kWorkCode};
    }
    if (code == 0) return;
    if (stops) throw Stopped();
    if (code > 128 && error_code_ == 0) {
      const int signal = code - 128;
      const std::string why = signal == SIGKILL ? ", as it is where memory runs out" : "";
      throw Failed{
          "was ended by signal " + std::to_string(signal) + " (" + strsignal(signal) + ")" + why,
          code};
    }
    throw Failed{error_.empty() ? "ended with exit code " + std::to_string(code) : error_, code};
  }

  void Hear(const std::string& line) {
    if (ExceedsBounds(line)) return;
    const auto json = nlohmann::ordered_json::parse(line, nullptr, false);
    if (!json.is_object()) return;
    try {
      if (json.contains("stage")) {
        Tell(json.at("stage").get<std::string>(), json.value("share", 0.0));
      } else if (json.contains("warning")) {
        const std::string warning = Own(json.at("warning").get<std::string>());
        if (record.warnings.size() < kMostWarnings &&
            std::find(record.warnings.begin(), record.warnings.end(), warning) ==
                record.warnings.end()) {
          record.warnings.push_back(warning);
        }
      } else if (json.contains("error")) {
        error_ = Own(json.at("error").get<std::string>());
        error_code_ = json.value("exit_code", kWorkCode);
      } else if (json.contains("before")) {
        pictures_ = line;
      } else if (json.contains("width_kept")) {
        record.outcome = json;
      }
    } catch (const nlohmann::json::exception&) {  // of another version, or of its plug-in
    }
  }

  // A line in the words of whoever asked for the clip.
  std::string Own(std::string line) const {
    line.resize(std::min(line.size(), kLongestSaid));
    ReplaceAll(line, task_.source, task_.clip);
    ReplaceAll(line, written_, task_.output);
    ReplaceAll(line, plan_.folder + "/", "");
    return Shown(line);
  }

  void Tell(const std::string& stage, double share) {
    share_ = std::max(share_, ShareOf(stage, share));
    watcher_.Show(share_, stage);
    const auto now = Clock::now();
    if (now - told_ < std::chrono::seconds(1)) return;
    told_ = now;
    char machine[65] = "";
    gethostname(machine, sizeof machine - 1);
    const nlohmann::ordered_json json = {
        {"share", share_}, {"stage", stage}, {"machine", machine}, {"pid", getpid()}};
    WriteWhole(progress_, json.dump() + "\n");
  }

  // The record comes first: an output that got its name has one, whatever ends this program.
  void GiveName(bool replaces) {
    const std::optional<FileIdentity> earlier = record.output_identity;
    const std::string output = plan_.OutputOf(task_);
    record.output_identity = IdentityOf(written_);
    record.state = Record::State::done;
    Save();
    // Linking fails where renaming would replace what came up meanwhile.
    if ((!replaces && link(written_.c_str(), output.c_str()) == 0) ||
        ((replaces || errno != EEXIST) && std::rename(written_.c_str(), output.c_str()) == 0)) {
      media::SyncFolderOf(output);
      return;
    }
    const int error = errno;
    record.output_identity = earlier;
    throw Failed{error == EEXIST ? ShownOutput() + ": exists already (--overwrite replaces it)"
                                 : ShownOutput() + ": can't be written: " + std::strerror(error),
                 kOutputCode};
  }

  std::string ShownOutput() const { return Shown(plan_.OutputOf(task_)); }

  const Plan& plan_;
  const Task& task_;
  const int threads_;
  TaskWatcher& watcher_;
  const int lock_;
  const TaskFolder folder_;
  const std::string written_, progress_;
  std::string error_;
  int error_code_ = 0;
  std::string pictures_;  // of a frame before and after, as the program told them
  double share_ = 0;
  Clock::time_point told_ = Clock::now() - std::chrono::hours(1);
};

TaskResult FailedTask(Record record, const Failed& failed) {
  record.state = Record::State::failed;
  record.error = failed.line;
  record.exit_code = failed.code;
  return {TaskResult::State::failed, std::move(record)};
}

TaskResult RunLocked(const Plan& plan, const Task& task, int threads, TaskWatcher& watcher,
                     int lock) {
  std::optional<Record> done = DoneRecord(plan, task);
  std::error_code error;
  if (done && (!plan.reports || task.is_piece || fs::exists(plan.ReportOf(task), error))) {
    return {TaskResult::State::unchanged, *std::move(done)};
  }
  Run run(plan, task, threads, watcher, lock);
  try {
    if (done) {
      run.record = *std::move(done);
    } else {
      run.Steady();
    }
    run.Describe();
    return {TaskResult::State::done, run.record};
  } catch (const Stopped&) {
    return {TaskResult::State::stopped, run.record};
  } catch (const Failed& failed) {
    TaskResult result = FailedTask(run.record, failed);
    WriteWhole(plan.FolderOf(task).record(), TextOf(result.record));
    return result;
  }
}

}  // namespace

TaskResult RunTask(const Plan& plan, const Task& task, int threads, TaskWatcher& watcher) {
  Record record;
  record.source = task.source;
  record.output = task.output;
  if (!task.refused.empty()) return FailedTask(record, {task.refused, task.refused_code});
  const TaskFolder folder = plan.FolderOf(task);
  try {
    media::MakeFolders(folder.path());
    const FileLock lock(folder.lock());
    if (!lock.is_held()) return {TaskResult::State::busy, {}};
    SweepParts(folder.path());
    return RunLocked(plan, task, threads, watcher, lock.descriptor());
  } catch (const std::system_error& error) {
    return FailedTask(record, {Shown(folder.path()) + ": " + error.code().message(), kOutputCode});
  } catch (const std::bad_alloc&) {
    return FailedTask(record, {"out of memory", kWorkCode});
  }
}

double ShareOf(const Plan& plan, const Task& task) {
  const auto progress = ReadObject(plan.FolderOf(task).progress());
  try {
    return progress ? std::clamp(progress->value("share", 0.0), 0.0, 1.0) : 0;
  } catch (const nlohmann::json::exception&) {
    return 0;
  }
}

}  // namespace calmframe::batch
