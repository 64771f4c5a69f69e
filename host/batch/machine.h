#pragma once

#include <cstdint>

namespace calmframe::batch {

// What a program may use of the machine it runs on.
struct Machine {
  int processors = 1;       // of its affinity, and of its group's quota
  std::int64_t memory = 0;  // bytes that can be had, of the machine and of its group; 0: unknown
};

Machine ThisMachine();

// The most that a run keeps of decoded frames of a clip, from its analysis for its render: what it
// takes of so many pixels a frame, of 8 bits or `deep`, without its encoder, stays below 450 MB
// with that. Of 1280x720 some 190 frames, of 1920x1080 50, of 3840x2160 none.
std::int64_t MostKept(double pixels, bool deep);
// How much of that this process may keep, which has so many threads, 0 for all: no more than a
// quarter of the memory that can be had; and of both the part that it has of the processors, since
// others of a batch have the rest. Nothing where that memory isn't known, or where the process has
// a limit of its own.
std::int64_t BytesToKeep(const Machine& machine, int threads, double pixels, bool deep);

}  // namespace calmframe::batch
