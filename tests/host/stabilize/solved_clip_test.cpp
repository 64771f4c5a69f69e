#include "host/stabilize/solved_clip.h"

#include <cstring>

#include "platform/hx/hx_controls.h"
#include "platform/tessel/filesupport.h"
#include "tests/contract/played_plugin.h"

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
  Effect& Moved(const Played& played, const Windows& windows) {
    SavedEffect moved = played.saved;
    moved.instance = WithWindows(moved.instance, windows);
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
};

// Windows that show what the effect shows: its own, at the scale at which they cover the frame.
Windows OwnWindows(const SolvedClip& clip, bool scales) {
  const SolvedClip::Crop& crop = *clip.crop;
  const float cover =
      std::max((clip.height + 1.0f) / crop.height, (clip.width + 1.0f) / crop.width);
  const double step = 1 / (scales ? std::clamp(cover, 1.0f, 1.5f) : 1.0);
  Windows windows;
  for (const SolvedClip::Window& w : crop.windows) {
    windows.push_back({step, 0,
                       (w.left + w.right) / 2.0 + crop.origin.x - step * (clip.width - 1) / 2,
                       (w.top + w.bottom) / 2.0 + crop.origin.y - step * (clip.height - 1) / 2});
  }
  return windows;
}

// Largest difference of two frames within a margin, in their own units.
template <class Component>
double Largest(const WorldBuffer& a, const WorldBuffer& b) {
  constexpr int kMargin = 20;
  double largest = 0;
  for (int y = kMargin; y < a.world().height - kMargin; ++y) {
    for (int i = kMargin * 4; i < (a.world().width - kMargin) * 4; ++i) {
      largest = std::max(
          largest, std::abs(a.row<Component>(y)[i] - static_cast<double>(b.row<Component>(y)[i])));
    }
  }
  return largest;
}

TEST_F(SolvedClipTest, TheEffectsOwnWindowsShowItsOwnPicture) {
  const Case cases[] = {{"scaled", 3, 4},
                        {"position, odd sizes", 2, 1, {1, 1}, 161, 121},
                        {"similarity, narrow pixels", 3, 2, {8, 9}},
                        {"perspective, wide pixels, trimmed", 2, 3, {4, 3}, 160, 120, 0, 3},
                        {"fields", 3, 4, {1, 1}, 160, 120, HX_FIELD_FIRST_ORDER}};
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const Played played = Play(c);
    const bool fields = c.field_type != HX_FIELD_PROGRESSIVE;
    EXPECT_EQ(played.clip.frame_count, (16 - c.start) * (fields ? 2 : 1));
    EXPECT_EQ(played.clip.first_frame, c.start);
    ASSERT_TRUE(played.clip.crop);
    Effect& moved = Moved(played, OwnWindows(played.clip, c.framing == 3));
    const auto own = played.effect->MakeRenderer(), other = moved.MakeRenderer();
    for (const std::int64_t frame : {0, 5, 12}) {
      RenderRequest request{frame, 32};
      request.second_field = fields && frame == 5;
      const auto a = own->Planned(request).pixels, b = other->Planned(request).pixels;
      ASSERT_TRUE(a && b);
      EXPECT_LT(Largest<float>(*a, *b) * 255, 0.05);
      request.bit_depth = 8;
      // Either of the two roundings of a sample may tip.
      EXPECT_LE(Largest<std::uint8_t>(*own->Direct(request).pixels, *other->Direct(request).pixels),
                2);
    }
  }
}

