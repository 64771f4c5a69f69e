#include "apps/report/batch_page.h"

#include "apps/report/page_head.h"
#include "apps/report/plot.h"

namespace calmframe::report {
namespace {

constexpr char kStyle[] = R"html(<style>
.clips td { white-space: nowrap; vertical-align: middle; }
.clips td.says { white-space: normal; min-width: 24ch; }
.clips td.name { white-space: normal; overflow-wrap: anywhere; min-width: 14ch; }
.clips img { display: inline-block; width: 120px; height: auto; border-radius: 4px; background: #000; vertical-align: middle; }
.clips .failed { color: var(--c0); }
</style>
)html";

std::string LinkOf(const std::string& address, const std::string& text) {
  if (address.empty()) return Escaped(text);
  return "<a href=\"" + Escaped(address) + "\">" + Escaped(text) + "</a>";
}

std::string PictureOf(const std::string& url, const std::string& what) {
  if (url.empty()) return "";
  return "<img src=\"" + Escaped(url) + "\" alt=\"" + Escaped(what) + "\" loading=\"lazy\">";
}

std::string HtmlOf(const BatchRow& row) {
  std::string html = "<tr><td class=\"name\">" + LinkOf(row.output, row.clip) + "</td><td>" +
                     PictureOf(row.before, row.clip + " as shot") + "</td><td>" +
                     PictureOf(row.after, row.clip + " steadied") + "</td><td" +
                     (row.failed ? " class=\"failed\"" : "") + ">" + Escaped(row.state) + "</td>";
  for (const std::string& cell : row.cells) html += "<td>" + Escaped(cell) + "</td>";
  html += "<td class=\"says\">" + Escaped(row.says) + "</td><td>" +
          (row.report.empty() ? "" : LinkOf(row.report, "report")) + "</td></tr>\n";
  return html;
}

}  // namespace

std::string HtmlOf(const BatchPage& page) {
  std::string html = BeginOfPage(page.title + ", steadied") + kStyle + "<h1>" +
                     Escaped(page.title) + "</h1>\n<section class=\"cards\">\n" +
                     TableOf("In figures", page.facts);
  if (!page.settings.empty()) html += TableOf("Flags", page.settings);
  html +=
      "</section>\n<h2>Clips</h2>\n<p class=\"lead\">Zoom: of the frame that is enlarged most. "
      "Shake: per mille of the width, before and after.</p>\n<div class=\"wide\"><table "
      "class=\"clips\">\n<tr><th>Clip</th><th>As shot</th><th>Steadied</th><th>State</th>"
      "<th>Seconds</th><th>Zoom</th><th>Shake</th><th>Warnings</th><th></th></tr>\n";
  for (const BatchRow& row : page.rows) html += HtmlOf(row);
  return html +
         "</table></div>\n<footer>Made by <code>calmframe batch</code></footer>\n</body>\n"
         "</html>\n";
}

}  // namespace calmframe::report
