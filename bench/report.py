#!/usr/bin/env python3
"""Rewrites the results in docs/benchmarks.md from Google Benchmark's JSON output; targets are judged on each
repetition: "yes" when all meet one, "no" when none does, "open" otherwise. Draws the typed reads' time per row
into docs/typed-reads.png when gnuplot is there."""

import argparse
import json
import os
import platform
import re
import shutil
import statistics
import subprocess
from collections import defaultdict

BEGIN, END = "<!-- results:begin -->", "<!-- results:end -->"
LOCATIONS = ("tmpfs", "disk", "memory")

# (title, section prefixes): one table each; docs/benchmarks.md says what each measures.
SECTIONS = [("Write operations", ["write"]), ("Batches", ["batch"]), ("Queries", ["select", "join", "page", "exist"]),
            ("Reading a cursor", ["walk"]), ("Names", ["lock", "intern", "memory"]), ("Conditions", ["cond"]),
            ("Schema", ["schema"]), ("Sessions", ["session"]), ("Safety", ["safety"]),
            ("Typed reads", ["typed"]), ("Watching", ["watch"]), ("Search", ["search"])]


def ratio(a, b, metric="real", per=None):
    """a / b in metric, each divided by its counter per when given."""
    return lambda r: r(a, metric) / (r(a, per) if per else 1) / (r(b, metric) / (r(b, per) if per else 1))


def one(what, a, b, op, bound, metric="real", per=None):
    """The target what: a / b; a b without "/" is another impl of a's case."""
    return what, ratio(a, b if "/" in b else a.rsplit("/", 1)[0] + "/" + b, metric, per), op, bound


def both(*args, **kwargs):
    """one(...) at tmpfs and at disk: {l} in its strings is the location."""
    return [one(*(x.format(l=l) if isinstance(x, str) else x for x in args), **kwargs) for l in LOCATIONS[:2]]


def of(name, metric, by):
    """name's metric divided by its counter by, or by the number by."""
    return lambda r: r(name, metric) / (r(name, by) if isinstance(by, str) else by)


