#include "stabilization/crop/cropper.h"
#include "stabilization/warp/cp_warper.h"

using namespace marrow::stabilization;

boost::shared_ptr<cropper> RunCropper(const SolverParamsRecord& parameters, std::size_t frameCount,
                                      const CPWarper& warper, const progress_functor& progress) {
  return RunCropper(
      parameters, frameCount, [&warper](std::size_t f) { return warper.frameWarp(f); },
      warper.unionBounds(), warper.boundsEmpty(), progress);
}
