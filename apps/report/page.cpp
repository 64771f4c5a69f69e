#include "apps/report/page.h"

#include <cmath>
#include <nlohmann/json.hpp>

#include "apps/report/page_head.h"

namespace calmframe::report {
namespace {

constexpr char kScript[] = R"html(<script>
"use strict";
const data = JSON.parse(document.getElementById("data").textContent);
const plots = [...document.querySelectorAll("svg.plot")];
function show(index) {
  for (const svg of plots) {
    const count = +svg.dataset.count, cursor = svg.querySelector(".cursor");
    const i = Math.max(0, Math.min(count - 1, index)), x = 56 + i * (720 - 56 - 12) / (count - 1);
    cursor.setAttribute("x1", x);
    cursor.setAttribute("x2", x);
    cursor.style.display = "inline";
    const curves = Object.values(data.plots[svg.id].curves);
    svg.closest("figure").querySelectorAll("output").forEach((output, c) => {
      const value = curves[c][i];
      output.textContent = value == null ? "–" : value + " " + data.plots[svg.id].unit;
    });
  }
  document.getElementById("moment").textContent = (index * data.seconds_a_value).toFixed(2) + " s";
}
let last = 0;
for (const svg of plots) {
  svg.tabIndex = 0;
  svg.addEventListener("pointermove", event => {
    const box = svg.getBoundingClientRect(), x = (event.clientX - box.left) / box.width * 720;
    last = Math.round((x - 56) / (720 - 56 - 12) * (svg.dataset.count - 1));
    show(last = Math.max(0, Math.min(svg.dataset.count - 1, last)));
  });
  svg.addEventListener("keydown", event => {
    const step = { ArrowLeft: -1, ArrowRight: 1 }[event.key];
    if (step) show(last = Math.max(0, Math.min(svg.dataset.count - 1, last + step)));
  });
}
</script>
)html";

// A curve that stands alone has the second one's colour and no key.
std::string FigureOf(const Plot& plot, double seconds_a_value) {
  std::string html = "<figure><figcaption><b>" + Escaped(plot.title) +
                     (plot.unit.empty() ? "" : ", " + Escaped(plot.unit)) + "</b>";
  const bool alone = plot.curves.size() == 1;
  for (std::size_t c = 0; c < plot.curves.size(); ++c) {
    html += "<span class=\"key k" + std::to_string(alone ? 1 : c) + "\"><i></i>" +
            Escaped(plot.curves[c].name) + "<output></output></span>";
  }
  if (!plot.band.name.empty()) {
    html += "<span class=\"key shade\"><i></i>" + Escaped(plot.band.name) + "</span>";
  }
  html += "<p>" + Escaped(plot.about) + "</p></figcaption>\n";
  return html + SvgOf(plot, seconds_a_value) + "</figure>\n";
}

std::string TableOf(const MarkedTable& table) {
  std::string html = "<div class=\"wide\"><table class=\"ways\">\n<thead><tr>";
  for (const std::string& column : table.columns) {
    html += "<th scope=\"col\">" + Escaped(column) + "</th>";
  }
  html += "</tr></thead>\n<tbody>\n";
  for (std::size_t r = 0; r < table.rows.size(); ++r) {
    const bool marked = r == table.marked;
    html += marked ? "<tr class=\"taken\">" : "<tr>";
    for (std::size_t c = 0; c < table.rows[r].size(); ++c) {
      const std::string cell = Escaped(table.rows[r][c]);
      if (c > 0) {
        html += "<td>" + cell + "</td>";
        continue;
      }
      html += "<th scope=\"row\">" + cell +
              (marked ? "<mark>" + Escaped(table.mark) + "</mark>" : "") + "</th>";
    }
    html += "</tr>\n";
  }
  return html + "</tbody>\n</table></div>\n";
}

std::string SectionOf(const Shots& shots) {
  std::string html = "<h2>Shots</h2>\n<div class=\"strip\">";
  for (std::size_t s = 0; s < shots.lengths.size(); ++s) {
    const auto& row = shots.table.rows[s];
    html += std::string("<i") + (s == shots.table.marked ? " class=\"here\"" : "") +
            " style=\"flex-grow: " + Short(shots.lengths[s], 3) + "\" title=\"" +
            Escaped(row.size() > 1 ? row[0] + ", from " + row[1] : row[0]) + "\"></i>";
  }
  return html + "</div>\n" + TableOf(shots.table);
}

std::string SectionOf(const Shown& shown) {
  std::string html = "<h2>What is shown</h2>\n";
  for (const std::string& words : shown.words) {
    html += "<p class=\"words\">" + Escaped(words) + "</p>\n";
  }
  if (shown.ways.rows.empty()) return html;
  const Scatter& scatter = shown.scatter;
  return html + TableOf(shown.ways) + "<figure><figcaption><b>" + Escaped(scatter.title) +
         "</b><p>" + Escaped(scatter.about) + "</p></figcaption>\n" + SvgOf(scatter) +
         "</figure>\n";
}

// With its name on it.
std::string PictureOf(const std::string& url, const std::string& name, const std::string& when) {
  if (url.empty()) return "";
  return "<div><img alt=\"" + when + " " + name + "\" src=\"" + url + "\"><span>" + name +
         "</span></div>";
}

double Rounded(double value) {
  return std::round(value * 1000) / 1000;
}

nlohmann::ordered_json Values(const std::vector<double>& values) {
  auto array = nlohmann::ordered_json::array();
  for (const double value : values) {
    if (std::isfinite(value)) {
      array.push_back(Rounded(value));
    } else {
      array.push_back(nullptr);
    }
  }
  return array;
}

std::string DataOf(const Page& page) {
  nlohmann::ordered_json json;
  json["seconds_a_value"] = page.seconds_a_value;
  json["plots"] = nlohmann::ordered_json::object();
  for (const Plot& plot : page.plots) {
    auto& entry = json["plots"][plot.id];
    entry["unit"] = plot.unit;
    entry["curves"] = nlohmann::ordered_json::object();
    for (const Curve& curve : plot.curves) entry["curves"][curve.name] = Values(curve.values);
    if (plot.band.name.empty()) continue;
    entry["band"] = {{"least", Values(plot.band.least)}, {"most", Values(plot.band.most)}};
  }
  std::string text = json.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace);
  // Nothing in it may end the element.
  for (std::size_t at = 0; (at = text.find('<', at)) != std::string::npos;) {
    text.replace(at, 1, "\\u003c");
  }
  return text;
}

}  // namespace

