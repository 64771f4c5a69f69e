#include "studio/server/worker_process.h"

#include <sys/socket.h>
#include <unistd.h>

#include <boost/asio/buffer.hpp>
#include <boost/asio/post.hpp>
#include <boost/asio/write.hpp>
#include <cerrno>
#include <chrono>
#include <exception>
#include <optional>
#include <system_error>
#include <utility>

#include "host/batch/child.h"

namespace calmframe::studio {

using boost::system::error_code;
using Clock = std::chrono::steady_clock;

WorkerProcess::WorkerProcess(boost::asio::io_context& context, EndingThreads& ending, Events events)
    : ending_(ending),
      socket_(context),
      events_(std::move(events)),
      part_(256 << 10),
      rest_(context) {}

WorkerProcess::~WorkerProcess() {
  Close();
}

std::shared_ptr<WorkerProcess> WorkerProcess::Start(boost::asio::io_context& context,
                                                    EndingThreads& ending,
                                                    std::vector<std::string> words, Events events) {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
    throw std::system_error(errno, std::generic_category());
  }
  const std::shared_ptr<WorkerProcess> worker(
      new WorkerProcess(context, ending, std::move(events)));
  worker->socket_.assign(boost::asio::local::stream_protocol(), ends[0]);
  words.push_back(std::to_string(ends[1]));
  // A child belongs to the thread that started it.
  worker->thread_ = std::thread([words, theirs = ends[1], process = worker->process_, &context,
                                 weak = std::weak_ptr<WorkerProcess>(worker)]() mutable {
    int code = 127;
    std::string said;
    try {
      batch::Child child(words, theirs);
      close(std::exchange(theirs, -1));
      constexpr std::chrono::seconds kUntilKilled(4);
      std::optional<Clock::time_point> ends_since;
      std::string line;
      while (true) {
        const batch::Child::Said what = child.Next(line, 200);
        if (what == batch::Child::Said::end) break;
        if (what == batch::Child::Said::line) said = line;
        const Process is_to = *process;
        if (is_to == Process::live) continue;
        if (!ends_since) ends_since = Clock::now();
        if (is_to == Process::die || Clock::now() - *ends_since > kUntilKilled) break;
      }
      // What a clip has taken over may hear nothing, and say nothing any more.
      child.Kill();
      code = child.Wait();
    } catch (const std::exception& error) {
      if (theirs >= 0) close(theirs);
      said = error.what();
    }
    boost::asio::post(context, [weak, code, said] {
      const std::shared_ptr<WorkerProcess> ended = weak.lock();
      if (!ended || ended->closed_) return;
      const auto tell = ended->events_.end;
      ended->Close();
      if (tell) tell(code, said);
    });
  });
  worker->Read();
  return worker;
}

void WorkerProcess::Send(const Message& message) {
  if (closed_) return;
  // Settings with all the tracks that may be deleted are some 300 kB.
  constexpr std::size_t kMostWaiting = std::size_t{32} << 20;
  out_.push_back(Encode(message));
  out_bytes_ += out_.back().size();
  if (out_bytes_ > kMostWaiting) HangUp(Process::die);
  if (out_.size() == 1) Write();
}

void WorkerProcess::Close() {
  closed_ = true;
  events_ = {};
  HangUp(Process::end);
  rest_.cancel();
  // What is still to be written may hold this until the context goes, after all else.
  if (thread_.joinable()) ending_.threads.push_back(std::move(thread_));
}

void WorkerProcess::HangUp(Process is_to) {
  *process_ = is_to;
  error_code ignored;
  socket_.shutdown(boost::asio::local::stream_protocol::socket::shutdown_both, ignored);
}

void WorkerProcess::Read() {
  socket_.async_read_some(
      boost::asio::buffer(part_),
      [weak = weak_from_this()](const error_code& error, std::size_t size) {
        const std::shared_ptr<WorkerProcess> self = weak.lock();
        if (!self || self->closed_) return;
        if (error) return self->HangUp(Process::end);  // its end is told by its process
        const Clock::time_point began = Clock::now();
        try {
          self->reader_.Add(self->part_.data(), size);
          while (std::optional<Message> message = self->reader_.Next()) {
            if (self->events_.message) self->events_.message(std::move(*message));
          }
        } catch (const std::exception&) {  // no message, or one that makes no sense
          return self->HangUp(Process::die);
        }
        // Whoever talks without end has a fifth of the thread's time.
        constexpr std::chrono::milliseconds kShort(2);
        const Clock::duration took = Clock::now() - began;
        if (took < kShort) return self->Read();
        self->rest_.expires_after(4 * took);
        self->rest_.async_wait([weak](const error_code&) {
          const std::shared_ptr<WorkerProcess> rested = weak.lock();
          if (rested && !rested->closed_) rested->Read();
        });
      });
}

void WorkerProcess::Write() {
  boost::asio::async_write(socket_, boost::asio::buffer(out_.front()),
                           [self = shared_from_this()](const error_code& error, std::size_t) {
                             if (error) return;
                             self->out_bytes_ -= self->out_.front().size();
                             self->out_.pop_front();
                             if (!self->out_.empty()) self->Write();
                           });
}

}  // namespace calmframe::studio
