#include "host/stabilize/solved_clip.h"

#include <algorithm>
#include <cstring>

#include "host/stabilize/follow_windows.h"
#include "platform/hx/hx_controls.h"
#include "tests/contract/played_plugin.h"
#include "tests/support/given_frames.h"

namespace calmframe::host {
namespace {

using Bytes = std::vector<std::uint8_t>;
using Windows = std::vector<Similarity>;
constexpr double kTremor = 1.2;

struct Case {
  std::string name;
  int framing, method;
  HX_Ratio aspect = {1, 1};
  int width = 160, height = 120;
  std::int32_t field_type = HX_FIELD_PROGRESSIVE, start = 0;
  Warps warps = Warps::solved;
};

class SolvedClipTest : public PlayedPlugin {
 protected:
  struct Played {
    boost::shared_ptr<Layer> other_layer;  // of the same source
    Effect* effect;
    SavedEffect saved;
    SolvedClip clip;
  };

  Played Play(const Case& c) {
    const auto make_layer = [&] {
      auto layer = MakeLayer({c.width, c.height, 16, c.name, kTremor, c.aspect});
      layer->Change([&](LayerState& state) {
        state.field_type = c.field_type;
        state.start_frame = c.start;
        state.length -= c.start;
      });
      return layer;
    };
    Played played{make_layer(), &session().Apply(make_layer()), {}, {}};
    played.effect->SetParam(kFraming, c.framing);
    played.effect->SetParam(kMethod, c.method);
    played.effect->SetParam(kSynthesisEdgeFeather, 0);
    EXPECT_EQ(Settle(*played.effect), kReady);
    played.saved = Saved(*played.effect);
    played.clip = ReadSolvedClip(played.saved.instance);
    return played;
  }

  // A second effect, which must have nothing to do.
  Effect& Moved(const Played& played, const Windows& windows, Warps warps = Warps::solved) {
    SavedEffect moved = played.saved;
    const bool crops = moved.values[HX_FRAMING.disk_id] != 4;
    moved.instance =
        WithWindows(moved.instance, windows, warps, crops ? PlacedBy::crop : PlacedBy::bounds);
    moved.values[HX_ADDITIONAL_SCALE.disk_id] = 100;
    const std::uint64_t analysed = Analysed();
    Effect& effect = session().Load(played.other_layer, moved);
    const double told = *ValueOf(*effect.Param(kStatusCounter));
    EXPECT_EQ(Settle(effect), kReady);
    EXPECT_EQ(*ValueOf(*effect.Param(kStatusCounter)), told);
    EXPECT_EQ(Analysed(), analysed);
    // Raw and deflated alike: all that it keeps, but the crop.
    const Bytes kept = Saved(effect).instance;
    const Windows still(windows.size());
    EXPECT_TRUE(WithWindows(kept, still) == WithWindows(moved.instance, still));
    EXPECT_EQ(ReadSolvedClip(kept).crop->width, played.clip.width + 1);
    return effect;
  }

