#pragma once

#include <boost/function.hpp>

// What the sources of the threads share.
namespace tessel::threads::internal {

// Runs `body` on a thread of its own, until whose end Shutdown waits. Throws std::system_error
// where there is no thread.
void StartThread(boost::function<void()> body);

// Ends the queues of all single-threaded executors; their threads end when those are done. Until
// FinishEnding, executors are borrowed with their queue ended.
void BeginEndingPooledThreads();
void FinishEndingPooledThreads();

}  // namespace tessel::threads::internal
