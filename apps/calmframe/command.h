#pragma once

#include <string>
#include <vector>

#include "apps/calmframe/flags.h"

namespace calmframe {

// A command of the program: in the program's parser from its construction on, run when that has
// chosen it.
class Command {
 public:
  virtual ~Command() = default;
  Command(const Command&) = delete;
  Command& operator=(const Command&) = delete;

  const CLI::App& parser() const { return parser_; }
  // Whether it tells failures as JSON objects.
  virtual bool json() const { return false; }
  // Files that stand whatever ends it: what is saved, and results that are whole. Empty names stand
  // for none; not all need be there.
  virtual std::vector<std::string> Kept() const { return {}; }
  // Throws what the program has an exit code for; see failures.h.
  virtual void Run() = 0;

 protected:
  // `parser`: of AddCommand.
  explicit Command(CLI::App& parser) : parser_(parser) {}

  CLI::App& parser_;
};

}  // namespace calmframe
