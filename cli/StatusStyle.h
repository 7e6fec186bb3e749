#pragma once

#include <string_view>

namespace cli {

// The style sheet of the status page. Colours follow the setting of the device.
inline constexpr std::string_view kStatusStyle = R"(
:root { color-scheme: light dark;
  --page: #f7f4ee; --card: #fffdf9; --line: #e6dfd2; --text: #2b2620; --faint: #756b5e;
  --bar: #c07a1f; --wait: #b9b0a2; --fail: #c2402f; --hover: #f1e6d3; }
@media (prefers-color-scheme: dark) { :root {
  --page: #171410; --card: #211d18; --line: #38312a; --text: #efe7da; --faint: #a89c8b;
  --bar: #e9a34a; --wait: #6d6458; --fail: #ff8370; --hover: #332b20; } }
* { box-sizing: border-box; }
body { margin: 0 auto; max-width: 72rem; padding: 1.25rem; background: var(--page);
  color: var(--text); font: 16px/1.5 system-ui, sans-serif; }
header { display: flex; flex-wrap: wrap; align-items: baseline; gap: .25rem 1rem;
  margin-bottom: 1.25rem; color: var(--faint); }
header strong { font-size: 1.6rem; color: var(--text); letter-spacing: -.02em; }
.pill { margin-left: auto; padding: .1rem .7rem; border: 1px solid var(--line);
  border-radius: 1rem; font-size: .85rem; }
h1, h2, h3 { margin: 0; line-height: 1.3; }
h1 { margin: 2rem 0 1rem; font-size: 1.3rem; overflow-wrap: anywhere; }
h2 { margin-bottom: .9rem; font-size: 1.1rem; }
h3 { font-size: .9rem; font-weight: 600; color: var(--faint); }
.class { display: grid; gap: 1rem; grid-template-columns: minmax(0, 1fr); }
section, .card { background: var(--card); border: 1px solid var(--line); border-radius: .75rem; }
section { padding: 1.1rem 1.25rem; }
.cards { display: grid; gap: 1rem; grid-template-columns: repeat(auto-fit, minmax(10rem, 1fr)); }
.card { display: flex; flex-direction: column; padding: .9rem 1.1rem; min-width: 0; }
.card .name, .note { color: var(--faint); font-size: .85rem; }
.card .value { font-size: 1.4rem; white-space: nowrap; font-weight: 650; font-variant-numeric: tabular-nums;
  letter-spacing: -.02em; line-height: 1.35; }
.bad .value, .error { color: var(--fail); }
.note, .error { margin: .6rem 0 0; }
.card .note { margin: 0; }
.charts { display: grid; gap: 1.5rem;
  grid-template-columns: repeat(auto-fit, minmax(min(20rem, 100%), 1fr)); }
figure { margin: 0; min-width: 0; }
figcaption, .axis { display: flex; justify-content: space-between; gap: 1rem; }
.most, .axis { color: var(--faint); font-size: .8rem; font-variant-numeric: tabular-nums; }
.chart { display: block; shape-rendering: crispEdges; width: 100%; height: 8rem; margin: .35rem 0 .25rem;
  border-top: 1px dashed var(--line); border-bottom: 1px solid var(--line); }
.share { display: block; width: 100%; height: .4rem; margin-top: .3rem; border-radius: .2rem;
  background: var(--line); }
.bar { fill: var(--bar); } .wait { fill: var(--wait); } .fail { fill: var(--fail); }
.back { fill: transparent; } g:hover .back { fill: var(--hover); }
ul { list-style: none; margin: 0; padding: 0; }
.folders li { display: grid; grid-template-columns: minmax(0, 1fr) auto; gap: 0 1rem;
  padding: .35rem 0; }
.folders .share { grid-column: 1 / -1; }
.path, .paths li { overflow-wrap: anywhere; }
.count { color: var(--faint); font-variant-numeric: tabular-nums; }
summary { cursor: pointer; padding: .35rem 0; }
.paths { padding: .2rem 0 .6rem 1.1rem; font-size: .85rem; color: var(--faint); }
dl { display: grid; gap: .9rem 1.5rem; margin: 0;
  grid-template-columns: repeat(auto-fit, minmax(min(14rem, 100%), 1fr)); }
dt { color: var(--faint); font-size: .85rem; }
dd { margin: 0; font-variant-numeric: tabular-nums; }
)";

}  // namespace cli
