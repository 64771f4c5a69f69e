#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <map>
#include <mutex>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/hx/hx_types.h"

namespace calmframe::host {

// The code that an operation made to fail answers.
inline constexpr HX_Err kFaultCode = 9001;

// Every operation of the host that a plug-in calls and that may fail passes through Begin, so that
// any of them can be counted, and made to fail on purpose. One in a process, since the interface's
// functions carry no host. Any thread.
//
// Names: callbacks as in HX_Callbacks ("new_handle"), suites' operations as "Suite.Operation" with
// the suite's name without vendor, "Suite" and version ("Param Utils.SetParamValue"), operations of
// extra records as "plan.checkout_layer", and "acquire <suite name>".
class Operations {
 public:
  static Operations& Get();

  // HX_ERR_NONE, or kFaultCode when this operation is to fail.
  HX_Err Begin(const char* name);

  // -- Fault switches --
  // The n-th operation from now on, counted from 1, fails; 0: none. With a name, the n-th of those.
  void FailNth(std::int64_t n, const std::string& name = {});
  // Every operation of that name fails from now on.
  void FailAlways(const std::string& name);
  void FailNone();

  // -- Counts --
  // Operations since the process began.
  std::uint64_t count() const { return count_.load(std::memory_order_relaxed); }
  // While recording, names are kept in order.
  void Record(bool on);
  std::vector<std::string> recorded() const;

 private:
  HX_Err BeginWatched(const char* name);

  std::atomic<std::uint64_t> count_{0};
  std::atomic<bool> watched_{false};  // a switch is on or names are kept
  mutable std::mutex mutex_;
  bool recording_ = false;             // guarded by mutex_
  std::int64_t fail_in_ = 0;           // guarded by mutex_
  std::string fail_name_;              // guarded by mutex_; empty: any
  std::set<std::string> fail_always_;  // guarded by mutex_
  std::vector<std::string> recorded_;  // guarded by mutex_
};

// For the interface's functions: returns the fault code when the operation is to fail.
inline HX_Err BeginOperation(const char* name) {
  return Operations::Get().Begin(name);
}

// The suites that the plug-in holds, by name, and what it did wrong, as giving back what it did not
// hold. One in a process. Any thread.
class Ledger {
 public:
  static Ledger& Get();

  void Take(std::string_view suite);
  // One that is not held is a mistake.
  void GiveBack(std::string_view suite) noexcept;
  // The line is both texts. The first 100 are kept, as far as there is memory.
  void Mistake(std::string_view where, std::string_view what = {}) noexcept;

  // Those with a count above 0.
  std::map<std::string, std::int64_t> held() const;
  std::vector<std::string> mistakes() const;
  // One line for each of both; empty when all is in order.
  std::string Report() const;
  // Forgets both.
  void Reset();

 private:
  mutable std::mutex mutex_;
  std::map<std::string, std::int64_t, std::less<>> held_;  // guarded by mutex_
  std::vector<std::string> mistakes_;                      // guarded by mutex_
};

}  // namespace calmframe::host
