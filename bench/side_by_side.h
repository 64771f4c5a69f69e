#pragma once

#include <benchmark/benchmark.h>

#include <algorithm>
#include <ctime>
#include <vector>

// Two pieces of work timed turn by turn, so that whatever else the machine does meets both alike.
namespace side_by_side {

// Milliseconds of this thread's own processor time.
inline double ThreadMilliseconds() {
  timespec t;
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &t);
  return 1e3 * static_cast<double>(t.tv_sec) + 1e-6 * static_cast<double>(t.tv_nsec);
}

inline double Median(std::vector<double> values) {
  if (values.empty()) return 0.0;
  const auto middle = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
  std::nth_element(values.begin(), middle, values.end());
  return *middle;
}

template <class Work>
double TimeOf(const Work& work) {
  const double begin = ThreadMilliseconds();
  work();
  return ThreadMilliseconds() - begin;
}

// Runs the benchmark's iterations; one is `ours` once and `peer` once, after one untimed call of
// each. Counters, medians over the iterations: ours_ms and peer_ms, each divided by `units` (frames
// of a call, say), their ratio, and with it the ratio that is wanted, `limit`. For UseManualTime,
// which reports ours.
template <class Ours, class Peer>
void Compare(benchmark::State& state, double limit, double units, const Ours& ours,
             const Peer& peer) {
  ours();
  peer();
  std::vector<double> our_times, peer_times;
  for (auto _ : state) {
    our_times.push_back(TimeOf(ours));
    peer_times.push_back(TimeOf(peer));
    state.SetIterationTime(our_times.back() / 1e3);
  }
  const double our_time = Median(our_times);
  const double peer_time = Median(peer_times);
  state.counters["ours_ms"] = our_time / units;
  state.counters["peer_ms"] = peer_time / units;
  state.counters["ratio"] = our_time / peer_time;
  state.counters["limit"] = limit;
}

}  // namespace side_by_side
