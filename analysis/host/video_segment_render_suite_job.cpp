#include "analysis/host/video_segment_render_suite_job.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <limits>
#include <memory>

#include "effect/host_text.h"
#include "platform/tesselmedia/time.h"

namespace kelp {
namespace {

using analysis::NodeReference;
using analysis::RationalTime;
using analysis::SegmentGraph;
using effect::ThrowIfFailed;
using tessel::utility::Guid;

constexpr std::uint32_t kFormat = HX_FORMAT_ARGB8;
constexpr std::int32_t kQuality = 3;
constexpr std::int32_t kFinalValue = 3;

HX_Guid ToHost(const Guid& guid) {
  HX_Guid to;
  std::copy(guid.bytes().begin(), guid.bytes().end(), to.bytes);
  return to;
}

std::int64_t ToTicks(const RationalTime& time) {
  return tesselmedia::ToTickTime({time.numerator, time.denominator}).ticks();
}

// The node that holds the effect's operator, from `node` down; none if there is none.
NodeReference FindOwner(const SegmentGraph& graph, NodeReference node, std::int64_t effect_id,
                        int depth = 0) {
  if (depth > analysis::kMaxGraphDepth) throw std::int32_t{HX_ERR_UNKNOWN};
  const std::int32_t operators = graph.OperatorCount(node.get());
  for (std::int32_t i = 0; i < operators; ++i) {
    const NodeReference effect_operator = graph.Operator(node.get(), i);
    if (graph.NumberProperty(effect_operator.get(), HX_PROPERTY_RUNTIME_INSTANCE_ID) == effect_id) {
      return node;
    }
  }
  const std::int32_t inputs = graph.InputCount(node.get());
  for (std::int32_t i = 0; i < inputs; ++i) {
    NodeReference owner = FindOwner(graph, graph.Input(node.get(), i), effect_id, depth + 1);
    if (owner) return owner;
  }
  return {};
}

// The media that enters the effect: its input, not its output.
NodeReference FindMediaNode(const SegmentGraph& graph, HX_EffectRef effect,
                            const HX_SequenceInfoSuite& sequence, const HX_UtilitySuite& utility) {
  std::uint32_t effect_id = 0;
  ThrowIfFailed(utility.GetRuntimeInstanceID(effect, &effect_id));
  NodeReference clip = graph.ClipNode(effect, sequence, utility);
  if (!clip) return {};
  const NodeReference owner = FindOwner(graph, std::move(clip), effect_id);
  if (!owner || graph.InputCount(owner.get()) < 1) return {};
  return graph.Input(owner.get(), 0);
}

// A reference to a cached frame, for a scope.
class FrameReference {
 public:
  FrameReference(const HX_CutPixSuite1& suite, HX_Frame frame) : suite_(suite), frame_(frame) {}
  ~FrameReference() {
    if (frame_ != 0) suite_.Dispose(frame_);
  }
  FrameReference(const FrameReference&) = delete;
  FrameReference& operator=(const FrameReference&) = delete;
  HX_Frame get() const { return frame_; }

