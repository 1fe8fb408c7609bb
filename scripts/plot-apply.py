#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
# Draws the results of veld_bench_apply, time over rules, both axes logarithmic, a panel per backend; prints them as
# tables in Markdown.
#
#   scripts/plot-apply.py <results.json> <plot.svg>
import json
import math
import sys

PANEL_WIDTH, PANEL_HEIGHT = 330, 300
LEFT, TOP, GAP, LEGEND = 60, 40, 60, 190
COLORS = {
    "profile load": "#999999",
    "bare restore": "#000000",
    "fwReloadAtomic": "#0060c0",
    "fwReload": "#c02020",
    "a process per command": "#e08030",
    "ufw reload": "#7030a0",
    "firewall-cmd --reload": "#208040",
}


def scale(low, high, length):
    """From a value to a position on a logarithmic axis."""
    return lambda value: length * math.log(value / low) / math.log(high / low)


def panel(comparisons, left, times):
    backend = comparisons[0]["backend"]
    sizes = [comparison["profileRules"] for comparison in comparisons]
    x = scale(min(sizes) / 1.3, max(sizes) * 1.3, PANEL_WIDTH)
    y = scale(*times, PANEL_HEIGHT)
    bottom = TOP + PANEL_HEIGHT
    parts = [
        f'<rect x="{left}" y="{TOP}" width="{PANEL_WIDTH}" height="{PANEL_HEIGHT}" fill="none" stroke="#444"/>',
        f'<text x="{left + PANEL_WIDTH / 2}" y="{TOP - 12}" text-anchor="middle">{backend}</text>',
        f'<text x="{left + PANEL_WIDTH / 2}" y="{bottom + 38}" text-anchor="middle">profile rules</text>',
    ]
    for size in sizes:
        parts.append(f'<text x="{left + x(size):.1f}" y="{bottom + 18}" text-anchor="middle">{size}</text>')
    tick = times[0]
    while tick <= times[1]:
        height = bottom - y(tick)
        label = f"{tick:g} ms" if tick < 1000 else f"{tick / 1000:g} s"
        parts.append(f'<path d="M{left} {height:.1f}h{PANEL_WIDTH}" stroke="#ddd"/>')
        parts.append(f'<text x="{left - 6}" y="{height + 4:.1f}" text-anchor="end">{label}</text>')
        tick *= 10
    for way, color in COLORS.items():
        points = [(left + x(comparison["profileRules"]), bottom - y(entry["medianMs"]))
                  for comparison in comparisons for entry in comparison["ways"] if entry["way"] == way]
        path = " ".join(f"{px:.1f},{py:.1f}" for px, py in points)
        parts.append(f'<polyline points="{path}" fill="none" stroke="{color}" stroke-width="2"/>')
        parts += [f'<circle cx="{px:.1f}" cy="{py:.1f}" r="3" fill="{color}"/>' for px, py in points]
    return parts


def plot(results):
    comparisons = results["comparisons"]
    measured = [entry["medianMs"] for comparison in comparisons for entry in comparison["ways"]]
    times = (10 ** math.floor(math.log10(min(measured))), 10 ** math.ceil(math.log10(max(measured))))
    backends = list(dict.fromkeys(comparison["backend"] for comparison in comparisons))
    width = LEFT + len(backends) * (PANEL_WIDTH + GAP) + LEGEND
    parts = [f'<svg xmlns="http://www.w3.org/2000/svg" width="{width}" height="{TOP + PANEL_HEIGHT + 50}" '
             'font-family="sans-serif" font-size="12">', '<rect width="100%" height="100%" fill="white"/>']
    for number, backend in enumerate(backends):
        parts += panel([comparison for comparison in comparisons if comparison["backend"] == backend],
                       LEFT + number * (PANEL_WIDTH + GAP), times)
    left = width - LEGEND - GAP + 20
    for number, (way, color) in enumerate(COLORS.items()):
        height = TOP + 15 + 20 * number
        parts.append(f'<path d="M{left} {height}h20" stroke="{color}" stroke-width="2"/>')
        parts.append(f'<text x="{left + 26}" y="{height + 4}">{way}</text>')
    return "\n".join(parts + ["</svg>\n"])


def time_text(milliseconds):
    return f"{milliseconds / 1000:.1f} s" if milliseconds >= 1000 else f"{milliseconds:.1f} ms"


def tables(results):
    yield "| backend | profile rules | kernel rules | way | runs | time | peak memory | allowed port closed | denied passed |"
    yield "|---|---|---|---|---|---|---|---|---|"
    for comparison in results["comparisons"]:
        for entry in comparison["ways"]:
            probe = entry.get("probe")
            seen = (time_text(probe["windowMs"]) if probe["allowedLost"] else "0", probe["deniedPassed"]) if probe else ("", "")
            yield (f'| {comparison["backend"]} | {comparison["profileRules"]:,} | {comparison["kernelRules"]:,} | {entry["way"]} '
                   f'| {entry["runs"]} | {time_text(entry["medianMs"])} | {entry["peakKilobytes"] / 1024:.1f} MB '
                   f"| {seen[0]} | {seen[1]} |")
    yield ""
    yield "| backend | profile rules | bar | figure |"
    yield "|---|---|---|---|"
    for comparison in results["comparisons"]:
        for bar, figure in comparison["bars"].items():
            yield f'| {comparison["backend"]} | {comparison["profileRules"]:,} | {bar} | {figure:.2f} |'
    yield ""
    yield "| backend | reloads | probes per kind and family | allowed lost | denied passed | transfer: lost packets | longest gap |"
    yield "|---|---|---|---|---|---|---|"
    for run in results["continuity"]:
        for place in ("elsewhere", "here"):
            probe = run[place]
            yield (f'| {run["backend"]} | {run["reloads"]} {place} | {probe["probes"]:,} | {probe["allowedLost"]} '
                   f'| {probe["deniedPassed"]} | {probe["transferRetransmissions"]} '
                   f'| {probe["transferLongestGapMs"]:.1f} ms |')


def main():
    if len(sys.argv) != 3:
        sys.exit(f"usage: {sys.argv[0]} <results.json> <plot.svg>")
    with open(sys.argv[1], encoding="utf-8") as file:
        results = json.load(file)
    with open(sys.argv[2], "w", encoding="utf-8") as file:
        file.write(plot(results))
    print("\n".join(tables(results)))


main()
