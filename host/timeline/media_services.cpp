#include "host/timeline/media_services.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <utility>

#include "host/timeline/media_core.h"

namespace calmframe::host {

MediaCore::MediaCore(const MediaSettings& settings, std::uint32_t number)
    : cache(settings.cache_bytes),
      maker(cache, number),
      queue(std::max(settings.render_threads, 2)) {}

std::optional<MediaTables::Attached> MediaTables::Find(HX_EffectRef effect) const {
  std::lock_guard lock(mutex_);
  const auto found = effects_.find(effect);
  if (found == effects_.end()) return std::nullopt;
  return found->second;
}

void MediaTables::Attach(HX_EffectRef effect, Attached attached) {
  std::lock_guard lock(mutex_);
  std::swap(effects_[effect], attached);
}

void MediaTables::Detach(HX_EffectRef effect) {
  Attached gone;
  std::lock_guard lock(mutex_);
  const auto found = effects_.find(effect);
  if (found == effects_.end()) return;
  std::swap(gone, found->second);
  effects_.erase(found);
}

MediaCorePtr MediaTables::NewCore(const MediaSettings& settings) {
  std::lock_guard lock(mutex_);
  std::erase_if(by_number_, [](const auto& entry) { return entry.second.expired(); });
  std::uint32_t number = 0;
  while (by_number_.count(number) != 0) ++number;
  const auto core = boost::make_shared<MediaCore>(settings, number);
  by_number_.emplace(number, core);
  return core;
}

MediaCorePtr MediaTables::CoreOf(std::uint32_t number) const {
  std::lock_guard lock(mutex_);
  const auto found = by_number_.find(number);
  return found == by_number_.end() ? nullptr : found->second.lock();
}

std::vector<MediaCorePtr> MediaTables::Cores() const {
  std::vector<MediaCorePtr> cores;
  std::lock_guard lock(mutex_);
  for (const auto& [number, weak] : by_number_) {
    if (MediaCorePtr core = weak.lock()) cores.push_back(std::move(core));
  }
  return cores;
}

struct MediaServices::Share : SharedByAll<MediaTables> {};

MediaServices::MediaServices(const MediaSettings& settings)
    : tables_(std::make_unique<Share>()),
      core_((*tables_)->NewCore(settings)),
      faults(core_->faults) {}

MediaServices::~MediaServices() {
  Shutdown();
}

const void* MediaServices::FindSuite(std::string_view name, std::int32_t version) {
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
  (*tables_)->Attach(effect, {std::move(layer), runtime_id, core_});
}

void MediaServices::DetachEffect(HX_EffectRef effect) {
  if (MediaTables* const tables = SharedByAll<MediaTables>::active()) tables->Detach(effect);
}

PicturePtr MediaServices::Input(HX_EffectRef effect, const InputRequest& request) {
  const auto attached = (*tables_)->Find(effect);
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
  const MediaTables& tables = **tables_;
  MediaCounts counts;
  counts.nodes = tables.nodes.size();
  counts.segments = tables.segments.size();
  counts.strings = tables.strings.size();
  counts.frames = tables.frames.size();
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
