#!/usr/bin/python3
"""Makes a report of what the benchmark programs measured.

usage: report.py DIRECTORY [EARLIER...]

Reads the programs' results (NAME.json) in the directory, prints the table of ratios that have a goal, and
writes there report.md with all tables, the plots, and results.json: all figures of this run. EARLIER are such
files of other runs, on other machines perhaps: ratios are then given as ranges over all runs.
"""

import json
import pathlib
import platform
import re
import subprocess
import sys

import matplotlib

matplotlib.use("Agg")
from matplotlib import pyplot  # noqa: E402

GOAL_OPERATIONS = ("Create", "CreateByTid", "GrantEx.saved", "GrantEx.deleted", "DeleteByTid", "DeleteByBindSid",
                   "DeleteByFunction")
GOAL_OVERHEAD = {"memory": 1.08, "disk": 1.03}
GOAL_GROWTH = 1.02  # the library's growth beside the bare engine's

PROGRAMS = ("overhead", "listing", "breakdown", "growth", "contention", "peers", "gate")

HALF_CHANGE = "no half change; the last one may be undone"
RETURNED = "what returned is kept"
ANSWERED = "what was answered is kept"
SECONDS_LOST = "the last second or two of answers may be lost"
PEERS = {  # what each guarantees at a power cut
    "ours-plain-per-call": ("this library, a function per call", HALF_CHANGE),
    "ours-plain-held": ("this library, a held object", HALF_CHANGE),
    "ours-tuned-per-call": ("the same, tuned: a function per call", RETURNED),
    "ours-tuned-per-call-beside-another": ("the same, tuned: a function per call, another process connected", RETURNED),
    "ours-tuned-held": ("the same, tuned: a held object", RETURNED),
    "redis-always-per-call": ("Redis, appendfsync always, a connection per call", ANSWERED),
    "redis-always-held": ("Redis, appendfsync always, a held connection", ANSWERED),
    "redis-everysec-per-call": ("Redis, appendfsync everysec, a connection per call", SECONDS_LOST),
    "redis-everysec-held": ("Redis, appendfsync everysec, a held connection", SECONDS_LOST),
    "postgresql-per-call": ("PostgreSQL, a connection per call", ANSWERED),
    "postgresql-held": ("PostgreSQL, a held connection", ANSWERED),
}
PEER_GOALS = (  # what, compared with what, the greatest allowed ratio
    ("ours-tuned-held", "redis-always-held", 1),
    ("ours-plain-held", "redis-always-held", None),
    ("ours-plain-per-call", "postgresql-per-call", 1),
    ("ours-tuned-per-call", "postgresql-per-call", None),
)

GATE_GOALS = (  # what, compared with what, the least allowed ratio
    ("write-ahead/8", "redis/8", 0.9),
    ("write-ahead/64", "redis/64", 1.0),
    ("write-ahead/256", "redis/256", 0.9),
    ("one-token/64", "redis-one-token/64", 1.0),
    ("rollback/64", "calls/64", 30),
    ("rollback/64", "calls-locked/64", 20),
    ("nginx/64", "nginx-at-once/64", 0.4),
    ("many-tokens/64", "write-ahead/64", 0.5),
    ("call-beside/1", "call/1", 2),
)


SYSTEM_CALLS = {  # of the kinds that are shown
    "openat": "opens", "close": "closes", "read": "reads", "pread64": "reads", "write": "writes", "pwrite64": "writes",
    "fsync": "syncs", "fdatasync": "syncs", "fcntl": "locks", "unlink": "unlinks", "newfstatat": "stats",
    "access": "stats",
}
KINDS_OF_CALLS = tuple(dict.fromkeys(SYSTEM_CALLS.values())) + ("others",)
NOT_COUNTERS = ("family_index", "per_family_instance_index", "repetitions", "repetition_index", "threads", "iterations",
                "real_time", "cpu_time")


def figures(content):
    """The counters of each benchmark, by its name without the program's."""
    cells = {}
    for benchmark in content["benchmarks"]:
        if benchmark.get("aggregate_name", "median") == "median":
            name = benchmark["run_name"].split("/iterations:")[0].partition("/")[2]
            cells[name] = {counter: float(f"{value:.5g}") for counter, value in benchmark.items()
                           if isinstance(value, (int, float)) and counter not in NOT_COUNTERS}
    return cells


def system_calls(path, grants):
    """The system calls of one grant: strace's counts of a whole run, divided by its grants."""
    numbers = dict.fromkeys(KINDS_OF_CALLS, 0)
    for number, name in re.findall(r"^ *(\d+) (\w+)$", path.read_text("utf-8"), re.MULTILINE):
        if name not in ("total", "getuid"):  # the redirection of the database asks for the uid
            numbers[SYSTEM_CALLS.get(name, "others")] += int(number)
    return {kind: round(number / grants) for kind, number in numbers.items()}


