#include "host/timeline/media_services.h"

#include <algorithm>
#include <stdexcept>
#include <utility>

#include "host/timeline/media_core.h"

namespace calmframe::host {
namespace {

std::atomic<MediaServices*> active_services = nullptr;

}  // namespace

MediaCore::MediaCore(const MediaSettings& settings, const MediaFaults& fault_switches)
    : faults(fault_switches),
      cache(settings.cache_bytes),
      maker(cache),
      queue(std::max(settings.render_threads, 2)) {}

MediaCore* MediaCore::active() {
  MediaServices* const services = MediaServices::active();
  return services ? services->core_.get() : nullptr;
}

std::optional<MediaCore::Attached> MediaCore::Find(HX_EffectRef effect) const {
  std::lock_guard lock(mutex_);
  const auto found = effects_.find(effect);
  if (found == effects_.end()) return std::nullopt;
  return found->second;
}

void MediaCore::Attach(HX_EffectRef effect, Attached attached) {
  std::lock_guard lock(mutex_);
  std::swap(effects_[effect], attached);
}

void MediaCore::Detach(HX_EffectRef effect) {
  Attached gone;
  std::lock_guard lock(mutex_);
  const auto found = effects_.find(effect);
  if (found == effects_.end()) return;
  std::swap(gone, found->second);
  effects_.erase(found);
}

MediaServices::MediaServices(const MediaSettings& settings)
    : core_(std::make_unique<MediaCore>(settings, faults)) {
  MediaServices* none = nullptr;
  if (!active_services.compare_exchange_strong(none, this)) {
    throw std::logic_error("the media services of a process are active already");
  }
}

MediaServices::~MediaServices() {
  Shutdown();
  active_services = nullptr;
}

MediaServices* MediaServices::active() {
  return active_services;
}

const void* MediaServices::FindSuite(std::string_view name, std::int32_t version) const {
  const struct {
    const char* name;
    std::int32_t version;
    const void* table;
  } suites[] = {
      {HX_SEQUENCE_INFO_SUITE, HX_SEQUENCE_INFO_SUITE_VERSION_2, &SequenceInfoTable()},
      {HX_SEQUENCE_INFO_SUITE, HX_SEQUENCE_INFO_SUITE_VERSION_3, &SequenceInfoTable()},
      {HX_VIDEO_SEGMENT_SUITE, HX_VIDEO_SEGMENT_SUITE_VERSION, &VideoSegmentTable()},
      {HX_VIDEO_SEGMENT_RENDER_SUITE, HX_VIDEO_SEGMENT_RENDER_SUITE_VERSION,
       &VideoSegmentRenderTable()},
      {HX_CUTPIX_SUITE, HX_CUTPIX_SUITE_VERSION, &CutPixTable()},
      {HX_CUTPIX_CACHE_SUITE, HX_CUTPIX_CACHE_SUITE_VERSION, &CutPixCacheTable()},
      {HX_STRING_SUITE, HX_STRING_SUITE_VERSION, &StringSuiteTable()},
  };
  for (const auto& suite : suites) {
    if (name == suite.name && version == suite.version) return suite.table;
  }
  return nullptr;
}

void MediaServices::AttachEffect(HX_EffectRef effect, boost::shared_ptr<Layer> layer,
                                 std::uint32_t runtime_id) {
  core_->Attach(effect, {std::move(layer), runtime_id});
}

void MediaServices::DetachEffect(HX_EffectRef effect) {
  core_->Detach(effect);
}

PicturePtr MediaServices::Input(HX_EffectRef effect, const InputRequest& request) {
  const auto attached = core_->Find(effect);
  if (!attached) return nullptr;
  const boost::shared_ptr<const LayerState> layer =
      request.layer ? request.layer : attached->layer->state();
  const std::optional<GraphNode> node = InputOf(layer, attached->runtime_id);
  if (!node) return nullptr;
  const SourceInfo& info = layer->source->info();
  FrameRequest frame{*node, PictureAt(*layer, request.time_ticks, request.single_field),
                     request.kind, request.width > 0 ? request.width : info.width,
                     request.height > 0 ? request.height : info.height};
  const PicturePtr picture = core_->maker.Get(frame, {});
  if (picture && !picture->top_down()) return core_->maker.Copy(*picture, {});
  return picture;
}

std::string MediaServices::failure() const {
  return core_->maker.failure();
}

void MediaServices::Shutdown() {
  core_->queue.Close();
}

MediaCounts MediaServices::counts() const {
  MediaCounts counts;
  counts.nodes = core_->nodes.size();
  counts.segments = core_->segments.size();
  counts.strings = core_->strings.size();
  counts.frames = core_->frames.size();
  counts.references = core_->cache.references();
  counts.requests = core_->queue.outstanding();
  counts.cached_bytes = core_->cache.bytes();
  counts.delivered = core_->delivered;
  return counts;
}

void MediaServices::SetCacheBytes(std::size_t bytes) {
  core_->cache.SetBound(bytes);
}

}  // namespace calmframe::host
