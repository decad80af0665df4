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
import pictures  # pylint: disable=wrong-import-position

WIDTH, HEIGHT = 570, 420  # a phone shows it in a readable size
LEFT, RIGHT, TOP, BOTTOM = 84, 360, 76, 356  # of the area of the lines; labels are right of it
LINE = 19  # between the base lines of two labels
COLOURS = {"kova": ("#0b5cad", "#3f86cc"), "peers": ("#b4451f", "#7a7a7a", "#2e7d4f", "#8a4fa0", "#a07a00")}
STYLE = ("text{font-size:16px}.title{font-size:18px;font-weight:bold}.bold{font-weight:bold}"
         ".line{fill:none;stroke-linejoin:round}")
INK, QUIET, GRID, PAPER = "#222", "#555", "#dde1e6", "#fafafa"


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
    Plot("path-filter", "Does the path filter leave a path out?", "patterns", "time for one path",
         both("path_filter_peer_bench", r"walk/(\d+)", ("kova", "PathFilter, walk"),
              ("re2", "RE2::Set, walk"))
         + both("path_filter_peer_bench", r"random/(\d+)", ("kova", "PathFilter, random"),
                ("re2", "RE2::Set, random"))),
    Plot("path-filter-hostile", "A hostile pattern on a long path", "bytes of the path",
         "time for one path", both("path_filter_peer_bench", r"hostileLength/(\d+)",
                                   ("kova", "PathFilter"), ("re2", "RE2"))),
    Plot("templates", "Filling in a template with 40 names", "bytes of the template",
         "time for one text",
         both("template_peer_bench", r"expandMap/bytes:(\d+)/names:40", ("kova", "replaceMustache"),
              ("ctemplate", "ctemplate, parsed"), ("ctemplate_parsing", "ctemplate"))),
    Plot("sections-load", "Loading the last section of a file", "sections of the file",
         "time for one load", both("section_bench", r"load/(\d+)", ("kova", "optSectionLoad"),
                                   ("gkeyfile", "GKeyFile"), ("read", "read the file"))),
    Plot("sections-list", "Listing the sections of a file", "sections of the file",
         "time for one list", both("section_bench", r"listNames/(\d+)", ("kova", "optSectionListName"),
                                   ("read_and_list", "plain loop"))),
    Plot("sections-save", "Saving one section of a file", "sections of the file",
         "time for one save", both("section_bench", r"save/(\d+)", ("kova", "optSectionSave"),
                                   ("gkeyfile", "GKeyFile"), ("bare_calls", "the bare calls"))),
    Plot("processes", "Starting a command and waiting for it", "open descriptors",
         "time for one command",
         both("subprocess_bench", r"call/(\d+)", ("kova", "SubProcess::call"))
         + both("command_bench", r"command/megabytes:0/descriptors:(\d+)", ("kova", "Command::run"))
         + both("subprocess_bench", r"call/(\d+)", ("posix_spawn", "posix_spawn"),
                ("system", "system"), ("fork_sweep", "fork, close each"))),
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


def text(x, y, words, anchor="start", colour=INK, kind=""):
    kind = f' class="{kind}"' if kind else ""
    return (f'<text x="{x:g}" y="{y:g}" text-anchor="{anchor}" fill="{colour}"{kind}>'
            f'{html.escape(words)}</text>')


def grid(across, down, sizes, costs):
    """The lines and numbers of both axes."""
    for cost in costs:
        y = down(cost)
        yield f'<path stroke="{GRID}" d="M{LEFT} {y:g}H{RIGHT}"/>'
        yield text(LEFT - 8, y + 5, bench_results.time_text(cost).replace(".00", "").replace(".0", ""),
                   "end", QUIET)
    for size in sizes:
        x = across(size)
        yield f'<path stroke="{GRID}" d="M{x:g} {TOP}V{BOTTOM}"/>'
        yield text(x, BOTTOM + 22, f"{size:,.0f}", "middle", QUIET)


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


def lines(drawn, across, down):
    """The lines of pairs of series and points, with their labels."""
    heights = label_heights([down(points[-1][1]) for _, points in drawn])
    colours = colours_of([series for series, _ in drawn])
    for (series, points), colour, height in zip(drawn, colours, heights):
        ours = series.who == bench_results.OURS
        spots = [(across(size), down(cost)) for size, cost in points]
        way = "L".join(f"{x:g} {y:g}" for x, y in spots)
        yield f'<path class="line" stroke="{colour}" stroke-width="{3 if ours else 2}" d="M{way}"/>'
        yield from (f'<circle cx="{x:g}" cy="{y:g}" r="{4 if ours else 3}" fill="{colour}"/>'
                    for x, y in spots)
        x, y = spots[-1]
        yield (f'<path stroke="{colour}" stroke-dasharray="2 3" d="M{x:g} {y:g}'
               f'L{max(x, RIGHT) + 10:g} {height:g}"/>')
        yield text(RIGHT + 14, height + 5, series.label, colour=colour, kind="bold" if ours else "")


def series_of(plot, results):
    """Pairs of the series that have a line, and its points."""
    both_ways = [(series, points_of(series, results)) for series in plot.series]
    return [(series, points) for series, points in both_ways if len(points) > 1]


def draw(plot, results):
    """The picture, or None if the rows of the library or of all peers are missing."""
    drawn = series_of(plot, results)
    if {series.who == bench_results.OURS for series, _ in drawn} != {True, False}:
        return None
    low_size, high_size, sizes = axis([size for _, points in drawn for size, _ in points])
    low_cost, high_cost, costs = axis([cost for _, points in drawn for _, cost in points])
    across = place(low_size, high_size, LEFT, RIGHT)
    down = place(low_cost, high_cost, BOTTOM, TOP)
    body = "\n".join([
        f'<rect width="{WIDTH}" height="{HEIGHT}" fill="{PAPER}"/>',
        text(16, 28, plot.title, kind="title"),
        text(16, 52, f"{plot.cost}; both axes are logarithmic", colour=QUIET),
        *grid(across, down, sizes, costs),
        text((LEFT + RIGHT) / 2, BOTTOM + 46, plot.size, "middle"), *lines(drawn, across, down)])
    return "\n".join([
        f'<svg xmlns="http://www.w3.org/2000/svg" width="{WIDTH}" height="{HEIGHT}" '
        f'viewBox="0 0 {WIDTH} {HEIGHT}" font-family="sans-serif" role="img">',
        f"<title>{html.escape(plot.title)}</title>",
        f"<style>{STYLE}{pictures.dark_style(body)}</style>", body, "</svg>", ""])


def missing(results):
    """The lines that have no rows, each with its picture."""
    return [f"{plot.name} ({series.label})" for plot in PLOTS for series in plot.series
            if len(points_of(series, results)) < 2]


def draw_all(results):
    """The text of each picture by its name; None for those that are left out."""
    return {plot.name: draw(plot, results) for plot in PLOTS}
