#include "analysis/effect/banner_cache.h"

#include <boost/make_shared.hpp>

#include "platform/tesselui/font.h"

namespace kelp::analysis::effect {
namespace {

using tesselui::drawbot::Color;

constexpr int kMargin = 4;  // pixels of width and height around the text
constexpr int kBytes = 4;   // of a pixel
constexpr float kFaintTextAlpha = 0.4f;

Color TextColor(FrameStatus status) {
  const bool faint = status == FrameStatus::SubsequentSolveOnDeletion;
  return {1, 1, 1, faint ? kFaintTextAlpha : 1};
}

}  // namespace

BannerImage::BannerImage(const std::string& text, const Color& color) {
  const tesselui::Font font = tesselui::Font::HostFont();
  const tesselui::TextExtent extent = font.Measure(text);
  width_ = extent.width + kMargin;
  height_ = extent.height + kMargin;
  pixels_.resize(static_cast<std::size_t>(width_) * static_cast<std::size_t>(height_) * kBytes);
  tesselui::drawbot::Surface surface(pixels_.data(), width_ * kBytes, width_, height_);
  const int x = (width_ - extent.width) / 2;
  const int y = (height_ - extent.height + 2) / 2;
  surface.DrawText(font, text, x, y, color);
  surface.Flush();
}

HX_World BannerImage::world() const {
  HX_World world{};
  world.data = const_cast<std::uint8_t*>(pixels_.data());
  world.row_bytes = width_ * kBytes;
  world.width = width_;
  world.height = height_;
  world.format = HX_FORMAT_BGRA8;
  world.extent = {0, 0, width_, height_};
  return world;
}

boost::shared_ptr<const BannerImage> BannerCache::Get(const StatusRecord& record,
                                                      const std::string& text) {
  boost::shared_ptr<const BannerImage>& image = images_[record];
  if (!image) image = boost::make_shared<BannerImage>(text, TextColor(record.status));
  return image;
}

}  // namespace kelp::analysis::effect
