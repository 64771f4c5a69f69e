#include "studio/server/program_run.h"

#include <boost/asio/post.hpp>
#include <chrono>
#include <exception>
#include <optional>
#include <utility>

#include "host/base/json_bounds.h"
#include "host/batch/child.h"

namespace calmframe::studio {

// What is posted finds it, or nobody.
struct ProgramRun::Listener {
  Events events;
  std::string error;  // that it told last, cut

  void Hear(const std::string& line) {
    const nlohmann::json told =
        ExceedsBounds(line) ? nlohmann::json() : nlohmann::json::parse(line, nullptr, false);
    constexpr std::size_t kLongest = 2000;
    if (!told.is_object()) {
      error = line.substr(0, kLongest);
      return;
    }
    try {
      error = told.value("error", error).substr(0, kLongest);
      events.told(told);
    } catch (const nlohmann::json::exception&) {  // of another shape
    }
  }

  void End(int code) {
    if (code == 0) {
      error.clear();
    } else if (code > 128) {
      error = "it crashed (signal " + std::to_string(code - 128) + ")";
    } else if (error.empty()) {
      error = "it ended with code " + std::to_string(code);
    }
    events.ended(error);
  }
};

ProgramRun::ProgramRun(boost::asio::io_context& context, std::vector<std::string> words,
                       Events events)
    : listener_(std::make_shared<Listener>(Listener{std::move(events), {}})) {
  const std::weak_ptr<Listener> weak = listener_;
  // Lines on their way: a run that talks faster than it is heard waits.
  const auto unheard = std::make_shared<std::atomic<int>>(0);
  const auto post = [&context, weak, unheard](auto act) {
    ++*unheard;
    boost::asio::post(context, [weak, act, unheard] {
      --*unheard;
      if (const std::shared_ptr<Listener> listener = weak.lock()) act(*listener);
    });
  };
  thread_ = std::thread([post, unheard, words = std::move(words), stops = stops_] {
    int code = 127;
    try {
      batch::Child child(words);
      using Clock = std::chrono::steady_clock;
      constexpr std::chrono::seconds kUntilKilled(20);
      std::string line;
      std::optional<Clock::time_point> stopped;
      while (true) {
        const batch::Child::Said said = child.Next(line, 100);
        if (*stops) {
          child.AskToEnd();
          if (!stopped) stopped = Clock::now();
          if (Clock::now() - *stopped > kUntilKilled) break;
        }
        if (said == batch::Child::Said::end) break;
        if (said == batch::Child::Said::line) {
          post([line](Listener& listener) { listener.Hear(line); });
        }
        constexpr int kMostUnheard = 100;
        while (*unheard > kMostUnheard && !*stops) {
          std::this_thread::sleep_for(std::chrono::milliseconds(5));
        }
      }
      child.Kill();  // see WorkerProcess::Start
      code = child.Wait();
    } catch (const std::exception& error) {
      post([line = std::string(error.what())](Listener& listener) { listener.Hear(line); });
    }
    post([code](Listener& listener) { listener.End(code); });
  });
}

ProgramRun::~ProgramRun() {
  *stops_ = true;
  listener_.reset();
  thread_.join();
}

}  // namespace calmframe::studio
