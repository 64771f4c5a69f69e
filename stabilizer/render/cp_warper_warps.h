#pragma once

#include <boost/shared_ptr.hpp>

#include "stabilization/warp/cp_warper.h"
#include "stabilizer/render/clip_warps.h"

namespace marrow::render {

// A warper's records as the renderer reads them. The warper's union bounds must have been computed.
class CPWarperWarps final : public ClipWarps {
 public:
  explicit CPWarperWarps(boost::shared_ptr<const stabilization::CPWarper> warper)
      : warper_(warper) {}
  std::size_t frameCount() const override { return warper_->frameWarpCount(); }
  boost::shared_ptr<const stabilization::VarVector> frameWarp(std::size_t frame) const override {
    return warper_->frameWarp(frame);
  }
  bool warpedGridOfFrame(std::size_t M, std::size_t N,
                         stabilization::VarVector& warp) const override {
    warp.cols = gridCols();
    warp.rows = gridRows();
    return warper_->warpedGridOfFrame(static_cast<std::int32_t>(M), static_cast<std::int32_t>(N),
                                      warp.values);
  }
  stabilization::frame_bounds unionBounds() const override { return warper_->unionBounds(); }
  std::int32_t frameWidth() const override { return warper_->frameWidth(); }
  std::int32_t frameHeight() const override { return warper_->frameHeight(); }
  std::int32_t gridCols() const override { return warper_->gridCols(); }
  std::int32_t gridRows() const override { return warper_->gridRows(); }

 private:
  boost::shared_ptr<const stabilization::CPWarper> warper_;
};

}  // namespace marrow::render