def measured(directory):
    """The measurements of a run, as in results.json."""
    contents = {program: json.loads((directory / f"{program}.json").read_text("utf-8"))
                for program in PROGRAMS if (directory / f"{program}.json").exists()}
    results = {program: figures(content) for program, content in contents.items()}
    if "breakdown" in results:
        for benchmark, cell in zip(contents["breakdown"]["benchmarks"], results["breakdown"].values()):
            calls = directory / (benchmark["run_name"].replace("/", "-") + ".calls")
            cell.update(system_calls(calls, benchmark["iterations"]))
    context = next(iter(contents.values()))["context"]
    return {"machine": machine(context, "peers" in results), **results}


def cells_of(results, program):
    """The same, by the parts of the names."""
    return {tuple(name.split("/")): cell for name, cell in results.get(program, {}).items()}


def table(header, rows):
    """A Markdown table that is readable as plain text."""
    texts = [header] + [[str(cell) for cell in row] for row in rows]
    widths = [max(len(row[i]) for row in texts) for i in range(len(header))]
    lines = ["| " + " | ".join(cell.ljust(width) for cell, width in zip(row, widths)) + " |" for row in texts]
    lines.insert(1, "|" + "|".join("-" * (width + 2) for width in widths) + "|")
    return "\n".join(lines) + "\n"


def microseconds(value):
    return f"{value:,.0f} µs" if value >= 100 else f"{value:.1f} µs"


def percent(value):
    return f"{100 * value:.2f} %" if value else "0"


def span(values):
    low, high = (f"{value:.3f}" for value in (min(values), max(values)))
    return low if low == high else f"{low} to {high}"


def verdict(met):
    """In how many runs a goal was met."""
    if all(met):
        return "met"
    return f"met in {sum(met)} of {len(met)} runs" if any(met) else "missed"


def machine(context, peers):
    """The versions that were measured, and the machine."""
    def printed(command):
        return subprocess.run(command, shell=True, capture_output=True, text=True, check=True).stdout.strip()

    cpuinfo = pathlib.Path("/proc/cpuinfo").read_text("utf-8")
    processor = dict(re.findall(r"^(model name|cpu family|model)\s*: (.*)$", cpuinfo, re.MULTILINE))
    name = "{model name} (family {cpu family}, model {model})".format_map(processor) if "model name" in processor else \
        platform.machine()
    lines = [
        f"{name}, {context['num_cpus']} processors, Linux {platform.release().split('-')[0]}",
        f"memory: {printed('df --output=fstype ${VEMO_BENCH_MEMORY:-/dev/shm} | tail -1')}, "
        f"disk: {printed('df --output=fstype ${VEMO_BENCH_DISK:-/var/tmp} | tail -1')}",
        f"libvemoaccesstoken {context['library']}, {context['compiler']}, SQLite {context['sqlite']}, "
        f"jsoncpp {context['jsoncpp']}",
    ]
    if peers:
        versions = printed("redis-server --version; $(pg_config --bindir)/postgres --version")
        lines.append("Redis {}, PostgreSQL {}".format(*re.search(r"v=(\S+).*\) (\S+)", versions, re.DOTALL).groups()))
    return lines


def comparisons(results):
    """Of a run: what, ours, beside, their ratio, and the most that it should be, or None."""
    for (operation, place, tokens), cell in cells_of(results, "overhead").items():
        yield (f"{operation}, {place}, {int(tokens):,} tokens", microseconds(cell["ours_us"]),
               f"bare engine {microseconds(cell['bare_us'])}", cell["ratio"],
               GOAL_OVERHEAD[place] if tokens == "10" and operation in GOAL_OPERATIONS else None)
    for (place, kind, tokens), cell in cells_of(results, "growth").items():
        if tokens == "1000000":
            yield (f"growth of a grant from 10 to 1,000,000 tokens, {kind}, {place}", f"{cell['ratio']:.2f}",
                   f"bare engine {cell['bare_ratio']:.2f}", cell["ratio"] / cell["bare_ratio"],
                   GOAL_GROWTH if kind == "indexed" else None)
    for (what,), cell in cells_of(results, "listing").items():
        if what == "time":
            yield ("tokenList, 100,000 tokens", f"{cell['ours_us'] / 1000:.0f} ms",
                   f"sqlite3_exec {cell['bare_us'] / 1000:.0f} ms", cell["ratio"], 1.5)
        else:
            yield ("its peak memory", f"{cell['peak_kB'] / 1000:.1f} MB",
                   f"the values {cell['values_kB'] / 1000:.1f} MB", cell["ratio"], 1.1)
    peers = results.get("peers")
    for ours, peer, goal in PEER_GOALS if peers else ():
        yield (ours, microseconds(peers[ours]["median_us"]), f"{peer} {microseconds(peers[peer]['median_us'])}",
               peers[ours]["median_us"] / peers[peer]["median_us"], goal)


