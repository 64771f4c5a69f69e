#include "analysis/src/read_job_input.h"

#include <algorithm>

#include "analysis/src/host_access.h"

namespace kelp::analysis {
namespace {

void ThrowIfRefused(HX_InData* host_in, HX_OutData* host_out) {
  const ScopedSuite<HX_AnalysisHostSuite1> suite(host_in, host_out, HX_ANALYSIS_HOST_SUITE,
                                                 HX_ANALYSIS_HOST_SUITE_VERSION);
  std::uint16_t units[kHostUnits] = {};
  ThrowIfFailed(suite->GetRefusal(host_in->effect_ref, units, kHostUnits));
  const std::u16string reason = UnitsToText(units);
  if (reason.empty()) return;
  char message[kHostTextSize];
  ConvertToHostText(host_in, host_out, reason, message);
  ShowMessage(host_in, host_out, message);
  throw std::int32_t{HX_ERR_LAYER_REFUSED};
}

}  // namespace

JobInput ReadJobInput(HX_InData* host_in, HX_OutData* host_out) {
  ThrowIfRefused(host_in, host_out);
  const ScopedSuite<HX_UtilitySuite> suite(host_in, host_out, HX_UTILITY_SUITE,
                                           HX_UTILITY_SUITE_VERSION_3);
  std::int32_t start = 0, count = 0;
  std::int64_t ticks = 0;
  JobInput input;
  ThrowIfFailed(suite->GetStartFrame(host_in->effect_ref, &start));
  ThrowIfFailed(suite->GetFrameCount(host_in->effect_ref, &count));
  ThrowIfFailed(suite->GetFieldType(host_in->effect_ref, &input.FieldType));
  ThrowIfFailed(suite->GetTicksPerFrame(host_in->effect_ref, &ticks));
  if (ticks <= 0) throw std::int32_t{HX_ERR_UNKNOWN};
  input.StepTime = Reduced(ticks, HX_TICKS_PER_SECOND);
  input.StartTime = input.StepTime * std::max(start, 0);
  input.Duration = input.StepTime * count;
  return input;
}

}  // namespace kelp::analysis
