#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <map>
#include <mutex>
#include <set>

#include "platform/hx/hx_suites.h"
#include "platform/tessel/guid.h"
#include "platform/tessel/threads.h"

namespace kelp {

class OutstandingRequests;

// Goes to the host with each render and comes back with its callback, which destroys it once it was
// filed. Until then it is the requester's. All but the constant parts is guarded by the lock of
// `requests`.
struct FrameRequest {
  // Of no request, so that a callback that comes before the filing finds nothing.
  static constexpr std::int32_t kNoId = -1;

  const tessel::utility::Guid frame;
  const boost::shared_ptr<OutstandingRequests> requests;
  const HX_CutPixSuite1* const cutpix;
  std::int32_t id = kNoId;
  bool filed = false;
  bool finished = false;  // the render ended before the filing
};

// What the host renders for one job. Shared by the job and its requests, so that a late callback
// still finds it. The callbacks may come on any thread; the rest is for the job's.
class OutstandingRequests {
 public:
  OutstandingRequests() = default;
  OutstandingRequests(const OutstandingRequests&) = delete;
  OutstandingRequests& operator=(const OutstandingRequests&) = delete;

  bool Contains(const tessel::utility::Guid& frame) const;
  // Enters an accepted request. False if its render has ended already: the record stays the
  // requester's.
  bool File(FrameRequest& request, std::int32_t id);
  // A render has ended, with or without a frame. Whether the record is now the callback's to
  // destroy.
  bool Finish(FrameRequest& request);
  // From now on Wait waits for this frame. Whether it is on its way: if not, nothing will ever end
  // a wait.
  bool Await(const tessel::utility::Guid& frame);
  void Wait() { frame_arrived_.Wait(); }
  // Empties the table; what it held, by the ids to be cancelled.
  std::map<std::int32_t, tessel::utility::Guid> TakeAll() noexcept;

 private:
  mutable std::recursive_mutex lock_;
  std::map<std::int32_t, tessel::utility::Guid> by_request_;  // guarded by lock_
  std::set<tessel::utility::Guid> identifiers_;               // guarded by lock_; the same frames
  tessel::utility::Guid awaited_;                             // guarded by lock_
  tessel::threads::Gate frame_arrived_;
};

// HX_RenderCallback for a FrameRequest.
void FinishFrameRequest(HX_Frame frame, void* record) noexcept;

}  // namespace kelp
