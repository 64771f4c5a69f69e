#pragma once

#include <string>

namespace calmframe::host {

// How far a stage has come.
struct Progress {
  std::string stage;
  double done = 0, total = 0;  // total 0: nobody knows
  std::string unit = {};       // of both; empty for a mere share
  std::string says = {};       // what the effect shows its user meanwhile; may be empty
  bool ends = false;
  bool lasts = false;  // nothing more may be told for a while
};

// Whoever waits for a clip's work: a terminal, a page, a queue. Called between its steps, on the
// thread that works. What it throws ends the work, as Stops does.
class Watcher {
 public:
  virtual ~Watcher() = default;

  // Every stage's begin and end, and how it goes meanwhile; often.
  virtual void Show(const Progress& progress) = 0;
  // One line that the user should see; it may come more than once.
  virtual void Warn(const std::string& line) = 0;
  // Whether the work is to end, by Interrupted. Asked often; once true it stays so.
  virtual bool Stops() = 0;
  // What is drawn by now goes: no renderer of it may be left.
  virtual void Redraws() {}
};

}  // namespace calmframe::host
