#pragma once

#include <boost/make_shared.hpp>
#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <vector>

#include "stabilization/displacements.h"
#include "stabilization/models/matrix3.h"
#include "stabilization/models/motion_fits.h"
#include "stabilization/progress.h"
#include "stabilization/solve_records.h"
#include "stabilization/solver_params.h"
#include "stabilization/warp/frame_map.h"
#include "stabilization/warp/var_vector.h"

namespace marrow::stabilization {

// The vertices laid over a frame: about 2304 of them, as square as the frame allows, the outermost
// on the first and last pixel centres. Depends on the frame's size alone.
struct warp_grid {
  warp_grid(std::int32_t frameWidth, std::int32_t frameHeight);

  std::int32_t cols;
  std::int32_t rows;
  double cellWidth;  // pixels
  double cellHeight;
};

// Turns tracks and their stabilized positions into one VarVector a frame, in two stages:
// buildDisplacements decides each frame's model, drive() writes its record. Built and driven on one
// thread; afterwards read-only and readable from any.
//
// A frame's model is a number: 1 the rest grid moved by the mean displacement, 2 under a
// similarity, 3 under a homography, 4 each vertex solved (see grid_solver); between two of them a
// blend.
class CPWarper {
 public:
  static constexpr std::int32_t kModelRampFrames = 15;    // for one step of the model
  static constexpr std::int32_t kOutlierRampFrames = 60;  // from weight 0 to 1 along a track
  static constexpr std::size_t kLeastForProjection = 6;   // displacements of a frame

  CPWarper(std::int32_t frameCount, std::int32_t frameWidth, std::int32_t frameHeight);
  CPWarper& operator=(const CPWarper&) = delete;

  // Makes every frame's displacements and decides its model. Keeps stabilizerGlobal alive:
  // displacements point into it. Throws std::runtime_error "Homograph is not consistent with
  // displacements on frame" where a transition's stored motion does not lead to its targets.
  void buildDisplacements(boost::shared_ptr<const stabilizer_global> stabilizerGlobal,
                          const std::vector<factorization_window>& factorizationWindows,
                          const std::vector<transition_record>& transitionWindows,
                          const SolverParamsRecord& parameters, const progress_functor& progress);

  // The lighter variant for the robust pass around transition windows: sources alone, no models,
  // targets left to pruneDisplacements. `stabilizerGlobal` must outlive this object.
  void buildDisplacementsForWindows(stabilizer_global& stabilizerGlobal,
                                    const std::vector<factorization_window>& windows,
                                    const SolverParamsRecord& parameters);
  // These three work on the frames [max(lastFrame - 60, 0), lastFrame], or on one frame, of an
  // object made for windows. prune: drops the records without a stabilized sample, takes the
  // others' targets from it. reweight: the robust pass. projectFrame: writes into the stabilized
  // table where the frame's motion takes each live source sample; throws std::runtime_error "Not
  // enough features for computing similarity transform" with fewer than 6 displacements.
  void pruneDisplacements(std::int32_t lastFrame);
  void reweightRecent(std::int32_t lastFrame);
  void projectFrame(std::int32_t frame, bool translationOnly);

  // Writes frameWarps, one frame after the other. A frame whose grid solve fails gets a record of
  // zeros, without a word. What progress throws leaves the object fit for nothing but destruction.
  void drive(const progress_functor& progress);
  bool driven() const { return driven_; }

  // Fills the frame-to-frame map; radius in frames, 0 makes it empty. What progress throws leaves
  // the map as it was.
  void makeFrameMap(
      std::uint32_t radius, const progress_functor& progress = [] {});
  // The same warps with a map of that radius, beside this object, which others may be reading. A
  // warper that was read from a project knows no tracks: it keeps the map it has.
  boost::shared_ptr<CPWarper> withFrameMap(
      std::uint32_t radius, const progress_functor& progress = [] {}) const;
  // The same warps and map as a project brings them back, without what they were made from, which
  // takes several times their memory.
  boost::shared_ptr<const CPWarper> withoutTracks() const;
  const boost::shared_ptr<const MtoNMap>& frameMap() const { return frameMap_; }
  void setFrameMap(boost::shared_ptr<const MtoNMap> map) { frameMap_ = std::move(map); }

  // The motion that takes points of source frame M to the output of frame N, from the tracks they
  // share; false with fewer than 6. Weights are those of frame N. Throws std::runtime_error before
  // drive(). On the solve's thread.
  bool alignFrameMtoN(std::int32_t M, std::int32_t N, matrix3& output_n_from_source_m) const;

  // The rest grid under the motion from M to N, cols * rows pairs, row-major; false where there is
  // none, as always in a warper that was read from a project without a map.
  bool warpedGridOfFrame(std::int32_t M, std::int32_t N, std::vector<double>& grid) const;

