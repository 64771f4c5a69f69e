#include "host/base/operations.h"

#include <new>

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

void Ledger::Take(std::string_view suite) {
  std::lock_guard lock(mutex_);
  auto place = held_.find(suite);
  if (place == held_.end()) place = held_.emplace(suite, 0).first;
  ++place->second;
}

void Ledger::GiveBack(std::string_view suite) noexcept {
  {
    std::lock_guard lock(mutex_);
    const auto place = held_.find(suite);
    if (place != held_.end() && place->second > 0) {
      --place->second;
      return;
    }
  }
  Mistake(suite, ": given back but not held");
}

void Ledger::Mistake(std::string_view where, std::string_view what) noexcept {
  try {
    std::lock_guard lock(mutex_);
    if (mistakes_.size() < kMistakes) mistakes_.push_back(std::string(where).append(what));
  } catch (const std::bad_alloc&) {
  }
}

std::map<std::string, std::int64_t> Ledger::held() const {
  std::lock_guard lock(mutex_);
  std::map<std::string, std::int64_t> held;
  for (const auto& [suite, count] : held_) {
    if (count > 0) held.emplace(suite, count);
  }
  return held;
}

std::vector<std::string> Ledger::mistakes() const {
  std::lock_guard lock(mutex_);
  return mistakes_;
}

std::string Ledger::Report() const {
  std::string text;
  for (const auto& [suite, count] : held()) {
    text += std::to_string(count) + " of suite " + suite + " left\n";
  }
  for (const std::string& mistake : mistakes()) text += mistake + "\n";
  return text;
}

void Ledger::Reset() {
  std::lock_guard lock(mutex_);
  held_.clear();
  mistakes_.clear();
}

}  // namespace calmframe::host
