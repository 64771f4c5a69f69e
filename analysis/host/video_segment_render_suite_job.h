#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <map>

#include "analysis/host/outstanding_requests.h"
#include "analysis/src/executor_job.h"
#include "analysis/src/segment_graph.h"
#include "effect/suite.h"

namespace kelp {

// The job whose frames are the effect's input as the host renders it: asked for ahead, rendered on
// the host's threads into its frame cache, and read there. A frame goes by an identifier that the
// host makes from all that it depends on, so that whoever asks for an equal one shares it. Holds
// its suites as long as it lives. Every failure of a frame operation fails the job.
class VideoSegmentRenderSuiteJob final : public analysis::ExecutorJob {
 public:
  static constexpr char kNoMediaNode[] =
      "$$$/stabilizer/error/AcquireMediaNode=Error finding media node.";
  static constexpr char kNoNodeProperty[] =
      "$$$/stabilizer/error/GetNodePropertyError=Error reading node property.";
  static constexpr char kNoFrameIdentifier[] =
      "$$$/stabilizer/error/GetFrameIdentifierError=Error producing frame identifier.";
  static constexpr char kNoRender[] =
      "$$$/stabilizer/error/ProduceFrameAsyncError=Error initiating async render request.";
  static constexpr char kNoFrame[] =
      "$$$/stabilizer/error/GetRenderedFrameError=Error receiving synchronous frame.";

  // On the host's main thread. Throws HX_ERR_MISSING_SUITE, with its message; other codes of the
  // host; and tessel::config::Error where no media enters the effect.
  VideoSegmentRenderSuiteJob(HX_InData* host_in, HX_OutData* host_out,
                             const analysis::JobInput& input,
                             const boost::shared_ptr<analysis::Analysis>& analysis);
  ~VideoSegmentRenderSuiteJob() override;

  bool RequestFrame(const analysis::RationalTime& time, std::int32_t field) override;
  void GetFrame(const analysis::RationalTime& time, std::int32_t field, std::int32_t* row_bytes,
                bool* flipped, std::uint32_t* pixel_format, const std::uint8_t** pixels) override;
  void ReleaseFrame(const analysis::RationalTime& time, std::int32_t field) override;
  void GetFrameSize(std::int32_t* width, std::int32_t* height) override;

 protected:
  void ReadProperties() override;
  void ReleaseNode() override;
  void CancelRequests() override;
  void NotifyHost() override;

 private:
  explicit VideoSegmentRenderSuiteJob(const effect::HostContext& context,
                                      const analysis::JobInput& input,
                                      const boost::shared_ptr<analysis::Analysis>& analysis);

  std::int32_t ReadProperty(const char* key);
  HX_RenderParams RenderParams(std::int32_t field) const;
  tessel::utility::Guid MakeIdentifier(const analysis::RationalTime& time, std::int32_t field);
  HX_Frame Lookup(const tessel::utility::Guid& frame) const;
  void Reference(const tessel::utility::Guid& frame);
  void Dereference(const tessel::utility::Guid& frame);

  const HX_EffectRef effect_ref_;
  const effect::ScopedSuite<HX_CutPixSuite1> cutpix_;
  const effect::ScopedSuite<HX_CutPixCacheSuite5> cache_;
  const effect::ScopedSuite<HX_SequenceInfoSuite> sequence_;
  const effect::ScopedSuite<HX_VideoSegmentSuite5> segments_;
  const effect::ScopedSuite<HX_VideoSegmentRenderSuite3> render_;
  const effect::ScopedSuite<HX_PrivateEffectSuite3> private_;
  const effect::ScopedSuite<HX_UtilitySuite> utility_;
  const effect::ScopedSuite<HX_StringSuite1> strings_;
  const analysis::SegmentGraph graph_;
  const boost::shared_ptr<OutstandingRequests> requests_;

  // From here on the job's thread alone, after the constructor.
  analysis::NodeReference media_node_;
  std::int64_t ticks_per_frame_ = 0;
  std::int32_t frame_width_ = 0, frame_height_ = 0;
  std::int32_t par_num_ = 0, par_den_ = 0;
  // References in the cache that are still the job's.
  std::map<tessel::utility::Guid, int> references_;
};

// The JobFactory of such jobs.
boost::shared_ptr<analysis::ExecutorJob> MakeVideoSegmentRenderSuiteJob(
    HX_InData* host_in, HX_OutData* host_out, const analysis::JobInput& input,
    const boost::shared_ptr<analysis::Analysis>& analysis);

}  // namespace kelp
