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

// What the page's table of candidates has of one, by column; its name of the one chosen.
std::map<std::string, std::string> RowOf(const std::string& page, const std::string& name) {
  const auto cells = [](const std::string& text, const char* tag) {
    const std::string opening = "<" + std::string(tag);
    std::vector<std::string> found;
    for (std::size_t at = text.find(opening); at != std::string::npos;
         at = text.find(opening, at + 1)) {
      const std::size_t begin = text.find('>', at) + 1;
      found.push_back(text.substr(begin, text.find('<', begin) - begin));
    }
    return found;
  };
  const std::string table = page.substr(page.find("<table class=\"ways\">"));
  const std::vector<std::string> columns = cells(table.substr(0, table.find("</thead>")), "th ");
  const std::size_t begin = table.find("<th scope=\"row\">" + name + "<");
  if (begin == std::string::npos) return {};
  const std::vector<std::string> values =
      cells(table.substr(begin, table.find("</tr>", begin) - begin), "td");
  std::map<std::string, std::string> row;
  for (std::size_t i = 0; i < values.size(); ++i) row[columns.at(i + 1)] = values[i];
  return row;
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
  EXPECT_EQ(RunWell("report w.calm w.html --quiet --window steady"), "");
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

// The hand shakes, and more than the solve smooths away stays in view.
TEST_F(ReportTest, ShowsWhatStabilizeShowsAndWhy) {
  MakeWall("in.mkv", Made(kWidth, kHeight, kFrames, 25), [](double t) {
    return Camera{4 * t + 3 * std::sin(1.9 * t), 3 * std::cos(2.3 * t), 0.004 * std::sin(1.7 * t)};
  });
  const auto end = nlohmann::json::parse(
      RunWell("stabilize in.mkv out.mkv --project p.calm --json --quiet --zoom-at-most 1.3"));
  const nlohmann::json& choice = end.at("choice");
  const std::string saved = Content("p.calm");
  RunWell("report p.calm p.html --quiet --zoom-at-most 1.3");
  EXPECT_EQ(Content("p.calm"), saved);
  const std::string page = Content("p.html");
  int taken = 0;
  for (const auto& candidate : choice.at("candidates")) {
    const auto name = candidate.at("name").get<std::string>();
    auto row = RowOf(page, name);
    ASSERT_EQ(row.size(), 8u) << name;
    const auto told = [&](const char* column) { return std::stod(row[column]); };
    EXPECT_NEAR(told("Width kept"), 100 * candidate.at("width_kept").get<double>(), 0.06) << name;
    EXPECT_NEAR(told("Greatest zoom"), candidate.at("most_zoom"), 0.006) << name;
    EXPECT_NEAR(told("Black at most"), 100 * candidate.at("most_black").get<double>(), 0.06);
    EXPECT_NEAR(told("Shake"), candidate.at("shake_after"), 0.006) << name;
    EXPECT_NEAR(told("Shake of tracks"), candidate.at("tracks_after"), 0.006) << name;
    EXPECT_NEAR(told("Wobble"), candidate.at("wobble_after"), 0.006) << name;
    EXPECT_NEAR(told("Off the aim"), candidate.at("straying"), 0.06) << name;
    if (name == "as filmed") {
      EXPECT_EQ(row["Cost, dB"], "–") << "it is not weighed by it";
    } else {
      EXPECT_NEAR(told("Cost, dB"), candidate.at("cost"), 0.006) << name;
    }
    const bool is_taken = candidate.at("taken");
    taken += is_taken;
    EXPECT_EQ(page.find(name + "<mark>chosen</mark>") != std::string::npos, is_taken) << name;
  }
  EXPECT_EQ(taken, 1);

  // The frames' own figures are those of the whole, and the windows stay in the picture.
  const nlohmann::json data = DataOf(page);
  const auto zoom = Values(data, "window-zoom", "zoom");
  ASSERT_EQ(zoom.size(), std::size_t{kFrames});
  EXPECT_NEAR(*std::max_element(zoom.begin(), zoom.end()), end.at("most_zoom"), 1e-3);
  double kept = 0;
  for (const double value : zoom) kept += 1 / value / kFrames;
  EXPECT_NEAR(kept, end.at("width_kept"), 1e-3);
  for (const double most : data.at("plots").at("window-zoom").at("band").at("most")) {
    EXPECT_EQ(most, 1.3);
  }
  for (const char* plot : {"window-x", "window-y"}) {
    const auto centre = Values(data, plot, "centre");
    const nlohmann::json& band = data.at("plots").at(plot).at("band");
    for (int f = 0; f < kFrames; ++f) {
      EXPECT_GT(centre.at(f), band.at("least").at(f)) << plot << f;
      EXPECT_LT(centre.at(f), band.at("most").at(f)) << plot << f;
    }
  }
  // What the window adds to the camera's path is what makes it calm.
  const auto shot = Values(data, "path-x", "as shot"), steady = Values(data, "path-x", "steadied");
  const auto across = Values(data, "window-x", "centre");
  for (int f = 0; f < kFrames; ++f) {
    EXPECT_NEAR(steady[f] - shot[f], across[f] - across[0], 1.5) << f;
  }
  EXPECT_LT(Roughness(steady), 0.2 * Roughness(shot));
  EXPECT_EQ(data.at("plots").count("crop"), 0u) << "the effect's own";

  // The project tells the same.
  EXPECT_EQ(nlohmann::json::parse(Run("info p.calm --json").text).at("choice"), choice);
  EXPECT_THAT(RunWell("info p.calm"), HasSubstr("of the width kept, zoom "));
  RunWell("report p.calm steady.html --quiet --window steady");
  EXPECT_THAT(Content("steady.html"), HasSubstr("<p class=\"lead\">Steadied: crop window "));
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
  // The effect's own result is told as analyze tells it.
  RunWell("report w.calm own.html --quiet --window steady");
  const std::string crop = told.substr(told.find("crop window"));
  EXPECT_THAT(crop, HasSubstr("%), with --window steady\n"));
  EXPECT_THAT(Content("own.html"), HasSubstr(crop.substr(0, crop.find(", with"))));
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
  RunWell("report p.calm own.html --quiet --window steady");
  struct Page {
    const char* name;
    std::vector<std::string> plots;
  };
  for (const Page& shown :
       {Page{"p", {"window-x", "window-y", "window-zoom"}}, Page{"own", {"models", "crop"}}}) {
    const std::string page = Content(std::string(shown.name) + ".html");
    EXPECT_EQ(page.find("http:"), std::string::npos) << "nothing comes from elsewhere";
    EXPECT_EQ(page.find("https:"), std::string::npos);
    if (Shell("command -v chromium").code != 0) GTEST_SKIP() << "no chromium";
    const Outcome browser =
        Shell("cd '" + path().string() +
              "' && HOME=$PWD timeout 120 chromium --headless --no-sandbox --disable-gpu "
              "--disable-dev-shm-usage --user-data-dir=$PWD/profile --enable-logging=stderr "
              "--virtual-time-budget=5000 --dump-dom \"file://$PWD/" +
              shown.name + ".html\" 2>log.txt");
    ASSERT_EQ(browser.code, 0) << Content("log.txt");
    EXPECT_EQ(Content("log.txt").find("CONSOLE"), std::string::npos) << Content("log.txt");
    const std::string& dom = browser.text;
    // The script makes each plot it has found the data of answer to the keyboard.
    std::vector<std::string> plots = shown.plots;
    for (const char* plot : {"path-x", "path-y", "path-angle", "path-zoom", "tracks", "empty"}) {
      plots.push_back(plot);
    }
    for (const std::string& plot : plots) {
      const std::size_t begin = dom.find("id=\"" + plot + "\"");
      ASSERT_NE(begin, std::string::npos) << plot;
      const std::string svg = dom.substr(begin, dom.find("</svg>", begin) - begin);
      EXPECT_THAT(svg.substr(0, svg.find('>')), HasSubstr("tabindex=\"0\"")) << plot;
      const std::size_t curve = svg.find(" d=\"M", svg.find("class=\"curve"));
      ASSERT_NE(curve, std::string::npos) << plot;
      const std::string line = svg.substr(curve, svg.find('"', curve + 4) - curve);
      EXPECT_GE(std::count(line.begin(), line.end(), 'L'), 19) << plot;
      EXPECT_EQ(svg.find("nan"), std::string::npos) << plot;
    }
    int pictures = 0;
    for (std::size_t at = 0;
         (at = dom.find("src=\"data:image/jpeg;base64,", at)) != std::string::npos; ++at) {
      ++pictures;
    }
    EXPECT_EQ(pictures, 12);
  }
}

}  // namespace
}  // namespace calmframe