 private:
  const HX_CutPixSuite1& suite_;
  const HX_Frame frame_;
};

}  // namespace

VideoSegmentRenderSuiteJob::VideoSegmentRenderSuiteJob(
    HX_InData* host_in, HX_OutData* host_out, const analysis::JobInput& input,
    const boost::shared_ptr<analysis::Analysis>& analysis)
    : VideoSegmentRenderSuiteJob(effect::RecordsOnly(host_in, host_out), input, analysis) {}

VideoSegmentRenderSuiteJob::VideoSegmentRenderSuiteJob(
    const effect::HostContext& context, const analysis::JobInput& input,
    const boost::shared_ptr<analysis::Analysis>& analysis)
    : ExecutorJob(input, analysis),
      effect_ref_(context.in->effect_ref),
      cutpix_(context),
      cache_(context),
      sequence_(context, HX_SEQUENCE_INFO_SUITE_VERSION_2),
      segments_(context),
      render_(context),
      private_(context),
      utility_(context, HX_UTILITY_SUITE_VERSION_3),
      strings_(context),
      graph_(*segments_, *strings_),
      requests_(boost::make_shared<OutstandingRequests>()),
      media_node_(FindMediaNode(graph_, effect_ref_, *sequence_, *utility_)) {
  if (!media_node_) Fail(kNoMediaNode);
}

// A job that failed in a frame operation still has what was asked ahead.
VideoSegmentRenderSuiteJob::~VideoSegmentRenderSuiteJob() {
  try {
    CancelRequests();
  } catch (...) {
  }
}

void VideoSegmentRenderSuiteJob::ReadProperties() {
  ThrowIfFailed(utility_->GetTicksPerFrame(effect_ref_, &ticks_per_frame_));
  frame_width_ = ReadProperty(HX_PROPERTY_STREAM_WIDTH);
  frame_height_ = ReadProperty(HX_PROPERTY_STREAM_HEIGHT);
  par_num_ = ReadProperty(HX_PROPERTY_STREAM_PAR_NUM);
  par_den_ = ReadProperty(HX_PROPERTY_STREAM_PAR_DEN);
  if (frame_width_ < 1 || frame_height_ < 1) Fail(kNoNodeProperty);
}

std::int32_t VideoSegmentRenderSuiteJob::ReadProperty(const char* key) {
  bool absent = false;
  const std::int64_t value = graph_.NumberProperty(media_node_.get(), key, &absent);
  if (absent) Fail(kNoNodeProperty);
  const bool fits = value >= 0 && value <= std::numeric_limits<std::int32_t>::max();
  return fits ? static_cast<std::int32_t>(value) : 0;
}

void VideoSegmentRenderSuiteJob::ReleaseNode() {
  media_node_.Reset();
}

void VideoSegmentRenderSuiteJob::CancelRequests() {
  for (const auto& [id, frame] : requests_->TakeAll()) render_->Cancel(id);
  for (const auto& [frame, count] : references_) {
    const HX_Guid identifier = ToHost(frame);
    for (int i = 0; i < count; ++i) cache_->Dereference(&identifier);
  }
  references_.clear();
}

void VideoSegmentRenderSuiteJob::NotifyHost() {
  private_->ForceRerender(effect_ref_);
}

HX_RenderParams VideoSegmentRenderSuiteJob::RenderParams(std::int32_t field) const {
  const bool one_field =
      CountsFields(input()) && field != HX_FIELD_FIRST_ORDER && field != HX_FIELD_SECOND_ORDER;
  return {&kFormat, 1,        frame_width_, frame_height_,     par_num_,
          par_den_, kQuality, field,        one_field ? 1 : 0, kFinalValue};
}

Guid VideoSegmentRenderSuiteJob::MakeIdentifier(const RationalTime& time, std::int32_t field) {
  const HX_RenderParams params = RenderParams(field);
  HX_String text = nullptr;
  if (render_->MakeIdentifier(media_node_.get(), ToTicks(time), ticks_per_frame_, frame_width_,
                              frame_height_, par_num_, par_den_, &params, &text) != HX_ERR_NONE) {
    Fail(kNoFrameIdentifier);
  }
  try {
    return Guid::FromText(effect::TakeText(*strings_, text));
  } catch (std::int32_t) {
    Fail(kNoFrameIdentifier);
  }
}

HX_Frame VideoSegmentRenderSuiteJob::Lookup(const Guid& frame) const {
  const HX_Guid identifier = ToHost(frame);
  HX_Frame found = 0;
  return cache_->Lookup(&identifier, &found) == HX_ERR_NONE ? found : 0;
}

void VideoSegmentRenderSuiteJob::Reference(const Guid& frame) {
  const HX_Guid identifier = ToHost(frame);
  int& count = references_[frame];
  ThrowIfFailed(cache_->Reference(&identifier));
  ++count;
}

void VideoSegmentRenderSuiteJob::Dereference(const Guid& frame) {
  const auto found = references_.find(frame);
  if (found == references_.end()) return;
  if (--found->second <= 0) references_.erase(found);
  const HX_Guid identifier = ToHost(frame);
  cache_->Dereference(&identifier);
}

bool VideoSegmentRenderSuiteJob::RequestFrame(const RationalTime& time, std::int32_t field) {
  const Guid frame = MakeIdentifier(time, field);
  Reference(frame);
  if (requests_->Contains(frame)) return true;  // another reader has asked
  if (const HX_Frame found = Lookup(frame)) {
    cutpix_->Dispose(found);
    return true;
  }
  const HX_RenderParams params = RenderParams(field);
  auto request = std::unique_ptr<FrameRequest>(new FrameRequest{frame, requests_, &*cutpix_});
  std::int32_t id = FrameRequest::kNoId;
  if (render_->RenderAsync(media_node_.get(), ToTicks(time), ToTicks(input().StepTime), &params,
                           FinishFrameRequest, request.get(), &id) != HX_ERR_NONE) {
    Dereference(frame);
    Fail(kNoRender);
  }
  FrameRequest* const accepted = request.release();
  if (!requests_->File(*accepted, id)) delete accepted;
  return false;
}

void VideoSegmentRenderSuiteJob::GetFrame(const RationalTime& time, std::int32_t field,
                                          std::int32_t* row_bytes, bool* flipped,
                                          std::uint32_t* pixel_format,
                                          const std::uint8_t** pixels) {
  WaitPoint();
  NotifyHost();
  const Guid identifier = MakeIdentifier(time, field);
  const bool on_its_way = requests_->Await(identifier);
  HX_Frame found = Lookup(identifier);
  if (found == 0 && on_its_way) {
    requests_->Wait();
    found = Lookup(identifier);
  }
  if (found == 0) Fail(kNoFrame);
  const FrameReference frame(*cutpix_, found);
  std::uint8_t* data = nullptr;
  std::int32_t width = 0, height = 0;
  if (cutpix_->GetPixels(frame.get(), &data) != HX_ERR_NONE || data == nullptr ||
      cutpix_->GetRowBytes(frame.get(), row_bytes) != HX_ERR_NONE ||
      cutpix_->GetPixelFormat(frame.get(), pixel_format) != HX_ERR_NONE ||
      cutpix_->GetSize(frame.get(), &width, &height) != HX_ERR_NONE || width != frame_width_ ||
      height != frame_height_ || (*pixel_format & ~HX_FORMAT_TOP_DOWN) != kFormat) {
    Fail(kNoFrame);
  }
  *flipped = (*pixel_format & HX_FORMAT_TOP_DOWN) == 0;
  *pixels = data;
}

void VideoSegmentRenderSuiteJob::ReleaseFrame(const RationalTime& time, std::int32_t field) {
  Dereference(MakeIdentifier(time, field));
}

void VideoSegmentRenderSuiteJob::GetFrameSize(std::int32_t* width, std::int32_t* height) {
  *width = frame_width_;
  *height = frame_height_;
}

boost::shared_ptr<analysis::ExecutorJob> MakeVideoSegmentRenderSuiteJob(
    HX_InData* host_in, HX_OutData* host_out, const analysis::JobInput& input,
    const boost::shared_ptr<analysis::Analysis>& analysis) {
  return boost::make_shared<VideoSegmentRenderSuiteJob>(host_in, host_out, input, analysis);
}

}  // namespace kelp
