#pragma once

#include <boost/function.hpp>
#include <cstdint>
#include <vector>

#include "pipeline/pictures.h"
#include "tracking/frame_images.h"
#include "tracking/frame_source.h"

namespace calmframe::pipeline {

// A clip as the tracker sees it: a frame of the tracker is a picture of the clip. `poll` is called
// before each picture is fetched and may throw to end the run.
class ClipFrameSource final : public marrow::tracking::FrameSource {
 public:
  ClipFrameSource(media::ClipReader& reader, boost::function<void(std::size_t picture)> poll);

  std::size_t width() const override;
  std::size_t height() const override;
  std::size_t frame_count() const override;
  void LoadLuma(std::size_t picture, std::uint8_t* destination) override;
  void LoadMask(std::size_t picture, std::uint8_t* destination) override;
  void LoadColor(std::size_t picture, float* destination) override;
  marrow::tracking::ImagePyramid::first_level first_level() const override {
    return marrow::tracking::ImagePyramid::first_level::bytes;
  }
  void LoadColorPyramid(std::size_t picture, marrow::tracking::ImagePyramid& pyramid,
                        std::vector<float>& scratch) override;

 private:
  marrow::tracking::ArgbFrame Fetch(std::size_t picture);

  const media::ClipInfo& info_;
  PictureReader<HX_Pixel8> reader_;
  marrow::tracking::FrameImages images_;
  const boost::function<void(std::size_t)> poll_;
  std::size_t polled_ = static_cast<std::size_t>(-1);  // the last picture that poll_ heard of
};

}  // namespace calmframe::pipeline
