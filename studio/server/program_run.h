#pragma once

#include <atomic>
#include <boost/asio/io_context.hpp>
#include <functional>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>
#include <thread>
#include <vector>

namespace calmframe::studio {

// A run of the program itself with --json: what it tells, and how it ended. On the context's
// thread.
class ProgramRun {
 public:
  struct Events {
    // An object that it told.
    std::function<void(const nlohmann::json& told)> told;
    // It is gone, of itself or since it was stopped, and this may go too. `error`: one line of why;
    // empty where all went well.
    std::function<void(const std::string& error)> ended;
  };

  // words: the program's path first. Nothing is told before this has returned.
  ProgramRun(boost::asio::io_context& context, std::vector<std::string> words, Events events);
  // Stops it and waits for its end, of which nothing is told.
  ~ProgramRun();
  ProgramRun(const ProgramRun&) = delete;
  ProgramRun& operator=(const ProgramRun&) = delete;

  // Asks it to end, and kills it where it has not after a while.
  void Stop() { *stops_ = true; }
  bool is_stopped() const { return *stops_; }

 private:
  struct Listener;

  const std::shared_ptr<std::atomic<bool>> stops_ = std::make_shared<std::atomic<bool>>(false);
  std::shared_ptr<Listener> listener_;
  std::thread thread_;  // that the process belongs to
};

}  // namespace calmframe::studio
