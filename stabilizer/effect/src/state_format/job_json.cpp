#include "stabilizer/effect/src/state_format/job_json.h"

#include <cmath>
#include <limits>
#include <type_traits>

#include "analysis/effect/analysis_parameter_rows.h"
#include "analysis/src/identities.h"
#include "analysis/src/param_fields.h"
#include "platform/tessel/serialization.h"
#include "platform/tessel/utility.h"
#include "platform/tesselmedia/time.h"

namespace kelp::effect::state_format {

using analysis::AnalyzerRecord;
using analysis::JobInput;
using analysis::JobStage;
using analysis::RationalTime;
using tessel::serialization::Value;
using tessel::utility::Guid;

namespace {

Value TimeValue(const RationalTime& time) {
  return {{"value", time.numerator}, {"scale", time.denominator}};
}

RationalTime ParseTime(const Value& object, const char* key) {
  const Value& time = tessel::serialization::GetObject(object, key);
  const auto value = tessel::serialization::GetInteger<std::int64_t>(time, "value");
  const auto scale = tessel::serialization::GetInteger<std::int64_t>(time, "scale");
  if (scale <= 0) throw tessel::serialization::WrongType("scale");
  if (!tesselmedia::IsLegacyTimeScale(scale)) return {value, scale};
  const auto corrected = tesselmedia::CorrectLegacyRatioTimeAtTimeScale(value, scale);
  return {corrected.value, corrected.scale};
}

Value JobInputValue(const JobInput& input) {
  return {{"ProjectPath", tessel::utility::ToUTF8(input.ProjectPath)},
          {"SourceID", input.SourceID.ToText()},
          {"FieldType", input.FieldType},
          {"StartTime", TimeValue(input.StartTime)},
          {"Duration", TimeValue(input.Duration)},
          {"StepTime", TimeValue(input.StepTime)}};
}

JobInput ReadJobInputValue(const Value& object) {
  JobInput input;
  input.ProjectPath =
      tessel::utility::ToUTF16(tessel::serialization::GetString(object, "ProjectPath"));
  input.SourceID = Guid::FromText(tessel::serialization::GetString(object, "SourceID"));
  input.FieldType = tessel::serialization::GetInteger<std::int32_t>(object, "FieldType");
  input.StartTime = ParseTime(object, "StartTime");
  input.Duration = ParseTime(object, "Duration");
  input.StepTime = ParseTime(object, "StepTime");
  return input;
}

template <class Params>
Value ParamsValue(const Params& params) {
  Value object = Value::object();
  analysis::ForEachField(params,
                         [&object](const char* name, const auto& value) { object[name] = value; });
  return object;
}

template <class T>
T ReadField(const Value& object, const char* name) {
  if constexpr (std::is_same_v<T, bool>) {
    return tessel::serialization::GetBool(object, name);
  } else if constexpr (std::is_integral_v<T>) {
    return tessel::serialization::GetInteger<T>(object, name);
  } else {
    const double value = tessel::serialization::GetFloat(object, name);
    if (!(std::abs(value) <= std::numeric_limits<T>::max())) {
      throw tessel::serialization::WrongType(name);
    }
    return static_cast<T>(value);
  }
}

// Fields that came later; their defaults stand for them.
bool MayBeMissing(const std::string& name) {
  return name == "eig_ratio_threshold" || name == "tolerance_primary_color_threshold" ||
         name == "kill_tracks_shorter_than";
}

template <class Params>
Params ReadParamsValue(const Value& object) {
  Params params;
  analysis::ForEachField(params, [&object](const char* name, auto& field) {
    if (MayBeMissing(name) && !object.contains(name)) return;
    field = ReadField<std::remove_reference_t<decltype(field)>>(object, name);
  });
  return params;
}

// An analysis takes memory and time by these. What no control can ask for is of no effect of ours.
void ExpectAskedFor(const marrow::tracking::SelectorParams& selector,
                    const marrow::tracking::TrackerParams& tracker) {
  using namespace analysis::effect;
  for (const auto& [value, control] : {std::pair{selector.max_count, kMaxCountParam},
                                       {selector.half_winx, kSelectorXRadiusParam},
                                       {selector.half_winy, kSelectorYRadiusParam},
                                       {tracker.max_iterations, kMaxIterationsParam},
                                       {tracker.pyramidal_levels, kPyramidalLevelsParam},
                                       {tracker.half_win_x, kTrackerXRadiusParam},
                                       {tracker.half_win_y, kTrackerYRadiusParam}}) {
    const kelp::effect::ParameterRow& row = *AnalysisParameterRow(control);
    if (value > static_cast<std::uint64_t>(row.valid.max)) {
      throw tessel::serialization::WrongType(row.name.literal);
    }
  }
  // Each alone may be the most; together they would take many gigabytes of windows, three floats a
  // pixel with a border of one. What the defaults call for takes a quarter of one at the most.
  constexpr std::uint64_t kMostWindowBytes = std::uint64_t{1} << 29;
  const std::uint64_t side = 2 * tracker.half_win_x + 3;
  if (selector.max_count * tracker.pyramidal_levels * side * side * 3 * sizeof(float) >
      kMostWindowBytes) {
    throw tessel::serialization::WrongType("windows");
  }
}

}  // namespace

std::u16string JobInputText(const JobInput& input) {
  return tessel::serialization::GetJSONString(JobInputValue(input));
}

std::u16string JobText(const AnalyzerRecord& job) {
  return tessel::serialization::GetJSONString(
      {{"job_guid", job.job_guid.ToText()},
       {"job_input_parameters", JobInputValue(job.job_input_parameters)},
       {"selector_params", ParamsValue(job.selector_params)},
       {"tracker_params", ParamsValue(job.tracker_params)},
       {"job_stage", static_cast<std::int32_t>(job.job_stage)},
       {"tracker_guid", job.tracker_guid.ToText()}});
}

JobInput ParseJobInput(const std::u16string& text) {
  return ReadJobInputValue(tessel::serialization::JSONParse(text));
}

AnalyzerRecord ParseJob(const std::u16string& text) {
  const Value object = tessel::serialization::JSONParse(text);
  AnalyzerRecord job;
  job.job_guid = Guid::FromText(tessel::serialization::GetString(object, "job_guid"));
  job.job_input_parameters =
      ReadJobInputValue(tessel::serialization::GetObject(object, "job_input_parameters"));
  job.selector_params = ReadParamsValue<marrow::tracking::SelectorParams>(
      tessel::serialization::GetObject(object, "selector_params"));
  job.tracker_params = ReadParamsValue<marrow::tracking::TrackerParams>(
      tessel::serialization::GetObject(object, "tracker_params"));
  ExpectAskedFor(job.selector_params, job.tracker_params);
  if (object.contains("job_stage")) {
    const auto stage = tessel::serialization::GetInteger<std::int32_t>(object, "job_stage");
    if (stage < 0 || stage > static_cast<std::int32_t>(JobStage::SeenEnded)) {
      throw tessel::serialization::WrongType("job_stage");
    }
    job.job_stage = static_cast<JobStage>(stage);
  }
  job.tracker_guid =
      object.contains("tracker_guid")
          ? Guid::FromText(tessel::serialization::GetString(object, "tracker_guid"))
          : analysis::GetIdentifierForTracker(job.selector_params, job.tracker_params);
  return job;
}

}  // namespace kelp::effect::state_format
