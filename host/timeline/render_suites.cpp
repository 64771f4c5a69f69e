#include <boost/make_shared.hpp>
#include <chrono>
#include <exception>

#include "host/timeline/media_core.h"
#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

using tessel::utility::Guid;
using Tables = MediaTables;
using Node = MediaTables::Placed<GraphNode>;

// Width, height and depth that count are those of the params; a frame is the same whatever the rest
// says.
std::optional<FrameRequest> RequestOf(const GraphNode& node, std::int64_t time_ticks,
                                      const HX_RenderParams* params) {
  if (node.is_operator || !params || params->width < 1 || params->height < 1) return std::nullopt;
  const bool field = params->field_selection == 1;
  for (std::int32_t i = 0; params->formats && i < params->format_count; ++i) {
    for (const PixelKind kind : {PixelKind::argb8, PixelKind::argb16, PixelKind::argbf}) {
      if ((params->formats[i] & ~HX_FORMAT_TOP_DOWN) == FormatOf(kind)) {
        return FrameRequest{node, PictureAt(*node.layer, time_ticks, field), kind, params->width,
                            params->height};
      }
    }
  }
  return std::nullopt;
}

// A handle of the frame; 0 when there is none.
HX_Frame MakeFrame(Tables& tables, MediaCore& core, const FrameRequest& request) noexcept {
  try {
    if (core.faults.null_frame) return 0;
    const FrameLayout layout{core.faults.row_padding, !core.faults.bottom_up};
    const PicturePtr picture = core.maker.Get(request, layout);
    if (!picture) return 0;
    ++core.delivered;
    return tables.frames.Add(picture);
  } catch (const std::exception&) {
    return 0;
  }
}

HX_Err RenderAsync(HX_Node node, int64_t time_ticks, int64_t /*rate_ticks*/,
                   const HX_RenderParams* params, HX_RenderCallback callback, void* record,
                   int32_t* request_id) {
  return Operation("Video Segment Render.RenderAsync", [=](Tables& tables) {
    return WithHandle(tables.nodes, node, [&](const Node& found) {
      const std::optional<FrameRequest> request = RequestOf(found.value, time_ticks, params);
      MediaCore& core = *found.core;
      if (!request || !callback || !request_id || core.faults.render_refused) {
        return HX_ERR_UNKNOWN;
      }
      const auto called = boost::make_shared<tessel::threads::CompletionEvent>();
      const std::int32_t id = core.queue.Post([=, &tables, &core](bool cancelled) {
        callback(cancelled ? 0 : MakeFrame(tables, core, *request), record);
        called->Signal();
      });
      if (id == 0) return HX_ERR_UNKNOWN;
      *request_id = id;
      // A thread of the queue could wait for itself.
      if (core.faults.early_callback && !core.queue.IsOwnThread()) called->Wait();
      return HX_ERR_NONE;
    });
  });
}

HX_Err MakeIdentifier(HX_Node node, int64_t time_ticks, int64_t /*ticks_per_frame*/,
                      int32_t /*width*/, int32_t /*height*/, int32_t /*par_num*/,
                      int32_t /*par_den*/, const HX_RenderParams* params, HX_String* text) {
  return Operation("Video Segment Render.MakeIdentifier", [=](Tables& tables) {
    return WithHandle(tables.nodes, node, [&](const Node& found) {
      const std::optional<FrameRequest> request = RequestOf(found.value, time_ticks, params);
      if (!request || !text || found.core->faults.identifier_failed) return HX_ERR_UNKNOWN;
      *text = tables.strings.Make(found.core->maker.Identifier(*request).ToText());
      return HX_ERR_NONE;
    });
  });
}

HX_Err Cancel(int32_t request_id) {
  return GivingBack("Video Segment Render.Cancel", [=](Tables& tables) {
    for (const MediaCorePtr& core : tables.Cores()) {
      core->queue.Cancel(request_id, std::chrono::milliseconds(core->faults.late_callback_ms));
    }
    return true;
  });
}

