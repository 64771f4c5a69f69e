#pragma once

#include <sys/wait.h>

#include <cstdio>
#include <string>

namespace calmframe {

struct Outcome {
  int code;  // -1: a signal ended it
  std::string text;
};

// What a line of the shell prints to the standard output, and how it ends.
inline Outcome Shell(const std::string& line) {
  Outcome outcome{-1, ""};
  FILE* const pipe = popen(line.c_str(), "r");
  char part[4096];
  while (const std::size_t n = std::fread(part, 1, sizeof part, pipe)) outcome.text.append(part, n);
  const int status = pclose(pipe);
  if (WIFEXITED(status)) outcome.code = WEXITSTATUS(status);
  return outcome;
}

}  // namespace calmframe
