#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "host/batch/clip_search.h"
#include "host/batch/record.h"
#include "host/batch/task_folder.h"

namespace calmframe::batch {

// The program's exit codes that stand in records.
constexpr int kUsageCode = 2, kInputCode = 3, kOutputCode = 4, kWorkCode = 5;

// Stands in a task's words for the file that it writes.
inline constexpr char kOutputWord[] = "{output}";

// One clip -> one output, with its project beside it.
struct Task {
  std::string clip = {};    // as whoever asked for it calls it
  std::string source = {};  // absolute
  std::string output = {};  // to the plan's folder
  // Of one that can't be begun: why, in words, and the exit code that it stands for.
  std::string refused = {};
  int refused_code = 0;
  // What the program is to do of it, in place of steadying it: a command and its words.
  std::vector<std::string> words = {};
  bool is_piece = false;  // of a film's work: its words are its settings, and nobody looks at it
  // What it is expected to take, by what its container says: the pixels of all frames, and bytes.
  double cost = 0;
  std::int64_t memory = 0;
};

// Unique among runs on all machines, letters and digits.
std::string NewRun();

// Clips that are steadied with the same settings to one folder.
struct Plan {
  std::string run = NewRun();  // a name of its own, for what it leaves
  std::string program = {};    // absolute
  std::string folder = {};     // absolute
  // Flags of `stabilize`, "--name" or "--name=value", sorted.
  std::vector<std::string> settings = {};
  bool overwrites = false;  // files that are not of an earlier batch
  bool reports = false;     // a page is made of each clip
  std::vector<Task> tasks = {};

  std::string OutputOf(const Task& task) const { return folder + "/" + task.output; }
  std::string ProjectOf(const Task& task) const { return OutputOf(task) + ".calm"; }
  std::string ReportOf(const Task& task) const { return OutputOf(task) + ".html"; }
  const std::vector<std::string>& SettingsOf(const Task& task) const {
    return task.is_piece ? task.words : settings;
  }
  TaskFolder FolderOf(const Task& task) const { return {folder, task.output}; }
};

// Gives `plan`, which has a folder, its tasks. Those whose output would be another's, or an input,
// are refused.
void AddTasks(const std::vector<FoundClip>& clips, const std::string& name_template, Plan& plan);

// The record of what is done, with these settings, of what the clip is now, and stands unchanged;
// none where there is something to do.
std::optional<Record> DoneRecord(const Plan& plan, const Task& task);

// Looks at the clips of all tasks that are left to do for what they are expected to take; those
// that can't be opened are refused. It is processes of the plan's program that open them, some at a
// time: none of them brings this one down. Once `stops` is true, no more of them.
void Appraise(Plan& plan, const std::function<bool()>& stops);

// The program's command that such a process runs, with the clips behind it, and the line that it
// writes of each in turn: a JSON object of media::Glance, or with "refused", which says why.
inline constexpr char kGlancesCommand[] = "batch-glances";
std::string GlanceText(const std::string& path);

// Bytes at the peak, from frames of that size and number.
std::int64_t ExpectedMemory(double width, double height, double frames);

// As text, for other machines. Throws nlohmann::json::exception where it is none.
std::string TextOf(const Plan& plan);
Plan PlanOf(const std::string& text);

}  // namespace calmframe::batch
