"""The figures of all programs as one table."""

import dataclasses
import statistics

PHASES = {
    "first": "First index: from nothing to all content searchable",
    "unchanged": "Second run: nothing has changed",
    "altered": "Third run: 1 % of the files have changed",
}
COLUMNS = ("wall", "processor", "memory", "index", "written")
TITLES = ("program", "wall", "processor", "peak memory", "index", "written", "found")


@dataclasses.dataclass
class Figures:
    """Medians of one program in one phase. in_time is False where a run was ended too early, so that
    the other figures are lower bounds."""

    wall: float
    processor: float
    memory: float
    index: float
    written: float
    found: int
    in_time: bool
    runs: int


def medians(outcomes):
    def median(values):
        return statistics.median(values)

    costs = [outcome.cost for outcome in outcomes]
    return Figures(
        wall=median(cost.wall for cost in costs),
        processor=median(cost.processor for cost in costs),
        memory=median(cost.memory for cost in costs),
        index=median(outcome.index for outcome in outcomes),
        written=median(cost.written for cost in costs),
        found=int(median(outcome.found for outcome in outcomes)),
        in_time=all(cost.in_time for cost in costs),
        runs=len(outcomes))


def _amount(column, value):
    if column in ("wall", "processor"):
        return f"{value:.2f} s" if value < 10 else f"{value:.1f} s"
    return f"{value / 1e6:.1f} MB" if value < 1e7 else f"{value / 1e6:.0f} MB"


def _cell(figures, ours, column):
    value = getattr(figures, column)
    bound = "" if figures.in_time else "> "
    text = bound + _amount(column, value)
    if ours is None or ours is figures:
        return text
    of_ours = getattr(ours, column)
    return f"{text} {bound.strip()}{value / of_ours:.1f}x" if of_ours > 0 else text


def _rows(titles, phase, figures):
    """figures: by name of the program and by phase. The ratios are to Quarry's."""
    ours = figures.get("quarry", {}).get(phase)
    for name, title in titles.items():
        of_phase = figures[name].get(phase)
        if of_phase is None:
            yield [title] + ["-"] * (len(COLUMNS) + 1)
        else:
            yield ([title] + [_cell(of_phase, ours, column) for column in COLUMNS]
                   + [f"{of_phase.found:,}"])


def _aligned(rows):
    widths = [max(len(row[i]) for row in rows) for i in range(len(rows[0]))]
    for row in rows:
        yield "  ".join([row[0].ljust(widths[0])]
                        + [text.rjust(width) for text, width in zip(row[1:], widths[1:])])


def render(titles, figures):
    """titles: of each program, by its name, in the order of the lines. Returns the lines."""
    lines = []
    for phase, heading in PHASES.items():
        rows = [list(TITLES)] + list(_rows(titles, phase, figures))
        lines += ["", heading, ""] + ["  " + line for line in _aligned(rows)]
    return lines
