#pragma once

#include <cstdint>

// What stands in an input of studio_fuzz for what a page knows.
inline constexpr char kSecret = '\x01', kClip = '\x02', kHere = '\x03';
// The studio reads what came before, ahead of what comes behind.
inline constexpr char kPause = '\x04';

// The first byte: what the others are.
enum : std::uint8_t { kOfStranger = 0, kOfWorker = 1 };
