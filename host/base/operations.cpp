#include "host/base/operations.h"

#include <algorithm>

namespace calmframe::host {
namespace {

// The first ones tell; a plug-in that repeats one for ever shall not fill the memory.
constexpr std::size_t kMistakes = 100;

}  // namespace

Operations& Operations::Get() {
  static Operations operations;
  return operations;
}

HX_Err Operations::Begin(const char* name) {
  count_.fetch_add(1, std::memory_order_relaxed);
  return watched_.load(std::memory_order_relaxed) ? BeginWatched(name) : HX_ERR_NONE;
}

HX_Err Operations::BeginWatched(const char* name) {
  std::lock_guard lock(mutex_);
  if (recording_) recorded_.push_back(name);
  const bool counts = fail_in_ > 0 && (fail_name_.empty() || fail_name_ == name);
  const bool nth = counts && --fail_in_ == 0;
  return nth || fail_always_.count(name) != 0 ? kFaultCode : HX_ERR_NONE;
}

void Operations::FailNth(std::int64_t n, const std::string& name) {
  std::lock_guard lock(mutex_);
  fail_in_ = n;
  fail_name_ = name;
  watched_ = recording_ || fail_in_ > 0 || !fail_always_.empty();
}

void Operations::FailAlways(const std::string& name) {
  std::lock_guard lock(mutex_);
  fail_always_.insert(name);
  watched_ = true;
}

void Operations::FailNone() {
  std::lock_guard lock(mutex_);
  fail_in_ = 0;
  fail_always_.clear();
  watched_ = recording_;
}

void Operations::Record(bool on) {
  std::lock_guard lock(mutex_);
  if (on) recorded_.clear();
  recording_ = on;
  watched_ = recording_ || fail_in_ > 0 || !fail_always_.empty();
}

std::vector<std::string> Operations::recorded() const {
  std::lock_guard lock(mutex_);
  return recorded_;
}

Ledger& Ledger::Get() {
  static Ledger ledger;
  return ledger;
}

void Ledger::Take(const std::string& kind, std::int64_t count) {
  std::lock_guard lock(mutex_);
  held_[kind] += count;
}

void Ledger::GiveBack(const std::string& kind, std::int64_t count) {
  std::lock_guard lock(mutex_);
  std::int64_t& held = held_[kind];
  if (held < count && mistakes_.size() < kMistakes) {
    mistakes_.push_back(kind + ": given back but not held");
  }
  held = std::max<std::int64_t>(held - count, 0);
}

void Ledger::Mistake(const std::string& what) {
  std::lock_guard lock(mutex_);
  if (mistakes_.size() < kMistakes) mistakes_.push_back(what);
}

std::map<std::string, std::int64_t> Ledger::held() const {
  std::lock_guard lock(mutex_);
  std::map<std::string, std::int64_t> held;
  for (const auto& [kind, count] : held_) {
    if (count > 0) held.emplace(kind, count);
  }
  return held;
}

std::vector<std::string> Ledger::mistakes() const {
  std::lock_guard lock(mutex_);
  return mistakes_;
}

std::string Ledger::Report() const {
  std::string text;
  for (const auto& [kind, count] : held())
    text += std::to_string(count) + " of " + kind + " left\n";
  for (const std::string& mistake : mistakes()) text += mistake + "\n";
  return text;
}

void Ledger::Reset() {
  std::lock_guard lock(mutex_);
  held_.clear();
  mistakes_.clear();
}

}  // namespace calmframe::host
