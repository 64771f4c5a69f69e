#pragma once

#include <cstdint>
#include <string>

// How the fuzzer's input tells what is to be read: a byte of version, a byte of flags, the payload.
namespace kelp::effect {

inline constexpr std::uint32_t kFirstVersion = 3, kVersionCount = 14;

enum : std::uint8_t {
  kAsItStands = 1,  // the payload is deflated already, or is to be read as if it were
  kOneByOne = 2,    // the present source
  kAnamorphic = 4,  // the present source
  kPacked = 8,      // the payload, as a host has it in memory, of the present version alone
};

inline std::string StateInput(std::uint32_t version, std::uint8_t flags,
                              const std::string& payload) {
  return std::string{static_cast<char>(version - kFirstVersion), static_cast<char>(flags)} +
         payload;
}

}  // namespace kelp::effect
