#!/usr/bin/env python3
"""Writes the figures of a run into docs/performance.md and README.md, and draws their pictures.

Usage: bench_page.py publish FILE    FILE becomes the one that the page shows
       bench_page.py check           fails when page or pictures differ from what bench/results gives

bench/results holds one file. The page has a part for each benchmark program between two marks; those
of programs that have no marks are in the part `others`.
"""
import pathlib
import signal
import sys

sys.dont_write_bytecode = True  # no __pycache__ among the scripts
import bench_plots  # pylint: disable=wrong-import-position
import bench_results  # pylint: disable=wrong-import-position
import marked  # pylint: disable=wrong-import-position
from bench_results import (  # pylint: disable=wrong-import-position
    OURS, Unusable, goal_missed, ratio_text, time_text)

ROOT = pathlib.Path(__file__).resolve().parent.parent
PICTURES = "performance-{}.svg"


def run_part(results):
    machine, packages = results["machine"], results["packages"]
    versions = ", ".join(f"{name} {version}" for name, version in packages.items())
    yield (f"Run of {results['date'].partition('T')[0]} at commit {results['commit']}, "
           f"{len(results['rows'])} rows, begun under a load of {machine['load']:.1f}.\n")
    yield (f"{machine['cpu']}, {machine['cores']} cores, {machine['caches']}, "
           f"{machine['memory_mib'] / 1024:.0f} GiB of memory; {machine['kernel']}; "
           f"{results['compiler']}; {versions}.")


def missed_part(results):
    """The goals that were missed, and the rows that have no figures."""
    lines = [f"| {row['program']} | `{row['name']}` | {peer} | {ratio_text(row['ratio'][peer])} | {ratio_text(goal)} |"
             for row in bench_results.measured(results) for peer, goal in row["goal"].items()
             if goal_missed(row, peer)]
    goals = sum(len(row["goal"]) for row in bench_results.measured(results))
    yield f"{goals - len(lines)} of {goals} goals are reached."
    if lines:
        yield from ("", "| Benchmark | Row | Peer | Ratio | Goal |", "|---|---|---|--:|--:|", *lines)
    failed = bench_results.failures(results)
    if failed:
        yield from ("", "These rows failed and have no figures:", "", *(f"- `{line}`" for line in failed))


def memory_of(rows):
    peaks = [row["peak_kib"] for row in rows if row.get("peak_kib")]
    if not peaks:
        return []
    low, high = (bench_results.memory_text(peak) for peak in (min(peaks), max(peaks)))
    return ["", f"Peak memory: {low}"
            + (f" to {high}." if low != high else ".")]


def table_of(rows):
    yield from ("| Row | Library | Peer | Peer's time | Ratio | Goal |", "|---|--:|---|--:|--:|--:|")
    for row in rows:
        name, ours = f"`{row['name']}`", time_text(row["ns"][OURS])
        for peer, ratio in row["ratio"].items():
            goal = ratio_text(row["goal"][peer]) if peer in row["goal"] else ""
            goal += ", missed" if goal_missed(row, peer) else ""
            yield (f"| {name} | {ours} | {peer} | {time_text(row['ns'][peer])} | {ratio_text(ratio)} "
                   f"| {goal} |")
            name = ours = ""
        if name:
            yield f"| {name} | {ours} | | | | |"


def link(plot, folder=""):
    return (f"![{plot.title}: {plot.cost} over the number of {plot.size}]"
            f"({folder}{PICTURES.format(plot.name)})")


def program_part(program, results, pictures):
    for plot in bench_plots.PLOTS:
        if plot.series[0].program == program and plot.name in pictures:
            yield from (link(plot), "")
    rows = [row for row in bench_results.measured(results) if row["program"] == program]
    if rows:
        yield from (*table_of(rows), *memory_of(rows))
    else:
        yield "This run has no figures of it."


def others_part(results, placed):
    programs = {row["program"] for row in bench_results.measured(results)} - placed
    for program in sorted(programs):
        yield from (f"### {program}", "", *program_part(program, results, {}), "")


def page_of(text, results, pictures):
    placed = set(marked.names(text, "scripts/bench")) - {"run", "missed", "others"}
    parts = {program: program_part(program, results, pictures) for program in placed}
    parts |= {"run": run_part(results), "missed": missed_part(results),
              "others": others_part(results, placed)}
    return marked.replaced(text, "scripts/bench", parts)


def readme_of(text, pictures):
    """README.md with the first picture that there is."""
    drawn = [link(plot, "docs/") for plot in bench_plots.PLOTS if plot.name in pictures]
    return marked.replaced(text, "scripts/bench", {"picture": drawn[:1]})


def files_of(root, results):
    """The texts of all files that show the figures."""
    pictures = {name: picture for name, picture in bench_plots.draw_all(results).items() if picture}
    page, readme = root / "docs" / "performance.md", root / "README.md"
    return {page: page_of(page.read_text(encoding="utf-8"), results, pictures),
            readme: readme_of(readme.read_text(encoding="utf-8"), pictures),
            **{root / "docs" / PICTURES.format(name): text for name, text in pictures.items()}}


def stale(root, files):
    """Pictures of earlier runs."""
    return [file for file in sorted((root / "docs").glob(PICTURES.format("*"))) if file not in files]


def published(results_folder):
    found = sorted(results_folder.glob("*.json"))
    if len(found) != 1:
        raise Unusable(f"{results_folder} holds {len(found)} files of figures instead of one")
    return bench_results.read(found[0])


def check(root):
    files = files_of(root, published(root / "bench" / "results"))
    wrong = [file for file, text in files.items()
             if not file.exists() or file.read_text(encoding="utf-8") != text] + stale(root, files)
    if wrong:
        raise Unusable(f"{wrong[0].relative_to(root)} is out of date: run scripts/bench --publish FILE "
                       "with the file of bench/results")


def publish(root, source):
    results = bench_results.read(source)
    if results["commit"].endswith("-dirty"):
        raise Unusable(f"{source} is of changes that were not committed")
    target = root / "bench" / "results" / (results["date"].partition("T")[0] + ".json")
    files = files_of(root, results)
    earlier = [file for file in target.parent.iterdir() if file != target] + stale(root, files)
    bench_results.write(target, results)
    for file, text in files.items():
        file.write_text(text, encoding="utf-8")
    for file in earlier:
        file.unlink()
    print("written:", ", ".join(str(file.relative_to(root)) for file in [target, *files]))
    missing = bench_plots.missing(results)
    if missing:
        print(f"lines without rows in these pictures: {', '.join(missing)}")


def main(arguments):
    try:
        match arguments:
            case ["publish", name]:
                publish(ROOT, pathlib.Path(name))
            case ["check"]:
                check(ROOT)
            case _:
                raise Unusable(__doc__)
    except (Unusable, OSError) as reason:
        print(f"bench: {reason}", file=sys.stderr)
        return 1
    return 0


if __name__ == "__main__":
    signal.signal(signal.SIGPIPE, signal.SIG_DFL)  # a reader such as head may end first
    sys.exit(main(sys.argv[1:]))
