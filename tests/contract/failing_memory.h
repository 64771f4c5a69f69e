#pragma once

#include <cstdint>

// A process whose memory runs out: the program that has this replaces operator new, for the
// libraries that it loads too, and the start of threads. While armed, allocations of all threads
// are counted from 1, and those from `first` on fail, `count` of them.
class FailingMemory {
 public:
  static void Arm(std::int64_t first, std::int64_t count);
  // Allocations since it was armed.
  static std::int64_t Disarm();
};
