#pragma once

#include <atomic>
#include <boost/asio/io_context.hpp>
#include <boost/asio/local/stream_protocol.hpp>
#include <boost/asio/steady_timer.hpp>
#include <deque>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "studio/wire/message.h"

namespace calmframe::studio {

// Threads that end soon by themselves, and are waited for at last.
struct EndingThreads {
  EndingThreads() = default;
  ~EndingThreads() {
    for (std::thread& thread : threads) thread.join();
  }
  EndingThreads(const EndingThreads&) = delete;
  EndingThreads& operator=(const EndingThreads&) = delete;
  std::vector<std::thread> threads;
};

// The studio's end of a worker: a process of its own, which may end in whatever way. All is called
// on the context's thread.
class WorkerProcess : public std::enable_shared_from_this<WorkerProcess> {
 public:
  struct Events {
    std::function<void(Message)> message;
    // It is gone: its exit code, or 128 + the signal that ended it, and what it said last.
    std::function<void(int code, const std::string& said)> end;
  };

  // words: the program, and what comes ahead of the number of the socket that it inherits. Throws
  // std::system_error.
  static std::shared_ptr<WorkerProcess> Start(boost::asio::io_context& context,
                                              EndingThreads& ending, std::vector<std::string> words,
                                              Events events);
  ~WorkerProcess();

  // One that takes nothing until too much waits is killed.
  void Send(const Message& message);
  // Nothing is heard of it any more; it ends by itself, or is made to.
  void Close();

 private:
  WorkerProcess(boost::asio::io_context& context, EndingThreads& ending, Events events);
  // What its process is to do; what it says after `end` is not heard any more.
  enum class Process { live, end, die };
  void HangUp(Process is_to);
  void Read();
  void Write();

  EndingThreads& ending_;
  boost::asio::local::stream_protocol::socket socket_;
  Events events_;
  MessageReader reader_;
  std::vector<char> part_;
  boost::asio::steady_timer rest_;  // between what it says
  std::deque<std::string> out_;
  std::size_t out_bytes_ = 0;
  bool closed_ = false;
  const std::shared_ptr<std::atomic<Process>> process_ =
      std::make_shared<std::atomic<Process>>(Process::live);
  std::thread thread_;  // that the process belongs to
};

}  // namespace calmframe::studio
