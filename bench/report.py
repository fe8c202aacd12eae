#!/usr/bin/python3
"""Makes a report of what the benchmark programs measured.

usage: report.py DIRECTORY

Reads the programs' results (NAME.json) in the directory, prints the table of ratios, and writes there
report.md with all tables, and the plots.
"""

import json
import os
import platform
import re
import subprocess
import sys

import matplotlib

matplotlib.use("Agg")
from matplotlib import pyplot  # noqa: E402

GOAL_OPERATIONS = (
    "Create",
    "CreateByTid",
    "GrantEx.saved",
    "GrantEx.deleted",
    "DeleteByTid",
    "DeleteByBindSid",
    "DeleteByFunction",
)
GOAL_OVERHEAD = {"memory": 1.08, "disk": 1.03}

PEERS = {  # what each promises at a power cut
    "ours-plain-per-call": ("this library, a function per call", "no half change; the last one may be undone"),
    "ours-plain-held": ("this library, a held object", "no half change; the last one may be undone"),
    "ours-tuned-per-call": ("the same, tuned: a function per call", "what returned is kept"),
    "ours-tuned-per-call-beside-another": (
        "the same, tuned: a function per call, another process connected",
        "what returned is kept",
    ),
    "ours-tuned-held": ("the same, tuned: a held object", "what returned is kept"),
    "redis-always-per-call": ("Redis, appendfsync always, a connection per call", "what was answered is kept"),
    "redis-always-held": ("Redis, appendfsync always, a held connection", "what was answered is kept"),
    "redis-everysec-per-call": (
        "Redis, appendfsync everysec, a connection per call",
        "the last second or two of answers may be lost",
    ),
    "redis-everysec-held": (
        "Redis, appendfsync everysec, a held connection",
        "the last second or two of answers may be lost",
    ),
    "postgresql-per-call": ("PostgreSQL, a connection per call", "what was answered is kept"),
    "postgresql-held": ("PostgreSQL, a held connection", "what was answered is kept"),
}


class Results:
    """The counters of each benchmark, by the parts of its name that follow the program's."""

    def __init__(self, directory, name):
        path = os.path.join(directory, name + ".json")
        self.context = {}
        self.cells = {}
        if not os.path.exists(path):
            return
        with open(path, encoding="utf-8") as file:
            content = json.load(file)
        self.context = content["context"]
        for benchmark in content["benchmarks"]:
            if benchmark.get("error_occurred"):
                sys.exit(f"{benchmark['name']}: {benchmark['error_message']}")
            if benchmark.get("aggregate_name", "median") != "median":
                continue
            name = benchmark["run_name"].split("/iterations:")[0]
            self.cells[tuple(name.split("/")[1:])] = benchmark


def table(header, rows):
    """A Markdown table that can be read as it stands."""
    texts = [header] + [[str(cell) for cell in row] for row in rows]
    widths = [max(len(row[i]) for row in texts) for i in range(len(header))]
    lines = ["| " + " | ".join(cell.ljust(width) for cell, width in zip(row, widths)) + " |" for row in texts]
    lines.insert(1, "|" + "|".join("-" * (width + 2) for width in widths) + "|")
    return "\n".join(lines) + "\n"


def microseconds(value):
    return f"{value:,.0f} µs" if value >= 100 else f"{value:.1f} µs"


def percent(value):
    return f"{100 * value:.2f} %" if value else "0"


def verdict(ratio, goal):
    return "" if goal is None else f"{goal:g}: {'met' if round(ratio, 3) <= goal else 'missed'}"


def output_of(command):
    try:
        return subprocess.run(command, capture_output=True, text=True, check=False).stdout.strip()
    except FileNotFoundError:
        return ""


