#pragma once

#include <boost/shared_ptr.hpp>
#include <cstddef>
#include <cstdint>

#include "stabilization/warp/var_vector.h"

namespace marrow::render {

// A solved clip as the renderer needs it. Read-only; any thread may call.
class ClipWarps {
 public:
  virtual ~ClipWarps() = default;
  virtual std::size_t frameCount() const = 0;
  virtual boost::shared_ptr<const stabilization::VarVector> frameWarp(std::size_t frame) const = 0;
  // The rest grid of source frame M as it lies in the output of frame N, into `warp`; false where
  // no motion between the two is known.
  virtual bool warpedGridOfFrame(std::size_t M, std::size_t N,
                                 stabilization::VarVector& warp) const = 0;
  virtual stabilization::frame_bounds unionBounds() const = 0;
  virtual std::int32_t frameWidth() const = 0;  // square pixels
  virtual std::int32_t frameHeight() const = 0;
  virtual std::int32_t gridCols() const = 0;
  virtual std::int32_t gridRows() const = 0;
};

}  // namespace marrow::render
