#pragma once

#include <atomic>
#include <memory>
#include <mutex>

namespace calmframe::host {

// A share of the one T of the process, which the first share makes and the last takes down: for
// what a plug-in names without telling whose it is. Any thread.
template <class T>
class SharedByAll {
 public:
  SharedByAll() {
    State& state = Get();
    const std::lock_guard lock(state.mutex);
    if (state.shares == 0) state.object = new T;
    ++state.shares;
  }
  ~SharedByAll() {
    State& state = Get();
    std::unique_ptr<T> last;  // goes unlocked
    const std::lock_guard lock(state.mutex);
    if (--state.shares == 0) last.reset(state.object.exchange(nullptr));
  }
  SharedByAll(const SharedByAll&) = delete;
  SharedByAll& operator=(const SharedByAll&) = delete;

  T& operator*() const { return *Get().object; }
  T* operator->() const { return Get().object; }

  // Null while there is no share. For whoever runs only while somebody holds one.
  static T* active() { return Get().object; }

 private:
  struct State {
    std::mutex mutex;
    int shares = 0;  // guarded by mutex
    std::atomic<T*> object{nullptr};
  };
  static State& Get() {
    static State& state = *new State;  // outlives threads that ask at the process's end
    return state;
  }
};

}  // namespace calmframe::host
