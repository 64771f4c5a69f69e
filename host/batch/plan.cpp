#include "host/batch/plan.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <map>
#include <nlohmann/json.hpp>
#include <random>
#include <set>
#include <system_error>
#include <utility>

#include "host/base/json_bounds.h"
#include "host/base/shown_text.h"
#include "host/batch/child.h"
#include "host/batch/machine.h"
#include "host/media/clip.h"
#include "host/media/glance.h"
#include "platform/tessel/threads.h"

namespace calmframe::batch {
namespace {

namespace fs = std::filesystem;

// Measured peaks, rounded up: of the program with few frames, of frames under way, and of what the
// analysis and the solve keep of each frame.
constexpr double kProgramBytes = 160 << 20, kBytesAPixel = 200, kBytesAFrame = 100 << 10;

void Refuse(Task& task, const std::string& why, int code) {
  task.refused = why;
  task.refused_code = code;
}

// Of a clip that doesn't tell.
constexpr media::Glance kUnknown = {1920, 1080, 1000};

void Expect(const media::Glance& clip, Task& task) {
  const double frames = clip.frames > 0 ? clip.frames : kUnknown.frames;
  task.cost = frames * clip.width * clip.height;
  task.memory = ExpectedMemory(clip.width, clip.height, frames);
}

// What a process says of a clip. It reads what strangers made, so it isn't believed all.
void Take(const nlohmann::ordered_json& json, Task& task) try {
  if (json.contains("refused")) {
    // Its name as it was asked for stands before all that is told of it.
    const std::string why = BytesOf(json["refused"]), begin = task.source + ": ";
    Refuse(task, Shown(why.starts_with(begin) ? why.substr(begin.size()) : why), kInputCode);
    return;
  }
  const media::Glance clip{json.value("width", 0), json.value("height", 0),
                           json.value("frames", 0.0)};
  constexpr int kMostSide = 1 << 20;
  constexpr double kMostFrames = 1e9;
  if (clip.width > 0 && clip.width < kMostSide && clip.height > 0 && clip.height < kMostSide &&
      clip.frames < kMostFrames) {
    Expect(clip, task);
  }
} catch (const nlohmann::json::exception&) {  // of another shape: it stays unknown
}

// Clips that one process looks at: its start takes as long as some tens of them.
constexpr std::size_t kFewAPart = 32, kMostAPart = 256;

// Takes what a process of its own says of the clips, a line each: how many it came to.
std::size_t Glances(const std::string& program, const std::vector<Task*>& tasks,
                    const std::function<bool()>& stops) try {
  std::vector<std::string> words = {program, kGlancesCommand};
  for (const Task* task : tasks) words.push_back(task->source);
  Child child(words);
  std::size_t done = 0;
  std::string line;
  while (done < tasks.size()) {
    constexpr int kPatience = 100;  // ms
    const Child::Said said = child.Next(line, kPatience);
    if (said == Child::Said::end || stops()) break;
    if (said == Child::Said::nothing) continue;
    if (ExceedsBounds(line)) continue;
    const auto json = nlohmann::ordered_json::parse(line, nullptr, false);
    if (!json.is_object()) continue;  // what a library says
    Take(json, *tasks[done++]);
  }
  return done;
} catch (const std::system_error&) {
  return tasks.size();  // it can't be started; what comes of it is told by the clips' own runs
}

std::optional<std::pair<dev_t, ino_t>> FileAt(const std::string& path) {
  struct stat status;
  if (stat(path.c_str(), &status) != 0) return std::nullopt;
  return std::pair(status.st_dev, status.st_ino);
}

}  // namespace

std::string NewRun() {
  std::random_device random;
  char name[33];
  std::snprintf(name, sizeof name, "%08x%08x%08x%08x", random(), random(), random(), random());
  return name;
}

void AddTasks(const std::vector<FoundClip>& clips, const std::string& name_template, Plan& plan) {
  constexpr std::size_t kLongestName = 255 - 5;  // bytes, on most file systems, with ".html" behind
  std::map<std::string, std::size_t> users;      // of an output
  std::set<std::pair<dev_t, ino_t>> sources;
  for (const FoundClip& clip : clips) {
    Task task;
    task.clip = clip.name;
    if (!clip.trouble.empty()) {
      Refuse(task, clip.trouble, kInputCode);
    } else {
      task.source = fs::absolute(clip.name).lexically_normal().string();
      task.output = OutputName(name_template, clip.below, clip.name);
      ++users[task.output];
      if (const auto file = FileAt(task.source)) sources.insert(*file);
    }
    plan.tasks.push_back(std::move(task));
  }
  for (Task& task : plan.tasks) {
    if (!task.refused.empty()) continue;
    const auto there = FileAt(plan.OutputOf(task));
    if (users[task.output] > 1) {
      Refuse(task,
             std::to_string(users[task.output]) + " clips would be written to " +
                 Shown(task.output) + "; another --name or --to keeps them apart",
             kOutputCode);
    } else if (there && sources.count(*there) > 0) {
      Refuse(task, "would be written over " + Shown(task.output) + ", which is an input",
             kOutputCode);
    } else if (fs::path(task.output).filename().native().size() > kLongestName) {
      Refuse(task,
             "its output's name would be longer than " + std::to_string(kLongestName) + " bytes",
             kOutputCode);
    }
  }
}

std::optional<Record> DoneRecord(const Plan& plan, const Task& task) {
  std::optional<Record> record = ReadRecord(plan.FolderOf(task).record());
  if (!record || record->state != Record::State::done || record->source != task.source ||
      record->settings != plan.SettingsOf(task) || !record->output_identity ||
      IdentityOf(task.source) != record->source_identity ||
      IdentityOf(plan.OutputOf(task)) != record->output_identity) {
    return std::nullopt;
  }
  return record;
}

std::int64_t ExpectedMemory(double width, double height, double frames) {
  constexpr double kDecodedBytesAPixel = 1.5;  // 4:2:0 of 8 bits
  const double pixels = width * height;
  const double kept =
      std::min(static_cast<double>(MostKept(pixels, false)), kDecodedBytesAPixel * pixels * frames);
  return static_cast<std::int64_t>(kProgramBytes + kBytesAPixel * pixels + kBytesAFrame * frames +
                                   kept);
}

std::string GlanceText(const std::string& path) {
  nlohmann::ordered_json json;
  try {
    const media::Glance clip = media::GlanceAt(path);
    json = {{"width", clip.width}, {"height", clip.height}, {"frames", clip.frames}};
  } catch (const media::Failure& failure) {
    json["refused"] = JsonOfBytes(failure.what());
  }
  return json.dump();
}

void Appraise(Plan& plan, const std::function<bool()>& stops) {
  std::vector<Task*> tasks;
  for (Task& task : plan.tasks) {
    if (!task.refused.empty() || stops() || DoneRecord(plan, task)) continue;
    Expect(kUnknown, task);
    tasks.push_back(&task);
  }
  const std::size_t parts =
      std::max<std::size_t>((tasks.size() + kMostAPart - 1) / kMostAPart,
                            std::min(tasks.size() / kFewAPart + 1, std::size_t{16}));
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t part) {
        std::vector<Task*> mine;
        for (std::size_t n = part; n < tasks.size(); n += parts) mine.push_back(tasks[n]);
        std::size_t done = 0;
        while (done < mine.size() && !stops()) {
          // One that ended early had trouble with the next, which comes up again in its own run.
          done += Glances(plan.program,
                          {mine.begin() + static_cast<std::ptrdiff_t>(done), mine.end()}, stops) +
                  1;
        }
      },
      parts);
}

