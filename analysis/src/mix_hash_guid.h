#pragma once

#include <cstddef>
#include <cstdint>

#include "platform/tessel/guid.h"

namespace kelp::analysis {

// An identity in the making: MixHash over piece after piece, from nil. Its steps are traced on the
// channel "MixHashGuid" at level 6.
class MixHashGuid {
 public:
  explicit MixHashGuid(const char* level_name);
  ~MixHashGuid();
  MixHashGuid(const MixHashGuid&) = delete;
  MixHashGuid& operator=(const MixHashGuid&) = delete;

  void Add(const void* data, std::size_t size);
  // Bytes as they lie in memory: the width of T is part of the identity.
  template <class T>
  void AddValue(const T& value) {
    Add(&value, sizeof value);
  }
  void Add(const tessel::utility::Guid& guid) { Add(guid.bytes().data(), guid.bytes().size()); }

  std::uint64_t byte_count() const { return byte_count_; }
  // Nil if nothing was added.
  const tessel::utility::Guid& Finish() const { return state_; }

 private:
  tessel::utility::Guid state_;
  std::uint64_t byte_count_ = 0;
};

}  // namespace kelp::analysis
