#include "stabilizer/effect/src/instance_handle.h"

#include <mutex>
#include <unordered_map>
#include <utility>

#include "effect/host_text.h"
#include "stabilizer/effect/src/stabilizer_state.h"
#include "stabilizer/effect/src/stabilizer_strings.h"
#include "stabilizer/effect/src/state_format/format.h"

namespace kelp::effect {
namespace {

// The handles that live in this process, with the states that they own; null for none. Any thread.
struct LiveHandles {
  std::mutex mutex;
  std::unordered_map<HX_Handle, StabilizerState*> states;  // guarded by mutex
};

LiveHandles& Live() {
  static LiveHandles live;
  return live;
}

bool HasHeader(const HostContext& context, HX_Handle handle) {
  return handle && context.in->cb->handle_size(handle) >= sizeof(InstanceHandleHeader);
}

}  // namespace

HX_Handle NewInstanceHandle(const HostContext& context, std::uint64_t payload_length) {
  OwnedHandle handle(*context.in->cb, kInstanceHandleOverhead + payload_length);
  if (!handle) {
    ShowMessage(context, GetString(context, kStringOutOfMemory));
    throw std::int32_t{HX_ERR_NO_INSTANCE};
  }
  *InstanceHandleLock(context, handle.get()) = {state_format::kPresentVersion, 0, 0, nullptr,
                                                payload_length};
  return handle.release();
}

HX_Handle NewLiveHandle(const HostContext& context, std::uint64_t payload_length) {
  OwnedHandle handle(*context.in->cb, NewInstanceHandle(context, payload_length));
  const std::lock_guard lock(Live().mutex);
  Live().states[handle.get()] = nullptr;
  return handle.release();
}

void ForgetLiveHandle(HX_Handle handle) {
  const std::lock_guard lock(Live().mutex);
  Live().states.erase(handle);
}

InstanceHandleLock::InstanceHandleLock(const HostContext& context, HX_Handle handle)
    : handle_(handle), lock_(*context.in->cb, HasHeader(context, handle) ? handle : nullptr) {}

// The bytes count too: a host may have given the place of a handle that it lost to another.
bool InstanceHandleLock::lives() const {
  const std::lock_guard lock(Live().mutex);
  const auto found = Live().states.find(handle_);
  return found != Live().states.end() && !(*this)->flattened && (*this)->state == found->second;
}

void InstanceHandleLock::SetState(std::unique_ptr<StabilizerState> state) const {
  if (!lives()) throw std::int32_t{HX_ERR_HANDLE_LOCK};
  const std::lock_guard lock(Live().mutex);
  Live().states[handle_] = (*this)->state = state.release();
}

std::unique_ptr<StabilizerState> InstanceHandleLock::TakeState() const {
  std::unique_ptr<StabilizerState> own(state());
  ForgetLiveHandle(handle_);
  (*this)->state = nullptr;
  return own;
}

StabilizerState* StateOfHandle(const HostContext& context, HX_Handle handle) {
  if (!HasHeader(context, handle)) return nullptr;
  return InstanceHandleLock(context, handle).state();
}

FlattenedInstance InspectInstance(const HostContext& context, HX_Handle handle) {
  if (!HasHeader(context, handle)) return FlattenedInstance::Damaged;
  const std::uint64_t room = context.in->cb->handle_size(handle) - sizeof(InstanceHandleHeader);
  const InstanceHandleLock header(context, handle);
  if (!header->flattened) {
    return header.lives() ? FlattenedInstance::Live : FlattenedInstance::Damaged;
  }
  if (header->version < state_format::kOldestVersion) return FlattenedInstance::TooOld;
  if (header->version > state_format::kPresentVersion) return FlattenedInstance::TooNew;
  if (header->payload_length > room) return FlattenedInstance::Damaged;
  return header->payload_length == 0 ? FlattenedInstance::Nothing : FlattenedInstance::Payload;
}

}  // namespace kelp::effect
