#include "host/shots/shot_finder.h"

#include <algorithm>
#include <optional>
#include <utility>

#include "host/shots/cut_rule.h"
#include "host/shots/dissolve_search.h"
#include "host/shots/fade_watch.h"
#include "host/shots/frame_history.h"

namespace calmframe::host {

class ShotFinder::Search {
 public:
  explicit Search(const Settings& settings)
      : dissolves_(settings.frames_per_second),
        fades_(settings.frames_per_second),
        history_(static_cast<std::size_t>(std::max(dissolves_.memory(), fades_.memory())) +
                 kCutLag) {}

  void Add(const FrameDigest& digest) {
    history_.Add(digest);
    std::int64_t first = 0;
    for (const ShotBorder& border : lately_) first = std::max(first, border.frame);
    KeepFade(fades_.Next(history_, first));
    while (next_cut_ + kCutLag <= history_.end()) LookForCut();
    while (next_mixture_ + dissolves_.reach() + kCutLag < history_.end()) LookForMixture();
  }

  void Finish() {
    while (next_cut_ < history_.end()) LookForCut();
    KeepFade(fades_.Finish(history_, history_.end()));
    SettleMixtures(history_.end());
  }

  std::vector<ShotBorder> Take() {
    std::sort(told_.begin(), told_.end(),
              [](const ShotBorder& a, const ShotBorder& b) { return a.frame < b.frame; });
    return std::exchange(told_, {});
  }

 private:
  void LookForCut() {
    const std::int64_t frame = next_cut_++;
    if (frame == 0) return;
    if (const std::optional<double> confidence = CutAt(history_, frame)) {
      KeepFade(fades_.Finish(history_, frame));
      SettleMixtures(frame);
      Keep(ShotBorder{frame, frame, frame, ShotBorder::Kind::cut, *confidence});
    }
  }

  // Borders are told in their order: what lies before one is decided first. No frame behind that
  // one says anything about it.
  void KeepFade(const std::optional<ShotBorder>& border) {
    if (!border) return;
    SettleMixtures(border->first);
    Keep(border);
  }
  void SettleMixtures(std::int64_t end) {
    while (next_mixture_ < end) LookForMixture(end);
    Keep(dissolves_.Finish(history_));
  }

  void LookForMixture() { LookForMixture(history_.end()); }
  void LookForMixture(std::int64_t end) {
    const std::int64_t frame = next_mixture_++;
    std::int64_t first = 0;
    for (const ShotBorder& border : lately_) {
      if (border.kind == ShotBorder::Kind::dissolve) continue;
      if (border.last < frame) first = std::max(first, border.last);
      if (border.first > frame) end = std::min(end, border.first);
      if (border.first <= frame && frame <= border.last) return;
    }
    Keep(dissolves_.Next(history_, frame, first, end));
  }

  // Unless it lies in one that was told.
  void Keep(const std::optional<ShotBorder>& border) {
    if (!border) return;
    for (const ShotBorder& other : lately_) {
      if (border->first <= other.last && other.first <= border->last) return;
    }
    told_.push_back(*border);
    lately_.push_back(*border);
    std::erase_if(lately_, [this](const ShotBorder& old) { return old.last < history_.first(); });
  }

  DissolveSearch dissolves_;
  FadeWatch fades_;
  FrameHistory history_;
  std::int64_t next_cut_ = 0, next_mixture_ = 0;
  std::vector<ShotBorder> told_;    // not taken yet
  std::vector<ShotBorder> lately_;  // of the frames in the history
};

ShotFinder::ShotFinder(const Settings& settings) : search_(std::make_unique<Search>(settings)) {}
ShotFinder::~ShotFinder() = default;
void ShotFinder::Add(const FrameDigest& digest) {
  search_->Add(digest);
}
std::vector<ShotBorder> ShotFinder::Take() {
  return search_->Take();
}
void ShotFinder::Finish() {
  search_->Finish();
}

}  // namespace calmframe::host