std::string TextOf(const Plan& plan) {
  nlohmann::ordered_json json;
  json["run"] = plan.run;
  json["program"] = JsonOfBytes(plan.program);
  json["folder"] = JsonOfBytes(plan.folder);
  auto& settings = json["settings"] = nlohmann::ordered_json::array();
  for (const std::string& word : plan.settings) settings.push_back(JsonOfBytes(word));
  json["overwrites"] = plan.overwrites;
  json["reports"] = plan.reports;
  auto& tasks = json["tasks"] = nlohmann::ordered_json::array();
  for (const Task& task : plan.tasks) {
    tasks.push_back({{"clip", JsonOfBytes(task.clip)},
                     {"source", JsonOfBytes(task.source)},
                     {"output", JsonOfBytes(task.output)},
                     {"cost", task.cost},
                     {"memory", task.memory}});
    if (task.words.empty()) continue;
    auto& words = tasks.back()["words"] = nlohmann::ordered_json::array();
    for (const std::string& word : task.words) words.push_back(JsonOfBytes(word));
    tasks.back()["is_piece"] = task.is_piece;
  }
  return json.dump(1) + "\n";
}

Plan PlanOf(const std::string& text) {
  const auto json = nlohmann::ordered_json::parse(text);
  Plan plan;
  plan.run = json.at("run").get<std::string>();
  plan.program = BytesOf(json.at("program"));
  plan.folder = BytesOf(json.at("folder"));
  for (const auto& word : json.at("settings")) plan.settings.push_back(BytesOf(word));
  plan.overwrites = json.at("overwrites").get<bool>();
  plan.reports = json.at("reports").get<bool>();
  for (const auto& entry : json.at("tasks")) {
    Task task;
    task.clip = BytesOf(entry.at("clip"));
    task.source = BytesOf(entry.at("source"));
    task.output = BytesOf(entry.at("output"));
    task.cost = entry.at("cost").get<double>();
    task.memory = WholeOf(entry.at("memory"));
    if (entry.contains("words")) {
      for (const auto& word : entry.at("words")) task.words.push_back(BytesOf(word));
      task.is_piece = entry.at("is_piece").get<bool>();
    }
    plan.tasks.push_back(std::move(task));
  }
  return plan;
}

}  // namespace calmframe::batch
