#!/usr/bin/env python3
"""Makes the table of ratios, and the curves, from the JSON files that scripts/bench.sh measured.

usage: report.py RESULTS [ROOT]    with ROOT, writes docs/performance.md's table and docs/*.svg
                                   there, and the figures of README.md that are rows of the table
"""

import collections
import json
import pathlib
import statistics
import subprocess
import sys

LIBRARY = "kelodrcore"
BASELINE = "baseline"
NANOSECONDS = {"ns": 1, "us": 1e3, "ms": 1e6, "s": 1e9}


class Comparison:
    """One piece of work: the times of each contestant, in the order of the repetitions."""

    def __init__(self):
        self.times = collections.defaultdict(list)
        self.bounds = {}  # the largest ratios that are accepted
        self.bytes_per_row = {}

    def add(self, contestant, run):
        kind = "cpu_time" if run["name"].endswith(contestant) else "real_time"
        self.times[contestant].append(run[kind] * NANOSECONDS[run["time_unit"]])
        for name, values in (("bound", self.bounds), ("bytes_per_row", self.bytes_per_row)):
            if name in run:
                values[contestant] = run[name]

    def median(self, contestant):
        return statistics.median(self.times[contestant])

    def ratios(self, contestant):
        """Lower quartile, median and upper quartile of the library's time over the contestant's."""
        pairs = zip(self.times[LIBRARY], self.times[contestant])
        ratios = [ours / theirs for ours, theirs in pairs]
        return statistics.quantiles(ratios, n=4, method="inclusive")


def load(results):
    comparisons = collections.OrderedDict()
    context = {}
    for path in sorted(pathlib.Path(results).glob("*.json"), key=lambda p: p.stat().st_mtime_ns):
        document = json.loads(path.read_text())
        context = document["context"]
        for run in document["benchmarks"]:
            if run["run_type"] != "iteration":
                continue
            operation, work, contestant = run["name"].split("/")[:3]
            comparisons.setdefault((operation, work), Comparison()).add(contestant, run)
    return comparisons, context


def time_text(nanoseconds):
    for unit, factor in (("s", 1e9), ("ms", 1e6), ("µs", 1e3)):
        if nanoseconds >= factor:
            return f"{nanoseconds / factor:.3g} {unit}"
    return f"{nanoseconds:.3g} ns"


def ratio_text(low, middle, high):
    return f"{middle:.3f} ({low:.3f}–{high:.3f})"


def bound_text(bound):
    return f"≤ 1/{1 / bound:.0f}" if bound < 1 else "< 1" if bound == 1 else f"≤ {bound:.2f}"


def rows_of(operation, work, comparison):
    others = [name for name in comparison.times if name != LIBRARY]
    for contestant in sorted(others, key=lambda name: (name != BASELINE, name)):
        bound = comparison.bounds.get(contestant)
        low, middle, high = comparison.ratios(contestant)
        missed = bound is not None and middle > bound
        yield [
            operation, work, time_text(comparison.median(LIBRARY)), contestant,
            ratio_text(low, middle, high), bound_text(bound) if bound else "",
            "missed" if missed else "",
        ]


def all_rows(comparisons):
    return [row for (operation, work), comparison in comparisons.items()
            if not operation.startswith("growth")
            for row in rows_of(operation, work, comparison)]


def table(comparisons):
    head = ["operation", "work", "time", "beside", "ratio (quartiles)", "bound", ""]
    rows = [head] + all_rows(comparisons)
    widths = [max(len(row[i]) for row in rows) for i in range(len(head))]
    rows.insert(1, ["-" * width for width in widths])
    lines = []
    for row in rows:
        cells = (cell.ljust(width) for cell, width in zip(row, widths))
        lines.append("| " + " | ".join(cells) + " |")
    return "\n".join(lines) + "\n"


def machine(context):
    keys = ["processor", "system", "compiler", "build", "kelodrcore", "sqlite", "jsoncpp",
            "sqlitecpp", "soci", "boost"]
    lines = [f"{context['num_cpus']} processors"]
    lines += [f"{key}: {context[key]}" for key in keys]
    return "".join(f"    {line}\n" for line in lines)


def curve(comparisons, operation, contestant, value):
    """The points of one curve: what the work counts, and the value of its comparison."""
    return [
        (int(work), value(int(work), comparison, contestant))
        for (name, work), comparison in comparisons.items()
        if name == operation and contestant in comparison.times
    ]


