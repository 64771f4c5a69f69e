#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <vector>

#include "host/media/clip.h"
#include "host/shots/shot_finder.h"
#include "host/timeline/source.h"

namespace calmframe::host {

// A clip's frames, with where its shots end: as somebody tells it, or as it is found in the frames
// while an analysis fetches them; or where the source itself ends one. Any thread.
class ShotSource final : public Source {
 public:
  // `range`: the frames that are worked. With `borders` the first frames of shots, ascending,
  // without that of the range; else they are looked for in 8-bit frames that are fetched in about
  // ascending order from the range's first.
  ShotSource(SourcePtr source, const media::FrameRange& range,
             std::optional<std::vector<ShotBorder>> borders);

  const SourceInfo& info() const override { return source_->info(); }
  PicturePtr Fetch(std::int64_t frame, PixelKind kind) override;
  std::int64_t EndOfShot(std::int64_t frame) const override;
  void KeepDecoded(std::size_t bytes) override { source_->KeepDecoded(bytes); }

  // Those that stand by now, oldest first.
  std::vector<ShotBorder> borders() const;

 private:
  void Look(std::int64_t frame, const FrameDigest& digest);
  // An analysis that goes on where an earlier process left it does not ask for what that has seen.
  void CatchUp(std::int64_t frame);

  const SourcePtr source_;
  const media::FrameRange range_;
  const bool looks_;
  std::mutex catching_up_;
  mutable std::mutex mutex_;  // guards all below
  ShotFinder finder_;
  std::int64_t next_;                            // frame that the finder is to have
  std::map<std::int64_t, FrameDigest> waiting_;  // behind it
  std::vector<ShotBorder> borders_;
};

}  // namespace calmframe::host
