#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>

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
  // Owned by the handle; null in a handle without a state. Never followed: see InstanceHandleLock.
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
// The same, which lives in this process; without a state yet.
HX_Handle NewLiveHandle(const HostContext& context, std::uint64_t payload_length);
// Of a handle that is to be disposed of as it is, and owns no state.
void ForgetLiveHandle(HX_Handle handle);

// The header of a handle, in place for a scope. Throws HX_ERR_HANDLE_LOCK where there is none.
//
// A handle's bytes may come from a file, and may say anything: whether it lives, and which state it
// owns, is known by a list of the process.
class InstanceHandleLock {
 public:
  InstanceHandleLock(const HostContext& context, HX_Handle handle);
  InstanceHandleHeader& operator*() const { return *lock_.as<InstanceHandleHeader>(); }
  InstanceHandleHeader* operator->() const { return lock_.as<InstanceHandleHeader>(); }

  bool lives() const;
  // Null in a handle that doesn't live.
  StabilizerState* state() const { return lives() ? (*this)->state : nullptr; }
  // Into a handle that lives and has none; throws HX_ERR_HANDLE_LOCK where it doesn't live.
  void SetState(std::unique_ptr<StabilizerState> state) const;
  // The handle doesn't live any more.
  std::unique_ptr<StabilizerState> TakeState() const;

 private:
  const HX_Handle handle_;
  HandleLock lock_;
};

// The state that a handle owns; null for a null handle and one that doesn't live too. Throws
// HX_ERR_HANDLE_LOCK when the handle can't be locked.
StabilizerState* StateOfHandle(const HostContext& context, HX_Handle handle);

// What a handle that came from a project holds.
enum class FlattenedInstance {
  Live,     // it is this process's own
  Payload,  // to be read
  Nothing,  // of an instance that had nothing to store
  TooOld,
  TooNew,
  Damaged
};
FlattenedInstance InspectInstance(const HostContext& context, HX_Handle handle);

}  // namespace kelp::effect
