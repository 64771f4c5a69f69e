#pragma once

#include <boost/function.hpp>
#include <boost/shared_ptr.hpp>
#include <compare>
#include <map>
#include <mutex>

#include "analysis/src/analysis.h"
#include "analysis/src/executor_job.h"
#include "platform/hx/hx_types.h"
#include "platform/tessel/guid.h"

namespace kelp::analysis {

// The jobs of the process, so that a host's effects on equal input share one. Any thread.
class JobRegistry {
 public:
  // Equal timing alone does not make two clips one: the source counts too.
  struct Key {
    tessel::utility::Guid job;     // GetIdentifierForJobInput
    tessel::utility::Guid source;  // GetUpstreamIdentifier
    // The global data of the plug-in, of which each host has its own: a host's frames are nobody
    // else's.
    HX_Handle plugin = nullptr;
    auto operator<=>(const Key&) const = default;
  };
  // Two null pointers: no entry.
  struct Entry {
    boost::shared_ptr<Analysis> analysis;
    boost::shared_ptr<ExecutorJob> job;
  };

  static JobRegistry& Instance();

  Entry Find(const Key& key) const;
  // The entry of the key if `may_join` says so, else what `make` gives, in its place. `make` may
  // throw; then nothing changes.
  Entry FindOrMake(const Key& key, const boost::function<bool(const Entry&)>& may_join,
                   const boost::function<Entry()>& make);
  // Removes the key's entry if it is of the job of this id.
  void Remove(const Key& key, const tessel::utility::Guid& job_id);
  // Cancels every job of the host's and removes its entry; running jobs end on their threads. For
  // the plug-in's end.
  void CancelAll(HX_Handle plugin);

 private:
  JobRegistry() = default;

  mutable std::recursive_mutex lock_;
  std::map<Key, Entry> entries_;  // guarded by lock_
};

// Asks the job to stop, lifts a pause for good, and takes no more tasks.
void CancelJob(ExecutorJob& job);

}  // namespace kelp::analysis
