#pragma once

#include "analysis/effect/analysis_effect.h"
#include "stabilizer/effect/src/stabilizer_state.h"

namespace kelp::effect {

// What is done about an instance's solve, on the user interface thread, for one call of its effect.
// Host codes are thrown.
class SolveService {
 public:
  SolveService(analysis::effect::AnalysisEffect& effect, StabilizerState& state)
      : effect_(effect), context_(effect.context()), state_(state) {}

  // Compares what is stored with what the parameters ask for. None of them is supervised, so this
  // is where a slider's change takes effect.
  void CheckParams();
  // Whether it started one.
  bool StartIfNeeded();
  // Takes what the state's Solver, which has ended, gave, and tells the host.
  void Finish();
  // On the name of the Stabilization group: dots that move while a solve is at work.
  void ShowProgress();
  // On the name of the Auto-scale group.
  void ShowAutoScale();

 private:
  // Once for each size.
  void ReportSizeMismatch();

  analysis::effect::AnalysisEffect& effect_;
  const HostContext& context_;
  StabilizerState& state_;
};

}  // namespace kelp::effect