  std::int32_t frameCount() const { return frameCount_; }
  std::int32_t frameWidth() const { return frameWidth_; }
  std::int32_t frameHeight() const { return frameHeight_; }
  std::int32_t gridCols() const { return grid_.cols; }
  std::int32_t gridRows() const { return grid_.rows; }
  double cellWidth() const { return grid_.cellWidth; }
  double cellHeight() const { return grid_.cellHeight; }

  // Behind the robust pass, made anew at each call. After drive() the sources are the images under
  // the frame's base matrix. Empty in a warper that was read from a project.
  std::vector<Displacement> displacements(std::size_t frame) const;
  double modelScore(std::size_t frame) const { return modelScore_[frame]; }

  // Appends a record, which is rounded to 1/256 pixel about its corners' plane.
  void storeFrameWarp(const VarVector& record);
  // Appends exactly this one. Throws std::invalid_argument where a packed one's bytes are none.
  void storeFrameWarp(const quantised_warp& record);
  void storeFrameWarp(packed_warp record);
  // Records are kept packed and expanded for who asks; that of frame 0 is kept, so that its address
  // tells one solve from the next. Throws std::out_of_range "invalid vector<T> subscript" at or
  // past the end. Any thread.
  boost::shared_ptr<const VarVector> frameWarp(std::size_t frame) const;
  quantised_warp storedWarp(std::size_t frame) const;
  const packed_warp& packedWarp(std::size_t frame) const { return frameWarps_->at(frame).warp; }
  std::size_t frameWarpCount() const { return frameWarps_->size(); }

  // Of the frame's outer ring of vertices. A maximum is at least the smallest normal 32-bit float,
  // also for a frame that lies at negative coordinates; vertices that are not numbers are passed
  // over.
  frame_bounds frameBounds(std::size_t frame) const { return frameWarps_->at(frame).bounds; }
  // The union over all frames. Kept up by storeFrameWarp, so reading it is safe from any thread.
  const frame_bounds& unionBounds() const { return unionBounds_; }
  // True when the frames' bounds have no common box of at least one pixel.
  bool boundsEmpty() const;

 private:
  CPWarper(const CPWarper&) = default;

  // One frame's model: a base motion, and how far to go from it to the solved grid.
  struct frame_model {
    matrix3 base = identity3;
    double solved_share = 0;  // 0 the base alone, 1 the solved grid alone
  };

  void computeModelScores(const std::vector<factorization_window>& windows,
                          const std::vector<transition_record>& transitionWindows,
                          double methodLevel, const progress_functor& progress);
  static void checkConsistency(std::size_t frame, const std::vector<Displacement>& list,
                               const matrix3& stored);
  matrix3 storedSimilarity(std::size_t frame) const;
  void append(packed_warp packed, const quantised_warp& record, std::int32_t cols,
              std::int32_t rows);

  frame_model chooseModel(std::size_t frame, const std::vector<Displacement>& list);
  matrix3 fitKind(std::size_t frame, const std::vector<Displacement>& list, int kind);
  void locateInRestGrid(std::vector<Displacement>& list) const;
  void moveSources(std::vector<Displacement>& list, const matrix3& base,
                   const VarVector& base_grid) const;
  VarVector gridUnder(const matrix3& m) const;
  bool alignFrameMtoN(std::int32_t M, std::int32_t N, const std::vector<Displacement>& list,
                      const VarVector& warp, matrix3& output_n_from_source_m) const;

  const std::int32_t frameCount_;
  const std::int32_t frameWidth_;
  const std::int32_t frameHeight_;
  const warp_grid grid_;

  boost::shared_ptr<const stabilizer_global> global_;
  stabilizer_global* solving_ = nullptr;  // set by buildDisplacementsForWindows alone
  boost::shared_ptr<const blended_tracks> tracks_;
  displacement_lists windowLists_;  // of buildDisplacementsForWindows
  std::vector<double> modelScore_;
  std::vector<bool> overrideFlags_;     // the frame's similarity is stored, not to be fitted
  std::vector<double> overrideParams_;  // four a frame: scale, angle, tx, ty
  double homographyLimit_ = 50.0;
  double dataWeight_ = 1.0;
  homography_fitter homography_;
  bool driven_ = false;
  std::vector<matrix3> bases_;  // of the frames' models, once driven

  struct stored_frame {
    packed_warp warp;
    std::int32_t cols, rows;
    frame_bounds bounds;
  };
  // Shared with the warpers that withFrameMap makes, none of which write it.
  boost::shared_ptr<std::vector<stored_frame>> frameWarps_ =
      boost::make_shared<std::vector<stored_frame>>();
  boost::shared_ptr<const VarVector> firstWarp_;
  frame_bounds unionBounds_;
  boost::shared_ptr<const MtoNMap> frameMap_;
};

}  // namespace marrow::stabilization
