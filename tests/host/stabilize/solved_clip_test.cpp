#include "host/stabilize/solved_clip.h"

#include <cstring>

#include "platform/hx/hx_controls.h"
#include "platform/tessel/filesupport.h"
#include "tests/contract/played_plugin.h"

namespace calmframe::host {
namespace {

using Bytes = std::vector<std::uint8_t>;

struct Case {
  std::string name;
  int framing = 2, method = 4;
  HX_Ratio aspect = {1, 1};
  std::int32_t field_type = HX_FIELD_PROGRESSIVE;
  int width = 160, height = 120;
  std::int32_t start = 0;
};

class SolvedClipTest : public PlayedPlugin {
 protected:
  static constexpr double kTremor = 1.2;

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
  Effect& Moved(const Played& played, const std::vector<Similarity>& windows) {
    SavedEffect moved = played.saved;
    moved.instance = WithWindows(moved.instance, windows);
    moved.values[HX_ADDITIONAL_SCALE.disk_id] = 100;
    const std::uint64_t analysed = Analysed();
    Effect& effect = session().Load(played.other_layer, moved);
    const auto told = [&] { return *ValueOf(*effect.Param(kStatusCounter)); };
    const double before = told();
    EXPECT_EQ(Settle(effect), kReady);
    EXPECT_EQ(told(), before);
    EXPECT_EQ(Analysed(), analysed);
    EXPECT_EQ(ReadSolvedClip(Saved(effect).instance).vertices,
              ReadSolvedClip(moved.instance).vertices);
    return effect;
  }
};

// Windows that show what the effect shows: its own, at the scale at which they cover the frame.
std::vector<Similarity> OwnWindows(const SolvedClip& clip, bool scales) {
  const auto& crop = *clip.crop;
  const float covers =
      std::max((clip.height + 1.0f) / crop.height, (clip.width + 1.0f) / crop.width);
  const double step = 1 / (scales ? std::clamp(covers, 1.0f, 1.5f) : 1.0);
  std::vector<Similarity> windows;
  for (const SolvedClip::Window& w : crop.windows) {
    windows.push_back({step, 0,
                       (w.left + w.right) / 2.0 + crop.origin.x - step * (clip.width - 1) / 2,
                       (w.top + w.bottom) / 2.0 + crop.origin.y - step * (clip.height - 1) / 2});
  }
  return windows;
}

// Largest difference of the colours over all but a margin, in 255ths; both of that depth.
template <class Component>
double Largest(const WorldBuffer& a, const WorldBuffer& b, double full, int margin) {
  double largest = 0;
  for (int y = margin; y < a.world().height - margin; ++y) {
    for (int i = margin * 4; i < (a.world().width - margin) * 4; ++i) {
      const double difference =
          a.row<Component>(y)[i] - static_cast<double>(b.row<Component>(y)[i]);
      largest = std::max(largest, std::abs(difference) / full * 255);
    }
  }
  return largest;
}

TEST_F(SolvedClipTest, TheEffectsOwnWindowsShowItsOwnPicture) {
  const Case cases[] = {{"scaled", 3, 4},
                        {"position, odd sizes", 2, 1, {1, 1}, HX_FIELD_PROGRESSIVE, 161, 121},
                        {"similarity, narrow pixels", 3, 2, {8, 9}},
                        {"perspective, wide pixels, trimmed", 2, 3, {4, 3}, 0, 160, 120, 3},
                        {"fields", 3, 4, {1, 1}, HX_FIELD_FIRST_ORDER}};
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const Played played = Play(c);
    const bool fields = c.field_type != HX_FIELD_PROGRESSIVE;
    ASSERT_TRUE(played.clip.crop);
    EXPECT_EQ(played.clip.frame_count, (16 - c.start) * (fields ? 2 : 1));
    EXPECT_EQ(played.clip.first_frame, c.start);
    Effect& moved = Moved(played, OwnWindows(played.clip, c.framing == 3));
    const auto own = played.effect->MakeRenderer(), other = moved.MakeRenderer();
    for (const std::int64_t frame : {0, 5, 12}) {
      RenderRequest request{frame, 32};
      request.second_field = fields && frame == 5;
      const auto a = own->Planned(request), b = other->Planned(request);
      ASSERT_TRUE(a.pixels && b.pixels);
      EXPECT_LT(Largest<float>(*a.pixels, *b.pixels, 1, 20), 0.5);
      request.bit_depth = 8;
      EXPECT_LE(Largest<std::uint8_t>(*own->Direct(request).pixels, *other->Direct(request).pixels,
                                      255, 20),
                1);
    }
  }
}

// What a frame's warp and a window should draw, pixel by pixel: by cells of the grid, each looked
// up through the inverse of its bilinear map, with bilinear samples of the source.
class Expected {
 public:
  // shift: of the whole picture, in the source's pixels.
  Expected(const SolvedClip& clip, const WorldBuffer& source, int row, const Similarity& window,
           Point shift = {})
      : clip_(clip),
        source_(source),
        red_(static_cast<std::size_t>(clip.source_width) * clip.height, -1) {
    const Similarity output_from_plane = Inverse(window);
    const double scale = clip.source_width / static_cast<double>(clip.width);
    const Point* vertices =
        clip.vertices.data() + static_cast<std::size_t>(row) * clip.columns * clip.rows;
    const auto vertex = [&](int c, int r) {
      const Point p = output_from_plane(vertices[r * clip.columns + c]);
      return Point{(p.x + 0.5) * scale - 0.5 + shift.x, p.y + shift.y};
    };
    for (int r = 0; r + 1 < clip.rows; ++r) {
      for (int c = 0; c + 1 < clip.columns; ++c) {
        Draw(c, r, {vertex(c, r), vertex(c + 1, r), vertex(c, r + 1), vertex(c + 1, r + 1)});
      }
    }
  }

