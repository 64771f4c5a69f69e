// The real plug-in, played by the host as any plug-in is.

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <chrono>
#include <cmath>
#include <cstdio>

#include "host/base/operations.h"
#include "host/effects/session.h"
#include "host/pixels/world_operations.h"
#include "tests/host/tour/shaky_clip.h"

namespace calmframe::host {
namespace {

using namespace std::chrono_literals;

TEST(TourTest, First) {
  Host host(CALMFRAME_PLUGIN);
  std::printf("about: %s\n", host.About().message.c_str());
  std::printf("params %zu\n", host.declarations().size());
  {
    Session session(host);
    Effect& effect = session.Apply(boost::make_shared<Layer>(MakeShakyClip()));
    std::printf("creation %s\n", effect.creation().Line("apply").c_str());
    int last = -1;
    const auto begin = std::chrono::steady_clock::now();
    const auto wait = session.TickUntilSettled(120s, [&] {
      const int status = Session::StatusOf(effect);
      if (status != last) {
        std::printf("%6.3f status %d cancel '%s' group '%s'\n",
                    std::chrono::duration<double>(std::chrono::steady_clock::now() - begin).count(),
                    status, effect.Param(2)->name, effect.Param(3)->name);
      }
      last = status;
      return false;
    });
    std::printf("wait %d status %d\n", static_cast<int>(wait), Session::StatusOf(effect));
    for (const auto& m : effect.TakeMessages()) std::printf("message %s\n", m.c_str());
    std::printf("info %s|%s\n", host.user_interface().info().first.c_str(),
                host.user_interface().info().second.c_str());
    for (int i = 1; i < 31; ++i) {
      const auto p = *effect.Param(i);
      std::printf("%d '%s' ui %u value %g\n", i, p.name, p.ui_flags, ValueOf(p).value_or(-1));
    }
    const auto renderer = effect.MakeRenderer();
    std::printf("%s\n", renderer->result().Line("renderer").c_str());
    for (int depth : {8, 16, 32}) {
      for (bool direct : {true, false}) {
        if (direct && depth == 32) continue;
        for (HX_Ratio ds : {HX_Ratio{1, 1}, HX_Ratio{1, 2}}) {
          RenderRequest request{10, depth, ds};
          const auto frame = direct ? renderer->Direct(request) : renderer->Planned(request);
          std::printf("%d %s %u: %s %dx%d at %d %d full %d %d %d %d\n", depth,
                      direct ? "direct" : "planned", ds.den, frame.result.Line("r").c_str(),
                      frame.pixels ? frame.pixels->world().width : -1,
                      frame.pixels ? frame.pixels->world().height : -1,
                      frame.pixels ? frame.pixels->world().origin_x : -1,
                      frame.pixels ? frame.pixels->world().origin_y : -1, frame.full_rect.left,
                      frame.full_rect.top, frame.full_rect.right, frame.full_rect.bottom);
          if (frame.pixels) {
            WorldBuffer out(frame.pixels->world().width, frame.pixels->world().height,
                            HX_FORMAT_ARGB8);
            CopyWorld(frame.pixels->world(), out.world(), nullptr, nullptr);
            char name[100];
            std::snprintf(name, sizeof(name), "/tmp/hc-%d-%s-%u.ppm", depth,
                          direct ? "direct" : "planned", ds.den);
            FILE* file = std::fopen(name, "wb");
            std::fprintf(file, "P6 %d %d 255\n", out.world().width, out.world().height);
            for (int y = 0; y < out.world().height; ++y) {
              for (int x = 0; x < out.world().width; ++x) {
                std::fwrite(out.row<std::uint8_t>(y) + x * 4 + 1, 1, 3, file);
              }
            }
            std::fclose(file);
          }
        }
      }
    }
  }
  const auto stop = host.Stop();
  std::printf("%s\nleaks:\n%s", stop.Line("stop").c_str(), host.LeakReport().c_str());
}

}  // namespace
}  // namespace calmframe::host
