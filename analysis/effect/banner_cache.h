#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "analysis/effect/analysis_effect.h"
#include "platform/hx/hx_world.h"

namespace kelp::analysis::effect {

// A text in the host's font on a clear ground: 8-bit BGRA of straight alpha, top row first. Memory
// of its own, so that it outlives the call and the instance that it was made in. Constant once
// made.
class BannerImage {
 public:
  BannerImage(const std::string& text, const tesselui::drawbot::Color& color);

  std::int32_t width() const { return width_; }
  std::int32_t height() const { return height_; }
  // For the host to read; borrows the pixels.
  HX_World world() const;

 private:
  std::int32_t width_ = 0, height_ = 0;
  std::vector<std::uint8_t> pixels_;
};

// The images of the whole plug-in, so that a render lays out no text for each frame. Whoever uses
// it holds AnalysisEffect::GetBannerCacheLock.
class BannerCache {
 public:
  // That of the record, made if need be.
  boost::shared_ptr<const BannerImage> Get(const StatusRecord& record, const std::string& text);
  std::size_t size() const { return images_.size(); }

 private:
  std::map<StatusRecord, boost::shared_ptr<const BannerImage>> images_;
};

}  // namespace kelp::analysis::effect
