#pragma once

#include <cstddef>
#include <cstdint>

#include "effect/handle.h"
#include "effect/host_context.h"

namespace kelp::effect {

class StabilizerState;

// What an instance handle begins with, live or flattened. Little-endian; the payload stands behind
// it.
struct InstanceHandleHeader {
  std::uint32_t version;
  std::uint8_t flattened;  // a payload to be stored, and no state
  std::uint8_t raw;        // the payload is not compressed
  // Owned by the handle; null in a handle without a state, and of no meaning in a flattened one.
  StabilizerState* state;
  std::uint64_t payload_length;
};
static_assert(sizeof(InstanceHandleHeader) == 24);
static_assert(offsetof(InstanceHandleHeader, state) == 8);

// Bytes of a handle besides its payload.
inline constexpr std::uint64_t kInstanceHandleOverhead = 31;
// A live handle's payload.
inline constexpr std::uint64_t kLivePayloadLength = 1;

// A handle for that much payload, all of it zero but the version and the length. Throws
// HX_ERR_NO_INSTANCE, with a message, when there is no memory.
HX_Handle NewInstanceHandle(const HostContext& context, std::uint64_t payload_length);

// The header of a handle, in place for a scope. Throws HX_ERR_HANDLE_LOCK where there is none.
class InstanceHandleLock {
 public:
  InstanceHandleLock(const HostContext& context, HX_Handle handle);
  InstanceHandleHeader& operator*() const { return *lock_.as<InstanceHandleHeader>(); }
  InstanceHandleHeader* operator->() const { return lock_.as<InstanceHandleHeader>(); }

 private:
  HandleLock lock_;
};

// The state that a handle owns; null for a null, flattened or too small handle too. Throws
// HX_ERR_HANDLE_LOCK when the handle can't be locked.
StabilizerState* StateOfHandle(const HostContext& context, HX_Handle handle);

// What a handle that came from a project holds.
enum class FlattenedInstance {
  Live,     // not flattened
  Payload,  // to be read
  Nothing,  // of an instance that had nothing to store
  TooOld,
  TooNew,
  Damaged
};
FlattenedInstance InspectInstance(const HostContext& context, HX_Handle handle);

}  // namespace kelp::effect
