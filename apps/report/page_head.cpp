#include "apps/report/page_head.h"

#include "apps/report/plot.h"

namespace calmframe::report {
namespace {

constexpr char kHead[] = R"html(<meta name="viewport" content="width=device-width, initial-scale=1">
<meta http-equiv="Content-Security-Policy" content="default-src 'none'; img-src data:; style-src 'unsafe-inline'; script-src 'unsafe-inline'">
<link rel="icon" href="data:,">
<style>
:root { color-scheme: light dark; --ink: #1c2024; --soft: #5f6b76; --line: #dfe4e8; --card: #fff; --back: #f5f6f8; --c0: #d55e00; --c1: #0072b2; --c2: #009e73; }
@media (prefers-color-scheme: dark) { :root { --ink: #e8eaed; --soft: #9aa5b1; --line: #363c43; --card: #1e2226; --back: #14171a; --c0: #f0a35e; --c1: #5ab4f0; --c2: #3fcf9f; } }
* { box-sizing: border-box; }
body { margin: 0 auto; max-width: 1080px; padding: 24px 20px 60px; background: var(--back); color: var(--ink); font: 15px/1.5 system-ui, "Segoe UI", "Noto Sans", "DejaVu Sans", sans-serif; }
h1 { font-size: 26px; line-height: 1.25; margin: 8px 0 2px; overflow-wrap: anywhere; }
h2 { font-size: 17px; margin: 34px 0 10px; }
h2 + .lead { margin-bottom: 14px; max-width: 75ch; }
.lead, figcaption p { color: var(--soft); margin: 0; }
section.cards { display: grid; grid-template-columns: repeat(auto-fit, minmax(min(320px, 100%), 1fr)); gap: 14px; margin-top: 18px; align-items: start; }
table { width: 100%; border-collapse: collapse; background: var(--card); border: 1px solid var(--line); border-radius: 8px; }
caption { text-align: left; font-weight: 600; padding: 0 0 6px; }
th, td { text-align: left; vertical-align: top; padding: 5px 12px; border-top: 1px solid var(--line); overflow-wrap: anywhere; }
tr:first-child > * { border-top: 0; }
th { font-weight: 400; color: var(--soft); width: 1%; white-space: nowrap; }
td { font-variant-numeric: tabular-nums; }
.notes { background: var(--card); border: 1px solid var(--line); border-left: 4px solid var(--c0); border-radius: 6px; padding: 8px 14px; margin: 18px 0 0; list-style: none; }
figure { margin: 0 0 16px; background: var(--card); border: 1px solid var(--line); border-radius: 8px; padding: 12px 14px 8px; break-inside: avoid; }
figcaption { display: flex; flex-wrap: wrap; gap: 2px 16px; align-items: baseline; font-size: 13.5px; margin-bottom: 6px; }
figcaption b { font-size: 15px; }
figcaption p { flex-basis: 100%; }
.key { white-space: nowrap; }
.key i { display: inline-block; width: 18px; height: 0; border-top: 3px solid; vertical-align: middle; margin-right: 6px; }
.key output { font-variant-numeric: tabular-nums; margin-left: 6px; color: var(--ink); }
.k0 { color: var(--c0); } .k1 { color: var(--c1); } .k2 { color: var(--c2); }
.k0 i { border-top-style: dashed; }
.key.shade { color: var(--soft); }
.key.shade i { height: 10px; border: 0; background: var(--c2); opacity: .3; }
svg.plot { display: block; width: 100%; height: auto; touch-action: pan-y; }
svg text { font-size: 11px; fill: var(--soft); }
svg .y { text-anchor: end; dominant-baseline: middle; }
svg .x, svg .axis { text-anchor: middle; }
svg .grid, svg .tick { stroke: var(--line); }
svg .curve { fill: none; stroke-linejoin: round; stroke-linecap: round; stroke-width: 1.4; vector-effect: non-scaling-stroke; }
svg .c0 { stroke: var(--c0); stroke-dasharray: 4 2.5; } svg .c1 { stroke: var(--c1); stroke-width: 2.2; } svg .c2 { stroke: var(--c2); }
svg .alone { stroke-dasharray: none; stroke: var(--c1); stroke-width: 1.8; }
svg .cursor { stroke: var(--soft); display: none; }
svg.scatter { display: block; width: 100%; height: auto; }
svg .band { fill: var(--c2); fill-opacity: .16; stroke: var(--c2); stroke-opacity: .4; }
svg .dot { fill: var(--card); stroke: var(--c0); stroke-width: 2; }
svg circle.marked { fill: var(--c1); }
svg .name { dominant-baseline: central; fill: var(--ink); }
svg .name.marked { font-weight: 600; }
.words { max-width: 85ch; margin: 0 0 10px; }
.wide { overflow-x: auto; margin: 14px 0 16px; }
.ways th { white-space: nowrap; width: auto; overflow-wrap: normal; }
.ways thead th { vertical-align: bottom; white-space: normal; font-size: 13.5px; }
.ways td, .ways thead th + th { text-align: right; white-space: nowrap; }
.ways tbody tr:first-child > * { border-top: 1px solid var(--line); }
.ways .taken > * { color: var(--ink); font-weight: 600; background: rgb(0 114 178 / 10%); }
.ways mark { background: var(--c1); color: var(--card); border-radius: 9px; padding: 1px 8px; margin-left: 8px; font-size: 12px; font-weight: 400; }
.strip { display: flex; gap: 1px; height: 22px; overflow: hidden; }
.strip i { flex-basis: 0; min-width: 1px; border-radius: 3px; background: var(--c0); opacity: .45; }
.strip .here { background: var(--c1); opacity: 1; }
.film { display: grid; grid-template-columns: repeat(auto-fill, minmax(min(300px, 46%), 1fr)); gap: 14px; }
.film figure { padding: 8px; margin: 0; }
.film div { position: relative; margin-top: 4px; }
.film img { display: block; width: 100%; height: auto; border-radius: 4px; background: #000; }
.film span { position: absolute; left: 6px; bottom: 6px; padding: 0 7px; border-radius: 9px; background: rgb(0 0 0 / 60%); color: #fff; font-size: 12px; line-height: 18px; }
.film figcaption { margin: 0; color: var(--soft); }
footer { color: var(--soft); font-size: 13px; margin-top: 40px; }
@media (max-width: 640px) { svg.plot { overflow: visible; margin-bottom: 6px; } svg text { font-size: 23px; } svg .x { transform: translateY(9px); } svg.scatter text { font-size: 16px; } svg.scatter .x { transform: none; } }
@media print { :root { color-scheme: light; --back: #fff; } body { max-width: none; padding: 0; } h2 { break-after: avoid; } section.cards { break-inside: avoid; } }
</style>
)html";

}  // namespace

std::string BeginOfPage(const std::string& title) {
  return "<!DOCTYPE html>\n<html lang=\"en\">\n<head>\n<meta charset=\"utf-8\">\n<title>" +
         Escaped(title) + "</title>\n" + kHead + "</head>\n<body>\n";
}

std::string TableOf(const std::string& caption, const std::vector<Fact>& facts) {
  std::string html = "<table><caption>" + Escaped(caption) + "</caption>\n";
  for (const Fact& fact : facts) {
    html += "<tr><th scope=\"row\">" + Escaped(fact.name) + "</th><td>" + Escaped(fact.value) +
            "</td></tr>\n";
  }
  return html + "</table>\n";
}

}  // namespace calmframe::report
