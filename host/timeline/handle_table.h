#pragma once

#include <cstddef>
#include <limits>
#include <mutex>
#include <optional>
#include <unordered_map>
#include <utility>

namespace calmframe::host {

// What was lent, by numbers from 1 on. A number is never used again while numbers last, so that one
// given back twice harms nobody else's. Any thread.
template <class Number, class Value>
class HandleTable {
 public:
  Number Add(Value value) {
    std::lock_guard lock(mutex_);
    do {
      last_ = last_ == kLast ? Number{1} : static_cast<Number>(last_ + 1);
    } while (values_.count(last_) != 0);
    values_.emplace(last_, std::move(value));
    return last_;
  }

  std::optional<Value> Find(Number number) const {
    std::lock_guard lock(mutex_);
    const auto found = values_.find(number);
    if (found == values_.end()) return std::nullopt;
    return found->second;
  }

  // False if there is no such number.
  bool Remove(Number number) {
    typename std::unordered_map<Number, Value>::node_type removed;  // destroyed unlocked
    std::lock_guard lock(mutex_);
    removed = values_.extract(number);
    return !removed.empty();
  }

  std::size_t size() const {
    std::lock_guard lock(mutex_);
    return values_.size();
  }

 private:
  static constexpr Number kLast = std::numeric_limits<Number>::max();
  mutable std::mutex mutex_;
  Number last_ = 0;                           // guarded by mutex_
  std::unordered_map<Number, Value> values_;  // guarded by mutex_
};

}  // namespace calmframe::host