// What a frame's warp and a window should draw of the source, cell by cell of the grid; these are
// so small that three of their corners tell the map.
class Expected {
 public:
  // shift: of the whole picture, in the source's pixels.
  Expected(const SolvedClip& clip, const WorldBuffer& source, int row, const Similarity& window,
           Point shift)
      : width_(clip.source_width), height_(clip.height), red_(width_ * height_, -1) {
    const Similarity output_from_plane = Inverse(window);
    const auto vertex = [&](int c, int r) {
      const Point p = output_from_plane(clip.vertices[(row * clip.rows + r) * clip.columns + c]);
      return Point{(p.x + 0.5) * width_ / clip.width - 0.5 + shift.x, p.y + shift.y};
    };
    const double cell_x = (width_ - 1.0) / (clip.columns - 1);
    const double cell_y = (height_ - 1.0) / (clip.rows - 1);
    for (int i = 0; i < (clip.columns - 1) * (clip.rows - 1); ++i) {
      const int c = i % (clip.columns - 1), r = i / (clip.columns - 1);
      const Point p = vertex(c, r), p10 = vertex(c + 1, r), p01 = vertex(c, r + 1);
      const Point du = {p10.x - p.x, p10.y - p.y}, dv = {p01.x - p.x, p01.y - p.y};
      const double determinant = du.x * dv.y - du.y * dv.x, reach = cell_x + cell_y;
      for (int y = std::max(0.0, p.y - reach); y < std::min<double>(p.y + 2 * reach, height_);
           ++y) {
        for (int x = std::max(0.0, p.x - reach); x < std::min<double>(p.x + 2 * reach, width_);
             ++x) {
          const double u = ((x - p.x) * dv.y - (y - p.y) * dv.x) / determinant;
          const double v = ((y - p.y) * du.x - (x - p.x) * du.y) / determinant;
          if (u < 0 || u > 1 || v < 0 || v > 1) continue;
          red_[y * width_ + x] = Sample(source, (c + u) * cell_x - 0.5, (r + v) * cell_y - 0.5);
        }
      }
    }
  }

  // Calls rest(x, y, pixel) where nothing is to be drawn, nor beside it.
  template <class Rest>
  void Compare(const WorldBuffer& picture, const Rest& rest) const {
    double worst = 0;
    int compared = 0;
    for (int y = 2; y < height_ - 2; ++y) {
      for (int x = 2; x < width_ - 2; ++x) {
        const HX_Pixel8& pixel = picture.row<HX_Pixel8>(y)[x];
        int drawn = 0;
        for (int i = 0; i < 25; ++i) drawn += red_[(y + i / 5 - 2) * width_ + x + i % 5 - 2] >= 0;
        if (drawn == 0) rest(x, y, pixel);
        if (drawn != 25) continue;
        ASSERT_EQ(pixel.alpha, 255) << x << ", " << y;
        worst = std::max(worst, std::abs(pixel.red - red_[y * width_ + x]));
        ++compared;
      }
    }
    EXPECT_LT(worst, 1.5);  // two roundings, and a cell's fourth corner
    EXPECT_GT(compared, width_ * height_ / 5);
  }

 private:
  double Sample(const WorldBuffer& source, double x, double y) const {
    x = std::clamp(x, 0.0, width_ - 1.001);
    y = std::clamp(y, 0.0, height_ - 1.001);
    const int i = static_cast<int>(x), j = static_cast<int>(y);
    const HX_Pixel8 *above = source.row<HX_Pixel8>(j) + i,
                    *below = source.row<HX_Pixel8>(j + 1) + i;
    return std::lerp(std::lerp(above[0].red, above[1].red, x - i),
                     std::lerp(below[0].red, below[1].red, x - i), y - j);
  }

  const int width_, height_;
  std::vector<double> red_;  // -1 where nothing is drawn
};

