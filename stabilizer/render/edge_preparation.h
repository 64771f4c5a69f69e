#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

#include "stabilizer/render/source_frames.h"

namespace marrow::render {

// What is taken off the sides of every source frame before it is drawn, in pixels of the full-size
// frame, 0 or more.
struct EdgeSettings {
  double left = 0;
  double top = 0;
  double right = 0;
  double bottom = 0;
  double feather = 0;

  bool any() const { return left > 0 || top > 0 || right > 0 || bottom > 0 || feather > 0; }
};

// The same in pixels of a render: so many columns or rows of each side become transparent, and
// alpha rises over `feather` pixels from there on.
struct EdgePreparation {
  std::int32_t left = 0;
  std::int32_t top = 0;
  std::int32_t right = 0;
  std::int32_t bottom = 0;
  float feather = 0;
};

// One scale for all sides: the renderer's horizontal one.
EdgePreparation scaledEdges(const EdgeSettings& edges, float scaleX);

// Copies `from` to `to`, which is of its size, and prepares the copy's alpha: 0 in what is cut;
// inside, d pixels from the nearest cut (0 on the left and at the top, 1 on the right and at the
// bottom) and with q = (d + 1) / (feather + 1), it is multiplied by the smooth step 2 q^2 up to
// q = 1/2, (4 - 2 q) q - 1 above. Colours stay.
template <class Pixel>
void prepareEdges(const WorldX<Pixel>& from, const EdgePreparation& edges, WorldX<Pixel>& to);

// Other source frames, prepared. For a render of `frame`, whose passes may come back to the first
// neighbour that they asked for: that one and the latest frame are held, so that each is prepared
// once. One thread.
template <class Pixel>
class PreparedSources final : public SourceFrames<Pixel> {
 public:
  PreparedSources(SourceFrames<Pixel>& sources, const EdgePreparation& edges, std::size_t frame)
      : sources_(sources), edges_(edges), frame_(frame) {}

  boost::shared_ptr<const WorldX<Pixel>> fetch(std::size_t frame) override;

 private:
  struct prepared {
    std::size_t frame = 0;
    boost::shared_ptr<WorldX<Pixel>> world;
  };

  SourceFrames<Pixel>& sources_;
  const EdgePreparation edges_;
  const std::size_t frame_;
  prepared first_neighbour_;
  prepared latest_;
};

extern template class PreparedSources<HX_Pixel8>;
extern template class PreparedSources<HX_Pixel16>;
extern template class PreparedSources<HX_PixelFloat>;

}  // namespace marrow::render
