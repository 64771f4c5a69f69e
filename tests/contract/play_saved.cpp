// Loads a saved effect as a new process does, lets it do what it still has to, and writes its
// frames: play_saved PLUGIN SAVED FRAMES [SMOOTHNESS]. Prints the status that it settled at, how
// often it changed, and how many frames an analysis asked for.

#include <boost/make_shared.hpp>
#include <cstdio>
#include <cstdlib>

#include "host/base/operations.h"
#include "host/effects/session.h"
#include "tests/contract/saved_file.h"
#include "tests/support/shaky_clip.h"

int main(int argc, char** argv) {
  using namespace calmframe::host;
  if (argc < 4) return 2;
  constexpr std::int32_t kSmoothness = 5;
  Host host(argv[1]);
  {
    Session session(host);
    const SavedEffect saved = SavedFrom(ReadFile(argv[2]), "KLPX SubspaceStabilizer");
    Operations::Get().Record(true);
    Effect& effect = session.Load(boost::make_shared<Layer>(MakeShakyClip()), saved);
    const auto changes = [&effect] {
      return *ValueOf(*effect.Param(effect.IndexOf(Session::kStatusDiskId)));
    };
    const double before = saved.values.at(Session::kStatusDiskId);
    if (argc > 4) effect.SetParam(kSmoothness, std::atof(argv[4]));
    if (session.TickUntilSettled(std::chrono::minutes(5)) != Session::Wait::settled) return 3;
    Operations::Get().Record(false);
    int requests = 0;
    for (const std::string& name : Operations::Get().recorded()) {
      requests += name == "Video Segment Render.RenderAsync";
    }
    WriteFile(argv[3], FrameBytes(*effect.MakeRenderer()));
    std::printf("status %d, %d changes, %d requests\n", Session::StatusOf(effect),
                static_cast<int>(changes()) / 100 - static_cast<int>(before) / 100, requests);
  }
  return host.Stop().ok() && host.LeakReport().empty() ? 0 : 4;
}
