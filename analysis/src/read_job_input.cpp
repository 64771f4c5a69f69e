#include "analysis/src/read_job_input.h"

#include <algorithm>

#include "effect/host_text.h"
#include "effect/suite.h"

namespace kelp::analysis {

using effect::ScopedSuite;
using effect::ThrowIfFailed;

namespace {

void ThrowIfRefused(const effect::HostContext& context) {
  const ScopedSuite<HX_AnalysisHostSuite1> suite(context);
  std::uint16_t units[effect::kHostUnits] = {};
  ThrowIfFailed(suite->GetRefusal(context.in->effect_ref, units, effect::kHostUnits));
  const std::u16string reason = effect::UnitsToText(units);
  if (reason.empty()) return;
  char message[effect::kHostTextSize];
  effect::ConvertToHostText(context, reason, message);
  effect::ShowMessage(context, message);
  throw std::int32_t{HX_ERR_LAYER_REFUSED};
}

}  // namespace

JobInput ReadJobInput(HX_InData* host_in, HX_OutData* host_out) {
  const effect::HostContext context = effect::RecordsOnly(host_in, host_out);
  ThrowIfRefused(context);
  const ScopedSuite<HX_UtilitySuite> suite(context, HX_UTILITY_SUITE_VERSION_3);
  std::int32_t start = 0, count = 0;
  std::int64_t ticks = 0;
  JobInput input;
  ThrowIfFailed(suite->GetStartFrame(host_in->effect_ref, &start));
  ThrowIfFailed(suite->GetFrameCount(host_in->effect_ref, &count));
  ThrowIfFailed(suite->GetFieldType(host_in->effect_ref, &input.FieldType));
  ThrowIfFailed(suite->GetTicksPerFrame(host_in->effect_ref, &ticks));
  if (ticks <= 0) throw std::int32_t{HX_ERR_UNKNOWN};
  input.StepTime = Reduced(ticks, HX_TICKS_PER_SECOND);
  // Before its first frame the media has nothing to analyse.
  input.StartTime = input.StepTime * std::max(start, 0);
  input.Duration =
      input.StepTime * std::max<std::int64_t>(std::int64_t{count} + std::min(start, 0), 0);
  return input;
}

}  // namespace kelp::analysis
