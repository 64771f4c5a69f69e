#pragma once

#include <cstdint>
#include <utility>

#include "platform/hx/hx_effect.h"

namespace kelp::effect {

// Keeps a block of the host's memory in place for its scope. Throws HX_ERR_HANDLE_LOCK for a null
// handle and when the host can't lock it.
class HandleLock {
 public:
  HandleLock(const HX_Callbacks& host, HX_Handle handle)
      : host_(host), handle_(handle), data_(handle ? host.lock_handle(handle) : nullptr) {
    if (!data_) throw std::int32_t{HX_ERR_HANDLE_LOCK};
  }
  ~HandleLock() { host_.unlock_handle(handle_); }
  HandleLock(const HandleLock&) = delete;
  HandleLock& operator=(const HandleLock&) = delete;

  void* data() const { return data_; }
  template <typename T>
  T* as() const {
    return static_cast<T*>(data_);
  }

 private:
  const HX_Callbacks& host_;
  const HX_Handle handle_;
  void* const data_;
};

// A block that is disposed of unless somebody releases it: a new one, zeroed, null when there is no
// memory; or one that is given.
class OwnedHandle {
 public:
  OwnedHandle(const HX_Callbacks& host, std::uint64_t size)
      : host_(host), handle_(host.new_handle(size)) {}
  OwnedHandle(const HX_Callbacks& host, HX_Handle handle) : host_(host), handle_(handle) {}
  ~OwnedHandle() {
    if (handle_) host_.dispose_handle(handle_);
  }
  OwnedHandle(const OwnedHandle&) = delete;
  OwnedHandle& operator=(const OwnedHandle&) = delete;

  explicit operator bool() const { return handle_ != nullptr; }
  HX_Handle get() const { return handle_; }
  HX_Handle release() { return std::exchange(handle_, nullptr); }

 private:
  const HX_Callbacks& host_;
  HX_Handle handle_;
};

}  // namespace kelp::effect
