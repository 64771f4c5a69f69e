#include "apps/calmframe/progress_line.h"

#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <csignal>
#include <cstdio>

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

}  // namespace

void CatchInterrupts() {
  std::signal(SIGINT, OnInterrupt);
  std::signal(SIGTERM, OnInterrupt);
}

bool InterruptAsked() {
  return interrupt_asked != 0;
}

std::string ProgressText(const std::string& stage, double done, double total,
                         const std::string& unit, double elapsed_seconds) {
  const double share = total > 0 ? std::clamp(done / total, 0.0, 1.0) : 1.0;
  char text[160];
  int length = std::snprintf(text, sizeof text, "%-10s %3.0f %%", stage.c_str(), 100 * share);
  const auto add = [&](const auto&... values) {
    length +=
        std::snprintf(text + length, sizeof text - static_cast<std::size_t>(length), values...);
  };
  if (!unit.empty()) {
    add("  %.0f/%.0f %s", done, total, unit.c_str());
    if (done > 0 && elapsed_seconds > 0) add("  %.1f %s/s", done / elapsed_seconds, unit.c_str());
  }
  if (share >= 1.0) {
    add("  in %s", Clock(elapsed_seconds).c_str());
  } else if (share > 0.0) {
    add("  %s left", Clock(elapsed_seconds * (1 - share) / share).c_str());
  }
  return text;
}

ProgressLine::ProgressLine(bool quiet) : quiet_(quiet), terminal_(isatty(STDERR_FILENO) != 0) {}

ProgressLine::~ProgressLine() {
  if (line_open_) std::fputc('\n', stderr);
}

void ProgressLine::Progress(const char* stage, double done, double total, const char* unit) {
  if (quiet_) return;
  const auto now = std::chrono::steady_clock::now();
  const bool begins = stage_ != stage;
  const bool ends = done >= total;
  if (begins) {
    stage_ = stage;
    stage_begin_ = now;
  }
  constexpr std::chrono::milliseconds kBetween(100);  // faster than that nobody reads
  if (!begins && !ends && (!terminal_ || now - last_shown_ < kBetween)) return;
  last_shown_ = now;
  const double elapsed = std::chrono::duration<double>(now - stage_begin_).count();
  Show(ProgressText(stage, done, total, unit, elapsed), ends);
  if (ends) stage_.clear();
}

bool ProgressLine::Cancelled() {
  return InterruptAsked();
}

void ProgressLine::Warn(const std::string& line) {
  if (line_open_) std::fputc('\n', stderr);
  line_open_ = false;
  std::fprintf(stderr, "calmframe: %s\n", line.c_str());
}

void ProgressLine::Show(const std::string& text, bool last) {
  if (terminal_) {
    std::fprintf(stderr, "\r%s\033[K%s", text.c_str(), last ? "\n" : "");
    line_open_ = !last;
  } else {
    std::fprintf(stderr, "%s\n", text.c_str());
  }
  std::fflush(stderr);
}

}  // namespace calmframe
