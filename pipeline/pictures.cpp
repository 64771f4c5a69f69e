#include "pipeline/pictures.h"

#include <boost/make_shared.hpp>
#include <cstring>

namespace calmframe::pipeline {
namespace {

template <class Sample>
Sample Average(Sample a, Sample b) {
  return static_cast<Sample>((a + b + 1) / 2);
}
template <>
float Average(float a, float b) {
  return 0.5f * (a + b);
}

template <class Pixel>
void CopyRow(const WorldX<Pixel>& from, int y, WorldX<Pixel>& to) {
  std::memcpy(to.row(y), from.row(y), sizeof(Pixel) * static_cast<std::size_t>(to.width()));
}

}  // namespace

template <class Pixel>
void KeepField(WorldX<Pixel>& world, int parity) {
  const int height = world.height();
  if (height < 2) return;
  for (int y = 1 - parity; y < height; y += 2) {
    const Pixel* above = world.row(y > 0 ? y - 1 : y + 1);
    const Pixel* below = world.row(y + 1 < height ? y + 1 : y - 1);
    Pixel* row = world.row(y);
    for (int x = 0; x < world.width(); ++x) {
      row[x].alpha = Average(above[x].alpha, below[x].alpha);
      row[x].red = Average(above[x].red, below[x].red);
      row[x].green = Average(above[x].green, below[x].green);
      row[x].blue = Average(above[x].blue, below[x].blue);
    }
  }
}

template <class Pixel>
void CopyField(const WorldX<Pixel>& from, int parity, WorldX<Pixel>& to) {
  for (int y = parity; y < to.height(); y += 2) CopyRow(from, y, to);
}

template <class Pixel>
PictureReader<Pixel>::PictureReader(media::ClipReader& reader)
    : reader_(reader),
      pictures_(reader.info()),
      frame_(boost::make_shared<WorldX<Pixel>>(reader.info().width, reader.info().height)),
      picture_(pictures_.interlaced()
                   ? boost::make_shared<WorldX<Pixel>>(reader.info().width, reader.info().height)
                   : frame_) {}

template <class Pixel>
const boost::shared_ptr<WorldX<Pixel>>& PictureReader<Pixel>::Read(std::size_t picture) {
  if (held_picture_ == picture) return picture_;
  const std::size_t frame = pictures_.frame_of(picture);
  held_picture_ = kNone;
  if (held_frame_ != frame) {
    held_frame_ = kNone;
    reader_.Read(frame, frame_->data(), frame_->row_bytes());
    held_frame_ = frame;
  }
  if (pictures_.interlaced()) {
    for (int y = 0; y < frame_->height(); ++y) CopyRow(*frame_, y, *picture_);
    KeepField(*picture_, pictures_.parity_of(picture));
  }
  held_picture_ = picture;
  return picture_;
}

template void KeepField(WorldX<HX_Pixel8>&, int);
template void KeepField(WorldX<HX_Pixel16>&, int);
template void KeepField(WorldX<HX_PixelFloat>&, int);
template void CopyField(const WorldX<HX_Pixel8>&, int, WorldX<HX_Pixel8>&);
template void CopyField(const WorldX<HX_Pixel16>&, int, WorldX<HX_Pixel16>&);
template void CopyField(const WorldX<HX_PixelFloat>&, int, WorldX<HX_PixelFloat>&);
template class PictureReader<HX_Pixel8>;
template class PictureReader<HX_Pixel16>;
template class PictureReader<HX_PixelFloat>;

}  // namespace calmframe::pipeline
