#include "analysis/host/outstanding_requests.h"

namespace kelp {

using tessel::utility::Guid;
using Lock = std::lock_guard<std::recursive_mutex>;

bool OutstandingRequests::Contains(const Guid& frame) const {
  const Lock lock(lock_);
  return identifiers_.count(frame) != 0;
}

bool OutstandingRequests::File(FrameRequest& request, std::int32_t id) {
  const Lock lock(lock_);
  if (request.finished) return false;
  request.id = id;
  request.filed = true;
  by_request_.emplace(id, request.frame);
  identifiers_.insert(request.frame);
  return true;
}

bool OutstandingRequests::Finish(FrameRequest& request) {
  const Lock lock(lock_);
  const auto found = by_request_.find(request.id);
  if (found == by_request_.end()) {
    request.finished = true;
    return request.filed;  // and cancelled since
  }
  if (request.frame == awaited_) frame_arrived_.Open();
  identifiers_.erase(request.frame);
  by_request_.erase(found);
  return true;
}

bool OutstandingRequests::Await(const Guid& frame) {
  const Lock lock(lock_);
  awaited_ = frame;
  frame_arrived_.Close();
  return identifiers_.count(frame) != 0;
}

std::map<std::int32_t, Guid> OutstandingRequests::TakeAll() noexcept {
  std::map<std::int32_t, Guid> taken;
  const Lock lock(lock_);
  taken.swap(by_request_);
  identifiers_.clear();
  return taken;
}

void FinishFrameRequest(HX_Frame frame, void* record) noexcept {
  auto* const request = static_cast<FrameRequest*>(record);
  if (frame != 0) request->cutpix->Dispose(frame);  // the cache keeps it
  // The table may end with the record's reference.
  const boost::shared_ptr<OutstandingRequests> requests = request->requests;
  if (requests->Finish(*request)) delete request;
}

}  // namespace kelp
