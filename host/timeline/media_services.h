#pragma once

#include <atomic>
#include <boost/shared_ptr.hpp>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "host/timeline/layer.h"
#include "platform/hx/hx_suites.h"

namespace calmframe::host {

// How the services misbehave, for tests of what stands on them. Read at each call.
struct MediaFaults {
  std::atomic<bool> null_frame = false;      // renders end without a frame
  std::atomic<bool> early_callback = false;  // the callback ends before RenderAsync returns
  // A cancelled request's callback comes so much later.
  std::atomic<int> late_callback_ms = 0;
  std::atomic<bool> render_refused = false;     // RenderAsync fails
  std::atomic<bool> identifier_failed = false;  // MakeIdentifier fails
  std::atomic<bool> property_missing = false;   // GetProperty fails for "MediaNode::" keys
  std::atomic<bool> node_missing = false;       // nothing stands on the timeline
  std::atomic<bool> bottom_up = false;          // rendered frames are stored bottom row first
  std::atomic<int> row_padding = 0;  // bytes behind each row of a rendered frame; a multiple of 4
};

struct MediaSettings {
  // Bound of the frame cache. Frames that are referenced count, yet stay; 0 drops all others at
  // once. The default holds some 60 frames of 1920 x 1080 at 8 bits: a synthesis margin of a second
  // on both sides.
  std::size_t cache_bytes = std::size_t{512} << 20;
  int render_threads = 2;  // at least 2 are made
};

// What is lent or under way; the first four by all services of the process.
struct MediaCounts {
  std::size_t nodes = 0;  // references to nodes and operators
  std::size_t segments = 0;
  std::size_t strings = 0;
  std::size_t frames = 0;      // HX_Frame handles
  std::size_t references = 0;  // to identifiers of the frame cache
  std::size_t requests = 0;    // renders whose callback has not returned
  std::size_t cached_bytes = 0;
  std::uint64_t delivered = 0;  // frames that such renders ended with so far, lent or not
};

// A frame for a render of the host.
struct InputRequest {
  std::int64_t time_ticks = 0;  // media time
  PixelKind kind = PixelKind::argb8;
  int width = 0, height = 0;  // 0: the source's
  bool single_field = true;   // of an interlaced layer the one field of the time, at full height
  boost::shared_ptr<const LayerState> layer = {};  // as it stood; null: as it stands
};

class MediaCore;  // what the operations of the suites work on

// Media, node graph, frame cache and asynchronous rendering of one host: the suites
// "Rushbase Sequence Info Suite", "Rushbase Video Segment Suite", "Rushbase Video Segment Render
// Suite", "Cutline CutPix Suite", "Cutline CutPix Cache Suite" and "Rushbase StringSuite". Several
// in a process have nothing in common: each serves its own effects, with its own frames and
// threads, whatever is equal in their media. Any thread, but for construction and destruction.
class MediaServices {
 public:
  explicit MediaServices(const MediaSettings& settings = {});
  ~MediaServices();  // Shutdown, if it was not called
  MediaServices(const MediaServices&) = delete;
  MediaServices& operator=(const MediaServices&) = delete;

  // Table of a suite; null for one that is not of this half of the host.
  static const void* FindSuite(std::string_view name, std::int32_t version);

  // Puts the effect on the layer. Its operator must stand in the layer's chain, under this id,
  // for its nodes to be found. Attached anew, an effect changes over to the other layer.
  void AttachEffect(HX_EffectRef effect, boost::shared_ptr<Layer> layer, std::uint32_t runtime_id);
  // Nodes that were given and renders under way stay valid; the suites then refuse the effect.
  // Also when its services are gone.
  static void DetachEffect(HX_EffectRef effect);

  // What enters the effect at a time, scaled if asked; from the cache, else made on this thread.
  // Null where the media has no frame and when it can't be read (see failure).
  PicturePtr Input(HX_EffectRef effect, const InputRequest& request);

  // First line of what went wrong with the media; empty when all is well.
  std::string failure() const;

  // Refuses new renders, calls all outstanding callbacks and waits for them; the rest goes on.
  void Shutdown();

  MediaCounts counts() const;

  // The bound of MediaSettings, from now on.
  void SetCacheBytes(std::size_t bytes);

 private:
  struct Share;  // of what all services have lent
  const std::unique_ptr<Share> tables_;
  const boost::shared_ptr<MediaCore> core_;

 public:
  MediaFaults& faults;
};

}  // namespace calmframe::host