  double At(int x, int y) const {
    return red_[static_cast<std::size_t>(y) * clip_.source_width + x];
  }
  // Whether all pixels about it are drawn, or none.
  bool Near(int x, int y, bool drawn) const {
    for (int v = std::max(y - 2, 0); v <= std::min(y + 2, clip_.height - 1); ++v) {
      for (int u = std::max(x - 2, 0); u <= std::min(x + 2, clip_.source_width - 1); ++u) {
        if ((At(u, v) >= 0) != drawn) return false;
      }
    }
    return true;
  }

 private:
  void Draw(int c, int r, const std::array<Point, 4>& p) {
    const auto [x0, x1] = std::minmax({p[0].x, p[1].x, p[2].x, p[3].x});
    const auto [y0, y1] = std::minmax({p[0].y, p[1].y, p[2].y, p[3].y});
    for (int y = std::max(0, int(std::ceil(y0))); y <= std::min(clip_.height - 1.0, y1); ++y) {
      for (int x = std::max(0, int(std::ceil(x0))); x <= std::min(clip_.source_width - 1.0, x1);
           ++x) {
        double u = 0.5, v = 0.5;
        for (int i = 0; i < 8; ++i) {  // Newton
          const Point du = {(p[1].x - p[0].x) * (1 - v) + (p[3].x - p[2].x) * v,
                            (p[1].y - p[0].y) * (1 - v) + (p[3].y - p[2].y) * v};
          const Point dv = {(p[2].x - p[0].x) * (1 - u) + (p[3].x - p[1].x) * u,
                            (p[2].y - p[0].y) * (1 - u) + (p[3].y - p[1].y) * u};
          const double ex = x - (p[0].x * (1 - v) + p[2].x * v + du.x * u);
          const double ey = y - (p[0].y * (1 - v) + p[2].y * v + du.y * u);
          const double determinant = du.x * dv.y - du.y * dv.x;
          u += (ex * dv.y - ey * dv.x) / determinant;
          v += (du.x * ey - du.y * ex) / determinant;
        }
        if (u < 0 || u > 1 || v < 0 || v > 1) continue;
        red_[static_cast<std::size_t>(y) * clip_.source_width + x] =
            Sample((c + u) * (clip_.source_width - 1) / (clip_.columns - 1) - 0.5,
                   (r + v) * (clip_.height - 1) / (clip_.rows - 1) - 0.5);
      }
    }
  }
  double Sample(double x, double y) const {
    x = std::clamp(x, 0.0, clip_.source_width - 1.001);
    y = std::clamp(y, 0.0, clip_.height - 1.001);
    const int i = static_cast<int>(x), j = static_cast<int>(y);
    const auto red = [&](int u, int v) { return source_.row<HX_Pixel8>(v)[u].red; };
    return std::lerp(std::lerp(red(i, j), red(i + 1, j), x - i),
                     std::lerp(red(i, j + 1), red(i + 1, j + 1), x - i), y - j);
  }

