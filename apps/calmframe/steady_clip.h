#pragma once

#include <boost/shared_ptr.hpp>
#include <memory>
#include <string>
#include <vector>

#include "apps/calmframe/controls.h"
#include "apps/calmframe/progress_line.h"
#include "host/effects/host.h"
#include "host/effects/session.h"
#include "host/media/clip.h"

namespace calmframe {

// The crop window that the effect found for a clip, in square pixels of its frames.
struct CropWindow {
  int width = 0, height = 0;
};

// A clip on the timeline of a host, with the effect applied to it, its controls set and nothing
// done yet. For the thread that made it.
class SteadyClip {
 public:
  // Throws media::Failure, UsageFailure, and SolveFailure when the effect can't be had.
  SteadyClip(const std::string& path, const ControlFlags& controls);

  const media::ClipInfo& info() const { return info_; }
  host::Host& host() { return host_; }
  host::Effect& effect() { return *effect_; }

  // Waits until the effect has analysed and solved the clip. Throws Interrupted, SolveFailure,
  // media::Failure.
  void Work(ProgressLine& progress);

  // After Work. Null where the framing has none.
  std::unique_ptr<CropWindow> Crop();
  // The name of a parameter as the effect has it now, of a group with its readout.
  std::string NameOf(std::int32_t disk_id) const;

  // Throws media::Failure when the clip could not be read to its end.
  void CheckMedia();

 private:
  const media::ClipInfo info_;
  host::Host host_;
  const std::map<std::int32_t, double> values_;
  host::Session session_;
  host::Effect* effect_ = nullptr;  // the session's
};

}  // namespace calmframe
