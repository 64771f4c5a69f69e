#pragma once

#include <atomic>
#include <calmframe.hpp>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "editors/mlt/analysis.h"

namespace calmframe::mlt {

// What a steadier is made from.
struct SteadyRequest {
  std::string results;
  std::int64_t first = 0;  // source frame that was analysed first
  Controls controls;
  std::string identity;
  int rate_num = 25, rate_den = 1;
  // Shape of the whole picture: width to height as shown.
  int display_num = 4, display_den = 3;

  bool operator==(const SteadyRequest&) const = default;
};

// A clip whose results are taken up, solved for some controls. Any thread.
class Steadier {
 public:
  // Solves it for pictures of these kinds; of others when the first one comes. Throws Error, and
  // std::runtime_error, of results that are not of the clip as it is; soon, once `stops` is set,
  // which must outlive it.
  Steadier(const SteadyRequest& request, const std::vector<PictureKind>& kinds,
           const std::atomic<bool>& stops);

  const SteadyRequest& request() const { return request_; }
  int width() const { return frames_.width; }  // of the pictures that were analysed
  int height() const { return frames_.height; }
  bool has(std::int64_t source_frame) const {
    return source_frame >= request_.first && source_frame - request_.first < count_;
  }
  std::vector<PictureKind> kinds() const;

  void Draw(std::int64_t source_frame, const PictureKind& kind, const calmframe_image& from,
            const calmframe_image& to);

 private:
  Session& SessionFor(const PictureKind& kind);

  const SteadyRequest request_;
  const std::atomic<bool>& stops_;
  ClipFrames frames_;
  std::int64_t count_ = 0;
  mutable std::mutex making_;
  std::map<PictureKind, std::unique_ptr<Session>> sessions_;  // guarded by making_
};

}  // namespace calmframe::mlt