# (what, the value of one repetition given r(name, metric="real"), "<=" or ">=", bound)
TARGETS = [
    *[one(f"`{c}`, tmpfs: lib / raw", f"write/{c}/tmpfs/lib", "raw", "<=", 1.05)
      for c in ("Upsert", "Update", "Delete", "CreateTable", "DropTable")],
    *both("`Select` 100k, {l}: lib / raw (the cursor's floor: a locked map insert per value)",
          "select/100000/{l}/lib", "raw", "<=", 1.8),
    *[(f"`Select` 10k → 1M, {l}: growth of the time per row, lib's / raw's",
       lambda r, g=lambda i, l=l: ratio(f"select/1000000/{l}/{i}", f"select/10000/{l}/{i}"): g("lib")(r) / g("raw")(r),
       "<=", 1.0) for l in LOCATIONS[:2]],
    *both("`Select` 1M, {l}: heap held, lib / raw", "select/1000000/{l}/lib", "raw", "<=", 1.1, "result_bytes"),
    *both("`Query` page, {l}: `Select` all / page", "page/100000/{l}/selectall", "lib", ">=", 100),
    *both("`Query` page, {l}: lib / raw", "page/100000/{l}/lib", "raw", "<=", 1.8),
    *both("`ExecuteBatch`, {l}: lib / raw", "batch/Upsert10000/{l}/lib", "raw", "<=", 1.2),
    one("`ExecuteBatch`, disk: single calls / batch, per statement", "batch/Upsert10000/disk/single", "lib", ">=",
        100, per="statements"),
    ("`ExecuteBatch`, tmpfs: heap held / statement bytes", of("batch/Upsert10000/tmpfs/lib", "held_bytes",
                                                                "text_bytes"), "<=", 1.5),
    one("cursor walk: lib / raw", "walk/100000/memory/lib", "raw", "<=", 1.5),
    ("named lock, uncontended (ns)", of("lock/uncontended/memory/lib", "real", 1e-3), "<=", 100),
    ("named lock, 10M names: heap growth (KiB)", of("memory/names10000000/memory/lib", "growth_bytes", 1024), "<=",
     1024),
    ("`Intern` of a known name (ns)", of("intern/1thread/memory/lib", "real", 1e-3), "<=", 100),
    *both("retention, {l}: lib / raw", "cond/retention/{l}/lib", "raw", "<=", 1.3),
    *both("retention, {l}: equality / lib", "cond/retention/{l}/equality", "lib", ">=", 50),
    *both("count per type, {l}: lib / raw", "cond/count/{l}/lib", "raw", "<=", 1.3),
    *both("keyset page, {l}: lib / raw", "cond/keyset/{l}/lib", "raw", "<=", 1.8),
    *both("keyset page, {l}: offset / keyset", "cond/keyset/{l}/offset", "lib", ">=", 20),
    *both("keyset page, session, {l}: offset / keyset", "cond/keyset/{l}/sessionoffset", "session", ">=", 20),
    *both("keyset page by (ts, id), {l}: lib / raw", "cond/keysetrow/{l}/lib", "raw", "<=", 1.8),
    *both("keyset page by (ts, id) into `DATypedCursor`, {l}: lib / raw", "cond/keysetrow/{l}/typed", "raw", "<=",
          1.3),
    *both("increment a counter by key, {l}: lib / raw", "cond/increment/{l}/lib", "raw", "<=", 1.1),
    *both("unread counts per batch of 100, {l}: recount / counters", "cond/unread/{l}/recount", "counter", ">=", 20),
    *both("`AddColumn`, 100k rows, {l}: lib / raw", "schema/AddColumn100000/{l}/lib", "raw", "<=", 1.2),
    *both("`AddColumn`, 100k rows, {l}: rewrite / lib", "schema/AddColumn100000/{l}/rewrite", "lib", ">=", 100),
    *both("`Migrate` up to date, {l}: lib / empty `Select`", "schema/MigrateUpToDate/{l}/lib", "select", "<=", 2),
    *[(f"`Compact` after deleting half of 100k rows, {l}: file after / before",
       of(f"schema/Compact100000/{l}/lib", "after_bytes", "before_bytes"), "<=", 0.55) for l in LOCATIONS[:2]],
    one("session `Upsert`, disk: per call / session", "session/Upsert/disk/percall", "lib", ">=", 3),
    one("session `Upsert` unsynced, disk: per call / session", "session/Upsert/disk/percall",
        "session/UpsertUnsynced/disk/lib", ">=", 30),
    one("session `Upsert` unsynced, disk: lib / raw", "session/UpsertUnsynced/disk/lib", "raw", "<=", 1.3),
    one("session `Select` by key, tmpfs: per call / session", "session/Select/tmpfs/percall", "lib", ">=", 10),
    one("session `Select` by key, tmpfs: lib / raw", "session/Select/tmpfs/lib", "raw", "<=", 2),
    one("session empty `Select`, tmpfs: 500 tables / 1", "session/EmptySelect500/tmpfs/lib",
        "session/EmptySelect1/tmpfs/lib", "<=", 1.2),
    *both("session reads beside a writer, {l}: 2 readers' reads/s / 1 reader's", "session/Readers1/{l}/lib",
          "session/Readers2/{l}/lib", ">=", 1.5, per="rows"),
    one("`QueryEach` 200k rows, tmpfs: lib / raw typed reads", "typed/rows200000/tmpfs/lib", "raw", "<=", 1.3),
    one("`Query` into `DATypedCursor` 200k rows, tmpfs: lib / raw typed copy", "typed/rows200000/tmpfs/typedcursor",
        "rawcopy", "<=", 1.6),
    one("`DATypedCursor` 200k rows: heap held / `DACursor`'s", "typed/rows200000/tmpfs/typedheld", "dacursorheld",
        "<=", 0.4, "result_bytes"),
    one("session `Query` by key into `DATypedCursor`, tmpfs: lib / raw", "typed/bykey/tmpfs/lib", "raw", "<=", 1.3),
    one("1 MiB blob written and read per call, tmpfs: lib / raw", "typed/blob1MiB/tmpfs/lib", "raw", "<=", 2),
    one("batch of 500 inserts, unsynced session, tmpfs: lib / raw", "typed/batch500/tmpfs/lib", "raw", "<=", 1.2),
    *[(f"commit → `Wait` in another process, {w}, tmpfs: {q} (ms)", of(f"watch/latency/tmpfs/{w}", f"{q}_ms", 1),
       "<=", b) for w in ("percall", "session") for q, b in (("median", 2), ("p95", 10))],
    ("idle watcher, 10 s: wake-ups", of("watch/idle/tmpfs/lib", "wakeups", 1), "<=", 0),
    one("`Upsert` per call, disk: watched / unwatched", "watch/write/disk/watched", "unwatched", "<=", 1.1),
    one("`Upsert` unsynced session, tmpfs: watched / unwatched", "watch/sessionwrite/tmpfs/watched", "unwatched",
        "<=", 1.3),
    ("`Check` after a wake-up, 10 watched tables (µs)", of("watch/check10/tmpfs/lib", "real", 1), "<=", 50),
    ("session write meeting another process's 20 ms write (ms)", of("watch/busy/tmpfs/session", "real", 1e3), "<=",
     25),
    ("session `Search`, a word with no hit, 50k messages (ms)", of("search/NoHit50000/tmpfs/lib", "real", 1000),
     "<=", 0.1),
    one("a word with no hit, 50k messages: `Contains` / `Search`", "search/NoHit50000/tmpfs/contains", "lib", ">=",
        50),
    one("session `Search` first page of 20, best first: lib / raw FTS5", "search/FirstPage50000/tmpfs/lib", "raw",
        "<=", 1.5),
    one("`CreateSearchIndex` over 50k messages: lib / raw 'rebuild'", "search/Index50000/tmpfs/lib", "raw", "<=",
        1.3),
    one("10k inserts in batches of 100 into an indexed table: lib / raw", "search/Insert10000/tmpfs/lib", "raw",
        "<=", 1.3),
    ("session held (KiB beyond the page cache)", of("session/Select/tmpfs/lib", "held_bytes", 1024), "<=", 1024),
    *both("backup of 53k messages beside a writer, {l}: lib / raw `backup_step(-1)`", "safety/Backup53000/{l}/lib",
          "raw", "<=", 2),
    *[(f"backup, {l}: the writer's longest commit (ms)", of(f"safety/Backup53000/{l}/lib", "writer_wait_ms", 1), "<=",
       50) for l in LOCATIONS[:2]],
    *[(f"salvage, one damaged page, {l}: rows not on it and not recovered", lambda r, c=f"safety/Salvage53000/{l}/lib":
       r(c, "rows_not_on_page") - r(c, "rows_recovered"), "<=", 0) for l in LOCATIONS[:2]],
    *both("salvage, {l}: lib / a full `Query`", "safety/Salvage53000/{l}/lib", "query", "<=", 3),
    *both("quick check, {l}: lib / raw", "safety/QuickCheck53000/{l}/lib", "raw", "<=", 1.2),
]


