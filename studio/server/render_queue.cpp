#include "studio/server/render_queue.h"

#include <algorithm>
#include <boost/asio/post.hpp>
#include <chrono>
#include <exception>
#include <filesystem>
#include <system_error>
#include <utility>

#include "host/base/json_depth.h"
#include "host/batch/child.h"

namespace calmframe::studio {
namespace {

constexpr std::size_t kMostJobs = 200;
constexpr std::size_t kMostNotes = 50;  // of a job

std::string Number(double value) {
  return nlohmann::json(value).dump();
}

// The same of what is shown as the page has it.
void AddWindowFlags(const host::WindowSettings& window, std::vector<std::string>& words) {
  using Kind = host::WindowSettings::Kind;
  if (window.kind != Kind::by_controls) {
    words.insert(words.end(), {"--window", window.kind == Kind::follow ? "follow" : "steady"});
  }
  if (window.most_zoom > 0) words.insert(words.end(), {"--zoom-at-most", Number(window.most_zoom)});
  if (window.zoom_speed) words.insert(words.end(), {"--zoom-speed", Number(*window.zoom_speed)});
  if (window.still == host::Still::background) {
    words.insert(words.end(), {"--steady", "background"});
  }
  if (window.still == host::Still::subject) words.insert(words.end(), {"--steady", "subject"});
  if (window.as_set) words.push_back("--as-set");
}

}  // namespace

struct RenderQueue::Job {
  RenderOrder order;
  std::uint64_t number = 0;
  std::string state = "waiting";
  double share = 0;
  nlohmann::json left = nullptr;
  std::string error;
  std::vector<std::string> notes;
  std::string project;
  std::shared_ptr<std::atomic<bool>> stops = std::make_shared<std::atomic<bool>>(false);
  std::thread thread;

