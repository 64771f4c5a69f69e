#include "host/stabilize/motion_groups.h"

#include <cmath>
#include <limits>

#include "platform/tessel/threads.h"
#include "tests/contract/played_plugin.h"
#include "tests/support/given_frames.h"

namespace calmframe::host {
namespace {

constexpr int kAcross = 320, kDown = 180;
constexpr std::int32_t kDeletedBegins = -10;

// Somebody stands on the lower edge, in the middle, and sways, before a scene that a hand shakes.
struct Subject {
  std::string name;
  double width, height;  // of the frame; 0: nobody is there
  HX_Ratio aspect = {1, 1};
  std::int32_t start = 0;  // of the layer in the clip

  static Point Sway(double t) { return {6 * std::sin(1.1 * t + 0.5), 3 * std::sin(0.8 * t)}; }
  // How far inside of its outline, in pixels; outside below 0.
  double Depth(double t, double x, double y) const {
    const Point sway = Sway(t);
    return std::min(width * kAcross / 2 - std::abs(x - kAcross / 2.0 - sway.x),
                    y - (1 - height) * kDown - sway.y);
  }
  SourcePtr Draw() const {
    SourceInfo info;
    info.width = kAcross;
    info.height = kDown;
    info.pixel_aspect = aspect;
    info.frame_count = 24;
    info.content = tessel::utility::Guid::FromText(name);
    return MakeDrawnSource(info, [*this](std::int64_t frame, Picture& picture) {
      const auto t = static_cast<double>(frame);
      const Point hand = {1.5 * t + 5 * std::sin(2.1 * t), 4 * std::sin(1.7 * t + 1)};
      const Point sway = Sway(t);
      FillPicture(picture, [&](int x, int y) {
        const bool near = Depth(t, x, y) > 0;
        const auto value = static_cast<float>(near ? Noise(x - sway.x + 5000, y - sway.y)
                                                   : Noise(x + hand.x, y + hand.y));
        return HX_PixelFloat{1, value, value, value};
      });
    });
  }
};

class MotionGroupsTest : public PlayedPlugin {
 protected:
  static boost::shared_ptr<Layer> LayerOf(const Subject& subject) {
    const auto layer = boost::make_shared<Layer>(subject.Draw());
    layer->Change([&](LayerState& state) {
      state.start_frame = subject.start;
      state.length -= subject.start;
    });
    return layer;
  }
  Effect& Solve(const Subject& subject) {
    Effect& effect = session().Apply(LayerOf(subject));
    EXPECT_EQ(Settle(effect), kReady);
    return effect;
  }
  static SolvedClip ClipOf(Effect& effect) { return ReadSolvedClip(Saved(effect).instance); }
};

void ExpectSameGroups(const MotionGroups& a, const MotionGroups& b) {
  ASSERT_EQ(a.tracks.size(), b.tracks.size());
  for (std::size_t i = 0; i < a.tracks.size(); ++i) EXPECT_EQ(a.tracks[i].group, b.tracks[i].group);
  EXPECT_EQ(a.miss_of_background, b.miss_of_background);
  EXPECT_EQ(a.subject_cover, b.subject_cover);
}

TEST_F(MotionGroupsTest, WhoMovesByThemselvesIsTheSubject) {
  const Subject cases[] = {{"a tenth of the frame", 0.25, 0.4},
                           {"three tenths, narrow pixels, trimmed", 0.4, 0.75, {8, 9}, 2},
                           {"six tenths", 0.7, 0.86},
                           {"nobody", 0, 0}};
  for (const Subject& c : cases) {
    SCOPED_TRACE(c.name);
    const SolvedClip clip = ClipOf(Solve(c));
    const MotionGroups groups = FindMotionGroups(clip);
    {
      const tessel::threads::ProcessorLimit one(1);
      ExpectSameGroups(FindMotionGroups(clip), groups);
    }
    int seen[2] = {}, right[2] = {};  // of the background, of the subject
    for (const GroupedTrack& track : groups.tracks) {
      const Point at = clip.TracksOf(track.row).places[track.slot];
      const double depth = c.width > 0 ? c.Depth(clip.first_frame + track.row, at.x, at.y) : -99;
      // Windows on the outline see both.
      if (std::abs(depth) < 10 || track.group == MotionGroup::unsure) continue;
      const bool subject = depth > 0;
      ++seen[subject];
      right[subject] += (track.group == MotionGroup::subject) == subject;
    }
    const bool anybody = c.width > 0;
    EXPECT_EQ(groups.has_subject, anybody);
    EXPECT_GT(seen[0], 50);
    EXPECT_GE(right[0], seen[0] * (anybody ? 0.95 : 1.0)) << seen[0];
    EXPECT_GE(right[1], seen[1] * 0.95);
    EXPECT_EQ(seen[1] > 20, anybody) << seen[1];
    // Tracks keep away from the frame's edges, and cells count that are touched.
    EXPECT_NEAR(groups.subject_cover, c.width * c.height, anybody ? 0.15 : 0);
    EXPECT_GT(groups.background_cover, 0.9 - c.width * c.height);
  }
}

TEST_F(MotionGroupsTest, DeletedTracksAreLeftOutUntilTheyComeBack) {
  const Subject subject = {"deleted", 0.4, 0.75, {1, 1}, 3};
  Effect& effect = Solve(subject);
  Saved(effect);  // which rounds its tracks
  effect.SetParam(kSmoothness, 31);
  EXPECT_EQ(Settle(effect), kReady);
  const SolvedClip all = ClipOf(effect);
  const MotionGroups groups = FindMotionGroups(all);
  const auto points = TracksOf(all, groups, MotionGroup::subject);
  ASSERT_GT(points.size(), 20u);
  const std::uint64_t analysed = Analysed();
  EXPECT_TRUE(effect.DeleteTracks(points).ok());
  EXPECT_EQ(Settle(effect), kReady);
  const SavedEffect saved = Saved(effect);
  const SolvedClip without = ReadSolvedClip(saved.instance);
  const GivenFrames frames = GivenFrames::Of(without), all_frames = GivenFrames::Of(all);
  EXPECT_FALSE(frames.vertices == all_frames.vertices);
  std::size_t deleted = 0;
  for (const GroupedTrack& track : groups.tracks) {
    const std::int32_t status = frames.statuses[track.row * all.slots + track.slot];
    EXPECT_EQ(status == kDeletedBegins, track.group == MotionGroup::subject);
    deleted += status == kDeletedBegins;
  }
  EXPECT_EQ(deleted, points.size());
  ExpectSameGroups(FindMotionGroups(without), groups);

  // Out of a project, of which nobody tells it again.
  Effect& loaded = session().Load(LayerOf(subject), saved);
  const double told = *ValueOf(*loaded.Param(kStatusCounter));
  EXPECT_EQ(Settle(loaded), kReady);
  EXPECT_EQ(*ValueOf(*loaded.Param(kStatusCounter)), told) << "nothing to do";
  EXPECT_TRUE(loaded.DeleteTracks(points).ok());
  EXPECT_EQ(Settle(loaded), kReady);
  EXPECT_EQ(*ValueOf(*loaded.Param(kStatusCounter)), told) << "they were deleted already";
  EXPECT_TRUE(GivenFrames::Of(ClipOf(loaded)).vertices == frames.vertices);
  for (Effect* each : {&effect, &loaded}) {
    EXPECT_TRUE(each->DeleteTracks({}).ok());
    EXPECT_EQ(Settle(*each), kReady);
    const GivenFrames back = GivenFrames::Of(ClipOf(*each));
    EXPECT_TRUE(back.vertices == all_frames.vertices);
    EXPECT_EQ(std::count(back.statuses.begin(), back.statuses.end(), kDeletedBegins), 0);
  }
  EXPECT_EQ(Analysed(), analysed);

  EXPECT_TRUE(effect.DeleteTracks(points).ok());
  effect.SetParam(kDetailedAnalysis, 1);
  EXPECT_EQ(Settle(effect), kReady);
  const GivenFrames anew = GivenFrames::Of(ClipOf(effect));
  EXPECT_EQ(std::count(anew.statuses.begin(), anew.statuses.end(), kDeletedBegins), 0);
}

// 40 slots of a clip of that many frames, each at(row, slot), and one track a slot.
template <class At>
SolvedClip Drawn(int frames, const At& at) {
  SolvedClip clip;
  clip.source_width = clip.width = kAcross;
  clip.source_height = clip.height = kDown;
  clip.frame_count = frames;
  clip.slots = 40;
  GivenFrames& given = GivenFrames::In(clip);
  for (int row = 0; row < frames; ++row) {
    for (int slot = 0; slot < clip.slots; ++slot) {
      given.tracks.push_back(at(row, slot));
      given.statuses.push_back(row == 0 ? 1 : 0);
    }
  }
  return clip;
}

TEST(FindMotionGroupsTest, ClipsThatTellNothing) {
  const auto spread = [](int row, int slot) {
    return Point{20.0 + slot % 8 * 39 + row, 18.0 + slot / 8 * 36};
  };
  constexpr double kNone = std::numeric_limits<double>::quiet_NaN();
  struct Case {
    std::string name;
    SolvedClip clip;
    std::size_t tracks;
    double cover;
  } cases[] = {{"one frame", Drawn(1, spread), 40, 1},
               {"one place",
                Drawn(9,
                      [](int row, int) {
                        return Point{50.0 + row, 90};
                      }),
                40, 1 / 40.0},
               {"nothing moves", Drawn(9, [&](int, int slot) { return spread(0, slot); }), 40, 1},
               {"beyond all frames",
                Drawn(9,
                      [](int row, int slot) {
                        return Point{6e7 * row, 1e9 * slot};
                      }),
                40, 0.1},
               {"no numbers",
                Drawn(3,
                      [](int, int) {
                        return Point{kNone, kNone};
                      }),
                40, 0.025},
               {"none begins", Drawn(9, spread), 0, 0},
               {"no tracks", Drawn(9, spread), 0, 0}};
  std::fill_n(GivenFrames::In(cases[5].clip).statuses.begin(), 40, 0);
  std::vector<std::int32_t>& none = GivenFrames::In(cases[6].clip).statuses;
  std::fill(none.begin(), none.end(), -1);
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const MotionGroups groups = FindMotionGroups(c.clip);
    EXPECT_FALSE(groups.has_subject);
    EXPECT_EQ(TracksOf(c.clip, groups, MotionGroup::background).size(), c.tracks);
    EXPECT_EQ(groups.tracks.size(), c.tracks);
    if (c.name != "beyond all frames") {
      EXPECT_NEAR(groups.background_cover, c.cover, 1e-9);
    }
    EXPECT_EQ(groups.subject_cover, 0);
  }
}

}  // namespace
}  // namespace calmframe::host
