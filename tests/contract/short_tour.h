#pragma once

#include <new>
#include <system_error>
#include <vector>

#include "tests/contract/played_plugin.h"

namespace calmframe::host {

// Once everything that an effect is asked for, on a clip so short that it can be played for each
// thing that may fail in it.
class ShortTour : public PlayedPlugin {
 protected:
  // A status that could not be told keeps a host waiting.
  static constexpr auto kPatience = 1000ms;

  ShortTour() { results_.reserve(100); }

  static boost::shared_ptr<Layer> ShortLayer() { return MakeLayer({96, 64, 6, "short clip"}); }

  // Leaves the effect, in front of others; or nothing, if it could not be made.
  void Play(const boost::shared_ptr<Layer>& layer) {
    results_.clear();
    Effect* effect = nullptr;
    Try([&] {
      effect = &session().Apply(layer);
      Keep(effect->creation());
    });
    if (!effect) return;
    const auto settle = [&] { Try([&] { session().TickUntilSettled(kPatience); }); };
    const auto render = [&](Effect& of) {
      Try([&] {
        const auto renderer = of.MakeRenderer();
        Keep(renderer->result());
        Keep(renderer->Direct({3}).result);
        Keep(renderer->Planned({3, 16}).result);
      });
    };
    Try([&] { Keep(session().Apply(ShortLayer()).creation()); });  // shares the analysis
    render(*effect);                                               // a banner
    settle();
    Try([&] { Keep(effect->SetParam(kFraming, 4)); });
    settle();
    render(*effect);
    SavedEffect saved;
    Try([&] { Keep(effect->Save(&saved)); });
    Try([&] {
      if (saved.match_name.empty()) return;
      Effect& loaded = session().Load(layer, saved);
      Keep(loaded.creation());
      Keep(loaded.Tick());
      render(loaded);
      session().Remove(loaded);
    });
    Try([&] { Keep(effect->SetParam(kSmoothness, 20)); });
    settle();
  }

  std::vector<CommandResult> results_;  // of the tour's commands
  int unfinished_ = 0;                  // steps for which the host had no memory

 private:
  void Keep(const CommandResult& result) { results_.push_back(result); }

  template <class Step>
  void Try(const Step& step) {
    try {
      step();
    } catch (const std::bad_alloc&) {
      ++unfinished_;
    } catch (const std::system_error&) {  // no thread
      ++unfinished_;
    }
  }
};

}  // namespace calmframe::host
