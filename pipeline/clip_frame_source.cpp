#include "pipeline/clip_frame_source.h"

namespace calmframe::pipeline {

ClipFrameSource::ClipFrameSource(media::ClipReader& reader, boost::function<void(std::size_t)> poll)
    : info_(reader.info()), reader_(reader), poll_(std::move(poll)) {}

std::size_t ClipFrameSource::width() const {
  return static_cast<std::size_t>(info_.width);
}
std::size_t ClipFrameSource::height() const {
  return static_cast<std::size_t>(info_.height);
}
std::size_t ClipFrameSource::frame_count() const {
  return reader_.pictures().count();
}

marrow::tracking::ArgbFrame ClipFrameSource::Fetch(std::size_t picture) {
  if (polled_ != picture) poll_(picture);
  polled_ = picture;
  const WorldX<HX_Pixel8>& world = *reader_.Read(picture);
  return {&world.data()->alpha, world.row_bytes(), width(), height()};
}

void ClipFrameSource::LoadLuma(std::size_t picture, std::uint8_t* destination) {
  images_.Luma(picture, Fetch(picture), destination);
}

void ClipFrameSource::LoadMask(std::size_t picture, std::uint8_t* destination) {
  images_.Mask(picture, Fetch(picture), destination);
}

void ClipFrameSource::LoadColor(std::size_t picture, float* destination) {
  ColorFromArgb(Fetch(picture), destination);
}

void ClipFrameSource::LoadColorPyramid(std::size_t picture, marrow::tracking::ImagePyramid& pyramid,
                                       std::vector<float>& scratch) {
  images_.ColorPyramid(picture, Fetch(picture), pyramid, scratch);
}

}  // namespace calmframe::pipeline
