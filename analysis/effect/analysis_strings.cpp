#include "analysis/effect/analysis_strings.h"

namespace kelp::analysis::effect {

const char* AnalysisStatusLiteral(std::int32_t status) {
  switch (status) {
    case 1:
      return "$$$/Plugin/AnalysisEffect/PressAnalyze=Click Analyze to begin.";
    case 2:
      return "$$$/Plugin/AnalysisEffect/FrameOutsideRange=Frame not analyzed; click Analyze.";
    case 3:
      return "$$$/Plugin/AnalysisEffect/AnalysisRangeChanged=New frames need analyzing; click "
             "Analyze.";
    case 4:
      return "$$$/Plugin/AnalysisEffect/FootageAnalysisInProgress=Analyzing in background (step 1 "
             "of 2)";
    case 5:
      return "$$$/Plugin/AnalysisEffect/MotionAnalysisInProgress=Solving (step 2 of 2)";
    case 6:
    case 7:
      return "$$$/Plugin/AnalysisEffect/MotionAnalysisInProgressSubsequent=Solving";
    case 9:
      return "$$$/Plugin/AnalysisEffect/AnalysisTrackingFailed=Analysis failed.";
    case 10:
      return "$$$/Plugin/AnalysisEffect/AnalysisSolveFailed=Analysis solve failed.";
    case 11:
      return "$$$/Plugin/AnalysisEffect/GeneralFailure=Unable to analyze.";
    default:
      return nullptr;
  }
}

}  // namespace kelp::analysis::effect
