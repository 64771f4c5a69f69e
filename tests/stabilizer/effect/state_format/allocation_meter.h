#pragma once

#include <cstdint>

// How many more bytes this thread has held, by operator new, than at the meter's beginning. One at
// a time on a thread.
class AllocationMeter {
 public:
  AllocationMeter();
  std::int64_t Peak() const;

 private:
  std::int64_t begin_;
};
