#pragma once

#include <boost/shared_ptr.hpp>
#include <cstddef>
#include <exception>
#include <stdexcept>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "stabilization/crop/cropper.h"
#include "stabilization/solve_records.h"
#include "stabilization/warp/cp_warper.h"
#include "stabilizer/effect/src/parameter_rules.h"
#include "tracking/track_store.h"

// The stages of a stabilization walked one after the other on the caller's thread, from a file to a
// file, without a host: analyse, solve, render. Each stage can be called alone.
namespace calmframe::pipeline {

// Hears how far a stage has come and is asked whether to go on. Called on the caller's thread.
class Listener {
 public:
  virtual ~Listener() = default;
  // done of total units of the stage; a stage begins with done = 0 and ends with done = total.
  virtual void Progress(const char* stage, double done, double total, const char* unit) = 0;
  virtual bool Cancelled() = 0;
  // One line that the user should see, without a newline.
  virtual void Warn(const std::string& line) = 0;
};

class Interrupted : public std::exception {};

// The tracks could not be turned into a stabilization.
class SolveFailure : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// What a solve leaves for the render and for reports.
struct Solution {
  boost::shared_ptr<const marrow::stabilization::CPWarper> warper;
  boost::shared_ptr<const cropper> crop;  // null unless Framing crops
  std::vector<marrow::stabilization::factorization_window> factorization_windows;
  std::vector<marrow::stabilization::transition_record> transition_windows;
};

struct Output {
  std::string path;
  media::EncodeSettings encode;
  int depth = 0;  // of the render, see Render
};

kelp::effect::ClipGeometry GeometryOf(const media::ClipInfo& info);

// Tracks the clip's pictures: one a frame, or one a field of an interlaced clip.
marrow::tracking::AllFeatures Analyze(media::ClipReader& reader,
                                      const kelp::effect::Controls& controls, Listener& listener);

Solution Solve(const marrow::tracking::AllFeatures& features,
               const kelp::effect::ClipGeometry& clip, const kelp::effect::Controls& controls,
               Listener& listener);

// Renders every frame through its warp and hands it to the writer. depth: 8, 16 or 32 (float) bits
// of a component, 0 the least that holds the source.
void Render(media::ClipReader& reader, const Solution& solution,
            const kelp::effect::Controls& controls, int depth, media::ClipWriter& writer,
            Listener& listener);

// All of it. Throws media::Failure, SolveFailure, Interrupted.
void Stabilize(const std::string& input, const kelp::effect::Controls& controls,
               const Output& output, Listener& listener);

}  // namespace calmframe::pipeline
