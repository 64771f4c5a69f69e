#include "apps/report/model_scores.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <iterator>
#include <limits>
#include <sstream>

#include "platform/tessel/debug.h"

namespace calmframe::report {

SolveLog::SolveLog() {
  tessel::debug::SetSink([this](const std::string& text) {
    const std::lock_guard lock(mutex_);
    text_ += text;
  });
}

SolveLog::~SolveLog() {
  tessel::debug::SetSink([](const std::string&) {});
}

std::vector<double> SolveLog::Scores(std::size_t frames) const {
  std::vector<double> scores(frames, std::numeric_limits<double>::quiet_NaN());
  const std::lock_guard lock(mutex_);
  std::istringstream lines(text_);
  for (std::string line; std::getline(lines, line);) {
    std::size_t frame = 0;
    double score = 0;
    if (std::sscanf(line.c_str(), "frame %zu: displacements %*d, models %*d, score %lf", &frame,
                    &score) == 2 &&
        frame < frames) {
      scores[frame] = score;
    }
  }
  return scores;
}

std::string ModelsText(const std::vector<double>& scores) {
  constexpr const char* kKinds[] = {"none", "shift", "shift, turn and size", "perspective",
                                    "bent grid"};
  std::size_t counts[std::size(kKinds)] = {};
  for (const double score : scores) {
    if (!std::isfinite(score)) continue;
    ++counts[std::clamp<int>(static_cast<int>(std::ceil(score - 1e-9)), 0, 4)];
  }
  std::string text;
  for (std::size_t kind = std::size(kKinds); kind-- > 0;) {
    if (counts[kind] == 0) continue;
    text += (text.empty() ? "" : "; ") + std::string(kKinds[kind]) + ": " +
            std::to_string(counts[kind]) + (counts[kind] == 1 ? " frame" : " frames");
  }
  return text;
}

}  // namespace calmframe::report
