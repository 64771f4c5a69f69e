#include <boost/make_shared.hpp>
#include <utility>

#include "host/timeline/source.h"

namespace calmframe::host {
namespace {

class DrawnSource final : public Source {
 public:
  DrawnSource(const SourceInfo& info, std::function<void(std::int64_t, Picture&)> draw)
      : info_(info), draw_(std::move(draw)), pool_(PicturePool::Make()) {}

  const SourceInfo& info() const override { return info_; }

  PicturePtr Fetch(std::int64_t frame, PixelKind kind) override {
    if (frame < 0 || frame >= info_.frame_count) return nullptr;
    const boost::shared_ptr<Picture> picture = pool_->NewPicture(kind, info_.width, info_.height);
    draw_(frame, *picture);
    return picture;
  }

 private:
  const SourceInfo info_;
  const std::function<void(std::int64_t, Picture&)> draw_;
  const boost::shared_ptr<PicturePool> pool_;
};

class ResizedSource final : public Source {
 public:
  ResizedSource(SourcePtr source, int width, int height)
      : source_(std::move(source)), info_(source_->info()), pool_(PicturePool::Make()) {
    info_.width = width;
    info_.height = height;
    const std::int32_t size[] = {width, height};
    info_.content = tessel::utility::MixHash(info_.content, size, sizeof size);
  }

  const SourceInfo& info() const override { return info_; }

  PicturePtr Fetch(std::int64_t frame, PixelKind kind) override {
    const PicturePtr whole = source_->Fetch(frame, kind);
    if (!whole) return nullptr;
    const boost::shared_ptr<Picture> picture = pool_->NewPicture(kind, info_.width, info_.height);
    ScalePicture(*whole, *picture);
    return picture;
  }

  const SourcePtr& source() const { return source_; }

 private:
  const SourcePtr source_;
  SourceInfo info_;
  const boost::shared_ptr<PicturePool> pool_;
};

}  // namespace

SourcePtr MakeDrawnSource(const SourceInfo& info,
                          std::function<void(std::int64_t, Picture&)> draw) {
  return boost::make_shared<DrawnSource>(info, std::move(draw));
}

SourcePtr MakeResizedSource(SourcePtr source, int width, int height) {
  // From the original: the media is scaled once however often its size changes.
  if (const auto resized = boost::dynamic_pointer_cast<ResizedSource>(source)) {
    source = resized->source();
  }
  const SourceInfo& info = source->info();
  if (info.width == width && info.height == height) return source;
  return boost::make_shared<ResizedSource>(std::move(source), width, height);
}

}  // namespace calmframe::host
