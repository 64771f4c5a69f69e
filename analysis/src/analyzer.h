#pragma once

#include <boost/function.hpp>
#include <boost/shared_ptr.hpp>
#include <boost/weak_ptr.hpp>
#include <cstdint>
#include <string>

#include "analysis/src/job_registry.h"
#include "platform/hx/hx_effect.h"

namespace kelp::analysis {

// Written by the effect's poll, except as noted.
enum class JobStage : std::int32_t {
  NotStarted = 0,  // by Stop
  Started = 1,     // by Start
  SeenRunning = 2,
  SeenEnded = 3  // the results are taken at the next poll
};

// The persisted part of an analyzer; field names are the keys.
struct AnalyzerRecord {
  tessel::utility::Guid job_guid;
  JobInput job_input_parameters;
  marrow::tracking::SelectorParams selector_params;
  marrow::tracking::TrackerParams tracker_params;
  tessel::utility::Guid tracker_guid;
  JobStage job_stage = JobStage::NotStarted;
};

// Makes the job that fetches an effect's frames from the host and has the analysis's run functions
// in its list. On the host's main thread; may throw.
using JobFactory = boost::function<boost::shared_ptr<ExecutorJob>(
    HX_InData* host_in, HX_OutData* host_out, const JobInput& input,
    const boost::shared_ptr<Analysis>& analysis)>;

// An effect's handle on the analysis of its clip: Start, GetStatus until the job has ended,
// GetFeatures, Stop; or Cancel and Stop. The host's main thread only, and nothing here waits for
// the job. The order of the virtual operations is part of the interface.
class Analyzer {
 public:
  virtual ~Analyzer() = default;
  Analyzer(const Analyzer&) = delete;
  Analyzer& operator=(const Analyzer&) = delete;

  virtual bool IsActive() = 0;
  virtual void Start(HX_InData* host_in, HX_OutData* host_out);
  virtual void Stop(HX_InData* host_in, HX_OutData* host_out);
  // Failed, without a text, if there is no job.
  virtual JobStatus GetStatus() = 0;
  virtual void Cancel(HX_InData* host_in, HX_OutData* host_out, const char* text) = 0;
  // The localisation literal of a failed job's cause, or empty.
  virtual std::string GetErrorText() = 0;
  // A header over the finished job's table; null before the end and for a cancelled or failed job.
  virtual boost::shared_ptr<marrow::tracking::AllFeatures> GetFeatures() = 0;
  // Whether an analyzer that was read from a project still has something to wait for: it has not
  // started, or its job runs or has results in this process.
  virtual bool CanGoOn() = 0;
  // The job, if there is one, ends before this row of its run (Job::EndBefore), and its table does
  // where the job had done more.
  virtual void EndBefore(std::int64_t row);
  // Ahead of Start: what was kept of an earlier run, which a job that is new goes on behind if it
  // is one of the same.
  virtual void GiveKept(std::vector<Bytes> pieces);
  // Asks the job for what a later process can go on behind, and gives what is there by now.
  virtual void WantPiece();
  virtual std::vector<Analysis::Piece> TakePieces();

  // Frames of the clip, of one StepTime each; the end excluded.
  std::int64_t FirstFrame() const;
  std::int64_t EndFrame() const;
  // Absolute index of row 0 of the table, where fields count as frames.
  std::int64_t FirstRunFrame() const;
  const tessel::utility::Guid& GetTrackerGuid() const { return record_.tracker_guid; }
  // Nil before Start.
  const tessel::utility::Guid& GetSourceIdentity() const { return source_identity_; }
  const AnalyzerRecord& record() const { return record_; }
  JobStage job_stage() const { return record_.job_stage; }
  void set_job_stage(JobStage stage) { record_.job_stage = stage; }

  // Whether the job has failed or is gone; if it has a text, the host shows that.
  bool ReportFailure(HX_InData* host_in, HX_OutData* host_out);

 protected:
  Analyzer(const marrow::tracking::SelectorParams& selector,
           const marrow::tracking::TrackerParams& tracker);
  // Read from a project, whose state knows the source.
  Analyzer(const AnalyzerRecord& record, const tessel::utility::Guid& source_identity);

  AnalyzerRecord record_;
  tessel::utility::Guid source_identity_;
};

// On jobs of the process's registry, in the background.
class AnalyzerPrem final : public Analyzer {
 public:
  // Reads the job input from the host, or throws its code.
  AnalyzerPrem(HX_InData* host_in, HX_OutData* host_out,
               const marrow::tracking::SelectorParams& selector,
               const marrow::tracking::TrackerParams& tracker, JobFactory make_job);
  // `plugin`: the host's global data of the plug-in.
  AnalyzerPrem(const AnalyzerRecord& record, const tessel::utility::Guid& source_identity,
               HX_Handle plugin, JobFactory make_job);

  bool IsActive() override;
  // Joins the host's job that runs on equal input, whatever its parameters are, or one that
  // finished with equal parameters; else makes one. The tracker identity becomes that of the job.
  void Start(HX_InData* host_in, HX_OutData* host_out) override;
  // With the results in, leaves the finished job to late joiners for a while.
  void Stop(HX_InData* host_in, HX_OutData* host_out) override;
  JobStatus GetStatus() override;
  void Cancel(HX_InData* host_in, HX_OutData* host_out, const char* text) override;
  std::string GetErrorText() override;
  boost::shared_ptr<marrow::tracking::AllFeatures> GetFeatures() override;
  bool CanGoOn() override;
  void EndBefore(std::int64_t row) override;
  void GiveKept(std::vector<Bytes> pieces) override { kept_ = std::move(pieces); }
  void WantPiece() override;
  std::vector<Analysis::Piece> TakePieces() override;

 private:
  JobRegistry::Key key() const { return {record_.job_guid, source_identity_, plugin_}; }
  // The registry's entry if it holds this analyzer's job.
  JobRegistry::Entry FindEntry();

  const HX_Handle plugin_;
  const JobFactory make_job_;
  std::vector<Bytes> kept_;  // until the start
  // The job that was started or joined. Empty in an analyzer that was read from a project until
  // it finds its job: another effect may have put a new one in its place since.
  boost::weak_ptr<ExecutorJob> job_;
  bool bound_ = false;
};

}  // namespace kelp::analysis
