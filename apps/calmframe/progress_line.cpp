#include "apps/calmframe/progress_line.h"

#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <csignal>
#include <cstdio>
#include <nlohmann/json.hpp>

#include "host/base/shown_text.h"

namespace calmframe {
namespace {

volatile std::sig_atomic_t interrupt_asked = 0;

void OnInterrupt(int signal) {
  interrupt_asked = 1;
  std::signal(signal, SIG_DFL);
}

std::string Clock(double seconds) {
  const long whole = std::lround(seconds);
  char text[32];
  if (whole >= 3600) {
    std::snprintf(text, sizeof text, "%ld:%02ld:%02ld", whole / 3600, whole / 60 % 60, whole % 60);
  } else {
    std::snprintf(text, sizeof text, "%ld:%02ld", whole / 60, whole % 60);
  }
  return text;
}

double ShareOf(const Progress& progress) {
  if (progress.ends) return 1;
  return progress.total > 0 ? std::clamp(progress.done / progress.total, 0.0, 1.0) : 0;
}

}  // namespace

void CatchInterrupts() {
  std::signal(SIGINT, OnInterrupt);
  std::signal(SIGTERM, OnInterrupt);
  // nohup wants the program to go on.
  if (std::signal(SIGHUP, OnInterrupt) == SIG_IGN) std::signal(SIGHUP, SIG_IGN);
}

bool InterruptAsked() {
  return interrupt_asked != 0;
}

std::string JsonLine(const nlohmann::ordered_json& json) {
  return json.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace);
}

std::string ProgressText(const Progress& progress, double elapsed_seconds) {
  const double share = ShareOf(progress);
  char text[256];
  int length = std::snprintf(text, sizeof text, "%-10s ", progress.stage.c_str());
  const auto add = [&](const auto&... values) {
    const std::size_t room = sizeof text - static_cast<std::size_t>(length);
    length += std::min(std::snprintf(text + length, room, values...), static_cast<int>(room) - 1);
  };
  const bool counts = !progress.unit.empty() && progress.total > 0;
  const bool says = !progress.says.empty() && !progress.ends;
  if (says) {
    add("%s", progress.says.c_str());
  } else {
    add("%3.0f %%", 100 * share);
    if (counts) add("  %.0f/%.0f %s", progress.done, progress.total, progress.unit.c_str());
  }
  if (counts && progress.done > 0 && elapsed_seconds > 0) {
    add("  %.1f %s/s", progress.done / elapsed_seconds, progress.unit.c_str());
  }
  if (progress.ends) {
    add("  in %s", Clock(elapsed_seconds).c_str());
  } else if (!progress.lasts && share > 0.0 && share < 1.0) {
    add("  %s left", Clock(elapsed_seconds * (1 - share) / share).c_str());
  }
  return text;
}

std::string ProgressJson(const Progress& progress, double elapsed_seconds, std::size_t shot) {
  nlohmann::ordered_json json;
  if (shot > 0) json["shot"] = shot;
  json["stage"] = progress.stage;
  if (progress.ends || progress.total > 0) json["share"] = ShareOf(progress);
  if (!progress.unit.empty() && progress.total > 0) {
    json["done"] = progress.done;
    json["total"] = progress.total;
    json["unit"] = progress.unit;
  }
  if (!progress.says.empty()) json["says"] = progress.says;
  if (progress.ends) json["ended"] = true;
  json["elapsed"] = std::round(elapsed_seconds * 1000) / 1000;
  return JsonLine(json);
}

ProgressLine::ProgressLine(Form form) : form_(form), terminal_(isatty(STDERR_FILENO) != 0) {}

ProgressLine::~ProgressLine() {
  if (line_open_) std::fputc('\n', stderr);
}

void ProgressLine::Show(const Progress& progress) {
  const auto now = std::chrono::steady_clock::now();
  const bool begins = stage_ != progress.stage;
  if (begins) {
    stage_ = progress.stage;
    stage_begin_ = now;
  }
  const double elapsed = std::chrono::duration<double>(now - stage_begin_).count();
  if (progress.ends) seconds_.emplace_back(progress.stage, elapsed);
  if (form_ == Form::none || form_ == Form::json_end) {
    if (progress.ends) stage_.clear();
    return;
  }
  constexpr std::chrono::milliseconds kBetween(100);  // faster than that nobody reads
  const bool flows = terminal_ || form_ == Form::json;
  const bool is_due = flows && (progress.lasts || now - last_shown_ >= kBetween);
  if (!begins && !progress.ends && !is_due) return;
  last_shown_ = now;
  if (form_ == Form::json) {
    std::fprintf(stderr, "%s\n", ProgressJson(progress, elapsed, shot_).c_str());
  } else {
    Write(Prefix() + ProgressText(progress, elapsed), progress.ends);
  }
  if (progress.ends) stage_.clear();
}

std::string ProgressLine::Prefix() const {
  return shot_ > 0 ? "shot " + std::to_string(shot_) + ": " : "";
}

void ProgressLine::Warn(const std::string& line) {
  if (warned_.insert(Prefix() + line).second) Tell("warning", Prefix() + line);
}

bool ProgressLine::Stops() {
  return InterruptAsked();
}

void ProgressLine::Note(const std::string& line) {
  if (form_ == Form::line || form_ == Form::json) Tell("note", Prefix() + line);
}

void ProgressLine::Item(const std::string& line, const nlohmann::ordered_json& object,
                        bool matters) {
  if (form_ == Form::json || form_ == Form::json_end) {
    std::fprintf(stderr, "%s\n", JsonLine(object).c_str());
  } else if (matters || form_ == Form::line) {
    Tell("", line);
  }
}

void ProgressLine::End(const std::string& line, nlohmann::ordered_json object) {
  nlohmann::ordered_json sums = nlohmann::ordered_json::object();
  for (const auto& [stage, seconds] : seconds_) sums[stage] = sums.value(stage, 0.0) + seconds;
  std::string stages;
  for (auto& [stage, sum] : sums.items()) {
    const double seconds = std::round(sum.get<double>() * 1000) / 1000;
    sum = seconds;
    char text[32];
    std::snprintf(text, sizeof text, " %.1f s", seconds);
    stages += (stages.empty() ? "" : ", ") + stage + text;
  }
  object["seconds"] = sums;
  if (form_ == Form::line) {
    Note(line + (stages.empty() ? "" : " (" + stages + ")"));
  } else if (form_ != Form::none) {
    std::fprintf(stderr, "%s\n", JsonLine(object).c_str());
  }
}

void ProgressLine::Tell(const char* key, const std::string& line) {
  if (line_open_) std::fputc('\n', stderr);
  line_open_ = false;
  if (form_ == Form::json || form_ == Form::json_end) {
    std::fprintf(stderr, "%s\n", JsonLine({{key, line}}).c_str());
  } else {
    std::fprintf(stderr, "calmframe: %s\n", Shown(line).c_str());
  }
}

void ProgressLine::Write(const std::string& text, bool last) {
  if (terminal_) {
    std::fprintf(stderr, "\r%s\033[K%s", text.c_str(), last ? "\n" : "");
    line_open_ = !last;
  } else {
    std::fprintf(stderr, "%s\n", text.c_str());
  }
  std::fflush(stderr);
}

}  // namespace calmframe
