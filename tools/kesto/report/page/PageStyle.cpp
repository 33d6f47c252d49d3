// SPDX-License-Identifier: Apache-2.0
// The colours of applications are told apart by people with each kind of colour blindness, and differ from the
// background by a contrast of 3 at least; text by 4.5.
#include "kesto/report/page/PageStyle.h"

std::string_view pageStyle()
{
    return R"(:root{color-scheme:light dark;
--page:#f4f6f8;--card:#fff;--ink:#18212b;--soft:#56616e;--edge:#dce1e6;--track:#e9edf1;
--c0:#8a8f98;--c1:#346fb8;--c2:#cb7d34;--c3:#15482f;--c4:#9b4270;--c5:#5f1f83;--c6:#666005;
--s1:#4a6a8a;--s2:#8ea9c3;--bad:#b3141f;
--h1:#fde0d2;--h2:#f8ba9a;--h3:#ee8562;--h4:#a8172a;--t3:#18212b;--t4:#fff}
@media screen and (prefers-color-scheme:dark){:root{
--page:#10151a;--card:#1b2027;--ink:#e6ebf0;--soft:#a0acb8;--edge:#323c46;--track:#2a323b;
--c0:#717b87;--c1:#618df3;--c2:#d36614;--c3:#6cfade;--c4:#b98ba9;--c5:#c0b6fe;--c6:#eee354;
--s1:#8db0d2;--s2:#5c7690;--bad:#ff7b72;
--h1:#45302c;--h2:#6b3a31;--h3:#a1493b;--h4:#ff9a86;--t3:#fff;--t4:#10151a}}
*{box-sizing:border-box}
body{margin:0;background:var(--page);color:var(--ink);font:15px/1.45 system-ui,"Segoe UI",Roboto,"Noto Sans","DejaVu Sans",sans-serif}
main{max-width:1140px;margin:0 auto;padding:28px 20px 36px}
h1{font-size:26px;line-height:1.2;margin:0 0 4px}h2{font-size:16px;margin:0 0 2px}p{margin:0}
.sub,.note,footer,.ax,summary,.none,thead th{color:var(--soft)}.note,footer,details{font-size:13px;margin-top:10px}.none{margin-top:14px}
bdi{overflow-wrap:anywhere}
section,.tiles>div{background:var(--card);border:1px solid var(--edge);border-radius:10px;padding:18px 20px;margin-top:16px;min-width:0}
.tiles{display:grid;grid-template-columns:repeat(4,1fr);gap:16px;margin-top:18px}.tiles>div{margin:0;padding:14px 18px;display:flex;flex-direction:column-reverse;justify-content:flex-end}
dd{margin:0;font-size:27px;line-height:1.25;font-weight:650}dt{color:var(--soft);font-size:13px}dl{margin:0}
.two{display:grid;grid-template-columns:1fr 1fr;gap:0 16px}
svg{display:block;width:100%;height:auto;margin-top:10px}svg text{fill:var(--ink);font-size:13px}svg .ax{fill:var(--soft);font-size:12px}svg .we{fill:var(--ink);font-weight:650}svg .val{font-size:12px}
.scroll{overflow-x:auto}.scroll>svg{min-width:720px}
.grid,.zero,.mean,.tick{fill:none;stroke:var(--edge)}.zero{stroke:var(--soft)}.mean{stroke:var(--ink);stroke-dasharray:4 3}.tick{stroke:var(--bad);stroke-width:1.6}.hit{fill:transparent}.track{fill:var(--track)}
.c0{fill:var(--c0)}.c1{fill:var(--c1)}.c2{fill:var(--c2)}.c3{fill:var(--c3)}.c4{fill:var(--c4)}.c5{fill:var(--c5)}.c6{fill:var(--c6)}.s1{fill:var(--s1)}.s2{fill:var(--s2)}
.legend,.shares{list-style:none;padding:0;margin:8px 0 0;font-size:13px}.legend{display:flex;flex-wrap:wrap;gap:4px 18px}.legend li{display:flex;align-items:center;gap:6px;min-width:0}
.key{width:11px;flex:none;margin:0}.shares li{margin-top:12px}.shares li>span{display:flex;justify-content:space-between;gap:16px}.shares li>span>span,.legend b{white-space:nowrap}.share{height:10px;margin-top:4px;border-radius:3px}
table{border-collapse:collapse;font-size:13px;width:100%;font-variant-numeric:tabular-nums}details table{width:auto;margin-top:6px}
th,td{padding:6px 8px;text-align:right;white-space:nowrap;font-weight:400}thead th{vertical-align:bottom;line-height:1.25;border-bottom:1px solid var(--edge)}tbody tr+tr>*{border-top:1px solid var(--edge)}
th:first-child,.l,.worst th:not(.n){text-align:left}.l,th:first-child{white-space:normal}details th:first-child{min-width:110px}details th{max-width:190px}details thead th{white-space:normal}
.worst td,.worst th{vertical-align:top}.worst td:nth-child(2),.worst td:nth-child(3){white-space:nowrap}.worst td:nth-child(4){min-width:165px}.worst .sub{font-size:12px}.line{width:200px;height:20px;margin:0}
.heat{margin-top:10px;border-collapse:separate;border-spacing:3px}.heat th,.heat td{border:0!important;text-align:center;padding:6px 2px}.heat th:first-child{text-align:left;padding-left:0;min-width:120px}.heat td{border-radius:4px;min-width:32px;background:var(--track)}
.heat .sum{background:none;font-weight:650;text-align:right;padding-left:8px}.few{width:auto}.few td{min-width:64px}.many{border-spacing:2px;font-size:12px}.many td{min-width:21px;padding:5px 0!important}
.we{font-weight:650;color:var(--ink)!important}
.h0{background:var(--track)}.heat .h1,.h1{background:var(--h1)}.heat .h2,.h2{background:var(--h2)}.heat .h3,.h3{background:var(--h3);color:var(--t3)}.heat .h4,.h4{background:var(--h4);color:var(--t4);font-weight:650}.heat .no,.no{background:none;color:var(--soft)}
.keys span{color:var(--ink);border-radius:4px;padding:2px 8px;white-space:nowrap;line-height:2}.keys .h3{color:var(--t3)}.keys .h4{color:var(--t4)}
summary{cursor:pointer}footer{margin-top:20px}footer p+p{margin-top:4px}
@media(max-width:860px){.two{grid-template-columns:1fr}.tiles{grid-template-columns:1fr 1fr}}
@media print{@page{size:A4;margin:11mm}:root{--page:#fff;color-scheme:light}.legend,.shares,.note,footer,dt{font-size:11px}body{font-size:12px;print-color-adjust:exact;-webkit-print-color-adjust:exact}main{padding:0;max-width:none}section,.tiles>div,tr{break-inside:avoid}h2{break-after:avoid}section{padding:10px 12px;margin-top:8px}.tiles{grid-template-columns:repeat(4,1fr);gap:8px}.two{grid-template-columns:1fr 1fr;gap:0 8px}dd{font-size:19px}details{display:none}.scroll{overflow:visible}.scroll>svg{min-width:0}table{font-size:10px}th,td{padding:3px}.heat td{min-width:20px}.many td{min-width:0}.heat th:first-child{min-width:80px}.line{width:110px;height:11px}}
)";
}
