#include "analysis/src/job_registry.h"

#include <iterator>
#include <utility>

namespace kelp::analysis {

using Lock = std::lock_guard<std::recursive_mutex>;

JobRegistry& JobRegistry::Instance() {
  static JobRegistry instance;
  return instance;
}

JobRegistry::Entry JobRegistry::Find(const Key& key) const {
  const Lock lock(lock_);
  const auto found = entries_.find(key);
  return found == entries_.end() ? Entry() : found->second;
}

JobRegistry::Entry JobRegistry::FindOrMake(const Key& key,
                                           const boost::function<bool(const Entry&)>& may_join,
                                           const boost::function<Entry()>& make) {
  Entry made, replaced;  // a job's end asks the host; it comes after the lock
  const Lock lock(lock_);
  const auto found = entries_.find(key);
  if (found != entries_.end() && may_join(found->second)) return found->second;
  made = make();
  if (found != entries_.end()) {
    replaced = std::exchange(found->second, made);
  } else {
    entries_.emplace(key, made);
  }
  return made;
}

void JobRegistry::Remove(const Key& key, const tessel::utility::Guid& job_id) {
  Entry removed;
  const Lock lock(lock_);
  const auto found = entries_.find(key);
  if (found == entries_.end() || found->second.job->id() != job_id) return;
  removed = std::move(found->second);
  entries_.erase(found);
}

void JobRegistry::CancelAll(HX_Handle plugin) {
  std::map<Key, Entry> removed;
  {
    const Lock lock(lock_);
    for (auto entry = entries_.begin(); entry != entries_.end();) {
      const auto next = std::next(entry);
      if (entry->first.plugin == plugin) removed.insert(entries_.extract(entry));
      entry = next;
    }
  }
  for (const auto& [key, entry] : removed) CancelJob(*entry.job);
}

void CancelJob(ExecutorJob& job) {
  job.Cancel();
  job.executor().Resume();
  job.executor().EndQueue();
}

}  // namespace kelp::analysis
