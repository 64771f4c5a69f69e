#pragma once

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

#include "host/effects/timeline_effect.h"

namespace calmframe::host {

// Keeps an analysis in a project's file while it is under way, each piece in a transaction of its
// own: whatever ends the program or the machine, the pieces that are there are whole. A project
// that is saved has none any more. A file that is not there is made, and holds no work yet. Where a
// piece can't be kept, nothing is kept from there on; the work is not disturbed.
class ProjectKeeper final : public AnalysisKeeper {
 public:
  // `start_frame`: of the layer that is analysed. Pieces lie at least `apart` from each other, and
  // so far that keeping them takes at most a fiftieth of the time.
  ProjectKeeper(std::string path, std::int32_t start_frame,
                std::chrono::milliseconds apart = std::chrono::seconds(5));

  bool Wants() noexcept override;
  void Keep(std::size_t number, const std::uint8_t* bytes, std::size_t size) noexcept override;
  const std::vector<std::uint8_t>* Find(std::size_t number) noexcept override;

 private:
  using Clock = std::chrono::steady_clock;

  const std::string path_;
  const std::int64_t start_frame_;
  const Clock::duration apart_;
  Clock::time_point next_;
  bool failed_ = false;
  std::vector<std::uint8_t> found_;
};

// False of a file of saved work that has none yet, but of an analysis that was stopped. What is no
// such file, and what can't be read, holds work: who loads it is told why not.
bool HoldsWork(const std::string& path);

}  // namespace calmframe::host
