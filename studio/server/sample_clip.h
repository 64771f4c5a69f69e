#pragma once

#include <boost/asio/io_context.hpp>
#include <functional>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "studio/server/program_run.h"

namespace calmframe::studio {

// The clip for whoever has none: drawn by a run of the program when it is first asked for, into a
// folder of the studio's own, and kept there. On the context's thread.
class SampleClip {
 public:
  // words: the program and what comes ahead of the file's name. drawn(): it is there now;
  // what it throws is told as an error.
  SampleClip(boost::asio::io_context& context, std::vector<std::string> words, std::string path,
             std::function<void()> drawn, std::function<void()> changed);

  const std::string& path() const { return path_; }
  bool is_there() const;
  // Unless it is there, or being drawn.
  void Draw();
  // Ends the drawing, which leaves nothing behind.
  void Cancel();

  // "share" (0 to 1) while it is drawn, "error" of the last time, one line; null: neither.
  nlohmann::json State() const;

 private:
  boost::asio::io_context& context_;
  const std::vector<std::string> words_;
  const std::string path_;
  const std::function<void()> drawn_, changed_;
  double share_ = 0;
  std::string error_;
  std::unique_ptr<ProgramRun> run_;
};

}  // namespace calmframe::studio