TEST_F(SolvedClipTest, WindowsShowTheirPartOfThePlane) {
  const Case cases[] = {{"square", 2, 4},
                        {"wide", 3, 4, {4, 3}},
                        {"odd", 2, 1, {1, 1}, 161, 121},
                        {"synthesized", 4, 1},
                        {"wide, synthesized", 4, 1, {4, 3}}};
  constexpr int kFrame = 5;
  // The camera's place then, as MakeShakyClip has it.
  const double camera_x = kTremor * (1.5 * kFrame + 5.0 * std::sin(2.1 * kFrame));
  const double camera_y = kTremor * (4.0 * std::sin(1.7 * kFrame + 1.0));
  for (const Case& c : cases) {
    const Played played = Play(c);
    const SolvedClip& clip = played.clip;
    const Point corner = clip.vertices[kFrame * clip.columns * clip.rows];
    const bool synthesized = c.framing == 4;
    for (const double scale : {0.8, 1.2, 2.0}) {  // the last leaves a rim of nothing all around
      SCOPED_TRACE(c.name + ", scale " + std::to_string(scale));
      Windows windows;  // about the frame's middle
      for (int f = 0; f < clip.frame_count; ++f) {
        windows.push_back({scale * std::cos(0.03), scale * std::sin(0.03),
                           clip.width * (1 - scale) / 2 + 2.7 + 0.37 * f,
                           clip.height * (1 - scale) / 2 - 4.3 - 0.41 * f});
      }
      Effect& moved = Moved(played, windows);
      const Point shift =
          synthesized ? ShiftWithoutCrop(ReadSolvedClip(Saved(moved).instance)) : Point{};
      double sum = 0;
      int filled = 0;
      Expected(clip, *SourceFrame(*played.effect, kFrame), kFrame, windows[kFrame], shift)
          .Compare(*moved.MakeRenderer()->Planned({kFrame}).OnLayer(), [&](int x, int y,
                                                                           const HX_Pixel8& pixel) {
            if (pixel.alpha != 255) return;
            const Point p = windows[kFrame](
                {(x - shift.x + 0.5) * clip.width / clip.source_width - 0.5, y - shift.y});
            const double scene_x = (p.x - corner.x) * clip.source_width / clip.width + camera_x;
            sum +=
                std::abs(pixel.red - 255 * Noise(scene_x - 0.5, p.y - corner.y + camera_y - 0.5));
            ++filled;
          });
      // By neighbours, which go with their frame.
      EXPECT_EQ(filled > (synthesized ? 300 : 0), synthesized && scale > 1) << filled;
      EXPECT_LE(sum, filled * 9);
    }
  }
}

// The payload's length goes with the bytes.
Bytes Cut(Bytes bytes, std::size_t size) {
  bytes.resize(size);
  const std::uint64_t length = size - 24;
  std::memcpy(bytes.data() + 16, &length, sizeof length);
  return bytes;
}

TEST_F(SolvedClipTest, ForeignAndDamagedInstances) {
  const Played played = Play({"damaged", 4, 1});
  const Windows windows(static_cast<std::size_t>(played.clip.frame_count));
  const Bytes raw = WithWindows(played.saved.instance, windows);
  EXPECT_EQ(ReadSolvedClip(raw).vertices, played.clip.vertices);

  tessel::filesupport::OStringByteStream deflated;
  tessel::filesupport::OZipByteStream zip(deflated);
  zip.Write(raw.data() + 24, raw.size() - 24);
  zip.Close();
  Bytes zipped(raw.begin(), raw.begin() + 24);
  zipped[5] = 0;
  zipped.insert(zipped.end(), deflated.bytes().begin(), deflated.bytes().end());
  EXPECT_EQ(WithWindows(Cut(zipped, zipped.size()), windows), raw);

  const auto after = [&raw](const std::string& marker) {
    const auto found = std::search(raw.begin(), raw.end(), marker.begin(), marker.end());
    return static_cast<std::size_t>(found - raw.begin()) + 4;
  };
  const std::size_t mesh = after("hseM"), map = after("NotM"), solve = after("vloS");
  const std::vector<std::pair<std::size_t, std::vector<std::uint32_t>>> damages = {
      {0, {15, 17}},                                    // version
      {4, {0x0100}},                                    // of an instance at work
      {16, {0x7fffffff}},                               // longer than it is
      {24, {0}},                                        // marker
      {28, {0, 0x7fffffff}},                            // width
      {44, {0, 15, 17, 0x7fffffff, 0xffffffff}},        // frames
      {48, {0, 1, 0x7fffffff, 0xffffffff}},             // slots
      {56, {0xffffffff}},                               // a text's length
      {solve, {0, 4}},                                  // not solved, failed
      {mesh, {0, 1, 47, 0x7fffffff, 0xffffffff}},       // columns
      {mesh + 4, {0, 1, 0x7fffffff, 0xffffffff}},       // rows
      {map, {0, 0x7fffffff, 0xffffffff}},               // entries
      {map + 12, {16, 0xffffffff}},                     // an entry's frame
      {after("porC") + 1, {5, 0x7fffffff, 0xffffffff}}  // windows
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
  EXPECT_THROW(WithWindows(raw, Windows(3)), std::invalid_argument);
  EXPECT_THROW(WithWindows(raw, Windows(16, {0, 0, 0, 0})), std::invalid_argument);
  EXPECT_THROW(ShiftWithoutCrop(played.clip), std::invalid_argument);
}

}  // namespace
}  // namespace calmframe::host