def plot(path, title, x, y, curves, extra=""):
    """Draws curves (title, points) with gnuplot."""
    script = [
        "set terminal svg size 720,440 font 'sans-serif,13' background rgb 'white'",
        f"set output '{path}'", f"set title '{title}'", f"set xlabel '{x}'", f"set ylabel '{y}'",
        "set key left top", "set grid", "set logscale x 10", extra,
    ]
    script += [
        f"$curve{i} << end\n" + "\n".join(f"{a} {b}" for a, b in points) + "\nend"
        for i, (_, points) in enumerate(curves)
    ]
    # The library and its baseline are neighbours, of one colour.
    lines = (f"$curve{i} with linespoints pt 7 ps 0.5 lc {1 + i // 2} "
             f"dt {1 + (BASELINE in name)} title '{name}'"
             for i, (name, _) in enumerate(curves))
    script.append("plot " + ", ".join(lines))
    subprocess.run(["gnuplot"], input="\n".join(script), text=True, check=True)


def draw(comparisons, docs):
    def both(operation, label, value):
        return [(f"{label}{name}", curve(comparisons, operation, name, value))
                for name in (LIBRARY, BASELINE)]

    def per_row(rows, comparison, name):
        return comparison.median(name) / rows / 1e3

    def whole(_, comparison, name):
        return comparison.median(name) / 1e3

    def mebibytes(rows, comparison, name):
        return comparison.bytes_per_row[name] * rows / 2**20

    plot(docs / "growth-rows.svg", "Inserts and selects", "rows", "µs a row",
         both("growth insert", "InsertRecord, ", per_row) +
         both("growth bulk", "InsertRecords, ", per_row) +
         both("growth select", "SelectRecords, ", per_row) +
         both("growth each", "SelectEach, ", per_row),
         "set logscale y 10; set format x '10^{%T}'; set key below")
    plot(docs / "growth-value.svg", "One row with a large text: inserted and selected",
         "bytes of the text", "µs", both("growth value", "", whole),
         "set logscale y 10; set format x '10^{%T}'")
    powers = "set logscale x 2; set yrange [0:*]"
    plot(docs / "growth-cache.svg", "Fresh cache reads by many processes", "processes",
         "µs a read, whole machine", both("growth cache", "", whole), powers)
    plot(docs / "growth-lock.svg", "One lock wanted by many processes", "processes",
         "µs a lock, whole machine",
         both("growth lock waiting", "waiting in the kernel, ", whole) +
         both("growth lock polling", "polling, ", whole), powers)
    plot(docs / "growth-memory.svg", "Peak memory of selects", "rows", "MiB",
         both("growth memory", "SelectRecords, ", mebibytes) +
         both("growth each memory", "SelectEach, ", mebibytes),
         "set logscale y 10; set format x '10^{%T}'")


def replace_section(text, name, section):
    """Puts `section` between the comments that mark its place."""
    begin, end = f"<!-- {name} -->\n", f"<!-- end of {name} -->\n"
    head, rest = text.split(begin)
    return head + begin + "\n" + section + "\n" + end + rest.split(end)[1]


def replace_figures(text, rows):
    """Puts the rows of the table in place of those in `text` of the same work, without quartiles."""
    figures = {(row[0], row[1], row[3]): row[:4] + [row[4].split()[0]] for row in rows}
    lines = text.split("\n")
    for i, line in enumerate(lines):
        cells = [cell.strip() for cell in line.strip("|").split("|")]
        if len(cells) == 5 and (cells[0], cells[1], cells[3]) in figures:
            figure = figures[cells[0], cells[1], cells[3]]
            lines[i] = "| " + " | ".join(figure) + " |"
    return "\n".join(lines)


def main():
    comparisons, context = load(sys.argv[1])
    print(machine(context))
    print(table(comparisons))
    if len(sys.argv) > 2:
        root = pathlib.Path(sys.argv[2])
        page = root / "docs/performance.md"
        text = replace_section(page.read_text(), "table", table(comparisons))
        page.write_text(replace_section(text, "machine", machine(context)))
        draw(comparisons, root / "docs")
        readme = root / "README.md"
        readme.write_text(replace_figures(readme.read_text(), all_rows(comparisons)))


main()