def load(path):
    """Every repetition of every result: name -> list of {metric: value}."""
    data, samples = json.load(open(path)), defaultdict(list)
    for run in data["benchmarks"]:
        if run.get("run_type") == "iteration" and not run.get("error_occurred"):
            sample = {k: v for k, v in run.items() if k in ("rows", "statements", "wakeups") or k.endswith(("_bytes", "_ms"))
                      or k.startswith("rows_")}
            sample["real"] = run["real_time"] * {"ns": 1e-3, "us": 1.0, "ms": 1e3, "s": 1e6}[run["time_unit"]]
            samples["/".join(run["run_name"].split("/")[:4])].append(sample)
    return data.get("context", {}), samples


def median(runs, metric="real"):
    return statistics.median(run[metric] for run in runs)


def cell(runs):
    """The median, ± half the range over the repetitions, and per row."""
    real, us = [run["real"] for run in runs], median(runs)
    text = f"{us / 1000:.2f} ms" if us >= 1000 else f"{us:.1f} µs" if us >= 1 else f"{us * 1000:.1f} ns"
    text += f" ±{(max(real) - min(real)) / 2 / us * 100:.0f} %" if len(runs) > 1 else ""
    return text + (f" ({us * 1000 / runs[0]['rows']:.0f} ns/row)" if runs[0].get("rows", 1) > 1 else "")


def table(title, prefixes, samples):
    """A row per case and location, a column per impl, lib / the first baseline, the counters."""
    rows, order = defaultdict(dict), ["lib", "raw", "sqlitecpp"]
    for name, runs in samples.items():
        section, case, location, impl = name.split("/")
        if section in prefixes:
            key = (prefixes.index(section), int(re.sub(r"\D", "", case) or 0), case, LOCATIONS.index(location))
            rows[key][impl] = runs
    impls = sorted({i for by in rows.values() for i in by}, key=lambda i: (order.index(i) if i in order else 3, i))
    base = next((i for i in impls if i != "lib"), "—")
    lines = [f"### {title}", "", f"| case | location | {' | '.join(impls)} | lib / {base} | counters |",
             "|---" * (len(impls) + 4) + "|"]
    for (section, _, case, location), by in sorted(rows.items()):
        share = f"{median(by['lib']) / median(by[base]):.3f}" if "lib" in by and base in by else "—"
        counted = {i: ", ".join(f"{k} {v:,.0f}" for k, v in sorted(runs[0].items()) if k not in ("real", "rows"))
                   for i, runs in by.items()}
        counters = "; ".join(f"{i}: {counted[i]}" for i in impls if counted.get(i))
        cells = " | ".join(cell(by[i]) if i in by else "—" for i in impls)
        lines.append(f"| `{prefixes[section]}/{case}` | {LOCATIONS[location]} | {cells} | {share} | {counters or '—'} |")
    return lines + [""] if rows else []


