#pragma once

#include <calmframe.h>
#include <framework/mlt.h>

#include <cstdint>
#include <vector>

namespace calmframe::mlt {

// What a session needs to know of pictures that come by one of MLT's formats.
struct PictureKind {
  mlt_image_format format = mlt_image_rgba;
  int colorspace = 0;  // as MLT counts: 601, 709, 2020; 0: not told
  bool full_range = false;

  auto operator<=>(const PictureKind&) const = default;
};

// The format itself where it can be steadied, else the one to ask for in its place.
mlt_image_format WorkedFormat(mlt_image_format format);

// As a session takes these pictures.
void SetKind(const PictureKind& kind, calmframe_options* options);

// Memory of MLT's pool, for a frame to take.
class PoolImage {
 public:
  PoolImage(mlt_image_format format, int width, int height);
  ~PoolImage();
  PoolImage(const PoolImage&) = delete;
  PoolImage& operator=(const PoolImage&) = delete;

  std::uint8_t* data() const { return data_; }
  // The frame owns it from now on.
  std::uint8_t* GiveTo(mlt_frame frame);

 private:
  int size_;
  std::uint8_t* data_;
};

// A picture in MLT's memory as a session sees it; packed 4:2:2, which sessions don't know, goes
// through planes of its own.
class SessionImage {
 public:
  // Reads from the picture.
  SessionImage(mlt_image_format format, int width, int height, std::uint8_t* data);
  const calmframe_image& image() const { return image_; }
  // Into the picture what a session drew; nothing where it has drawn there.
  void Finish();

 private:
  const mlt_image_format format_;
  std::uint8_t* const data_;
  calmframe_image image_{};
  std::vector<std::uint8_t> planes_;
};

// Scales a picture of one format to another size. Throws std::runtime_error.
void Scale(mlt_image_format format, int from_width, int from_height, std::uint8_t* from,
           int to_width, int to_height, std::uint8_t* to);

}  // namespace calmframe::mlt
