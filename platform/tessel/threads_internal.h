#pragma once

// What the sources of the threads share.
namespace tessel::threads::internal {

// Around the life of every thread that runs tasks; Shutdown waits for them.
void BeginThread();
void EndThread();

// Ends the queues of all single-threaded executors; their threads end when those are done. Until
// FinishEnding, executors are borrowed with their queue ended.
void BeginEndingPooledThreads();
void FinishEndingPooledThreads();

}  // namespace tessel::threads::internal
