#pragma once

#include <cstdint>

namespace calmframe::batch {

// What a program may use of the machine it runs on.
struct Machine {
  int processors = 1;       // of its affinity, and of its group's quota
  std::int64_t memory = 0;  // bytes that can be had, of the machine and of its group; 0: unknown
};

Machine ThisMachine();

}  // namespace calmframe::batch
