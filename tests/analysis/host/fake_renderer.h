#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "platform/hx/hx.h"
#include "platform/tessel/guid.h"

class FakeHost;

// The asynchronous renderer of a host and its cache, which keeps no frame that nobody references.
// One at a time; one thread renders.
class FakeRenderer {
 public:
  enum class Callbacks {
    kLater,  // on the render thread
    kEarly,  // before RenderAsync returns
    kHeld    // when the test says so
  };

  // Offers its suites to the host, which outlives it.
  explicit FakeRenderer(FakeHost& host);
  ~FakeRenderer();
  FakeRenderer(const FakeRenderer&) = delete;
  FakeRenderer& operator=(const FakeRenderer&) = delete;

  std::atomic<Callbacks> callbacks = Callbacks::kLater;
  std::atomic<bool> null_frames = false;
  std::atomic<bool> top_down = false;
  std::atomic<bool> refuse_renders = false, refuse_identifiers = false;
  std::atomic<int> delivered_width = 0;                  // 0: as asked
  std::atomic<std::int64_t> ticks_per_frame = 28224000;  // of the identifiers

  struct Request {
    std::int64_t time_ticks = 0, rate_ticks = 0;
    HX_RenderParams params{};
    tessel::utility::Guid frame;
  };
  // All accepted requests so far.
  std::vector<Request> requests() const;
  // Of requests that were cancelled before their callback.
  int cancelled() const;
  // Calls back what is held, cancelled or not.
  void Deliver();
  // No callback is held any more.
  void Resume();
  // Ends the render thread, when all that is not held has its callback.
  void Stop();
  // Until `count` requests are held.
  void WaitForHeld(std::size_t count);

  // What was lent and not given back: handles and references of frames, requests without callback.
  std::string Leaks() const;

  // The grey of a pixel of the frame at a time; shifts to the right with each frame of 25 a second.
  static std::uint8_t Grey(std::int64_t time_ticks, int x, int y);

 private:
  friend struct FakeRendererSuites;

  struct Frame {
    std::vector<std::uint8_t> pixels;
    int width, height;
  };
  struct Pending {
    std::int32_t id;
    Request request;
    HX_RenderCallback callback;
    void* record;
    bool cancelled;
  };

  void Finish(const Pending& pending);
  void Work();

  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<Pending> pending_;  // guarded by mutex_, as are the following
  bool stops_ = false;
  std::int32_t last_id_ = 0;
  int cancelled_ = 0;
  int unanswered_ = 0;
  std::vector<Request> requests_;
  std::map<tessel::utility::Guid, std::shared_ptr<Frame>> cache_;
  std::map<tessel::utility::Guid, int> references_;
  HX_Frame last_frame_ = 0;
  std::map<HX_Frame, std::shared_ptr<Frame>> handles_;
  std::vector<std::string> mistakes_;
  std::thread worker_;
};