  const SolvedClip& clip_;
  const WorldBuffer& source_;
  std::vector<double> red_;  // -1 where nothing is drawn
};

// Another one for each frame.
Similarity Window(int row, double scale, double angle, Point shift) {
  return {scale * std::cos(angle), scale * std::sin(angle), shift.x + 0.37 * row,
          shift.y - 0.41 * row};
}

TEST_F(SolvedClipTest, WindowsShowTheirPartOfThePlane) {
  const Case cases[] = {
      {"square", 2, 4}, {"wide", 2, 4, {4, 3}}, {"odd", 2, 1, {1, 1}, 0, 161, 121}};
  for (const Case& c : cases) {
    const Played played = Play(c);
    // The widest one leaves a rim of nothing all around.
    for (const double scale : {0.8, 1.0, 1.2, 2.0}) {
      SCOPED_TRACE(c.name + ", scale " + std::to_string(scale));
      std::vector<Similarity> windows;
      for (int f = 0; f < played.clip.frame_count; ++f) {
        const double centred = (1 - scale) / 2;
        windows.push_back(
            Window(f, scale, 0.03,
                   {played.clip.width * centred + 2.7, played.clip.height * centred - 4.3}));
      }
      const auto renderer = Moved(played, windows).MakeRenderer();
      for (const int frame : {1, 11}) {
        const auto rendered = renderer->Planned({frame});
        ASSERT_TRUE(rendered.pixels);
        const auto source = SourceFrame(*played.effect, frame);
        const Expected expected(played.clip, *source, frame,
                                windows[static_cast<std::size_t>(frame)]);
        int compared = 0, empty = 0;
        double worst = 0;
        for (int y = 0; y < played.clip.height; ++y) {
          for (int x = 0; x < played.clip.source_width; ++x) {
            const HX_Pixel8& pixel = rendered.pixels->row<HX_Pixel8>(y)[x];
            if (expected.Near(x, y, true)) {
              ++compared;
              ASSERT_EQ(pixel.alpha, 255) << x << ", " << y;
              worst = std::max(worst, std::abs(pixel.red - expected.At(x, y)));
            } else if (expected.Near(x, y, false)) {
              ++empty;
              ASSERT_EQ(pixel.alpha, 0) << x << ", " << y;
            }
          }
        }
        EXPECT_LT(worst, 1.5);
        EXPECT_GT(compared, 0.8 / std::max(scale * scale, 1.0) * c.width * c.height * 0.9);
        if (scale == 2.0) {
          EXPECT_GT(empty, c.width * c.height / 2);
        }
      }
    }
  }
}

// Neighbours go with their frame, and all is shifted as a whole.
TEST_F(SolvedClipTest, SynthesizedEdgesMoveWithTheirWindow) {
  for (const HX_Ratio aspect : {HX_Ratio{1, 1}, HX_Ratio{4, 3}}) {
    const Played played = Play({"synthesized", 4, 1, aspect});
    EXPECT_FALSE(played.clip.crop);
    std::vector<Similarity> windows;
    for (int f = 0; f < played.clip.frame_count; ++f) {
      windows.push_back(Window(f, 0.97, 0.02, {f % 3 - 12.5, 9.2 - f % 2}));
    }
    Effect& moved = Moved(played, windows);
    const Point shift = ShiftWithoutCrop(ReadSolvedClip(Saved(moved).instance));
    const double scale = played.clip.source_width / static_cast<double>(played.clip.width);
    for (const int frame : {4, 9}) {
      const auto row = static_cast<std::size_t>(frame);
      const auto picture = moved.MakeRenderer()->Planned({frame}).OnLayer();
      ASSERT_TRUE(picture);
      const Expected expected(played.clip, *SourceFrame(*played.effect, frame), frame, windows[row],
                              shift);
      // The camera's place, as MakeShakyClip has it.
      const double camera_x = kTremor * (1.5 * frame + 5.0 * std::sin(2.1 * frame));
      const double camera_y = kTremor * (4.0 * std::sin(1.7 * frame + 1.0));
      const Point moved_by = played.clip.vertices[row * played.clip.columns * played.clip.rows];
      double worst = 0, sum = 0;
      int filled = 0;
      for (int y = 2; y < played.clip.height - 2; ++y) {
        for (int x = 2; x < played.clip.source_width - 2; ++x) {
          const HX_Pixel8& pixel = picture->row<HX_Pixel8>(y)[x];
          if (expected.Near(x, y, true)) {
            worst = std::max(worst, std::abs(pixel.red - expected.At(x, y)));
          } else if (expected.Near(x, y, false) && pixel.alpha == 255) {
            const Point p = windows[row]({(x - shift.x + 0.5) / scale - 0.5, y - shift.y});
            ++filled;
            sum += std::abs(pixel.red - 255 * Noise((p.x - moved_by.x) * scale - 0.5 + camera_x,
                                                    p.y - moved_by.y - 0.5 + camera_y));
          }
        }
      }
      EXPECT_LT(worst, 1.5);
      EXPECT_GT(filled, 300);
      EXPECT_LT(sum / filled, 8);
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

std::size_t After(const Bytes& bytes, const std::string& marker) {
  return static_cast<std::size_t>(
      std::search(bytes.begin() + 24, bytes.end(), marker.begin(), marker.end()) - bytes.begin() +
      4);
}

TEST_F(SolvedClipTest, ForeignAndDamagedInstances) {
  const Played played = Play({"damaged", 4, 1});
  const std::vector<Similarity> windows(static_cast<std::size_t>(played.clip.frame_count));
  const Bytes raw = WithWindows(played.saved.instance, windows);
  // Unmoved, all is as it was.
  EXPECT_EQ(ReadSolvedClip(raw).vertices, played.clip.vertices);
  EXPECT_EQ(ReadSolvedClip(raw).statuses, played.clip.statuses);
  EXPECT_EQ(WithWindows(raw, windows), raw);

  tessel::filesupport::OStringByteStream deflated;
  tessel::filesupport::OZipByteStream zip(deflated);
  zip.Write(raw.data() + 24, raw.size() - 24);
  zip.Close();
  Bytes zipped(raw.begin(), raw.begin() + 24);
  zipped[5] = 0;
  zipped.insert(zipped.end(), deflated.bytes().begin(), deflated.bytes().end());
  EXPECT_EQ(WithWindows(Cut(zipped, zipped.size()), windows), raw);

  const std::size_t mesh = After(raw, "hseM"), map = After(raw, "NotM"), solve = After(raw, "vloS"),
                    crop = After(raw, "porC");
  const struct {
    const char* what;
    std::size_t place;
    std::uint32_t value;
  } damages[] = {{"older", 0, 15},
                 {"newer", 0, 17},
                 {"at work", 4, 0x0100},
                 {"longer than it is", 16, 0x7fffffff},
                 {"marker", 24, 0},
                 {"no width", 28, 0},
                 {"no frames", 44, 0},
                 {"many frames", 44, 0x7fffffff},
                 {"frames below 0", 44, 0xffffffff},
                 {"no slots", 48, 0},
                 {"many slots", 48, 0x7fffffff},
                 {"long text", 56, 0xffffffff},
                 {"not solved", solve, 0},
                 {"failed", solve, 4},
                 {"one column", mesh, 1},
                 {"many columns", mesh, 0x7fffffff},
                 {"many rows", mesh + 4, 0x7fffffff},
                 {"other grid", mesh, static_cast<std::uint32_t>(played.clip.columns - 1)},
                 {"many entries", map, 0x7fffffff},
                 {"entries below 0", map, 0xffffffff},
                 {"entry of no frame", map + 12, 1000},
                 {"crop of another clip", crop + 1, 5}};
  for (const auto& damage : damages) {
    SCOPED_TRACE(damage.what);
    Bytes bytes = raw;
    std::memcpy(bytes.data() + damage.place, &damage.value, sizeof damage.value);
    EXPECT_THROW(ReadSolvedClip(bytes), NoSolvedClip);
    EXPECT_THROW(WithWindows(bytes, windows), NoSolvedClip);
  }
  Bytes longer = raw;
  longer.resize(raw.size() + 7);
  EXPECT_NO_THROW(ReadSolvedClip(longer));
  EXPECT_THROW(ReadSolvedClip(Cut(longer, raw.size() + 7)), NoSolvedClip);
  for (const Bytes& whole : {raw, zipped}) {
    for (std::size_t size = 24; size < whole.size(); size += size < 600 ? 1 : whole.size() / 97) {
      EXPECT_THROW(ReadSolvedClip(Cut(whole, size)), NoSolvedClip) << size;
    }
  }
  EXPECT_THROW(ReadSolvedClip({}), NoSolvedClip);
  EXPECT_THROW(WithWindows(raw, std::vector<Similarity>(3)), std::invalid_argument);
  std::vector<Similarity> flat = windows;
  flat[2].a = 0;
  EXPECT_THROW(WithWindows(raw, flat), std::invalid_argument);
}

}  // namespace
}  // namespace calmframe::host