  bool has_ended() const { return state == "done" || state == "failed" || state == "cancelled"; }
};

RenderQueue::RenderQueue(boost::asio::io_context& context, std::string program, std::string folder,
                         Save save, std::function<void()> changed)
    : context_(context),
      program_(std::move(program)),
      folder_(std::move(folder)),
      save_(std::move(save)),
      changed_(std::move(changed)) {}

RenderQueue::~RenderQueue() {
  for (const std::unique_ptr<Job>& job : jobs_) *job->stops = true;
  for (const std::unique_ptr<Job>& job : jobs_) {
    if (job->thread.joinable()) job->thread.join();
    std::error_code ignored;
    if (!job->project.empty()) std::filesystem::remove(job->project, ignored);
  }
}

std::string RenderQueue::ProjectOf(std::uint64_t number) const {
  return folder_ + "/render-" + std::to_string(number) + ".calm";
}

RenderQueue::Job* RenderQueue::Find(std::uint64_t number) const {
  for (const std::unique_ptr<Job>& job : jobs_) {
    if (job->number == number) return job.get();
  }
  return nullptr;
}

void RenderQueue::Add(RenderOrder order) {
  if (jobs_.size() >= kMostJobs) {
    const auto ended = std::find_if(jobs_.begin(), jobs_.end(), [](const auto& job) {
      return job->has_ended() && !job->thread.joinable();
    });
    if (ended == jobs_.end()) throw std::invalid_argument("too many renders are waiting");
    jobs_.erase(ended);
  }
  auto job = std::make_unique<Job>();
  job->order = std::move(order);
  job->number = ++numbers_;
  jobs_.push_back(std::move(job));
  Next();
  changed_();
}

void RenderQueue::Remove(std::uint64_t number) {
  Job* const job = Find(number);
  if (!job) return;
  if (job->state == "running") {
    *job->stops = true;
  } else if (job->state == "waiting" || job->state == "saving") {
    job->state = "cancelled";
  } else {
    std::erase_if(jobs_, [job](const auto& other) { return other.get() == job; });
  }
  Next();
  changed_();
}

bool RenderQueue::Needs(const std::string& clip) const {
  return std::any_of(jobs_.begin(), jobs_.end(), [&clip](const auto& job) {
    return job->order.clip == clip && (job->state == "waiting" || job->state == "saving");
  });
}

void RenderQueue::Next() {
  Job* next = nullptr;
  for (const std::unique_ptr<Job>& job : jobs_) {
    if (job->state == "running" || job->state == "saving") return;
    if (!next && job->state == "waiting") next = job.get();
  }
  if (!next) return;
  next->state = "saving";
  next->project = ProjectOf(next->number);
  save_(next->order.clip, next->project,
        [this, number = next->number](const std::string& error, const Settings& settings) {
          Job* const job = Find(number);
          if (!job || job->state != "saving") {  // nobody waits for it any more
            std::error_code ignored;
            std::filesystem::remove(ProjectOf(number), ignored);
            return;
          }
          if (!error.empty()) {
            job->state = "failed";
            job->error = error;
            Next();
          } else {
            Run(*job, settings);
          }
          changed_();
        });
}

void RenderQueue::Run(Job& job, const Settings& settings) {
  job.state = "running";
  std::vector<std::string> words = {program_,
                                    "render",
                                    "--project",
                                    job.project,
                                    "--json",
                                    "--crf",
                                    std::to_string(job.order.crf)};
  if (!job.order.codec.empty()) words.insert(words.end(), {"--codec", job.order.codec});
  if (job.order.overwrite) words.push_back("--overwrite");
  if (!job.order.from.empty()) words.insert(words.end(), {"--from", job.order.from});
  if (!job.order.to.empty()) words.insert(words.end(), {"--to", job.order.to});
  AddWindowFlags(settings.window, words);
  words.push_back(job.order.output);
  job.thread = std::thread([this, words, number = job.number, stops = job.stops] {
    int code = 127;
    try {
      batch::Child child(words);
      using Clock = std::chrono::steady_clock;
      constexpr std::chrono::seconds kUntilKilled(20);
      std::string line;
      std::optional<Clock::time_point> stopped;
      while (true) {
        const batch::Child::Said said = child.Next(line, 100);
        if (*stops) {
          child.AskToEnd();
          if (!stopped) stopped = Clock::now();
          if (Clock::now() - *stopped > kUntilKilled) break;
        }
        if (said == batch::Child::Said::end) break;
        if (said != batch::Child::Said::line) continue;
        boost::asio::post(context_, [this, number, line] { Heard(number, line); });
      }
      child.Kill();  // see WorkerProcess::Start
      code = child.Wait();
    } catch (const std::exception& error) {
      const nlohmann::json told = {{"error", error.what()}};
      boost::asio::post(context_, [this, number, line = told.dump()] { Heard(number, line); });
    }
    boost::asio::post(context_, [this, number, code] { Ended(number, code); });
  });
}

void RenderQueue::Heard(std::uint64_t number, const std::string& line) {
  Job* const job = Find(number);
  if (!job) return;
  const nlohmann::json told =
      NestsTooDeep(line) ? nullptr : nlohmann::json::parse(line, nullptr, false);
  if (!told.is_object()) {
    job->error = line;
    return;
  }
  try {
    if (told.contains("error")) job->error = told["error"].get<std::string>();
    if (told.contains("warning") && job->notes.size() < kMostNotes) {
      job->notes.push_back(told["warning"].get<std::string>());
    }
    if (told.value("stage", "") == "rendering") {
      job->share = std::clamp(told.value("share", 0.0), 0.0, 1.0);
      const double elapsed = told.value("elapsed", 0.0);
      job->left = nullptr;
      if (job->share > 0.02) job->left = elapsed * (1 - job->share) / job->share;
    }
  } catch (const nlohmann::json::exception&) {  // of a program that a clip has taken over
  }
  changed_();
}

void RenderQueue::Ended(std::uint64_t number, int code) {
  Job* const job = Find(number);
  if (!job) return;
  if (job->thread.joinable()) job->thread.join();
  std::error_code ignored;
  std::filesystem::remove(job->project, ignored);
  job->left = nullptr;
  if (code == 0) {
    job->state = "done";
    job->share = 1;
    job->error.clear();
  } else if (*job->stops) {
    job->state = "cancelled";
    job->error.clear();
  } else {
    job->state = "failed";
    if (job->error.empty()) {
      job->error = code > 128 ? "the render crashed (signal " + std::to_string(code - 128) + ")"
                              : "the render ended with code " + std::to_string(code);
    }
  }
  Next();
  changed_();
}

nlohmann::json RenderQueue::State() const {
  nlohmann::json list = nlohmann::json::array();
  for (const std::unique_ptr<Job>& job : jobs_) {
    list.push_back({{"number", job->number},
                    {"clip", job->order.clip},
                    {"name", job->order.name},
                    {"output", job->order.output},
                    {"state", job->state},
                    {"share", job->share},
                    {"left", job->left},
                    {"error", job->error},
                    {"notes", job->notes}});
  }
  return list;
}

}  // namespace calmframe::studio
