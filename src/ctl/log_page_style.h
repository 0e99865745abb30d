// The style of the page of logs, and the script that narrows its table of scalars down.
#ifndef QUORLET_CTL_LOG_PAGE_STYLE_H_
#define QUORLET_CTL_LOG_PAGE_STYLE_H_

namespace quorlet {

inline constexpr char kPageStyle[] = R"css(
:root { color-scheme: light dark; --line: #c8ccd2; --mark: #1f6feb; --quiet: #57606a; }
@media (prefers-color-scheme: dark) { :root { --line: #3d444d; --mark: #4493f8; --quiet: #9198a1; } }
body { font: 1rem/1.45 system-ui, sans-serif; margin: 0 auto; max-width: 70rem; padding: 0 1rem 3rem; }
h1 { font-size: 1.5rem; } h2 { font-size: 1.2rem; margin: 2rem 0 .5rem; }
.wide { overflow-x: auto; margin-bottom: 1rem; }
table { border-collapse: collapse; font-variant-numeric: tabular-nums; }
caption { text-align: left; color: var(--quiet); padding: .25rem 0; overflow-wrap: anywhere; }
th, td { text-align: left; padding: .2rem .8rem .2rem 0; border-bottom: 1px solid var(--line); vertical-align: middle; }
tbody th { font-weight: 400; overflow-wrap: anywhere; min-width: 11rem; }
.number { text-align: right; white-space: nowrap; } .when { white-space: nowrap; }
svg { display: block; max-width: 100%; } svg rect { fill: var(--mark); opacity: .75; }
svg line, svg polyline { stroke: var(--mark); stroke-width: 1.5; fill: none; } svg .mean { stroke: currentColor; }
input { font: inherit; padding: .2rem .4rem; }
@media print { body { max-width: none; font-size: 9pt; } tr { break-inside: avoid; } #scalars p { display: none; } }
)css";

inline constexpr char kPageScript[] = R"js(
const wanted = document.getElementById('wanted');
if (wanted) {
  wanted.closest('p').hidden = false;
  wanted.addEventListener('input', () => {
    for (const row of document.querySelectorAll('#scalars tbody tr')) {
      row.hidden = !row.firstElementChild.textContent.includes(wanted.value);
    }
  });
}
)js";

}  // namespace quorlet

#endif  // QUORLET_CTL_LOG_PAGE_STYLE_H_
