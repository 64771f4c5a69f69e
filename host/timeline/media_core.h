#pragma once

#include <atomic>
#include <boost/shared_ptr.hpp>
#include <boost/weak_ptr.hpp>
#include <cstdint>
#include <map>
#include <mutex>
#include <new>
#include <optional>
#include <string>
#include <vector>

#include "host/base/operations.h"
#include "host/base/shared_by_all.h"
#include "host/timeline/frame_cache.h"
#include "host/timeline/frame_maker.h"
#include "host/timeline/handle_table.h"
#include "host/timeline/media_services.h"
#include "host/timeline/render_queue.h"
#include "host/timeline/string_table.h"

namespace calmframe::host {

// What one MediaServices works with. Nodes and effects that were lent keep it.
class MediaCore {
 public:
  // `number`: tells it from the others that live; in the identifiers of its frames.
  MediaCore(const MediaSettings& settings, std::uint32_t number);

  MediaFaults faults;
  FrameCache cache;
  FrameMaker maker;
  std::atomic<std::uint64_t> delivered{0};  // see MediaCounts
  RenderQueue queue;                        // last: its threads use all of the above
};

using MediaCorePtr = boost::shared_ptr<MediaCore>;

// What all MediaServices of the process have lent, since the suites' functions don't tell of which
// they ask: what stands under a handle does. Any thread.
class MediaTables {
 public:
  // Something of a layer, and where its frames are made.
  template <class Value>
  struct Placed {
    Value value;
    MediaCorePtr core;
  };
  struct Attached {
    boost::shared_ptr<Layer> layer;
    std::uint32_t runtime_id = 0;
    MediaCorePtr core;
  };

  std::optional<Attached> Find(HX_EffectRef effect) const;
  void Attach(HX_EffectRef effect, Attached attached);
  void Detach(HX_EffectRef effect);

  // Has the lowest number that is free, from 0.
  MediaCorePtr NewCore(const MediaSettings& settings);
  // Null where there is none of that number any more.
  MediaCorePtr CoreOf(std::uint32_t number) const;
  std::vector<MediaCorePtr> Cores() const;

  HandleTable<HX_Node, Placed<GraphNode>> nodes;
  HandleTable<HX_Segments, Placed<boost::shared_ptr<const LayerState>>> segments;
  HandleTable<HX_Frame, PicturePtr> frames;
  StringTable strings;

 private:
  mutable std::mutex mutex_;
  std::map<HX_EffectRef, Attached> effects_;                       // guarded by mutex_
  std::map<std::uint32_t, boost::weak_ptr<MediaCore>> by_number_;  // guarded by mutex_
};

// An operation of a suite, by the name that Operations knows: unless it is to fail, the body, which
// gets the tables and returns a code. Nothing is thrown to the caller.
template <class Body>
HX_Err Operation(const char* name, Body body) noexcept {
  try {
    if (const HX_Err code = BeginOperation(name)) return code;
    MediaTables* const tables = SharedByAll<MediaTables>::active();
    return tables ? body(*tables) : HX_ERR_UNKNOWN;
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
    MediaTables* const tables = SharedByAll<MediaTables>::active();
    if (!tables) return HX_ERR_UNKNOWN;
    if (!body(*tables)) {
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