def machine(results):
    context = results["overhead"].context
    with open("/proc/cpuinfo", encoding="utf-8") as file:
        model = re.search(r"model name\s*: (.*)", file.read())
    lines = [
        f"{model.group(1) if model else platform.machine()}, {context['num_cpus']} processors, "
        f"Linux {platform.release().split('-')[0]}",
        ", ".join(
            f"{name}: {output_of(['df', '--output=fstype', os.environ.get(variable, default)]).split()[-1]}"
            for name, variable, default in (
                ("memory", "VEMO_BENCH_MEMORY", "/dev/shm"),
                ("disk", "VEMO_BENCH_DISK", "/var/tmp"),
            )
        ),
        f"libvemoaccesstoken {context['library']}, {context['compiler']}, SQLite {context['sqlite']}, "
        f"jsoncpp {context['jsoncpp']}",
    ]
    if results["peers"].cells:
        redis = re.search(r"v=(\S+)", output_of(["redis-server", "--version"]))
        directory = output_of(["pg_config", "--bindir"]).strip()
        postgresql = re.search(r"[\d.]+", output_of([f"{directory}/postgres", "--version"]))
        lines.append(f"Redis {redis.group(1)}, PostgreSQL {postgresql.group()}")
    return "".join(f"- {line}\n" for line in lines)


def ratios(results):
    rows = []

    def add(what, ours, beside, ratio, goal=None):
        rows.append([what, ours, beside, f"{ratio:.3f}", verdict(ratio, goal)])

    for (operation, place, tokens), cell in results["overhead"].cells.items():
        goal = GOAL_OVERHEAD[place] if tokens == "10" and operation in GOAL_OPERATIONS else None
        add(
            f"{operation}, {place}, {int(tokens):,} tokens",
            microseconds(cell["ours_us"]),
            f"bare engine {microseconds(cell['bare_us'])}",
            cell["ratio"],
            goal,
        )
    listing = results["listing"].cells
    time, memory = listing[("time",)], listing[("memory",)]
    add(
        "tokenList, 100,000 tokens",
        f"{time['ours_us'] / 1000:.0f} ms",
        f"sqlite3_exec {time['bare_us'] / 1000:.0f} ms",
        time["ratio"],
        1.5,
    )
    add(
        "its peak memory",
        f"{memory['peak_kB'] / 1000:.1f} MB",
        f"the values {memory['values_kB'] / 1000:.1f} MB",
        memory["ratio"],
        1.1,
    )
    for (place, kind, tokens), cell in results["growth"].cells.items():
        if tokens == "1000000":
            add(
                f"grant at 1,000,000 tokens, {kind}, {place}",
                microseconds(cell["median_us"]),
                f"at 10 tokens {microseconds(cell['few_us'])}",
                cell["ratio"],
                1.3 if kind == "indexed" else None,
            )
    peers = results["peers"].cells
    for ours, peer, goal in (
        ("ours-tuned-held", "redis-always-held", 1),
        ("ours-plain-held", "redis-always-held", None),
        ("ours-plain-per-call", "postgresql-per-call", 1),
        ("ours-tuned-per-call", "postgresql-per-call", None),
    ):
        if peers:
            ours_us, peer_us = peers[(ours,)]["median_us"], peers[(peer,)]["median_us"]
            add(ours, microseconds(ours_us), f"{peer} {microseconds(peer_us)}", ours_us / peer_us, goal)
    return table(["Measured", "Ours", "Beside", "Ratio", "Goal"], rows)


def peers_table(results):
    rows = []
    for slug, (name, promise) in PEERS.items():
        cell = results["peers"].cells.get((slug,))
        if cell:
            rows.append([name, microseconds(cell["median_us"]), microseconds(cell["p99_us"]), promise])
    return table(["Grant", "Median", "99th percentile", "At a power cut"], rows)


