#pragma once

#include <chrono>
#include <cstddef>
#include <nlohmann/json_fwd.hpp>
#include <optional>
#include <string>
#include <vector>

#include "apps/calmframe/progress_line.h"
#include "host/batch/local_batch.h"

namespace calmframe {

// Tells how a batch goes and, at its end, what became of it: lines, a table, a page.
class BatchResults final : public batch::BatchWatcher {
 public:
  BatchResults(const batch::Plan& plan, ProgressLine& progress);

  void Show(const std::vector<double>& shares, std::size_t working) override;
  void Ended(std::size_t task, const batch::TaskResult& result) override;
  void Note(const std::string& line) override { progress_.Note(line); }
  bool Stops() override { return progress_.Stops(); }

  std::size_t failed() const { return Count(batch::TaskResult::State::failed); }
  std::size_t ended() const;
  // The last line, and the object for programs.
  void Tell();
  // A row a clip, in the order of the plan.
  std::string Table() const;
  // The same as a page in the plan's folder, with pictures and links. Throws media::Failure.
  void WritePage() const;

 private:
  std::size_t Count(batch::TaskResult::State state) const;
  double WorkOf(std::size_t task) const;

  const batch::Plan& plan_;
  ProgressLine& progress_;
  std::vector<std::optional<batch::TaskResult>> results_;  // a task each
};

}  // namespace calmframe
