# The style sheet of the report's page: for a wide window, a phone and paper, light and dark.

from __future__ import absolute_import, division, print_function

__metaclass__ = type

STYLE = """
:root { color-scheme: light dark; --back: #fff; --text: #1b1f23; --soft: #57606a; --line: #d0d7de;
  --good: #1a7f37; --bad: #c1121f; --warn: #8a5a00; --bar: #4a78b5; --panel: #f6f8fa; }
@media (prefers-color-scheme: dark) { :root { --back: #14171a; --text: #e3e6e9; --soft: #9aa4ae;
  --line: #3a4149; --good: #57c26f; --bad: #ff7b72; --warn: #e0b050; --bar: #6f9fdc; --panel: #1d2226; } }
* { box-sizing: border-box; }
body { margin: 0 auto; max-width: 64rem; padding: 1.25rem; background: var(--back); color: var(--text);
  font: 16px/1.5 system-ui, sans-serif; overflow-wrap: anywhere; }
h1 { margin: 0; font-size: 1.7rem; line-height: 1.2; }
h2 { margin: 2rem 0 .5rem; padding-bottom: .2rem; border-bottom: 1px solid var(--line); font-size: 1.15rem;
  break-after: avoid; }
h3, h4 { margin: .75rem 0 .25rem; font-size: 1rem; break-after: avoid; }
h4 { color: var(--soft); font-weight: normal; font-size: .9rem; }
header, article { padding-left: 1rem; border-left: .4rem solid var(--bad); }
header.good { border-color: var(--good); }
article { margin: 1rem 0 1.5rem; border-left-width: .25rem; }
article.warn { border-color: var(--warn); }
article h3 { margin-top: 0; }
h1.good, span.good { color: var(--good); }
h1.bad, span.bad { color: var(--bad); }
.warn { color: var(--warn); }
article.warn { color: inherit; }
p { margin: .25rem 0; }
.reason { font-weight: 600; }
a { color: inherit; text-decoration: none; }
a:hover, a:focus { text-decoration: underline; }
:target { background: var(--panel); }
code, pre { font: .875em/1.45 ui-monospace, monospace; unicode-bidi: isolate; }
pre { margin: 0; padding: .75rem; background: var(--panel); white-space: pre-wrap; }
small, dt, .soft { color: var(--soft); }
dl { display: grid; grid-template-columns: max-content 1fr; gap: .1rem 1rem; margin: 1rem 0; }
dd { margin: 0; }
table { width: 100%; border-collapse: collapse; }
th, td { padding: .35rem .75rem .35rem 0; border-bottom: 1px solid var(--line); text-align: left;
  vertical-align: top; }
th { color: var(--soft); font-weight: normal; }
td.short { white-space: nowrap; overflow-wrap: normal; }
tr { break-inside: avoid; }
ul { margin: 0; padding-left: 1.1rem; }
li { break-inside: avoid; }
ul.tiles { display: grid; grid-template-columns: repeat(auto-fill, minmax(11rem, 1fr)); gap: .3rem; padding: 0;
  list-style: none; }
ul.tiles li { background: var(--panel); border-left: .25rem solid var(--soft); font-size: .875rem; color: var(--text); }
ul.tiles li.good { border-color: var(--good); }
ul.tiles li.bad { border-color: var(--bad); }
ul.tiles li.warn { border-color: var(--warn); }
ul.tiles a { display: flex; gap: .4rem; padding: .25rem .5rem; }
ul.tiles small { display: block; }
svg { display: block; margin-bottom: .5rem; }
svg text { fill: var(--text); font: 14px system-ui, sans-serif; }
svg .ok { fill: var(--bar); }
svg .failed { fill: var(--bad); }
svg .rail { fill: var(--panel); }
@media (max-width: 40rem) { body { padding: .75rem; }
  thead { display: none; } tr { display: block; padding: .4rem 0; border-bottom: 1px solid var(--line); }
  td { display: block; padding: 0; border: 0; }
  td.short { display: inline-block; margin-right: 1rem; white-space: normal; }
  td[data-name]::before { content: attr(data-name) " "; color: var(--soft); } }
@media print { :root { color-scheme: light; --back: #fff; --text: #000; --soft: #444; --line: #999;
  --good: #0a5a20; --bad: #a00; --warn: #640; --bar: #4a78b5; --panel: #f2f2f2; }
  body { max-width: none; padding: 0; font-size: 10pt; }
  svg rect, ul.tiles li { print-color-adjust: exact; } }
"""