GATE_GOALS = (  # what, beside what, the least ratio
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


def gate_table(results):
    cells = results["gate"].cells
    rows = []
    for ours, other, goal in GATE_GOALS:
        rate, beside = (cells[tuple(name.split("/"))]["per_second"] for name in (ours, other))
        ratio = rate / beside
        rows.append(
            [ours, f"{rate:,.0f}", other, f"{beside:,.0f}", f"{ratio:.2f}", f"{goal:g}"
             + (": met" if ratio >= goal else ": missed")]
        )
    busy, many = cells[("write-ahead", "64")], cells[("write-ahead", "256")]
    spread = busy["p99_us"] / busy["median_us"]
    rows.append(["99th percentile, 64 clients", microseconds(busy["p99_us"]), "median", microseconds(busy["median_us"]),
                 f"{spread:.2f}", "at most 2.5: " + ("met" if spread <= 2.5 else "missed")])
    rows.append(["memory, 256 clients", f"{many['memory_MB']:.1f} MB", "", "", "",
                 "30 MB: " + ("met" if many["memory_MB"] < 30 else "missed")])
    return table(["Grants/s (clients)", "Gate", "Beside", "Grants/s", "Ratio", "Goal"], rows)


def plot_gate(results, directory):
    cells = results["gate"].cells
    figure, panels = pyplot.subplots(1, 2, figsize=(9, 4.5))
    for series in ("write-ahead", "rollback", "redis"):
        points = [(int(key[1]), cell) for key, cell in cells.items() if key[0] == series]
        points.sort(key=lambda point: point[0])
        label = "Redis, appendfsync always" if series == "redis" else f"gate, {series} journal"
        clients = [number for number, _ in points]
        panels[0].plot(clients, [cell["per_second"] for _, cell in points], marker="o", label=label)
        (line,) = panels[1].plot(clients, [cell["p99_us"] / 1000 for _, cell in points], marker="o", label=label)
        panels[1].plot(clients, [cell["median_us"] / 1000 for _, cell in points], linestyle=":", color=line.get_color())
    panels[0].set_title("grants a second")
    panels[1].set_title("a grant: 99th percentile, dotted: median (ms)")
    for axes in panels:
        axes.set_xscale("log", base=2)
        axes.set_yscale("log")
        axes.xaxis.set_major_formatter("{x:.0f}")
        axes.set_xlabel("clients")
        axes.grid(True, alpha=0.3)
    panels[0].legend()
    save(figure, directory, "gate.png")


def growth_table(results):
    cells = results["growth"].cells
    rows = []
    for tokens in ("10", "100", "1000", "10000", "100000", "1000000"):
        row = [f"{int(tokens):,}"]
        for place in ("memory", "disk"):
            for kind in ("plain", "indexed"):
                cell = cells[(place, kind, tokens)]
                row.append(f"{microseconds(cell['median_us'])} ({cell['ratio']:.2f})")
        rows.append(row)
    return table(["Tokens", "memory, plain", "memory, indexed", "disk, plain", "disk, indexed"], rows)


def contention_table(results):
    rows = []
    for (journal, calls, processes), cell in results["contention"].cells.items():
        rows.append(
            [
                journal,
                calls,
                processes,
                f"{cell['grants_per_second']:.0f}",
                f"{cell['median_us'] / 1000:.1f} ms",
                f"{cell['p99_us'] / 1000:.1f} ms",
                percent(cell["failed"]),
                percent(cell["false_failures"]),
                percent(cell["beyond_count"]),
            ]
        )
    header = ["Journal", "Calls", "Processes", "Grants/s", "Median", "99th percentile"]
    return table(header + ["Failed", "False failures", "Beyond count"], rows)


def breakdown_table(results):
    steps = ("open", "purge", "select", "save", "close", "library", "total")
    rows = []
    for (kind, place, journal), cell in results["breakdown"].cells.items():
        rows.append([f"{kind}, {place}, {journal}"] + [f"{cell[step + '_us']:.0f}" for step in steps])
    return table(["Grant (µs)"] + list(steps), rows)


def calls_table(results):
    kinds = ("opens", "closes", "reads", "writes", "syncs", "locks", "unlinks", "stats", "others")
    rows = []
    for (kind, place, journal), cell in results["breakdown"].cells.items():
        rows.append([f"{kind}, {place}, {journal}"] + [f"{cell[name]:.0f}" for name in kinds])
    return table(["System calls"] + list(kinds), rows)


def save(figure, directory, name):
    figure.tight_layout()
    figure.savefig(os.path.join(directory, name), dpi=100)
    pyplot.close(figure)


def plot_overhead(results, directory):
    cells = results["overhead"].cells
    names = [operation for operation, place, tokens in cells if (place, tokens) == ("memory", "10")]
    figure, axes = pyplot.subplots(figsize=(9, 4.5))
    for offset, place in ((-0.2, "memory"), (0.2, "disk")):
        values = [cells[(name, place, "10")]["ratio"] for name in names]
        axes.bar([i + offset for i in range(len(names))], values, 0.38, label=place)
        axes.axhline(GOAL_OVERHEAD[place], linestyle=":", color="C0" if place == "memory" else "C1")
    axes.set_xticks(range(len(names)), names, rotation=30, ha="right")
    axes.set_ylim(0.95, None)
    axes.set_ylabel("time / time of the bare engine")
    axes.set_title("The library beside the bare engine, 10 tokens (dotted: the goals)")
    axes.legend()
    save(figure, directory, "overhead.png")


def plot_growth(results, directory):
    cells = results["growth"].cells
    figure, panels = pyplot.subplots(1, 2, figsize=(9, 4.5), sharey=True)
    for axes, place in zip(panels, ("memory", "disk")):
        for kind in ("plain", "indexed"):
            series = (place, kind)
            points = [(int(key[2]), cell["median_us"] / 1000) for key, cell in cells.items() if key[:2] == series]
            axes.loglog(*zip(*points), marker="o", label=kind)
        axes.set_xlabel("tokens")
        axes.set_title(f"A grant in {place}" if place == "memory" else "A grant on disk")
        axes.grid(True, alpha=0.3)
        axes.legend()
    panels[0].set_ylabel("ms (median)")
    save(figure, directory, "growth.png")


def plot_contention(results, directory):
    cells = results["contention"].cells
    figure, panels = pyplot.subplots(2, 2, figsize=(9, 7), sharex=True)
    for axes, counter, factor, title in (
        (panels[0][0], "grants_per_second", 1, "grants a second"),
        (panels[0][1], "p99_us", 1e-3, "a call: 99th percentile, dotted: median (ms)"),
        (panels[1][0], "false_failures", 100, "false failures (% of calls)"),
        (panels[1][1], "beyond_count", 100, "uses beyond count (% of grants)"),
    ):
        for series in dict.fromkeys(key[:2] for key in cells):
            points = [(int(key[2]), cell[counter] * factor) for key, cell in cells.items() if key[:2] == series]
            (line,) = axes.plot(*zip(*points), marker="o", label=", ".join(series))
            if counter == "p99_us":
                medians = [cell["median_us"] * factor for key, cell in cells.items() if key[:2] == series]
                axes.plot([x for x, _ in points], medians, linestyle=":", color=line.get_color())
        axes.set_xscale("log", base=2)
        axes.xaxis.set_major_formatter("{x:.0f}")
        axes.set_title(title)
        axes.grid(True, alpha=0.3)
    panels[0][1].set_yscale("log")
    panels[1][0].legend()
    for axes in panels[1]:
        axes.set_xlabel("processes on one token")
    save(figure, directory, "contention.png")


def plot_peers(results, directory):
    cells = results["peers"].cells
    names = [slug for slug in PEERS if (slug,) in cells][::-1]
    figure, axes = pyplot.subplots(figsize=(9, 5))
    medians = [cells[(name,)]["median_us"] for name in names]
    highs = [cells[(name,)]["p99_us"] for name in names]
    axes.barh(range(len(names)), medians, color=["C0" if name.startswith("ours") else "C7" for name in names])
    axes.plot(highs, range(len(names)), "k|", markersize=12, label="99th percentile")
    axes.set_yticks(range(len(names)), names)
    axes.set_xscale("log")
    axes.set_xlabel("µs of a grant (bar: median)")
    axes.legend()
    save(figure, directory, "peers.png")


def main():
    if len(sys.argv) != 2:
        sys.exit("usage: report.py DIRECTORY")
    directory = sys.argv[1]
    names = ("overhead", "listing", "breakdown", "growth", "contention", "peers", "gate")
    results = {name: Results(directory, name) for name in names}
    sections = [
        ("Ratios", machine(results) + "\n" + ratios(results)),
        ("Where the time of a grant goes", breakdown_table(results) + "\n" + calls_table(results)),
        ("Growth", growth_table(results)),
        ("Contention", contention_table(results)),
    ]
    plot_overhead(results, directory)
    plot_growth(results, directory)
    plot_contention(results, directory)
    if results["peers"].cells:
        sections.append(("Peers", peers_table(results)))
        plot_peers(results, directory)
    if results["gate"].cells:
        sections.append(("The gate", gate_table(results)))
        plot_gate(results, directory)
    with open(os.path.join(directory, "report.md"), "w", encoding="utf-8") as file:
        file.write("\n".join(f"## {title}\n\n{text}" for title, text in sections))
    print(sections[0][1])
    print(f"All tables, plots and raw results are in {directory}.")


if __name__ == "__main__":
    main()
