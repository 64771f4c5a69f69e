#pragma once

#include <boost/function.hpp>

#include "platform/tessel/guid.h"

// The host's importer module: where background work learns that it has to pause, for example while
// the host plays. Any thread.
namespace tessel::importer {

// From now on `callback(true)` asks for a pause and `callback(false)` ends it, on whichever thread
// the host says so; one call at a time. Called with true at once when a pause is on.
utility::Guid RegisterPauseCallback(boost::function<void(bool)> callback);

// Once it returns, the callback is neither running nor called again; within a callback it returns
// at once. Unknown ids are ignored.
void UnregisterPauseCallback(const utility::Guid& id);

// For the host. Returns when all callbacks have.
void PauseBackgroundWork(bool pause);

}  // namespace tessel::importer
