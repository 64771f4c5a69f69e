#pragma once

#include <cstddef>
#include <new>

namespace tessel::utility {

// An object that is never destroyed, for statics of functions that threads may call while the
// process ends. It lies in the static itself, so that the first call takes no memory for it: that
// call may be the one of a destructor, after memory has run out.
template <class Value>
class Undying {
 public:
  Undying() { new (bytes_) Value; }
  Undying(const Undying&) = delete;
  Undying& operator=(const Undying&) = delete;

  Value& operator*() { return *std::launder(reinterpret_cast<Value*>(bytes_)); }

 private:
  alignas(Value) std::byte bytes_[sizeof(Value)];
};

}  // namespace tessel::utility
