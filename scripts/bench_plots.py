"""Draws the figures of a run as SVG: cost over size, both on logarithmic axes.

PLOTS says what is drawn. A plot is left out if a row that it needs is missing. The same figures
always give the same text.
"""
import dataclasses
import html
import math
import re
import sys

sys.dont_write_bytecode = True  # no __pycache__ among the scripts
import bench_results  # pylint: disable=wrong-import-position

WIDTH, HEIGHT = 640, 420
LEFT, RIGHT, TOP, BOTTOM = 84, 400, 76, 356  # of the area of the lines; labels are right of it
LINE = 19  # between the base lines of two labels
COLOURS = {"kova": ("#0b5cad", "#3f86cc"), "peers": ("#b4451f", "#7a7a7a", "#2e7d4f", "#8a4fa0", "#a07a00")}
STYLE = ("text{font-size:15px;fill:#222}.title{font-size:17px;font-weight:bold}.quiet{fill:#555}"
         ".grid{stroke:#dde1e6;stroke-width:1}.line{fill:none;stroke-linejoin:round}")


@dataclasses.dataclass(frozen=True)
class Series:
    """A line: the rows of a program whose names match. The group of the pattern is the size."""
    program: str
    rows: str
    who: str
    label: str


@dataclasses.dataclass(frozen=True)
class Plot:
    """A picture: docs/performance-NAME.svg."""
    name: str
    title: str
    size: str  # the name of the horizontal axis
    cost: str  # of the vertical one
    series: tuple


def both(program, rows, *named):
    """Series of the same rows: (who, label)..."""
    return tuple(Series(program, rows, who, label) for who, label in named)


PLOTS = (
    Plot("path-filter", "Does the filter leave a path out?", "patterns", "time for one path",
         both("path_filter_peer_bench", r"walk/(\d+)", ("kova", "PathFilter, walk"),
              ("re2_set", "RE2::Set, walk"))
         + both("path_filter_peer_bench", r"random/(\d+)", ("kova", "PathFilter, random"),
                ("re2_set", "RE2::Set, random"))),
)


def points_of(series, results):
    """Pairs of size and nanoseconds, by size."""
    points = []
    for row in bench_results.measured(results):
        found = re.fullmatch(series.rows, row["name"])
        if row["program"] == series.program and found and series.who in row["ns"]:
            points.append((int(found.group(1)), row["ns"][series.who]))
    return sorted(point for point in points if min(point) > 0)


def steps(low, high, factors):
    """The round numbers between two others, such as 1, 2, 5, 10, 20."""
    decades = range(math.floor(math.log10(low)), math.ceil(math.log10(high)) + 1)
    return [factor * 10.0 ** decade for decade in decades for factor in factors
            if low <= factor * 10.0 ** decade <= high * 1.0001]


def axis(values):
    """The ends of an axis that holds the values, and where it has numbers."""
    low, high = min(values), max(values)
    around = steps(low / 10, high * 10, (1, 2, 5))
    low, high = max(step for step in around if step <= low), min(step for step in around if step >= high)
    if low == high:
        low, high = low / 2, high * 2
    few = steps(low, high, (1,))
    return low, high, few if len(few) > 2 else steps(low, high, (1, 2, 5))


def place(low, high, start, end):
    """The function from a value to its coordinate."""
    return lambda value: round(start + math.log(value / low) / math.log(high / low) * (end - start), 1)


def text(x, y, words, anchor="start", kind=""):
    kind = f' class="{kind}"' if kind else ""
    return f'<text x="{x:g}" y="{y:g}" text-anchor="{anchor}"{kind}>{html.escape(words)}</text>'


def grid(across, down, sizes, costs):
    """The lines and numbers of both axes."""
    for cost in costs:
        y = down(cost)
        yield f'<path class="grid" d="M{LEFT} {y:g}H{RIGHT}"/>'
        yield text(LEFT - 8, y + 5, bench_results.time_text(cost).replace(".00", "").replace(".0", ""),
                   "end", "quiet")
    for size in sizes:
        x = across(size)
        yield f'<path class="grid" d="M{x:g} {TOP}V{BOTTOM}"/>'
        yield text(x, BOTTOM + 22, f"{size:,.0f}", "middle", "quiet")


def label_heights(ends):
    """The heights of labels at the ends of lines: near those, and never over each other."""
    heights = list(ends)
    order = sorted(range(len(ends)), key=ends.__getitem__)
    pairs = list(zip(order, order[1:]))
    for upper, lower in pairs:
        heights[lower] = max(heights[lower], heights[upper] + LINE)
    heights[order[-1]] = min(heights[order[-1]], BOTTOM)
    for upper, lower in reversed(pairs):
        heights[upper] = min(heights[upper], heights[lower] - LINE)
    return heights


def colours_of(series):
    """Blues for the library, the other colours for its peers."""
    used = {kind: iter(colours) for kind, colours in COLOURS.items()}
    return [next(used["kova" if one.who == bench_results.OURS else "peers"]) for one in series]


def lines(plot, all_points, across, down):
    ends = [down(points[-1][1]) for points in all_points]
    for series, points, colour, height in zip(plot.series, all_points, colours_of(plot.series),
                                              label_heights(ends)):
        ours = series.who == bench_results.OURS
        spots = [(across(size), down(cost)) for size, cost in points]
        way = "L".join(f"{x:g} {y:g}" for x, y in spots)
        yield f'<path class="line" stroke="{colour}" stroke-width="{3 if ours else 2}" d="M{way}"/>'
        yield from (f'<circle cx="{x:g}" cy="{y:g}" r="{4 if ours else 3}" fill="{colour}"/>'
                    for x, y in spots)
        x, y = spots[-1]
        if x < RIGHT - 1 or abs(height - y) > 2:
            yield f'<path stroke="{colour}" stroke-dasharray="2 3" d="M{x:g} {y:g}L{RIGHT + 10} {height:g}"/>'
        yield (f'<text x="{RIGHT + 14}" y="{height + 5:g}" style="fill:{colour}'
               f'{";font-weight:bold" if ours else ""}">{html.escape(series.label)}</text>')


def draw(plot, results):
    """The picture, or None if a row is missing."""
    all_points = [points_of(series, results) for series in plot.series]
    if any(len(points) < 2 for points in all_points):
        return None
    sizes = [size for points in all_points for size, _ in points]
    low_size, high_size, size_steps = axis(sizes)
    low_cost, high_cost, cost_steps = axis([cost for points in all_points for _, cost in points])
    across = place(low_size, high_size, LEFT, RIGHT)
    down = place(low_cost, high_cost, BOTTOM, TOP)
    return "\n".join([
        f'<svg xmlns="http://www.w3.org/2000/svg" width="{WIDTH}" height="{HEIGHT}" '
        f'viewBox="0 0 {WIDTH} {HEIGHT}" font-family="sans-serif" role="img">',
        f"<title>{html.escape(plot.title)}</title>", f"<style>{STYLE}</style>",
        f'<rect width="{WIDTH}" height="{HEIGHT}" fill="#fafafa"/>',
        text(16, 28, plot.title, kind="title"),
        text(16, 52, f"{plot.cost}, over the number of {plot.size}; logarithmic axes", kind="quiet"),
        *grid(across, down, size_steps, cost_steps),
        text((LEFT + RIGHT) / 2, BOTTOM + 46, plot.size, "middle"),
        *lines(plot, all_points, across, down), "</svg>", ""])


def draw_all(results):
    """The text of each picture by its name; None for those that are left out."""
    return {plot.name: draw(plot, results) for plot in PLOTS}
