#include "stabilizer/effect/src/instance_handle.h"

#include "effect/host_text.h"
#include "stabilizer/effect/src/stabilizer_strings.h"
#include "stabilizer/effect/src/state_format/format.h"

namespace kelp::effect {
namespace {

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

InstanceHandleLock::InstanceHandleLock(const HostContext& context, HX_Handle handle)
    : lock_(*context.in->cb, HasHeader(context, handle) ? handle : nullptr) {}

StabilizerState* StateOfHandle(const HostContext& context, HX_Handle handle) {
  if (!HasHeader(context, handle)) return nullptr;
  const InstanceHandleLock header(context, handle);
  return header->flattened ? nullptr : header->state;
}

FlattenedInstance InspectInstance(const HostContext& context, HX_Handle handle) {
  if (!HasHeader(context, handle)) return FlattenedInstance::Damaged;
  const std::uint64_t room = context.in->cb->handle_size(handle) - sizeof(InstanceHandleHeader);
  const InstanceHandleLock header(context, handle);
  if (!header->flattened) return FlattenedInstance::Live;
  if (header->version < state_format::kOldestVersion) return FlattenedInstance::TooOld;
  if (header->version > state_format::kPresentVersion) return FlattenedInstance::TooNew;
  if (header->payload_length > room) return FlattenedInstance::Damaged;
  return header->payload_length == 0 ? FlattenedInstance::Nothing : FlattenedInstance::Payload;
}

}  // namespace kelp::effect