std::string HtmlOf(const Page& page) {
  std::string html =
      BeginOfPage(page.title + ", steadied") + "<h1>" + Escaped(page.title) + "</h1>\n";
  if (!page.lead.empty()) html += "<p class=\"lead\">" + Escaped(page.lead) + "</p>\n";
  if (!page.notes.empty()) {
    html += "<ul class=\"notes\">\n";
    for (const std::string& note : page.notes) html += "<li>" + Escaped(note) + "</li>\n";
    html += "</ul>\n";
  }
  html += "<section class=\"cards\">\n" + TableOf("In figures", page.facts) +
          TableOf("Controls", page.controls) + "</section>\n";
  if (!page.shots.table.rows.empty()) html += SectionOf(page.shots);
  if (!page.shown.words.empty()) html += SectionOf(page.shown);
  if (!page.film.empty()) {
    html += "<h2>Before and after</h2>\n<section class=\"film\">\n";
    for (const FilmFrame& moment : page.film) {
      const std::string when = "frame " + std::to_string(moment.frame);
      html += "<figure><figcaption>" + when + ", " + Short(moment.seconds, 2) + " s</figcaption>" +
              PictureOf(moment.before, "as shot", when) + PictureOf(moment.after, "steadied", when);
      html += "</figure>\n";
    }
    html += "</section>\n";
  }
  if (!page.plots.empty()) {
    html += "<h2>Over time <output id=\"moment\"></output></h2>\n<p class=\"lead\">" +
            Escaped(page.plots_about) + "</p>\n";
  }
  for (const Plot& plot : page.plots) html += FigureOf(plot, page.seconds_a_value);
  html += "<script type=\"application/json\" id=\"data\">" + DataOf(page) + "</script>\n";
  if (!page.plots.empty()) html += kScript;
  return html + "<footer>Made by <code>calmframe report</code></footer>\n</body>\n</html>\n";
}

}  // namespace calmframe::report