  // Windows at the places of the effect's own, at the scale at which these cover the frame.
  void ExpectOwnPicture(const Played& played, const Case& c) {
    const SolvedClip& clip = played.clip;
    const SolvedClip::Crop& crop = *clip.crop;
    const float cover =
        std::max((clip.height + 1.0f) / crop.height, (clip.width + 1.0f) / crop.width);
    const double step = 1 / std::clamp(cover, 1.0f, c.framing == 3 ? 1.5f : 1.0f);
    Windows windows;
    for (const SolvedClip::Window& w : crop.windows) {
      windows.push_back({step, 0,
                         (w.left + w.right) / 2.0 + crop.origin.x - step * (clip.width - 1) / 2,
                         (w.top + w.bottom) / 2.0 + crop.origin.y - step * (clip.height - 1) / 2});
    }
    const auto own = played.effect->MakeRenderer(), other = Moved(played, windows).MakeRenderer();
    for (RenderRequest request : {RenderRequest{5, 32}, {12, 8}}) {
      request.second_field = c.field_type != HX_FIELD_PROGRESSIVE;
      EXPECT_LT(Difference(*own->Planned(request).pixels, *other->Planned(request).pixels, 20),
                request.bit_depth == 8 ? 0.05 : 0.01);
    }
  }
};

// One pixel of each cell of a frame's warp must show its place in the source. Cells are so small
// that three corners tell the map.
void ExpectCells(const SolvedClip& clip, int row, const Similarity& window,
                 const WorldBuffer& source, const WorldBuffer& picture) {
  const int width = clip.source_width, height = clip.height;
  const std::vector<Point> vertices = clip.VerticesOf(row);
  const auto vertex = [&](int c, int r) {
    const Point p = Inverse(window)(vertices[r * clip.columns + c]);
    return Point{(p.x + 0.5) * width / clip.width - 0.5, p.y};
  };
  double worst = 0;
  int compared = 0;
  for (int i = 0; i < (clip.columns - 1) * (clip.rows - 1); ++i) {
    const int c = i % (clip.columns - 1), r = i / (clip.columns - 1);
    const Point p = vertex(c, r), p10 = vertex(c + 1, r), p01 = vertex(c, r + 1);
    const Point du = {p10.x - p.x, p10.y - p.y}, dv = {p01.x - p.x, p01.y - p.y};
    const int x = std::lround(p.x + (du.x + dv.x) / 2), y = std::lround(p.y + (du.y + dv.y) / 2);
    if (x < 0 || y < 0 || x >= width || y >= height) continue;
    const double determinant = du.x * dv.y - du.y * dv.x;
    const double u = ((x - p.x) * dv.y - (y - p.y) * dv.x) / determinant;
    const double v = ((y - p.y) * du.x - (x - p.x) * du.y) / determinant;
    const double from_x = (c + u) * (width - 1) / (clip.columns - 1) - 0.5;
    const double from_y = (r + v) * (height - 1) / (clip.rows - 1) - 0.5;
    const bool rim = std::min(from_x, from_y) < 2 || from_x > width - 3 || from_y > height - 3;
    const HX_Pixel8& pixel = picture.row<HX_Pixel8>(y)[x];
    // The effect's own rim is up to a pixel off in others than square ones.
    ASSERT_TRUE(pixel.alpha == 255 || (rim && width != clip.width)) << x << ", " << y;
    if (rim) continue;
    const int i0 = static_cast<int>(from_x), j0 = static_cast<int>(from_y);
    const HX_Pixel8 *above = source.row<HX_Pixel8>(j0) + i0,
                    *below = source.row<HX_Pixel8>(j0 + 1) + i0;
    const double red = std::lerp(std::lerp(above[0].red, above[1].red, from_x - i0),
                                 std::lerp(below[0].red, below[1].red, from_x - i0), from_y - j0);
    worst = std::max(worst, std::abs(pixel.red - red));
    ++compared;
  }
  EXPECT_LT(worst, 1.5);  // two roundings, and the cells' fourth corners
  EXPECT_GT(compared, 900);
}

TEST_F(SolvedClipTest, WindowsShowTheirPartOfThePlane) {
  const Case cases[] = {
      {"scaled", 3, 4},
      {"position, odd sizes", 2, 1, {1, 1}, 161, 121},
      {"similarity, narrow pixels", 3, 2, {8, 9}},
      {"perspective, wide pixels, trimmed", 2, 3, {4, 3}, 160, 120, 0, 3},
      {"fields", 3, 4, {1, 1}, 160, 120, HX_FIELD_FIRST_ORDER},
      {"synthesized", 4, 1},
      {"wide, synthesized", 4, 1, {4, 3}},
      {.name = "not bent, synthesized", .framing = 4, .method = 1, .warps = Warps::none}};
  constexpr int kRow = 5;
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const Played played = Play(c);
    SolvedClip clip = played.clip;
    const bool fields = c.field_type != HX_FIELD_PROGRESSIVE, synthesized = c.framing == 4;
    EXPECT_EQ(clip.frame_count, (16 - c.start) * (fields ? 2 : 1));
    EXPECT_EQ(clip.first_frame, c.start);
    EXPECT_EQ(clip.crop.has_value(), !synthesized);
    if (clip.crop) ExpectOwnPicture(played, c);
    if (fields) continue;

    // As MakeShakyClip has it; tracks stand still in its scene.
    const auto camera_at = [&](int row) {
      const double t = row + c.start;
      return Point{kTremor * (1.5 * t + 5.0 * std::sin(2.1 * t)),
                   kTremor * (4.0 * std::sin(1.7 * t + 1.0))};
    };
    const Point camera = camera_at(kRow), before = camera_at(kRow - 1);
    int still = 0, tracked = 0;
    const TrackRow row = clip.TracksOf(kRow), row_before = clip.TracksOf(kRow - 1);
    for (int slot = 0; slot < clip.slots; ++slot) {
      if (row.statuses[slot] != 0) continue;
      const Point p = row.places[slot], q = row_before.places[slot];
      still += std::hypot(p.x + camera.x - q.x - before.x, p.y + camera.y - q.y - before.y) < 0.2;
      ++tracked;
    }
    EXPECT_GT(tracked, 50);
    EXPECT_GT(still, tracked * 0.9);
    if (c.warps == Warps::none) {
      const std::vector<Point> rest = GridAtRest(clip);
      std::copy(
          rest.begin(), rest.end(),
          GivenFrames::In(clip).vertices.begin() + kRow * static_cast<std::ptrdiff_t>(rest.size()));
    }
    const Point corner = clip.VerticesOf(kRow)[0];
    const double aspect = clip.width / static_cast<double>(clip.source_width);
    for (const double scale : {0.8, 1.2, 2.0}) {  // the last leaves a rim of nothing all around
      SCOPED_TRACE(scale);
      Windows windows;  // about the frame's middle
      for (int f = 0; f < clip.frame_count; ++f) {
        windows.push_back({scale * std::cos(0.03), scale * std::sin(0.03),
                           clip.width * (1 - scale) / 2 + 2.7 + 0.37 * f,
                           clip.height * (1 - scale) / 2 - 4.3 - 0.41 * f});
      }
      Effect& moved = Moved(played, windows, c.warps);
      if (synthesized) {
        const Point shift = ShiftWithoutCrop(ReadSolvedClip(Saved(moved).instance));
        EXPECT_NEAR(std::hypot(shift.x, shift.y), 0, 1e-4);  // windows are floats
      }
      const auto picture = moved.MakeRenderer()->Planned({kRow}).OnLayer();
      ExpectCells(clip, kRow, windows[kRow], *SourceFrame(*played.effect, kRow + c.start),
                  *picture);
      // Beside the frame neighbours show what the camera saw then, or nothing does.
      double sum = 0;
      int filled = 0;
      for (int i = 0; i < clip.source_width * clip.height; ++i) {
        const int x = i % clip.source_width, y = i / clip.source_width;
        const Point p = windows[kRow]({(x + 0.5) * aspect - 0.5, double(y)});
        const Point from = {(p.x - corner.x) / aspect, p.y - corner.y};
        const HX_Pixel8& pixel = picture->row<HX_Pixel8>(y)[x];
        const bool beside = std::min(from.x, from.y) < -4 || from.x > clip.source_width + 3 ||
                            from.y > clip.height + 3;
        if (!beside || pixel.alpha != 255) continue;
        sum += std::abs(pixel.red - 255 * Noise(from.x + camera.x - 0.5, from.y + camera.y - 0.5));
        ++filled;
      }
      EXPECT_EQ(filled > (synthesized ? 300 : 0), synthesized && scale > 1) << filled;
      EXPECT_LE(sum, filled * 8);
    }
  }
}

// By both framings the very same picture, wherever a frame has one: the corners that put the middle
// of the bounds right are such as nobody sees. Of the first frames all four are seen.
TEST_F(SolvedClipTest, WhereTheBoundsLieIsNotSeen) {
  const Played cropped = Play({"one", 3, 2}), filled = Play({"one", 4, 2});
  const SolvedClip& clip = filled.clip;
  ASSERT_TRUE(GivenFrames::Of(clip).vertices == GivenFrames::Of(cropped.clip).vertices);
  for (const Point aside : {Point{9, -7}, Point{-9, 7}}) {
    Windows windows;
    for (int f = 0; f < clip.frame_count; ++f) {
      const double scale = f < 4 ? 1.2 : 0.7;
      windows.push_back({scale, 0, clip.width * (1 - scale) / 2 + (f < 4 ? 0 : aside.x),
                         clip.height * (1 - scale) / 2 + (f < 4 ? 0 : aside.y)});
    }
    Effect& moved = Moved(filled, windows);
    const Point shift = ShiftWithoutCrop(ReadSolvedClip(Saved(moved).instance));
    EXPECT_NEAR(std::hypot(shift.x, shift.y), 0, 1e-4);
    const auto by_crop = Moved(cropped, windows).MakeRenderer(), by_fill = moved.MakeRenderer();
    for (int f = 0; f < clip.frame_count; ++f) {
      const auto own = by_crop->Planned({f, 16}).OnLayer(),
                 all = by_fill->Planned({f, 16}).OnLayer();
      int covered = 0, others = 0;
      for (int i = 0; i < clip.width * clip.height; ++i) {
        const HX_Pixel16& a = own->row<HX_Pixel16>(i / clip.width)[i % clip.width];
        const HX_Pixel16& b = all->row<HX_Pixel16>(i / clip.width)[i % clip.width];
        covered += a.alpha == 32768;
        others += a.alpha == 32768 && std::abs(a.red - b.red) > 40;
      }
      EXPECT_GT(covered, clip.width * clip.height / 2) << f;
      EXPECT_EQ(others, 0) << f;
    }
  }
}

// Windows leave their frames where the frames around have a picture.
TEST_F(SolvedClipTest, FilledEdgesLeaveNothingOpen) {
  const Played cropped = Play({"one", 3, 2});
  Played filled = Play({"one", 4, 2});
  const SolvedClip& clip = filled.clip;
  const WarpedPlane plane(clip, Warps::solved);
  const PictureMotion motion = FindMotion(plane);
  const auto width_kept = [&](const FollowSettings& settings) {
    double sum = 0;
    for (const Similarity& w : FollowWindows(plane, motion, settings)) sum += w.a;
    return sum / clip.frame_count;
  };
  for (const double feather : {0.0, 20.0}) {
    SCOPED_TRACE(feather);
    filled.saved.values[HX_SYNTHESIS_EDGE_FEATHER.disk_id] = feather;
    FollowSettings settings;
    settings.filling = Filling{12, RimOf(0, feather, 5)};
    EXPECT_GT(width_kept(settings), width_kept({}) + 0.02);
    const Windows windows = FollowWindows(plane, motion, settings);
    const auto by_crop = Moved(cropped, windows).MakeRenderer(),
               by_fill = Moved(filled, windows).MakeRenderer();
    int beside = 0, open = 0;
    for (int f = 0; f < clip.frame_count; ++f) {
      const auto own = by_crop->Planned({f, 16}).OnLayer(),
                 all = by_fill->Planned({f, 16}).OnLayer();
      for (int i = 0; i < clip.width * clip.height; ++i) {
        const int x = i % clip.width, y = i / clip.width;
        beside += own->row<HX_Pixel16>(y)[x].alpha == 0;
        open += all->row<HX_Pixel16>(y)[x].alpha < 32760;
      }
    }
    EXPECT_GT(beside, 5000);
    EXPECT_EQ(open, 0);
    const ShownMotion shown = MotionShown(plane, motion, windows, settings.filling);
    EXPECT_LT(*std::max_element(shown.uncovered.begin(), shown.uncovered.end()), 0.001);
  }
  // What nobody has is told: windows that show more than all frames together.
  const FilledPlane all(plane, {12, 2.5});
  EXPECT_GT(all.UncoveredShare(5, {1.5, 0, 0, 0}), 0.2);
  EXPECT_TRUE(all.RegionAround(5, {1.5, 0, 0, 0}).empty());
}

// The payload's length goes with the bytes.
Bytes Cut(Bytes bytes, std::size_t size) {
  bytes.resize(size);
  const std::uint64_t length = size - 24;
  std::memcpy(bytes.data() + 16, &length, sizeof length);
  return bytes;
}

// Where a section begins, behind its marker.
std::size_t After(const Bytes& bytes, const std::string& marker) {
  const auto found = std::search(bytes.begin(), bytes.end(), marker.begin(), marker.end());
  return static_cast<std::size_t>(found - bytes.begin()) + 4;
}

// A keystone whose corners are a parallelogram in y, so that it is stored about an affine map, and
// turned, where it is stored by its projective one.
TEST_F(SolvedClipTest, PerspectiveWarps) {
  Played played = Play({"perspective", 2, 1});
  const Similarity turn = {1, 1, 0, 0};
  const auto keystone = [](double u, double v) {
    const double w = 1 + 0.25 * u + 0.6 * v;
    return Point{(160 * u + 30 * v) / w, 110 * (v - 0.3125 / 0.96 * u) / w + 40};
  };
  Bytes& bytes = played.saved.instance;
  bytes = WithWindows(bytes, Windows(16));
  const Point corners[] = {turn(keystone(0, 0)), turn(keystone(1, 0)), turn(keystone(0, 1)),
                           turn(keystone(1, 1))};
  const std::size_t mesh = After(bytes, "hseM") + 8;
  std::memset(bytes.data() + mesh, 0, sizeof corners + played.clip.columns * played.clip.rows * 8);
  std::memcpy(bytes.data() + mesh, corners, sizeof corners);
  SolvedClip turned = ReadSolvedClip(bytes);
  const SolvedClip back = ReadSolvedClip(WithWindows(bytes, Windows(16, turn)));
  const std::vector<Point> of_turned = turned.VerticesOf(0), of_back = back.VerticesOf(0);
  for (int i = 0; i < turned.columns * turned.rows; ++i) {
    const Point p = keystone(i % turned.columns / (turned.columns - 1.0),
                             i / turned.columns / (turned.rows - 1.0));
    const Point q = turn(p), a = of_turned[i], b = of_back[i];
    ASSERT_NEAR(std::hypot(a.x - q.x, a.y - q.y), 0, 1e-9) << i;
    ASSERT_NEAR(std::hypot(b.x - p.x, b.y - p.y), 0, 0.003) << i;
  }
  // What is laid where the keystone puts the frame, turned, lies over the frame at rest. Matrices
  // by hand: the keystone's of x / 159 and y / 119, and x - y, x + y of it.
  const double k[] = {
      160 / 159.0, 30 / 119.0, 0, (10 - 110 * 0.3125 / 0.96) / 159, (110 + 24) / 119.0, 40,
      0.25 / 159,  0.6 / 119,  1};
  turned.neighbours = {{1,
                        0,
                        {k[0] - k[3], k[1] - k[4], k[2] - k[5], k[0] + k[3], k[1] + k[4],
                         k[2] + k[5], k[6], k[7], k[8]}}};
  const Matrix over = NeighboursIn(turned, Warps::none)[0].plane_from_frame;
  for (const Point& p : {Point{0, 0}, Point{159, 0}, Point{0, 119}, Point{159, 119}}) {
    const double w = over[6] * p.x + over[7] * p.y + over[8];
    EXPECT_NEAR((over[0] * p.x + over[1] * p.y + over[2]) / w, p.x, 0.01);
    EXPECT_NEAR((over[3] * p.x + over[4] * p.y + over[5]) / w, p.y, 0.01);
  }
  Effect& effect = Moved(played, Windows(16, turn));  // which sees it so too
  ExpectCells(turned, 0, turn, *SourceFrame(effect, 0),
              *effect.MakeRenderer()->Planned({0}).OnLayer());
}

TEST_F(SolvedClipTest, ForeignAndDamagedInstances) {
  const Played played = Play({"damaged", 4, 1});
  const Windows windows(static_cast<std::size_t>(played.clip.frame_count));
  const Bytes &zipped = played.saved.instance, raw = WithWindows(zipped, windows);
  EXPECT_EQ(zipped[5], 0);
  EXPECT_EQ(GivenFrames::Of(ReadSolvedClip(raw)).vertices, GivenFrames::Of(played.clip).vertices);

  const std::size_t mesh = After(raw, "hseM"), map = After(raw, "NotM"), solve = After(raw, "vloS");
  const std::vector<std::pair<std::size_t, std::vector<std::uint32_t>>> damages = {
      {0, {15, 17}},                                         // version
      {4, {0x0100}},                                         // of an instance at work
      {16, {0x7fffffff}},                                    // longer than it is
      {24, {0}},                                             // marker
      {28, {0, 0x7fffffff}},                                 // width
      {44, {0, 15, 17, 0x7fffffff, 0xffffffff}},             // frames
      {48, {0, 1, 0x7fffffff, 0xffffffff}},                  // slots
      {56, {0xffffffff}},                                    // a text's length
      {solve, {0, 4}},                                       // not solved, failed
      {mesh, {0, 1, 47, 0x7fffffff, 0xffffffff}},            // columns
      {mesh + 4, {0, 1, 0x7fffffff, 0xffffffff}},            // rows
      {map, {0, 0x7fffffff, 0xffffffff}},                    // entries
      {map + 12, {16, 0xffffffff}},                          // an entry's frame
      {After(raw, "porC") + 1, {5, 0x7fffffff, 0xffffffff}}  // windows
  };
  for (const auto& [place, values] : damages) {
    for (const std::uint32_t value : values) {
      Bytes bytes = raw;
      std::memcpy(bytes.data() + place, &value, sizeof value);
      EXPECT_THROW(ReadSolvedClip(bytes), NoSolvedClip) << place << ": " << value;
      EXPECT_THROW(WithWindows(bytes, windows), NoSolvedClip);
    }
  }
  for (const Bytes& whole : {raw, zipped}) {
    for (std::size_t size = 24; size < whole.size(); size += size < 600 ? 1 : whole.size() / 97) {
      EXPECT_THROW(ReadSolvedClip(Cut(whole, size)), NoSolvedClip) << size;
    }
    EXPECT_THROW(ReadSolvedClip(Cut(raw, raw.size() + 7)), NoSolvedClip);
  }
  EXPECT_THROW(ReadSolvedClip({}), NoSolvedClip);
  host().SaveAs(PayloadForm::packed);
  Bytes packed = Saved(*played.effect).instance;
  EXPECT_EQ(packed[5], HX_PAYLOAD_PACKED);
  EXPECT_EQ(GivenFrames::Of(ReadSolvedClip(packed)).vertices,
            GivenFrames::Of(played.clip).vertices);
  packed[51] = 0x7f;  // more slots than a row has bytes for
  EXPECT_THROW(ReadSolvedClip(packed), NoSolvedClip);
  EXPECT_THROW(WithWindows(raw, Windows(3)), std::invalid_argument);
  EXPECT_THROW(WithWindows(raw, Windows(16, {0, 0, 0, 0})), std::invalid_argument);
  EXPECT_THROW(ShiftWithoutCrop(played.clip), std::invalid_argument);
}

}  // namespace
}  // namespace calmframe::host
