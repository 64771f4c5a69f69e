#include <nlohmann/json.hpp>
#include <numbers>

#include "tests/apps/calmframe/program_fixture.h"

namespace calmframe {
namespace {

constexpr int kFrames = 40, kWidth = 320, kHeight = 240;

// A camera over a flat wall: it shakes while it pans, turns and comes closer.
Camera CameraAt(double t) {
  return {0.8 * t + 3 * std::sin(1.9 * t), 2.5 * std::cos(2.3 * t) - 2.5, 0.004 * std::sin(1.7 * t),
          1 + 0.001 * t};
}

class ReportTest : public ProgramTest {
 protected:
  static nlohmann::json DataOf(const std::string& page) {
    const std::string open = "<script type=\"application/json\" id=\"data\">";
    const std::size_t begin = page.find(open) + open.size();
    return nlohmann::json::parse(page.substr(begin, page.find("</script>", begin) - begin));
  }
};

std::vector<double> Values(const nlohmann::json& data, const char* plot, const char* curve) {
  return data.at("plots").at(plot).at("curves").at(curve).get<std::vector<double>>();
}

double Roughness(const std::vector<double>& values) {
  double sum = 0;
  for (std::size_t i = 2; i < values.size(); ++i) {
    sum += std::abs(values[i] - 2 * values[i - 1] + values[i - 2]);
  }
  return sum;
}

TEST_F(ReportTest, TellsTheCameraThatMadeTheClip) {
  const std::string clip = "a <wall> & 'more'.mp4";
  MakeWall(clip, Made(kWidth, kHeight, kFrames, 30), CameraAt);
  const std::string quoted = "\"" + clip + "\"";
  RunWell("analyze " + quoted + " --project w.calm --quiet");
  const std::string saved = Content("w.calm");
  EXPECT_EQ(RunWell("report w.calm w.html --quiet"), "");
  EXPECT_EQ(Content("w.calm"), saved);
  const std::string page = Content("w.html");
  EXPECT_THAT(page, HasSubstr("<h1>a &lt;wall&gt; &amp; &#39;more&#39;.mp4</h1>"));
  EXPECT_EQ(page.find("<wall>"), std::string::npos);

  const nlohmann::json data = DataOf(page);
  const auto x = Values(data, "path-x", "as shot"), y = Values(data, "path-y", "as shot");
  const auto angle = Values(data, "path-angle", "as shot");
  const auto zoom = Values(data, "path-zoom", "as shot");
  ASSERT_EQ(x.size(), std::size_t{kFrames});
  double expected_x = 0, expected_y = 0;
  for (int f = 1; f < kFrames; ++f) {
    // Where this frame sees what the last one had in its middle, told from the camera alone.
    const Camera now = CameraAt(f), last = CameraAt(f - 1);
    const double dx = now.x - last.x, dy = now.y - last.y;
    expected_x += now.zoom * (std::cos(now.angle) * dx + std::sin(now.angle) * dy);
    expected_y += now.zoom * (std::cos(now.angle) * dy - std::sin(now.angle) * dx);
    EXPECT_NEAR(x[f], expected_x, 0.5) << f;
    EXPECT_NEAR(y[f], expected_y, 0.5) << f;
    EXPECT_NEAR(angle[f], now.angle * 180 / std::numbers::pi, 0.1) << f;
    EXPECT_NEAR(zoom[f], now.zoom, 0.003) << f;
  }
  for (const char* axis : {"path-x", "path-y"}) {
    EXPECT_LT(Roughness(Values(data, axis, "steadied")),
              0.1 * Roughness(Values(data, axis, "as shot")))
        << axis;
  }
  const auto followed = Values(data, "tracks", "followed"), begun = Values(data, "tracks", "begun"),
             lost = Values(data, "tracks", "lost");
  for (int f = 1; f < kFrames; ++f) {
    EXPECT_EQ(followed[f], followed[f - 1] - lost[f - 1] + begun[f]) << f;
  }
  const auto scores = Values(data, "models", "score");
  ASSERT_EQ(scores.size(), std::size_t{kFrames});
  for (const double score : scores) EXPECT_TRUE(score >= 1 && score <= 4) << score;
  EXPECT_EQ(Values(data, "crop", "across").size(), std::size_t{kFrames});
  for (const double share : Values(data, "empty", "uncovered")) EXPECT_LT(share, 0.1);

  // Without scaling the window's surroundings stay empty: what the window leaves of the frame.
  RunWell("analyze " + quoted + " --project w.calm --framing crop --quiet");
  EXPECT_EQ(Run("report w.calm w.html --quiet").code, 4) << "is there already";
  RunWell("report w.calm w.html --quiet --overwrite");
  const std::string cropped = Content("w.html");
  const std::size_t window = cropped.find("Crop window</th><td>");
  int width = 0, height = 0;
  ASSERT_EQ(std::sscanf(cropped.c_str() + window, "Crop window</th><td>%d x %d", &width, &height),
            2);
  const double left = 100 * (1 - double(width) * height / (kWidth * kHeight));
  for (const double share : Values(DataOf(cropped), "empty", "uncovered")) {
    EXPECT_NEAR(share, left, 1.5);
  }
}

TEST_F(ReportTest, WithoutItsClipThePageHasAllButThePictures) {
  MakeClip("wide.mkv", 160, 120, 20, {64, 45});
  const std::string told = RunWell("analyze wide.mkv --project w.calm --quiet");
  RunWell("report w.calm with.html --quiet");
  fs::rename(Path("wide.mkv"), Path("elsewhere"));
  ExpectLine("report w.calm without.html --quiet", 0, "wide.mkv is gone; the page has no pictures");
  const std::string page = Content("without.html");
  EXPECT_THAT(page, HasSubstr("wide.mkv is gone; the page has no pictures</li>"));
  EXPECT_EQ(page.find("<img"), std::string::npos);
  EXPECT_EQ(DataOf(page), DataOf(Content("with.html")));
  // The result is told as analyze tells it.
  const std::string crop = told.substr(told.find("crop window"));
  EXPECT_THAT(page, HasSubstr(crop.substr(0, crop.find('\n'))));
  // Another clip in its place is none of its pictures.
  MakeClip("wide.mkv", 160, 120, 6);
  ExpectLine("report w.calm other.html --quiet", 0, "is not the clip");
  EXPECT_EQ(Content("other.html").find("<img"), std::string::npos);
}

TEST_F(ReportTest, OfNothingNothingIsDrawn) {
  MakeClip("one.mp4", 64, 48, 1);
  WriteClip(Path("blank.mp4"), Made(64, 48, 8, 30), [](int, HX_Pixel8* pixels) {
    std::fill_n(pixels, 64 * 48, HX_Pixel8{255, 128, 128, 128});
  });
  for (const std::string name : {"one", "blank"}) {
    RunWell("analyze " + name + ".mp4 --project " + name + ".calm --quiet");
    RunWell("report " + name + ".calm " + name + ".html --quiet");
    const std::string page = Content(name + ".html");
    EXPECT_EQ(page.find("id=\"path-x\""), std::string::npos) << name;
    EXPECT_EQ(page.find(" nan"), std::string::npos) << name;
  }
  EXPECT_THAT(Content("blank.html"), HasSubstr("Nothing to track was found"));
}

TEST_F(ReportTest, ABrowserShowsEveryPlotWithoutAWordOfComplaint) {
  MakeClip("in.mp4", 160, 120, 20);
  RunWell("analyze in.mp4 --project p.calm --quiet");
  RunWell("report p.calm p.html --quiet");
  // What the work came from is never written over, by no command and under no name.
  const std::string clip = Content("in.mp4"), saved = Content("p.calm");
  fs::create_hard_link(Path("in.mp4"), Path("same.mp4"));
  for (const char* command :
       {"report p.calm in.mp4", "report p.calm same.mp4", "report p.calm p.calm",
        "render --project p.calm same.mp4 --from 1 --to 3", "render --project p.calm p.calm",
        "stabilize in.mp4 p.calm --project p.calm"}) {
    EXPECT_EQ(Run(std::string(command) + " --overwrite --quiet").code, 4) << command;
  }
  EXPECT_EQ(Content("in.mp4"), clip);
  EXPECT_EQ(Content("p.calm"), saved);
  const std::string page = Content("p.html");
  EXPECT_EQ(page.find("http:"), std::string::npos) << "nothing comes from elsewhere";
  EXPECT_EQ(page.find("https:"), std::string::npos);
  if (Shell("command -v chromium").code != 0) GTEST_SKIP() << "no chromium";
  const Outcome browser = Shell(
      "cd '" + path().string() +
      "' && HOME=$PWD timeout 120 chromium --headless --no-sandbox "
      "--disable-gpu --disable-dev-shm-usage --user-data-dir=$PWD/profile --enable-logging=stderr "
      "--virtual-time-budget=5000 --dump-dom \"file://$PWD/p.html\" 2>log.txt");
  ASSERT_EQ(browser.code, 0) << Content("log.txt");
  EXPECT_EQ(Content("log.txt").find("CONSOLE"), std::string::npos) << Content("log.txt");
  const std::string& dom = browser.text;
  // The script makes each plot it has found the data of answer to the keyboard.
  for (const char* plot :
       {"path-x", "path-y", "path-angle", "path-zoom", "tracks", "models", "crop", "empty"}) {
    const std::size_t begin = dom.find("id=\"" + std::string(plot) + "\"");
    ASSERT_NE(begin, std::string::npos) << plot;
    const std::string svg = dom.substr(begin, dom.find("</svg>", begin) - begin);
    EXPECT_THAT(svg.substr(0, svg.find('>')), HasSubstr("tabindex=\"0\"")) << plot;
    const std::size_t curve = svg.find(" d=\"M");
    ASSERT_NE(curve, std::string::npos) << plot;
    const std::string path = svg.substr(curve, svg.find('"', curve + 4) - curve);
    EXPECT_GE(std::count(path.begin(), path.end(), 'L'), 19) << plot;
    EXPECT_EQ(path.find("nan"), std::string::npos) << plot;
  }
  int pictures = 0;
  for (std::size_t at = 0;
       (at = dom.find("src=\"data:image/jpeg;base64,", at)) != std::string::npos; ++at) {
    ++pictures;
  }
  EXPECT_EQ(pictures, 12);
}

}  // namespace
}  // namespace calmframe
