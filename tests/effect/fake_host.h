#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/hx/hx.h"
#include "platform/tessel/config.h"

// A host of one effect, as far as an effect's parts need one: records filled as a host fills them,
// callbacks, suites, and faults on order. One at a time in a process, since the interface's
// callbacks carry no host. Its functions may be called on any thread. Unlocked blocks move whenever
// they are unlocked, so that a pointer that was kept is found out.
class FakeHost {
 public:
  static constexpr HX_Err kFault = 9001;

  FakeHost();
  ~FakeHost();
  FakeHost(const FakeHost&) = delete;
  FakeHost& operator=(const FakeHost&) = delete;

  // The records of the next call. Call presets `out` and takes the handles back, as a host does for
  // every command.
  HX_InData in{};
  HX_OutData out{};
  HX_Err Call(HX_EffectMain entry, std::uint32_t command, HX_ParamDef* params[] = nullptr,
              HX_World* output = nullptr, void* extra = nullptr);
  // Presets `out` alone, for those who call parts of an effect.
  void Prepare();
  bool ShowsMessage() const { return out.out_flags & HX_OUT_FLAG_SHOW_MESSAGE; }

  // What each operation that may fail does: new_handle and lock_handle answer null, acquire
  // refuses, all others answer kFault.
  struct Operation {
    std::string name;  // of the callback, of "Suite.Operation", or "acquire Suite version"
    bool failed;
  };
  // The n-th such operation from now on fails, counted from 1; 0: none.
  void FailOperation(int n);
  // Every acquisition of the suite, of any version, fails.
  void RefuseSuite(const std::string& name) { refused_.insert(name); }
  void OfferAllSuites() { refused_.clear(); }
  const std::vector<Operation>& operations() const { return operations_; }
  void ForgetOperations() { operations_.clear(); }
  // How many operations have this name.
  int Count(const std::string& name) const;

  // Offers a table beside the fake's own: Param Utils 3, Private Effect 3, App 6, Adv App 1 and
  // World 2.
  void Offer(const std::string& name, std::int32_t version, const void* table);

  // Held by every operation: for a test that changes what other threads read.
  std::recursive_mutex& mutex() { return mutex_; }

  // Index 0 is the layer; the rest is what add_param appended. Checkouts give copies.
  std::vector<HX_ParamDef> params;
  std::vector<std::int32_t> checkout_times;
  // Arbitrary values that SetParamValue took others for; the test disposes of them.
  std::vector<HX_Handle> replaced_values;

  std::vector<HX_Rect> invalidated;

  // What the information panel shows, a line after the other.
  std::vector<std::string> info_text() const;
  int rerenders() const;
  std::string handle_bytes(HX_Handle handle) const;

  // What the effect did not give back, and what it gave back once too often: handles, locks,
  // suites, checkouts, worlds, string tables. Empty if all is in order.
  std::string Leaks() const;

 private:
  friend struct FakeHostCallbacks;

  // True when this operation is to fail.
  bool Operate(const std::string& name);
  void Expect(bool holds, const char* mistake);

  mutable std::recursive_mutex mutex_;
  std::map<std::pair<std::string, std::int32_t>, const void*> suites_;
  std::map<std::pair<std::string, std::int32_t>, int> acquired_;
  std::set<std::string> refused_;
  std::set<HX_Handle> handles_;
  std::map<std::uint64_t, std::unique_ptr<tessel::config::StringTable>> strings_;
  std::uint64_t last_token_ = 100;
  std::set<void*> worlds_;
  int checkouts_ = 0;
  std::vector<Operation> operations_;
  int fail_in_ = 0;
  std::vector<std::string> mistakes_;
  std::vector<std::string> info_text_;
  int rerenders_ = 0;
};
