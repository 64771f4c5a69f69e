#include "host/batch/machine.h"

#include <sched.h>
#include <sys/resource.h>

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <optional>
#include <string>
#include <utility>

namespace calmframe::batch {
namespace {

namespace fs = std::filesystem;

std::int64_t AvailableMemory() {
  std::ifstream file("/proc/meminfo");
  std::string name, unit;
  for (std::int64_t value = 0; file >> name >> value;) {
    if (name == "MemAvailable:") return value * 1024;
    std::getline(file, unit);
  }
  return 0;
}

// None of "max", and of what isn't there.
std::optional<std::int64_t> NumberIn(const fs::path& path) {
  std::ifstream file(path);
  std::int64_t number = 0;
  if (file >> number) return number;
  return std::nullopt;
}

// The control groups that this process is in, innermost first: of the unified hierarchy, and of
// the older one's controller of memory.
template <class Visit>
void VisitGroups(const Visit& visit) {
  std::ifstream file("/proc/self/cgroup");
  for (std::string line; std::getline(file, line);) {
    const std::size_t name = line.find(':'), path = line.find(':', name + 1);
    if (path == std::string::npos) continue;
    const std::string controllers = line.substr(name + 1, path - name - 1);
    if (!controllers.empty() && controllers != "memory") continue;
    const fs::path root = controllers.empty() ? "/sys/fs/cgroup" : "/sys/fs/cgroup/memory";
    // In a container the path may be one that is not to be seen there; its root is.
    for (fs::path group = line.substr(path + 1);; group = group.parent_path()) {
      visit(root / group.relative_path());
      if (group == group.parent_path() || group.empty()) break;
    }
  }
}

}  // namespace

Machine ThisMachine() {
  Machine machine;
  cpu_set_t set;
  if (sched_getaffinity(0, sizeof set, &set) == 0) machine.processors = CPU_COUNT(&set);
  machine.memory = AvailableMemory();
  VisitGroups([&](const fs::path& group) {
    for (const auto& [most, used] : {std::pair("memory.max", "memory.current"),
                                     {"memory.limit_in_bytes", "memory.usage_in_bytes"}}) {
      const auto limit = NumberIn(group / most), in_use = NumberIn(group / used);
      if (!limit || !in_use) continue;
      const std::int64_t left = std::max<std::int64_t>(*limit - *in_use, 1);
      machine.memory = machine.memory > 0 ? std::min(machine.memory, left) : left;
    }
    std::ifstream file(group / "cpu.max");
    double quota = 0, period = 0;
    if (file >> quota >> period && period > 0) {
      machine.processors =
          std::min(machine.processors, static_cast<int>(std::ceil(quota / period)));
    }
  });
  machine.processors = std::max(machine.processors, 1);
  return machine;
}

std::int64_t MostKept(double pixels, bool deep) {
  // Measured, rounded up: of the program, and of the frames that an analysis and a render have in
  // work.
  constexpr double kTogether = 410 << 20, kProgram = 60 << 20, kBytesAPixel = 100;
  const double left = kTogether - kProgram - (deep ? 2 : 1) * kBytesAPixel * pixels;
  return static_cast<std::int64_t>(std::max(left, 0.0));
}

std::int64_t BytesToKeep(const Machine& machine, int threads, double pixels, bool deep) {
  for (const auto resource : {RLIMIT_AS, RLIMIT_DATA}) {
    rlimit limit{};
    if (getrlimit(resource, &limit) == 0 && limit.rlim_cur != RLIM_INFINITY) return 0;
  }
  const int part = threads > 0 ? std::min(threads, machine.processors) : machine.processors;
  return std::min(MostKept(pixels, deep), machine.memory / 4) / machine.processors * part;
}

}  // namespace calmframe::batch
