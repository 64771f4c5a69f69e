#include "platform/tessel/importer.h"

#include <boost/make_shared.hpp>
#include <boost/shared_ptr.hpp>
#include <map>
#include <mutex>

#include "platform/tessel/undying.h"

namespace tessel::importer {
namespace {

struct Callbacks {
  // Held during calls, so that nobody leaves while being called; recursive, since a callback may
  // drop the last owner of one.
  std::recursive_mutex mutex;
  // Guarded by mutex. Shared, so that one which leaves while it is called needs no copy: that would
  // take memory, which may be what everything ends for.
  std::map<utility::Guid, boost::shared_ptr<const boost::function<void(bool)>>> by_id;
  bool paused = false;  // guarded by mutex
};

Callbacks& callbacks() {
  // Background threads may outlive static objects.
  static utility::Undying<Callbacks> instance;
  return *instance;
}

}  // namespace

utility::Guid RegisterPauseCallback(boost::function<void(bool)> callback) {
  const utility::Guid id = utility::Guid::MakeUnique();
  std::lock_guard<std::recursive_mutex> lock(callbacks().mutex);
  callbacks().by_id.emplace(id, boost::make_shared<const boost::function<void(bool)>>(callback));
  if (callbacks().paused) callback(true);
  return id;
}

void UnregisterPauseCallback(const utility::Guid& id) {
  boost::shared_ptr<const boost::function<void(bool)>>
      dropped;  // what it holds may end in another Unregister
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
    const auto callback = next->second;
    (*callback)(pause);
    next = callbacks().by_id.upper_bound(id);
  }
}

}  // namespace tessel::importer
