#include "stabilization/crop/cropper.h"
#include "stabilization/warp/cp_warper.h"

using namespace marrow::stabilization;

boost::shared_ptr<cropper> RunCropper(const SolverParamsRecord& parameters, std::size_t frameCount,
                                      const CPWarper& warper, const progress_functor& progress) {
  std::vector<boost::shared_ptr<const VarVector>> warps;
  for (std::size_t f = 0; f < frameCount; ++f) warps.push_back(warper.frameWarp(f));
  return RunCropper(parameters, warps, warper.unionBounds(), warper.boundsEmpty(), progress);
}
