"""The file in which scripts/bench keeps the figures of one run, and how its figures are written.

A file holds date, commit, compiler, machine, packages, problems and rows. A row holds:

    program, name    the benchmark program, and the row without Google Benchmark's suffixes
    ns               nanoseconds of processor time for one operation, by the name of who did it;
                     "kova" is this library
    ratio, spread    by the name of a peer: see bench/race.h
    goal             by the name of a peer, where one is set
    load, peak_kib   the machine's load, and the most memory that the program held while the row ran,
                     or what the program reports instead
    error            instead of the figures, if the row failed
"""
import json
import math
import re

FORMAT = 1
OURS = "kova"
GROUPS = ("ns", "ratio", "spread", "goal")
SUFFIXES = re.compile(r"/(?:iterations|repeats|min_time|min_warmup_time|threads):[^/]*"
                      r"|/(?:manual_time|real_time|process_time)")
UNITS = {"ns": 1, "µs": 1e3, "ms": 1e6, "s": 1e9}


class Unusable(Exception):
    """A file or a run without usable figures. The text is a sentence for the user."""


def short_name(name):
    return SUFFIXES.sub("", name)


def row_of(program, entry):
    """The row of an entry of Google Benchmark's JSON."""
    row = {"program": program, "name": short_name(entry["name"])}
    if entry.get("error_occurred"):
        return {**row, "error": entry.get("error_message") or "failed without a message"}
    for group in GROUPS:
        row[group] = {key.partition(":")[2]: rounded(value) for key, value in entry.items()
                      if key.startswith(group + ":")}
    if OURS not in row["ns"]:
        return {"program": program, "name": row["name"], "error": "is not a race: it reports no ns:kova"}
    row |= {key: rounded(entry[key]) for key in ("load", "peak_kib") if key in entry}
    try:
        check_row(row)
    except (KeyError, TypeError, ValueError) as reason:
        return {"program": program, "name": row["name"], "error": f"odd figures: {reason}"}
    return row


def rounded(value):
    """Five digits: more are noise, and make files that differ more than their figures do."""
    return float(f"{value:.5g}")


def write(path, results):
    """Writes one row a line, so that two files can be compared by eye."""
    head = json.dumps({key: value for key, value in results.items() if key != "rows"}, indent=1)
    rows = ",\n".join(" " + json.dumps(row) for row in results["rows"])
    path.write_text(f'{head[:-2]},\n "rows": [\n{rows}\n ]\n}}\n', encoding="utf-8")


def read(path):
    try:
        results = json.loads(path.read_text(encoding="utf-8"))
    except OSError as reason:
        raise Unusable(f"{path}: {reason.strerror}") from reason
    except ValueError as reason:
        raise Unusable(f"{path} is not a JSON file: {reason}") from reason
    if isinstance(results, dict) and "context" in results and "benchmarks" in results:
        raise Unusable(f"{path} is the output of one program; scripts/bench reads its own files")
    if not isinstance(results, dict) or results.get("format") != FORMAT:
        raise Unusable(f"{path} was not written by this version of scripts/bench")
    try:
        check(results)
    except (AttributeError, KeyError, TypeError, ValueError) as reason:
        raise Unusable(f"{path} is incomplete: {type(reason).__name__} {reason}") from reason
    return results


def check(results):
    """Raises if something is missing that every reader of the results uses."""
    for key in ("date", "commit", "compiler"):
        str.strip(results[key])
    dict.items(results["machine"])
    dict.items(results["packages"])
    list.copy(results["problems"])
    for row in results["rows"]:
        str.strip(row["program"] + row["name"])
        if "error" not in row:
            check_row(row)


def check_row(row):
    figures = [row["ns"][OURS], *dict.values(row["ratio"])]
    figures += [row["ns"][peer] for peer in row["ratio"]]
    odd = [figure for figure in figures if not (math.isfinite(figure) and figure > 0)]
    extras = [*dict.values(row["spread"]), *dict.values(row["goal"])]
    odd += [figure for figure in extras if not math.isfinite(figure)]
    if odd:
        raise ValueError(f"{odd[0]} among {row['name']}'s")


def goal_missed(row, peer):
    return peer in row["goal"] and row["ratio"][peer] > row["goal"][peer]


def measured(results):
    """The rows that have figures."""
    return [row for row in results["rows"] if "error" not in row]


def failures(results):
    """A sentence for each row and each program that failed."""
    return [f"{row['program']} {row['name']}: {row['error']}"
            for row in results["rows"] if "error" in row] + results["problems"]


def significant(value):
    """Three digits, without an exponent."""
    if value >= 99.95:
        return f"{value:.0f}"
    return f"{value:.1f}" if value >= 9.995 else f"{value:.2f}"


def time_text(nanoseconds):
    unit = max((unit for unit, size in UNITS.items() if nanoseconds >= 0.9995 * size),
               key=UNITS.get, default="ns")
    return f"{significant(nanoseconds / UNITS[unit])} {unit}"


def ratio_text(ratio):
    return f"{ratio:.2g}" if 0 < ratio < 0.0995 else significant(ratio)


def memory_text(kib):
    return f"{significant(kib / 1024)} MiB"
