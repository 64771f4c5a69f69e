#include "platform/tessel/importer.h"

#include <map>
#include <mutex>

namespace tessel::importer {
namespace {

struct Callbacks {
  // Held during calls, so that nobody leaves while being called; recursive, since a callback may
  // drop the last owner of one.
  std::recursive_mutex mutex;
  std::map<utility::Guid, boost::function<void(bool)>> by_id;  // guarded by mutex
  bool paused = false;                                         // guarded by mutex
};

Callbacks& callbacks() {
  static Callbacks& instance = *new Callbacks;  // background threads may outlive static objects
  return instance;
}

}  // namespace

utility::Guid RegisterPauseCallback(boost::function<void(bool)> callback) {
  const utility::Guid id = utility::Guid::MakeUnique();
  std::lock_guard<std::recursive_mutex> lock(callbacks().mutex);
  callbacks().by_id.emplace(id, callback);
  if (callbacks().paused) callback(true);
  return id;
}

void UnregisterPauseCallback(const utility::Guid& id) {
  boost::function<void(bool)> dropped;  // what it holds may end in another Unregister
  std::lock_guard<std::recursive_mutex> lock(callbacks().mutex);
  const auto found = callbacks().by_id.find(id);
  if (found == callbacks().by_id.end()) return;
  dropped.swap(found->second);
  callbacks().by_id.erase(found);
}

void PauseBackgroundWork(bool pause) {
  std::lock_guard<std::recursive_mutex> lock(callbacks().mutex);
  callbacks().paused = pause;
  // One that comes meanwhile is told by its registration.
  for (auto next = callbacks().by_id.begin(); next != callbacks().by_id.end();) {
    const utility::Guid id = next->first;
    const boost::function<void(bool)> callback = next->second;
    callback(pause);
    next = callbacks().by_id.upper_bound(id);
  }
}

}  // namespace tessel::importer