def ratios(runs, is_shown):
    """The figures of the first run, with the ratios of all."""
    spans = {}
    for results in runs:
        for what, _, _, ratio, _ in comparisons(results):
            spans.setdefault(what, []).append(ratio)
    rows = []
    for what, ours, beside, _, goal in comparisons(runs[0]):
        if is_shown(what, goal):
            rows.append([what, ours, beside, span(spans[what]),
                         "" if goal is None else f"{goal:g}: "
                         + verdict([round(ratio, 3) <= goal for ratio in spans[what]])])
    return table(["Measured", "Ours", "Beside", "Ratio", "Goal"], rows)


def peers_table(results):
    peers = results["peers"]
    return table(
        ["Grant", "Median", "99th percentile", "At a power cut"],
        [[name, microseconds(peers[slug]["median_us"]), microseconds(peers[slug]["p99_us"]), promise]
         for slug, (name, promise) in PEERS.items() if slug in peers])


def gate_table(results):
    gate = results["gate"]

    def goal(text, is_met):
        return f"{text}: " + ("met" if is_met else "missed")

    rows = []
    for ours, other, least in GATE_GOALS:
        rate, beside = gate[ours]["per_second"], gate[other]["per_second"]
        rows.append([ours, f"{rate:,.0f}", other, f"{beside:,.0f}", f"{rate / beside:.2f}",
                     goal(f"{least:g}", rate / beside >= least)])
    p99, median = gate["write-ahead/64"]["p99_us"], gate["write-ahead/64"]["median_us"]
    rows.append(["99th percentile, 64 clients", microseconds(p99), "median", microseconds(median),
                 f"{p99 / median:.2f}", goal("at most 2.5", p99 / median <= 2.5)])
    memory = gate["write-ahead/256"]["memory_MB"]
    rows.append(["memory, 256 clients", f"{memory:.1f} MB", "", "", "", goal("30 MB", memory < 30)])
    return table(["Grants/s (clients)", "Gate", "Beside", "Grants/s", "Ratio", "Goal"], rows)


def growth_table(results):
    def text(place, kind, tokens):
        cell = cells_of(results, "growth")[(place, kind, tokens)]
        return f"{microseconds(cell['median_us'])} ({cell['ratio']:.2f}; {cell['bare_ratio']:.2f})"

    return table(
        ["Tokens", "memory, plain", "memory, indexed", "disk, plain", "disk, indexed"],
        [[f"{int(tokens):,}"]
         + [text(place, kind, tokens) for place in ("memory", "disk") for kind in ("plain", "indexed")]
         for tokens in ("10", "100", "1000", "10000", "100000", "1000000")])


def indexes_table(results):
    return table(
        ["Tokens", "grant, one index", "three", "ratio", "written, one", "three", "deletion, one", "three"],
        [[f"{int(tokens):,}, {place}", microseconds(cell["one_us"]), microseconds(cell["three_us"]),
          f"{cell['three_us'] / cell['one_us']:.2f}", f"{cell['one_kB']:.0f} kB", f"{cell['three_kB']:.0f} kB",
          microseconds(cell["one_delete_us"]), microseconds(cell["three_delete_us"])]
         for (place, kind, tokens), cell in cells_of(results, "growth").items() if kind == "indexes"])


def contention_table(results):
    return table(
        ["Journal", "Calls", "Processes", "Grants/s", "Median", "99th percentile", "Failed", "False failures",
         "Beyond count"],
        [[*key, f"{cell['grants_per_second']:.0f}", f"{cell['median_us'] / 1000:.1f} ms",
          f"{cell['p99_us'] / 1000:.1f} ms"]
         + [percent(cell[counter]) for counter in ("failed", "false_failures", "beyond_count")]
         for key, cell in cells_of(results, "contention").items()])


def breakdown_table(results, title, names, suffix=""):
    return table([title, *names], [[", ".join(key)] + [f"{cell[name + suffix]:.0f}" for name in names]
                                   for key, cell in cells_of(results, "breakdown").items()])


def plot_lines(axes, cells, series, counter, factor=1, **options):
    """The counter of a series (the first parts of the benchmarks' names) over the number that comes last."""
    points = sorted((int(key[-1]), cell[counter] * factor) for key, cell in cells.items() if key[:-1] == series)
    return axes.plot(*zip(*points), **options)[0]


