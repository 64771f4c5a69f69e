#include "host/batch/slurm_batch.h"

#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <chrono>
#include <filesystem>
#include <map>
#include <nlohmann/json.hpp>
#include <numeric>
#include <sstream>
#include <thread>
#include <utility>

#include "host/base/shown_text.h"
#include "host/batch/child.h"

namespace calmframe::batch {
namespace {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;

// An array has at most 1,001 jobs where nobody has set MaxArraySize.
constexpr std::size_t kMostGroups = 1000;
// Pixels of all frames that are worth a job: some minute's work.
constexpr double kJobCost = 1e9;
constexpr std::chrono::seconds kBetweenLooks(2);
// A controller that is started anew is back sooner.
constexpr int kMostUnanswered = 60;

struct Answer {
  int code = 0;
  std::vector<std::string> lines;
};

// What a program of the cluster's says. Throws ClusterFailure where there is none.
Answer Ask(std::vector<std::string> words) {
  const std::string name = words[0];
  words.insert(words.begin(), "/usr/bin/env");
  Child child(words);
  Answer answer;
  std::string line;
  for (Child::Said said; (said = child.Next(line, 1000)) != Child::Said::end;) {
    if (said == Child::Said::line && !line.empty()) answer.lines.push_back(line);
  }
  answer.code = child.Wait();
  if (answer.code == 127) {
    throw ClusterFailure("there is no " + name + " here: --on slurm needs Slurm's programs");
  }
  return answer;
}

std::string NewRunFolder(const std::string& folder) {
  const std::string runs = folder + "/" + kRecordsFolder + "/runs";
  std::error_code error;
  fs::create_directories(runs, error);
  std::string name = runs + "/XXXXXX";
  if (error || !mkdtemp(name.data())) throw ClusterFailure(Shown(runs) + ": can't be written");
  return name;
}

// For a shell.
std::string Quoted(const std::string& word) {
  std::string quoted = "'";
  for (const char c : word) quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return quoted + "'";
}

}  // namespace

std::vector<std::vector<std::size_t>> GroupsOf(const Plan& plan, int clips_a_job,
                                               const std::vector<bool>& left_out) {
  const auto weight = [&](std::size_t n) { return clips_a_job > 0 ? 1 : plan.tasks[n].cost; };
  std::vector<std::size_t> left;
  double whole = 0;
  for (std::size_t n = 0; n < plan.tasks.size(); ++n) {
    if (left_out[n] || !plan.tasks[n].refused.empty() || DoneRecord(plan, plan.tasks[n])) continue;
    left.push_back(n);
    whole += weight(n);
  }
  std::stable_sort(left.begin(), left.end(), [&](std::size_t a, std::size_t b) {
    return plan.tasks[a].cost > plan.tasks[b].cost;
  });
  // Filled up to this no more than kMostGroups come out: each but the last holds as much.
  const double full = std::max(clips_a_job > 0 ? clips_a_job : kJobCost, whole / (kMostGroups - 1));
  std::vector<std::vector<std::size_t>> groups;
  double held = full;
  for (const std::size_t n : left) {
    if (held >= full) {
      groups.emplace_back();
      held = 0;
    }
    groups.back().push_back(n);
    held += weight(n);
  }
  return groups;
}

SlurmBatch::SlurmBatch(const Plan& plan, const SlurmSettings& settings, BatchWatcher& watcher)
    : plan_(plan),
      settings_(settings),
      watcher_(watcher),
      ended_(plan.tasks.size()),
      submitted_(plan.tasks.size()),
      shares_(plan.tasks.size()),
      killed_(plan.tasks.size()) {}

bool SlurmBatch::Submit() {
  for (std::size_t n = 0; n < ended_.size(); ++n) TakeResult(n);
  Adopt();
  std::vector<bool> adopted(submitted_.begin(), submitted_.end());
  const auto groups = GroupsOf(plan_, settings_.clips_a_job, adopted);
  if (!groups.empty()) watcher_.Note("submitted as job " + Submit(groups));
  return !arrays_.empty();
}

// Tasks of ours that jobs of a run before have still to do, as whoever let go of them left them;
// runs of which no job is left are cleared away.
void SlurmBatch::Adopt() {
  std::map<std::string, std::size_t> ours;
  for (std::size_t n = 0; n < plan_.tasks.size(); ++n) {
    if (!ended_[n]) ours[plan_.tasks[n].output] = n;
  }
  std::error_code error;
  bool has_looked = false;
  for (const auto& entry :
       fs::directory_iterator(plan_.folder + "/" + kRecordsFolder + "/runs", error)) {
    const auto json = ReadObject(entry.path() / "plan.json", kMostOfAll);
    const auto job = ReadObject(entry.path() / "job.json");
    if (!json || !job) continue;
    if (!has_looked && !Look()) return;
    has_looked = true;
    try {
      Array array{job->at("job").get<std::string>(), {}};
      const Plan plan = PlanOf(json->at("plan").get<std::string>());
      const auto groups = json->at("groups").get<std::vector<std::vector<std::size_t>>>();
      array.groups.resize(groups.size());
      std::size_t alive = 0, count = 0;
      for (std::size_t g = 0; g < groups.size(); ++g) {
        if (!there_[{array.job, g}].is_there) continue;
        ++alive;
        for (const std::size_t theirs : groups[g]) {
          const auto found = ours.find(plan.tasks.at(theirs).output);
          if (found == ours.end() ||
              plan.SettingsOf(plan.tasks[theirs]) != plan_.SettingsOf(plan_.tasks[found->second]) ||
              plan.tasks[theirs].source != plan_.tasks[found->second].source) {
            continue;
          }
          array.groups[g].push_back(found->second);
          ++submitted_[found->second];
          ++count;
          ours.erase(found);
        }
      }
      if (alive == 0) fs::remove_all(entry.path(), error);
      if (count == 0) continue;
      watcher_.Note("job " + array.job + " of an earlier run is still at work");
      arrays_.push_back(std::move(array));
    } catch (const std::exception&) {  // of another version
    }
  }
}

std::string SlurmBatch::Submit(std::vector<std::vector<std::size_t>> groups) {
  const std::string folder = NewRunFolder(plan_.folder);
  nlohmann::ordered_json json = {{"plan", TextOf(plan_)}, {"groups", groups}};
  // sbatch copies the script, so that its own place is unknown to it.
  const std::string script = "#!/bin/sh\nexec " + Quoted(plan_.program) + " batch-job " +
                             Quoted(folder + "/plan.json") + "\n";
  if (!WriteWhole(folder + "/plan.json", json.dump()) || !WriteWhole(folder + "/job.sh", script)) {
    throw ClusterFailure(Shown(folder) + ": can't be written");
  }
  std::vector<std::string> words = {"sbatch",
                                    "--parsable",
                                    "--array=0-" + std::to_string(groups.size() - 1),
                                    "--job-name=calmframe",
                                    "--requeue",
                                    "--open-mode=append",
                                    "--output=" + folder + "/%a.log"};
  words.insert(words.end(), settings_.flags.begin(), settings_.flags.end());
  words.push_back(folder + "/job.sh");
  const Answer answer = Ask(words);
  // "JOB" or "JOB;CLUSTER", maybe behind warnings.
  const std::string last = answer.lines.empty() ? "" : answer.lines.back();
  const std::string job = last.substr(0, last.find(';'));
  if (answer.code != 0 || job.empty() ||
      !std::all_of(job.begin(), job.end(), [](unsigned char c) { return std::isdigit(c); })) {
    throw ClusterFailure("Slurm takes no jobs: " + Shown(last));
  }
  // Without it nobody can take the jobs over, and they go on.
  WriteWhole(folder + "/job.json", nlohmann::ordered_json{{"job", job}}.dump());
  for (const auto& group : groups) {
    for (const std::size_t n : group) ++submitted_[n];
  }
  arrays_.push_back({job, std::move(groups)});
  return job;
}

// A result that was there before the task was submitted counts only if it is of what is asked for.
void SlurmBatch::TakeResult(std::size_t n) {
  if (ended_[n]) return;
  const Task& task = plan_.tasks[n];
  TaskResult result;
  if (!task.refused.empty()) {
    result.state = TaskResult::State::failed;
    result.record.error = task.refused;
    result.record.exit_code = task.refused_code;
  } else if (std::optional<Record> done = DoneRecord(plan_, task)) {
    result.state = submitted_[n] > 0 ? TaskResult::State::done : TaskResult::State::unchanged;
    result.record = *std::move(done);
  } else if (submitted_[n] > 0) {
    std::optional<Record> record = ReadRecord(plan_.FolderOf(task).record());
    if (!record || record->state != Record::State::failed || record->run != plan_.run) return;
    // What killed its program, such as too little memory, may not come again elsewhere.
    if (record->exit_code > 128 && submitted_[n] <= settings_.retries) {
      killed_[n] = record->error;
      // So that it isn't taken for the next try's.
      record->state = Record::State::begun;
      WriteWhole(plan_.FolderOf(task).record(), TextOf(*record));
      return;
    }
    result.state = TaskResult::State::failed;
    result.record = *record;
  } else {
    return;
  }
  ended_[n] = true;
  shares_[n] = 1;
  watcher_.Ended(n, result);
}

bool SlurmBatch::Look() {
  const Answer answer = Ask({"squeue", "--noheader", "--array", "--format=%F %K %T %r"});
  if (answer.code != 0) {
    if (++unanswered_ < kMostUnanswered) return false;
    throw ClusterFailure("Slurm doesn't answer: " +
                         (answer.lines.empty() ? "" : Shown(answer.lines.back())));
  }
  unanswered_ = 0;
  there_.clear();
  for (const std::string& line : answer.lines) {
    std::istringstream words(line);
    std::string job, state, reason;
    std::size_t index = 0;
    if (!(words >> job >> index >> state)) continue;
    std::getline(words, reason);
    // One that is held after it could not be started waits for an administrator.
    const bool is_held = state == "PENDING" && reason.find("eld") != std::string::npos;
    there_[{job, index}] = {!is_held, state == "RUNNING"};
  }
  return true;
}

// Jobs that the cluster has no more and that left no result are lost.
void SlurmBatch::Follow() {
  if (!Look()) return;
  working_ = 0;
  std::vector<std::vector<std::size_t>> again;
  for (Array& array : arrays_) {
    for (std::size_t g = 0; g < array.groups.size(); ++g) {
      auto& group = array.groups[g];
      const Element element = there_[{array.job, g}];
      // Of those that wait nothing is read: there may be thousands, on a disk that others use too.
      if (group.empty() || (element.is_there && !element.is_running)) continue;
      // What was there when the cluster was asked has left its result by now.
      for (const std::size_t n : group) TakeResult(n);
      std::erase_if(group, [this](std::size_t n) { return ended_[n]; });
      if (group.empty()) continue;
      if (element.is_running) {
        ++working_;
        for (const std::size_t n : group) {
          shares_[n] = std::max(shares_[n], ShareOf(plan_, plan_.tasks[n]));
        }
      }
      if (element.is_there) continue;
      std::vector<std::size_t> lost;
      for (const std::size_t n : group) {
        if (submitted_[n] <= settings_.retries) {
          lost.push_back(n);
          continue;
        }
        TaskResult result;
        result.record.error = killed_[n].empty()
                                  ? "was lost by the cluster " + std::to_string(submitted_[n]) +
                                        " times: its jobs ended without a result"
                                  : killed_[n];
        result.record.exit_code = kWorkCode;
        ended_[n] = true;
        watcher_.Ended(n, result);
      }
      group.clear();
      if (!lost.empty()) again.push_back(std::move(lost));
    }
  }
  if (again.empty()) return;
  std::size_t clips = 0;
  for (const auto& group : again) clips += group.size();
  watcher_.Note(std::to_string(clips) +
                (clips == 1 ? " clip was lost with its job or killed"
                            : " clips were lost with their jobs or killed") +
                ": submitted again as job " + Submit(std::move(again)));
}

void SlurmBatch::Cancel() {
  std::vector<std::string> words = {"scancel"};
  for (const Array& array : arrays_) words.push_back(array.job);
  if (words.size() > 1) Ask(std::move(words));
}

void SlurmBatch::Wait() {
  Clock::time_point looked = Clock::now();
  while (std::find(ended_.begin(), ended_.end(), false) != ended_.end()) {
    if (watcher_.Stops()) return Cancel();
    watcher_.Show(shares_, working_);
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    if (Clock::now() - looked < kBetweenLooks) continue;
    try {
      Follow();
    } catch (...) {
      Cancel();
      throw;
    }
    looked = Clock::now();
  }
  watcher_.Show(shares_, 0);
}

void RunGroup(const std::string& path, std::size_t group, int threads, TaskWatcher& watcher) {
  const auto json = ReadObject(path, kMostOfAll);
  if (!json) throw std::runtime_error(Shown(path) + ": is no plan of a batch");
  const Plan plan = PlanOf(json->at("plan").get<std::string>());
  for (const std::size_t n : json->at("groups").at(group).get<std::vector<std::size_t>>()) {
    const Task& task = plan.tasks.at(n);
    while (!watcher.Stops()) {
      if (RunTask(plan, task, threads, watcher).state != TaskResult::State::busy) break;
      std::this_thread::sleep_for(std::chrono::seconds(1));
    }
  }
}

}  // namespace calmframe::batch