def summary(samples):
    lines = ["### Summary against the targets", "", "| target | value | bound | met? |", "|---|---|---|---|"]
    for what, value, op, bound in TARGETS:
        counts = []

        def at(index):
            def r(name, metric="real"):
                runs = samples[name] if samples.get(name) else {}[name]  # KeyError: not run
                counts.append(len(runs))
                return median(runs, metric) if index is None else runs[index % len(runs)][metric]
            return r

        try:
            middle = value(at(None))
            ok = [(v <= bound) == (op == "<=") or v == bound for v in (value(at(i)) for i in range(max(counts)))]
        except (KeyError, ZeroDivisionError):
            continue
        verdict = "yes" if all(ok) else "**no**" if not any(ok) else f"open: {sum(ok)} of {len(ok)} repetitions"
        lines.append(f"| {what} | {middle:.3f} | {'≤' if op == '<=' else '≥'} {bound} | {verdict} |")
    return lines + [""]


def plot(samples, png):
    """Time per row against rows of the typed reads on tmpfs, one line per impl, drawn by gnuplot."""
    impls = {"raw": "raw SQLite", "lib": "QueryEach", "typedcursor": "DATypedCursor", "dacursor": "DACursor"}
    data = ""
    for impl in impls:
        points = sorted((runs[0]["rows"], median(runs) * 1000 / runs[0]["rows"]) for name, runs in samples.items()
                        if re.fullmatch(rf"typed/rows\d+/tmpfs/{impl}", name))
        data += "".join(f"{rows} {ns}\n" for rows, ns in points) + "e\n"
    if shutil.which("gnuplot") and re.search(r"\d", data):
        subprocess.run(["gnuplot"], text=True, check=True, input=(
            f'set terminal png size 800,480; set output "{png}"; set logscale xy; set grid; set key top left; '
            'set xrange [700:1.4e6]; set format x "%.0f"; set xlabel "rows"; '
            'set ylabel "ns per row (typed read of every value, tmpfs)"; plot '
            + ", ".join(f'"-" with linespoints lw 2 title "{title}"' for title in impls.values()) + "\n" + data))


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("--bench", required=True, help="Google Benchmark's JSON output")
    parser.add_argument("--doc", required=True, help="the report to rewrite")
    args = parser.parse_args()
    context, samples = load(args.bench)
    cpu = next((line.split(":", 1)[1].strip() for line in open("/proc/cpuinfo") if line.startswith("model name")), "?")
    versions = [context.get("sqlite_version", "?")] + [subprocess.run(
        ["dpkg-query", "-W", "-f=${Version}", p], capture_output=True, text=True).stdout or "?"
        for p in ("libbenchmark-dev", "libsqlitecpp-dev")]
    machine = [("CPU", f"{cpu}, {os.cpu_count()} cores"), ("Kernel", platform.release()),
               ("Compiler", f"GCC {context.get('compiler', '?')}, Release (-O3)"),
               ("SQLite, Google Benchmark, SQLiteCpp", ", ".join(versions)),
               ("Data", "tmpfs: a fresh folder on tmpfs; disk: one under the build folder; both removed after the run"),
               ("Run", context.get("date", "?"))]
    lines = ["## Results", "", "Generated by `scripts/bench.sh`; do not edit by hand. Times are medians of the "
             "repetitions, ± half their range.", "", "### Machine", "", "| | |", "|---|---|"]
    lines += [f"| {k} | {v} |" for k, v in machine] + [""] + summary(samples)
    for title, prefixes in SECTIONS:
        lines += table(title, prefixes, samples)
    text = re.sub(re.escape(BEGIN) + ".*?" + re.escape(END), lambda _: "\n".join([BEGIN, *lines, END]),
                  open(args.doc).read(), flags=re.S)
    open(args.doc, "w").write(text)
    plot(samples, os.path.join(os.path.dirname(os.path.abspath(args.doc)), "typed-reads.png"))


if __name__ == "__main__":
    main()
