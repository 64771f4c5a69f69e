#pragma once

#include <atomic>
#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <map>
#include <mutex>
#include <new>
#include <optional>
#include <string>

#include "host/base/operations.h"
#include "host/timeline/frame_cache.h"
#include "host/timeline/frame_maker.h"
#include "host/timeline/handle_table.h"
#include "host/timeline/media_services.h"
#include "host/timeline/render_queue.h"
#include "host/timeline/string_table.h"

namespace calmframe::host {

// What the operations of the suites work on.
class MediaCore {
 public:
  struct Attached {
    boost::shared_ptr<Layer> layer;
    std::uint32_t runtime_id = 0;
  };

  MediaCore(const MediaSettings& settings, const MediaFaults& fault_switches);

  // That of the active services; null when there are none.
  static MediaCore* active();

  std::optional<Attached> Find(HX_EffectRef effect) const;
  void Attach(HX_EffectRef effect, Attached attached);
  void Detach(HX_EffectRef effect);

  const MediaFaults& faults;
  FrameCache cache;
  FrameMaker maker;
  HandleTable<HX_Node, GraphNode> nodes;
  HandleTable<HX_Segments, boost::shared_ptr<const LayerState>> segments;
  HandleTable<HX_Frame, PicturePtr> frames;
  StringTable strings;
  std::atomic<std::uint64_t> delivered{0};  // see MediaCounts

 private:
  mutable std::mutex mutex_;
  std::map<HX_EffectRef, Attached> effects_;  // guarded by mutex_

 public:
  RenderQueue queue;  // last: its threads use all of the above
};

// An operation of a suite, by the name that Operations knows: unless it is to fail, the body, which
// gets the core and returns a code. Nothing is thrown to the caller.
template <class Body>
HX_Err Operation(const char* name, Body body) noexcept {
  try {
    if (const HX_Err code = BeginOperation(name)) return code;
    MediaCore* const core = MediaCore::active();
    return core ? body(*core) : HX_ERR_UNKNOWN;
  } catch (const std::bad_alloc&) {
    return HX_ERR_MEMORY;
  } catch (...) {
    return HX_ERR_UNKNOWN;
  }
}

// One that gives something back, which happens even when it is to fail. The body returns false for
// what was not lent.
template <class Body>
HX_Err GivingBack(const char* name, Body body) noexcept {
  try {
    const HX_Err code = BeginOperation(name);
    MediaCore* const core = MediaCore::active();
    if (!core) return HX_ERR_UNKNOWN;
    if (!body(*core)) {
      Ledger::Get().Mistake(name, " of what is not lent");
      return HX_ERR_UNKNOWN;
    }
    return code;
  } catch (...) {
    return HX_ERR_UNKNOWN;
  }
}

// `action` with what stands under a number; an error when nothing does.
template <class Number, class Value, class Action>
HX_Err WithHandle(const HandleTable<Number, Value>& table, Number number, Action action) {
  const std::optional<Value> value = table.Find(number);
  return value ? action(*value) : HX_ERR_UNKNOWN;
}

inline tessel::utility::Guid GuidOf(const HX_Guid& guid) {
  tessel::utility::Guid::Bytes bytes;
  std::copy(std::begin(guid.bytes), std::end(guid.bytes), bytes.begin());
  return tessel::utility::Guid(bytes);
}

// The suites' tables.
const HX_SequenceInfoSuite& SequenceInfoTable();
const HX_VideoSegmentSuite5& VideoSegmentTable();
const HX_VideoSegmentRenderSuite3& VideoSegmentRenderTable();
const HX_CutPixSuite1& CutPixTable();
const HX_CutPixCacheSuite5& CutPixCacheTable();
const HX_StringSuite1& StringSuiteTable();

}  // namespace calmframe::host
