"""Draws figures against the number of files, both axes logarithmic, as SVG."""

import html
import math

WIDTH, HEIGHT = 300, 230
LEFT, TOP, RIGHT, BOTTOM = 56, 34, 14, 40
COLOURS = ("#1f6fb2", "#c4571b", "#3a8a3a")
STYLE = ("text{font:11px sans-serif;fill:#222}.t{font-weight:bold;font-size:12px}"
         ".g{stroke:#ddd}.a{stroke:#888;fill:none}")


def draw(panels):
    """panels: a list of (title, unit, lines), lines a list of (name, [(x, y), ...]) with positive
    numbers. Returns the text of the SVG, which has its own white ground."""
    drawn = "".join(f'<g transform="translate({i * WIDTH},0)">{_panel(*panel)}</g>\n'
                    for i, panel in enumerate(panels))
    width = WIDTH * len(panels)
    return (f'<svg xmlns="http://www.w3.org/2000/svg" viewBox="0 0 {width} {HEIGHT}" '
            f'width="{width}" height="{HEIGHT}">\n<style>{STYLE}</style>\n'
            f'<rect width="100%" height="100%" fill="white"/>\n{drawn}</svg>\n')


class _Axis:
    """Whole powers of ten around the values, laid from one place to another."""

    def __init__(self, values, begin, end):
        self.low = math.floor(math.log10(min(values)) + 1e-9)
        self.high = max(math.ceil(math.log10(max(values)) - 1e-9), self.low + 1)
        self._begin, self._end = begin, end

    def place(self, value):
        share = (math.log10(value) - self.low) / (self.high - self.low)
        return round(self._begin + share * (self._end - self._begin), 1)

    def powers(self):
        return [10.0**power for power in range(self.low, self.high + 1)]


def _panel(title, unit, lines):
    points = [point for _, of_line in lines for point in of_line]
    across = _Axis([x for x, _ in points], LEFT, WIDTH - RIGHT)
    up = _Axis([y for _, y in points], HEIGHT - BOTTOM, TOP)
    return (f'<text class="t" x="{LEFT}" y="16">{html.escape(title)}</text>'
            + _grid(across, up, unit)
            + "".join(_line(i, *line, across, up) for i, line in enumerate(lines)))


def _grid(across, up, unit):
    bottom, right = HEIGHT - BOTTOM, WIDTH - RIGHT
    parts = [f'<text x="{right}" y="{HEIGHT - 6}" text-anchor="end">files</text>',
             f'<rect class="a" x="{LEFT}" y="{TOP}" width="{right - LEFT}" height="{bottom - TOP}"/>']
    for value in across.powers():
        x = across.place(value)
        parts.append(f'<path class="g" d="M{x} {TOP}V{bottom}"/>'
                     f'<text x="{x}" y="{bottom + 14}" text-anchor="middle">{_number(value)}</text>')
    for value in up.powers():
        y = up.place(value)
        parts.append(f'<path class="g" d="M{LEFT} {y}H{right}"/><text x="{LEFT - 5}" y="{y + 4}" '
                     f'text-anchor="end">{_number(value)} {unit}</text>')
    return "".join(parts)


def _line(index, name, points, across, up):
    colour = COLOURS[index % len(COLOURS)]
    places = [(across.place(x), up.place(y)) for x, y in points]
    path = " ".join(f"{x},{y}" for x, y in places)
    dots = "".join(f'<circle cx="{x}" cy="{y}" r="2.5" fill="{colour}"/>' for x, y in places)
    legend = (f'<text x="{LEFT + 8}" y="{TOP + 15 + 14 * index}" style="fill:{colour}">'
              f'{html.escape(name)}</text>')
    return f'<polyline points="{path}" fill="none" stroke="{colour}"/>{dots}{legend}'


def _number(value):
    for limit, mark in ((1e6, "M"), (1e3, "k")):
        if value >= limit:
            return f"{value / limit:g}{mark}"
    return f"{value:g}"
