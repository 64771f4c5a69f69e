#include "analysis/src/mix_hash_guid.h"

#include <atomic>
#include <string>

#include "platform/tessel/debug.h"

namespace kelp::analysis {
namespace {

constexpr char kChannel[] = "MixHashGuid";
constexpr int kLevel = 6;

// The change count in the upper bits, whether the channel is on in the lowest: identities are made
// on every idle tick, and a look at two words is all that an idle trace may cost.
bool TraceIsOn() {
  static std::atomic<std::uint64_t> cached{0};
  const std::uint64_t count = tessel::debug::TraceChangeCount();
  std::uint64_t known = cached.load(std::memory_order_relaxed);
  if (known >> 1 != count) {
    known = count << 1 | (tessel::debug::TraceEnabled(kChannel, kLevel) ? 1 : 0);
    cached.store(known, std::memory_order_relaxed);
  }
  return (known & 1) != 0;
}

void Trace(const std::string& text) {
  tessel::debug::Trace(kChannel, kLevel, text);
}

}  // namespace

MixHashGuid::MixHashGuid(const char* level_name) {
  if (TraceIsOn()) Trace(std::string("Start Level '") + level_name);
}

MixHashGuid::~MixHashGuid() {
  if (TraceIsOn()) Trace("End level");
}

void MixHashGuid::Add(const void* data, std::size_t size) {
  state_ = tessel::utility::MixHash(state_, data, size);
  byte_count_ += size;
  if (TraceIsOn()) {
    Trace("Added " + std::to_string(byte_count_) + " bytes, now: " + state_.ToText());
  }
}

}  // namespace kelp::analysis