template <class Result, class Read>
HX_Err Answer(const char* name, HX_Frame frame, Result* result, Read read) {
  return Operation(name, [=](Tables& tables) {
    return WithHandle(tables.frames, frame, [&](const PicturePtr& picture) {
      if (!result) return HX_ERR_UNKNOWN;
      *result = read(*picture);
      return HX_ERR_NONE;
    });
  });
}

HX_Err GetPixels(HX_Frame frame, uint8_t** pixels) {
  return Answer("CutPix.GetPixels", frame, pixels,
                [](const Picture& picture) { return const_cast<std::uint8_t*>(picture.memory()); });
}

HX_Err GetRowBytes(HX_Frame frame, int32_t* row_bytes) {
  return Answer("CutPix.GetRowBytes", frame, row_bytes, [](const Picture& picture) {
    return static_cast<std::int32_t>(picture.row_bytes());
  });
}

HX_Err GetPixelFormat(HX_Frame frame, uint32_t* format) {
  return Answer("CutPix.GetPixelFormat", frame, format, [](const Picture& picture) {
    return FormatOf(picture.kind()) | (picture.top_down() ? HX_FORMAT_TOP_DOWN : 0);
  });
}

HX_Err GetSize(HX_Frame frame, int32_t* width, int32_t* height) {
  return Answer("CutPix.GetSize", frame, height ? width : nullptr, [=](const Picture& picture) {
    *height = picture.height();
    return picture.width();
  });
}

HX_Err DisposeFrame(HX_Frame frame) {
  return GivingBack("CutPix.Dispose", [=](Tables& tables) { return tables.frames.Remove(frame); });
}

HX_Err Lookup(const HX_Guid* identifier, HX_Frame* frame) {
  return Operation("CutPix Cache.Lookup", [=](Tables& tables) {
    if (!identifier || !frame) return HX_ERR_UNKNOWN;
    const Guid guid = GuidOf(*identifier);
    const MediaCorePtr core = tables.CoreOf(NumberOf(guid));
    const PicturePtr picture = core ? core->cache.Find(guid) : nullptr;
    *frame = picture ? tables.frames.Add(picture) : 0;
    return HX_ERR_NONE;
  });
}

HX_Err Reference(const HX_Guid* identifier) {
  return Operation("CutPix Cache.Reference", [=](Tables& tables) {
    if (!identifier) return HX_ERR_UNKNOWN;
    const Guid guid = GuidOf(*identifier);
    const MediaCorePtr core = tables.CoreOf(NumberOf(guid));
    if (!core) return HX_ERR_UNKNOWN;
    core->cache.Reference(guid);
    return HX_ERR_NONE;
  });
}

HX_Err Dereference(const HX_Guid* identifier) {
  return GivingBack("CutPix Cache.Dereference", [=](Tables& tables) {
    if (!identifier) return false;
    const Guid guid = GuidOf(*identifier);
    if (const MediaCorePtr core = tables.CoreOf(NumberOf(guid))) core->cache.Dereference(guid);
    return true;
  });
}

}  // namespace

const HX_VideoSegmentRenderSuite3& VideoSegmentRenderTable() {
  static const HX_VideoSegmentRenderSuite3 table = [] {
    HX_VideoSegmentRenderSuite3 suite{};
    suite.RenderAsync = RenderAsync;
    suite.MakeIdentifier = MakeIdentifier;
    suite.Cancel = Cancel;
    return suite;
  }();
  return table;
}

const HX_CutPixSuite1& CutPixTable() {
  static const HX_CutPixSuite1 table = {GetPixels, GetRowBytes, GetPixelFormat, GetSize,
                                        DisposeFrame};
  return table;
}

const HX_CutPixCacheSuite5& CutPixCacheTable() {
  static const HX_CutPixCacheSuite5 table = [] {
    HX_CutPixCacheSuite5 suite{};
    suite.Lookup = Lookup;
    suite.Reference = Reference;
    suite.Dereference = Dereference;
    return suite;
  }();
  return table;
}

}  // namespace calmframe::host