def finish(figure, path, titles, xlabel, base):
    for axes, title in zip(figure.axes, titles):
        axes.set_title(title)
        axes.grid(True, alpha=0.3)
        axes.set_xlabel(xlabel)
        axes.set_xscale("log", base=base)
        axes.xaxis.set_major_formatter("{x:.0f}")
    figure.tight_layout()
    figure.savefig(path, dpi=100)
    pyplot.close(figure)


def plot_growth(results, path):
    figure, panels = pyplot.subplots(1, 2, figsize=(9, 4.5), sharey=True)
    for axes, place in zip(panels, ("memory", "disk")):
        for kind in ("plain", "indexed"):
            plot_lines(axes, cells_of(results, "growth"), (place, kind), "median_us", 1e-3, marker="o", label=kind)
        axes.set_yscale("log")
        axes.legend()
    panels[0].set_ylabel("ms (median)")
    finish(figure, path, ("A grant in memory", "A grant on disk"), "tokens", base=10)


def plot_contention(results, path):
    cells = cells_of(results, "contention")
    figure, panels = pyplot.subplots(2, 2, figsize=(9, 7))
    for axes, counter, factor in zip(
        panels.flatten(), ("grants_per_second", "p99_us", "false_failures", "beyond_count"), (1, 1e-3, 100, 100)
    ):
        for series in dict.fromkeys(key[:2] for key in cells):
            line = plot_lines(axes, cells, series, counter, factor, marker="o", label=", ".join(series))
            if counter == "p99_us":
                plot_lines(axes, cells, series, "median_us", factor, linestyle=":", color=line.get_color())
                axes.set_yscale("log")
    panels[1][0].legend()
    finish(figure, path, ("grants a second", "a call: 99th percentile, dotted: median (ms)",
                          "false failures (% of calls)", "uses beyond count (% of grants)"),
           "processes on one token", base=2)


def plot_gate(results, path):
    cells = cells_of(results, "gate")
    figure, panels = pyplot.subplots(1, 2, figsize=(9, 4.5))
    for series in ("write-ahead", "rollback", "redis"):
        label = "Redis, appendfsync always" if series == "redis" else f"gate, {series} journal"
        plot_lines(panels[0], cells, (series,), "per_second", marker="o", label=label)
        line = plot_lines(panels[1], cells, (series,), "p99_us", 1e-3, marker="o")
        plot_lines(panels[1], cells, (series,), "median_us", 1e-3, linestyle=":", color=line.get_color())
    for axes in panels:
        axes.set_yscale("log")
    panels[0].legend()
    finish(figure, path, ("grants a second", "a grant: 99th percentile, dotted: median (ms)"), "clients", base=2)


def main():
    if len(sys.argv) < 2:
        sys.exit("usage: report.py DIRECTORY [EARLIER...]")
    directory, *earlier = map(pathlib.Path, sys.argv[1:])
    results = measured(directory)
    lines = json.dumps(results).replace("}, ", "},\n") + "\n"  # a line for each benchmark
    (directory / "results.json").write_text(lines, "utf-8")
    runs = [results] + [run for path in earlier if (run := json.loads(path.read_text("utf-8"))) != results]
    machines = dict.fromkeys("".join(f"- {line}\n" for line in run["machine"]) for run in runs)

    def matters(what, goal):
        return goal is not None or what.endswith(", 10 tokens")

    goals = ratios(runs, matters)
    times = ("open", "purge", "select", "save", "close", "library", "total")
    sections = {
        "Goals": "\n".join(machines) + "\n" + goals,
        "Other ratios": ratios(runs, lambda what, goal: not matters(what, goal)),
        "Where the time of a grant goes": breakdown_table(results, "Grant (µs)", times, "_us") + "\n"
                                          + breakdown_table(results, "System calls", KINDS_OF_CALLS),
        "Growth": growth_table(results),
        "Indexes": indexes_table(results),
        "Contention": contention_table(results),
    }
    if "peers" in results:
        sections["Peers"] = peers_table(results)
    if "gate" in results:
        sections["The gate"] = gate_table(results)
    for name, plot in (("growth", plot_growth), ("contention", plot_contention), ("gate", plot_gate)):
        if name in results:
            plot(results, directory / f"{name}.png")
    report = "\n".join(f"## {title}\n\n{text}" for title, text in sections.items())
    (directory / "report.md").write_text(report, "utf-8")
    print(goals)
    print(f"All tables, plots and figures are in {directory}.")


if __name__ == "__main__":
    main()
