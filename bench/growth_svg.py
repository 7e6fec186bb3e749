#!/usr/bin/env python3
"""Draws what growth_benchmark printed, from standard input, as an SVG on standard output.

Both axes are logarithmic: a cost that does not grow is level, one that grows with the
mailbox rises by a decade for each decade of mails.
"""
import math
import sys

FIGURES = [  # as printed, what it is called, milliseconds of one unit, colour
    ("p95_ms", "query, 95th percentile", 1, "#c0392b"),
    ("p50_ms", "query, median", 1, "#e67e22"),
    ("mails_per_s", "a mail of the last tenth", None, "#2980b9"),
    ("cpu_ms_per_mail", "processor time of such a mail", 1, "#16a085"),
]
WIDTH, HEIGHT, LEFT, RIGHT, TOP, BOTTOM = 720, 420, 60, 220, 20, 50


def read_steps(lines):
    steps = []
    for line in lines:
        if line.startswith("mails="):
            steps.append({key: float(value) for key, value in
                          (word.split("=") for word in line.split())})
    if len(steps) < 2:
        sys.exit("growth_svg: there are fewer than two lines of growth_benchmark")
    return steps


def milliseconds(step, key, unit):
    return 1000 / step[key] if unit is None else step[key] * unit


def main():
    steps = read_steps(sys.stdin)
    curves = [(name, colour, [(step["mails"], milliseconds(step, key, unit)) for step in steps])
              for key, name, unit, colour in FIGURES]
    values = [y for _, _, points in curves for _, y in points]
    low, high = math.floor(math.log10(min(values))), math.ceil(math.log10(max(values)))
    first, last = math.log10(steps[0]["mails"]), math.log10(steps[-1]["mails"])

    def across(mails):
        return LEFT + (math.log10(mails) - first) / (last - first) * (WIDTH - LEFT - RIGHT)

    def down(value):
        return HEIGHT - BOTTOM - (math.log10(value) - low) / (high - low) * (HEIGHT - TOP - BOTTOM)

    out = [f'<svg xmlns="http://www.w3.org/2000/svg" viewBox="0 0 {WIDTH} {HEIGHT}" '
           'font-family="sans-serif" font-size="12">',
           f'<rect width="{WIDTH}" height="{HEIGHT}" fill="white"/>']
    for power in range(low, high + 1):
        y = down(10 ** power)
        out.append(f'<path d="M{LEFT} {y:.1f}H{WIDTH - RIGHT}" stroke="#ddd"/>')
        out.append(f'<text x="{LEFT - 6}" y="{y + 4:.1f}" text-anchor="end">{10 ** power:g} ms</text>')
    for step in steps:
        x = across(step["mails"])
        out.append(f'<path d="M{x:.1f} {TOP}V{HEIGHT - BOTTOM}" stroke="#eee"/>')
        out.append(f'<text x="{x:.1f}" y="{HEIGHT - BOTTOM + 18}" text-anchor="middle">'
                   f'{step["mails"]:,.0f}</text>')
    out.append(f'<text x="{(LEFT + WIDTH - RIGHT) / 2}" y="{HEIGHT - 10}" '
               'text-anchor="middle">mails</text>')
    for name, colour, points in curves:
        path = "L".join(f"{across(x):.1f} {down(y):.1f}" for x, y in points)
        out.append(f'<path d="M{path}" fill="none" stroke="{colour}" stroke-width="2"/>')
        for x, y in points:
            out.append(f'<circle cx="{across(x):.1f}" cy="{down(y):.1f}" r="3" fill="{colour}"/>')
    ends = sorted((down(points[-1][1]), name, colour) for name, colour, points in curves)
    y = 0
    for wanted, name, colour in ends:
        y = max(wanted, y + 14)  # apart, so that one can read them
        out.append(f'<text x="{WIDTH - RIGHT + 8}" y="{y + 4:.1f}" fill="{colour}">{name}</text>')
    out.append("</svg>")
    print("\n".join(out))


main()
