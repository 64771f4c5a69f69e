#pragma once

#include <boost/asio/io_context.hpp>
#include <cstdint>
#include <functional>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "studio/wire/settings.h"

namespace calmframe::studio {

// A clip that is to be drawn into a file.
struct RenderOrder {
  std::string clip, name;  // of the clip: its id, and its file
  std::string output;
  media::EncodeSettings encode;
  std::string from, to;  // times as flags have them; empty: all
};

// Renders, one after the other: each is a run of the program itself over saved work, which goes on
// whoever looks at it. On the context's thread.
class RenderQueue {
 public:
  // Has a clip's work, as it is set now, saved to a file. done(an error's line, or nothing; the
  // settings that it was saved with).
  using Save = std::function<void(const std::string& clip, const std::string& path,
                                  std::function<void(const std::string&, const Settings&)> done)>;

  // folder: for what is saved meanwhile.
  RenderQueue(boost::asio::io_context& context, std::string program, std::string folder, Save save,
              std::function<void()> changed);
  ~RenderQueue();
  RenderQueue(const RenderQueue&) = delete;
  RenderQueue& operator=(const RenderQueue&) = delete;

  void Add(RenderOrder order);
  // One that waits or runs is ended; one that has ended is forgotten.
  void Remove(std::uint64_t number);
  // Whether one is of the clip.
  bool Needs(const std::string& clip) const;

  // An object each: "number", "clip", "name", "output", "state" ("waiting", "saving", "running",
  // "done", "failed", "cancelled"), "share", "left" (seconds), "error", "notes".
  nlohmann::json State() const;

 private:
  struct Job;
  void Next();
  void Run(Job& job, const Settings& settings);
  void Heard(std::uint64_t number, const nlohmann::json& told);
  void Ended(std::uint64_t number, const std::string& error);
  Job* Find(std::uint64_t number) const;
  std::string ProjectOf(std::uint64_t number) const;

  boost::asio::io_context& context_;
  const std::string program_, folder_;
  const Save save_;
  const std::function<void()> changed_;
  std::vector<std::unique_ptr<Job>> jobs_;
  std::uint64_t numbers_ = 0;
};

}  // namespace calmframe::studio
