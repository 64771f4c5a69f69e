#include "analysis/src/identities.h"

#include "analysis/src/mix_hash_guid.h"
#include "analysis/src/param_fields.h"

namespace kelp::analysis {
namespace {

void AddTime(MixHashGuid& mix, const RationalTime& time) {
  const std::int64_t parts[2] = {time.numerator, time.denominator};
  mix.Add(parts, sizeof parts);
}

}  // namespace

tessel::utility::Guid GetIdentifierForJobInput(const JobInput& input) {
  MixHashGuid mix("Analyzer::GetIdentifierForJobInput");
  mix.Add(input.ProjectPath.data(), 2 * input.ProjectPath.size());
  mix.Add(input.SourceID);
  mix.AddValue(input.FieldType);
  AddTime(mix, input.StartTime);
  AddTime(mix, input.Duration);
  AddTime(mix, input.StepTime);
  return mix.Finish();
}

tessel::utility::Guid GetIdentifierForTracker(const marrow::tracking::SelectorParams& selector,
                                              const marrow::tracking::TrackerParams& tracker) {
  MixHashGuid mix("Analyzer::GetIdentifierForTracker");
  const auto add = [&mix](const char*, const auto& value) { mix.AddValue(value); };
  ForEachField(selector, add);
  ForEachField(tracker, add);
  return mix.Finish();
}

}  // namespace kelp::analysis
