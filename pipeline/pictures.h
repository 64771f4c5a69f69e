#pragma once

#include <boost/shared_ptr.hpp>
#include <cstddef>

#include "host/media/clip.h"
#include "stabilizer/render/world.h"

namespace calmframe::pipeline {

// How a clip's frames become pictures, the unit of analysis and render. A progressive frame is one
// picture. An interlaced frame is two, in the order in which its fields were shot: they lie half a
// frame time apart, and one warp for both would comb.
class Pictures {
 public:
  explicit Pictures(const media::ClipInfo& info)
      : field_order_(info.field_order), frame_count_(info.frame_count) {}

  bool interlaced() const { return field_order_ != media::FieldOrder::progressive; }
  std::size_t per_frame() const { return interlaced() ? 2 : 1; }
  std::size_t count() const { return frame_count_ * per_frame(); }
  std::size_t frame_of(std::size_t picture) const { return picture / per_frame(); }
  // The parity of the lines that belong to a picture of an interlaced clip: 0 for lines 0, 2, 4 ...
  int parity_of(std::size_t picture) const {
    const int second = static_cast<int>(picture % 2);
    return field_order_ == media::FieldOrder::top_first ? second : 1 - second;
  }

 private:
  media::FieldOrder field_order_;
  std::size_t frame_count_;
};

// Replaces the lines of the other parity by the average of the lines above and below; at the
// frame's edge by the nearest.
template <class Pixel>
void KeepField(WorldX<Pixel>& world, int parity);

// Copies the lines of one parity.
template <class Pixel>
void CopyField(const WorldX<Pixel>& from, int parity, WorldX<Pixel>& to);

// Reads a clip's pictures, each at the full height.
template <class Pixel>
class PictureReader {
 public:
  explicit PictureReader(media::ClipReader& reader);
  const Pictures& pictures() const { return pictures_; }

  // Valid until the next call. Throws media::Failure.
  const boost::shared_ptr<WorldX<Pixel>>& Read(std::size_t picture);

 private:
  media::ClipReader& reader_;
  const Pictures pictures_;
  static constexpr std::size_t kNone = static_cast<std::size_t>(-1);
  std::size_t held_frame_ = kNone;    // what frame_ holds
  std::size_t held_picture_ = kNone;  // what picture_ holds
  boost::shared_ptr<WorldX<Pixel>> frame_;
  boost::shared_ptr<WorldX<Pixel>> picture_;
};

}  // namespace calmframe::pipeline
