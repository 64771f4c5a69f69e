#include "studio/server/render_queue.h"

#include <algorithm>
#include <filesystem>
#include <system_error>
#include <utility>

#include "studio/server/program_run.h"

namespace calmframe::studio {
namespace {

constexpr std::size_t kMostJobs = 200;
constexpr std::size_t kMostNotes = 50, kLongestNote = 2000;  // of a job

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
  std::unique_ptr<ProgramRun> run;

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
  for (const std::unique_ptr<Job>& job : jobs_) {
    job->run.reset();
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
    const auto ended =
        std::find_if(jobs_.begin(), jobs_.end(), [](const auto& job) { return job->has_ended(); });
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
    job->run->Stop();
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
  const media::EncodeSettings& encode = job.order.encode;
  std::vector<std::string> words = {
      program_, "render", "--project", job.project, "--json", "--crf", std::to_string(encode.crf)};
  // One word each: what is set may begin as a flag does.
  const auto add = [&words](const std::string& flag, const std::string& value) {
    if (!value.empty()) words.push_back(flag + "=" + value);
  };
  add("--codec", encode.codec);
  add("--preset", encode.preset);
  for (const std::string& option : encode.options) add("--encoder-option", option);
  add("--from", job.order.from);
  add("--to", job.order.to);
  if (encode.overwrite) words.push_back("--overwrite");
  AddWindowFlags(settings.window, words);
  words.push_back(job.order.output);
  const std::uint64_t number = job.number;
  try {
    job.run = std::make_unique<ProgramRun>(
        context_, std::move(words),
        ProgramRun::Events{[this, number](const nlohmann::json& told) { Heard(number, told); },
                           [this, number](const std::string& error) { Ended(number, error); }});
  } catch (const std::system_error& error) {  // no thread is left
    Ended(number, error.what());
  }
}

void RenderQueue::Heard(std::uint64_t number, const nlohmann::json& told) {
  Job* const job = Find(number);
  if (!job) return;
  if (told.contains("warning") && job->notes.size() < kMostNotes) {
    job->notes.push_back(told["warning"].get<std::string>().substr(0, kLongestNote));
  }
  if (told.value("stage", "") == "rendering") {
    job->share = std::clamp(told.value("share", 0.0), 0.0, 1.0);
    const double elapsed = told.value("elapsed", 0.0);
    job->left = nullptr;
    if (job->share > 0.02) job->left = elapsed * (1 - job->share) / job->share;
  }
  changed_();
}

void RenderQueue::Ended(std::uint64_t number, const std::string& error) {
  Job* const job = Find(number);
  if (!job) return;
  const bool stopped = job->run && job->run->is_stopped();
  job->run.reset();
  std::error_code ignored;
  std::filesystem::remove(job->project, ignored);
  job->left = nullptr;
  if (error.empty()) {
    job->state = "done";
    job->share = 1;
  } else if (stopped) {
    job->state = "cancelled";
  } else {
    job->state = "failed";
    job->error = error;
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
