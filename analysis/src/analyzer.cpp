#include "analysis/src/analyzer.h"

#include <boost/make_shared.hpp>
#include <new>
#include <utility>

#include "analysis/src/identities.h"
#include "analysis/src/job_frame_source.h"
#include "analysis/src/mix_hash_guid.h"
#include "analysis/src/param_fields.h"
#include "analysis/src/read_job_input.h"
#include "effect/host_text.h"
#include "platform/tessel/config.h"
#include "platform/tessel/debug.h"

namespace kelp::analysis {
namespace {

// How long a finished job waits for joiners: the registry's own share of the track table.
constexpr std::uint32_t kLingerMs = 30000;

template <class Params>
void LogFields(const char* record, const Params& params) {
  ForEachField(params, [record](const char* name, const auto& value) {
    tessel::debug::Log("%s.%s: %f\n", record, name, static_cast<double>(value));
  });
}

// Its table is not of all that its input tells.
bool EndedEarly(const Job& job) {
  return job.end_row() < GetRunFrames(job.input()).frame_count;
}

// The table of a running job will do, since the effect learns from the identity what it was made
// with; a finished one that does not fit would only be made again.
bool MayJoin(const JobRegistry::Entry& entry, const tessel::utility::Guid& tracker_guid) {
  switch (entry.job->GetStatus().state) {
    case JobState::Ready:
    case JobState::Running:
      return true;
    case JobState::Finished:
      return !entry.job->WasCancelled() && !EndedEarly(*entry.job) &&
             entry.analysis->tracker_identity() == tracker_guid;
    default:
      return false;
  }
}

tessel::utility::Guid RunIdentity(const JobRegistry::Key& key,
                                  const tessel::utility::Guid& tracker_guid) {
  constexpr char kName[] = "RunIdentity";
  MixHashGuid mix(kName);
  for (const auto* guid : {&key.job, &key.source, &tracker_guid}) mix.AddValue(guid->bytes());
  return mix.Finish();
}

bool IsUnderWay(const JobRegistry::Entry& entry) {
  return entry.job && entry.job->GetStatus().state <= JobState::Running;
}

bool HasResults(const JobRegistry::Entry& entry) {
  return entry.job && entry.job->GetStatus().state == JobState::Finished &&
         !entry.job->WasCancelled();
}

}  // namespace

Analyzer::Analyzer(const marrow::tracking::SelectorParams& selector,
                   const marrow::tracking::TrackerParams& tracker) {
  record_.selector_params = selector;
  record_.tracker_params = tracker;
  record_.tracker_guid = GetIdentifierForTracker(selector, tracker);
}

Analyzer::Analyzer(const AnalyzerRecord& record, const tessel::utility::Guid& source_identity)
    : record_(record), source_identity_(source_identity) {}

void Analyzer::Start(HX_InData*, HX_OutData*) {
  record_.job_stage = JobStage::Started;
}

void Analyzer::Stop(HX_InData*, HX_OutData*) {
  record_.job_stage = JobStage::NotStarted;
}

void Analyzer::EndBefore(std::int64_t) {}

void Analyzer::GiveKept(std::vector<Bytes>) {}

void Analyzer::WantPiece() {}

std::vector<Analysis::Piece> Analyzer::TakePieces() {
  return {};
}

std::int64_t Analyzer::FirstFrame() const {
  const JobInput& input = record_.job_input_parameters;
  return FloorSteps(input.StartTime, input.StepTime);
}

std::int64_t Analyzer::EndFrame() const {
  const JobInput& input = record_.job_input_parameters;
  return CeilSteps(input.StartTime + input.Duration, input.StepTime);
}

std::int64_t Analyzer::FirstRunFrame() const {
  return GetRunFrames(record_.job_input_parameters).first_frame;
}

bool Analyzer::ReportFailure(HX_InData* host_in, HX_OutData* host_out) {
  if (GetStatus().state != JobState::Failed) return false;
  const std::string literal = GetErrorText();
  if (!literal.empty()) {
    kelp::effect::ShowMessage(kelp::effect::RecordsOnly(host_in, host_out),
                              tessel::config::Localizer::Localize(literal).c_str());
  }
  return true;
}

AnalyzerPrem::AnalyzerPrem(HX_InData* host_in, HX_OutData* host_out,
                           const marrow::tracking::SelectorParams& selector,
                           const marrow::tracking::TrackerParams& tracker, JobFactory make_job)
    : Analyzer(selector, tracker), plugin_(host_in->global_data), make_job_(std::move(make_job)) {
  record_.job_input_parameters = ReadJobInput(host_in, host_out);
  record_.job_guid = GetIdentifierForJobInput(record_.job_input_parameters);
}

AnalyzerPrem::AnalyzerPrem(const AnalyzerRecord& record,
                           const tessel::utility::Guid& source_identity, HX_Handle plugin,
                           JobFactory make_job)
    : Analyzer(record, source_identity), plugin_(plugin), make_job_(std::move(make_job)) {}

JobRegistry::Entry AnalyzerPrem::FindEntry() {
  const JobRegistry::Entry entry = JobRegistry::Instance().Find(key());
  if (!entry.job) return {};
  if (!bound_) {
    if (record_.job_stage == JobStage::NotStarted ||
        entry.analysis->tracker_identity() != record_.tracker_guid) {
      return {};
    }
    job_ = entry.job;
    bound_ = true;
  }
  return job_.lock() == entry.job ? entry : JobRegistry::Entry();
}

bool AnalyzerPrem::IsActive() {
  return IsUnderWay(FindEntry());
}

void AnalyzerPrem::Start(HX_InData* host_in, HX_OutData* host_out) {
  LogFields("selector", record_.selector_params);
  LogFields("tracker", record_.tracker_params);
  source_identity_ = GetUpstreamIdentifier(host_in, host_out);
  bool is_new = false;
  const JobRegistry::Entry entry = JobRegistry::Instance().FindOrMake(
      key(),
      [this](const JobRegistry::Entry& found) { return MayJoin(found, record_.tracker_guid); },
      [&] {
        JobRegistry::Entry made;
        made.analysis =
            boost::make_shared<Analysis>(record_.selector_params, record_.tracker_params);
        made.analysis->TakeUp(RunIdentity(key(), record_.tracker_guid),
                              record_.job_input_parameters, kept_);
        made.job = make_job_(host_in, host_out, record_.job_input_parameters, made.analysis);
        is_new = true;
        return made;
      });
  kept_ = {};
  job_ = entry.job;
  bound_ = true;
  record_.tracker_guid = entry.analysis->tracker_identity();
  try {
    entry.job->Start(entry.job);
  } catch (...) {  // others would join it and wait for ever
    if (is_new) JobRegistry::Instance().Remove(key(), entry.job->id());
    throw;
  }
  Analyzer::Start(host_in, host_out);
}

void AnalyzerPrem::Stop(HX_InData* host_in, HX_OutData* host_out) {
  const JobRegistry::Entry entry = FindEntry();
  if (entry.job) {
    // The task owns nothing: the registry's references are the last, dropped on the job's thread.
    const auto remove = [key = key(), job_id = entry.job->id()] {
      JobRegistry::Instance().Remove(key, job_id);
    };
    const auto lingers = [&] {
      try {
        return record_.job_stage == JobStage::SeenEnded &&
               entry.job->executor().Post(remove, kLingerMs);
      } catch (const std::bad_alloc&) {
        return false;
      }
    };
    if (!lingers()) remove();
  }
  job_.reset();
  bound_ = false;
  Analyzer::Stop(host_in, host_out);
}

JobStatus AnalyzerPrem::GetStatus() {
  const JobRegistry::Entry entry = FindEntry();
  return entry.job ? entry.job->GetStatus() : JobStatus{JobState::Failed, {}, 0};
}

void AnalyzerPrem::Cancel(HX_InData*, HX_OutData*, const char*) {
  const JobRegistry::Entry entry = FindEntry();
  if (entry.job) CancelJob(*entry.job);
}

std::string AnalyzerPrem::GetErrorText() {
  const JobRegistry::Entry entry = FindEntry();
  return entry.job ? entry.job->GetErrorText() : std::string();
}

boost::shared_ptr<marrow::tracking::AllFeatures> AnalyzerPrem::GetFeatures() {
  const JobRegistry::Entry entry = FindEntry();
  if (!HasResults(entry)) return {};
  const auto features =
      boost::make_shared<marrow::tracking::AllFeatures>(entry.analysis->all_features());
  ShortenTable(*features, entry.job->end_row(), record_.tracker_params.kill_tracks_shorter_than);
  return features;
}

void AnalyzerPrem::EndBefore(std::int64_t row) {
  const JobRegistry::Entry entry = FindEntry();
  if (entry.job) entry.job->EndBefore(row);
}

void AnalyzerPrem::WantPiece() {
  const JobRegistry::Entry entry = FindEntry();
  if (IsUnderWay(entry)) entry.analysis->WantPiece();
}

std::vector<Analysis::Piece> AnalyzerPrem::TakePieces() {
  const JobRegistry::Entry entry = FindEntry();
  return entry.analysis ? entry.analysis->TakePieces() : std::vector<Analysis::Piece>();
}

bool AnalyzerPrem::CanGoOn() {
  if (record_.job_stage == JobStage::NotStarted) return true;
  const JobRegistry::Entry entry = FindEntry();
  return IsUnderWay(entry) || HasResults(entry);
}

}  // namespace kelp::analysis
