#!/usr/bin/env python3
"""Rewrites the results in docs/benchmarks.md from Google Benchmark's JSON output.
Targets are judged on each repetition: "yes" when all meet one, "no" when none does, "open" otherwise."""

import argparse
import json
import os
import platform
import re
import statistics
import subprocess
from collections import defaultdict

BEGIN, END = "<!-- results:begin -->", "<!-- results:end -->"
LOCATIONS = ("tmpfs", "disk", "memory")

# (title, section prefixes, what is measured): one table each.
SECTIONS = [
    ("Write operations", ["write"], "Per call: open, one statement, close. Raw: the same path and statement text "
     "through `sqlite3_open` / `sqlite3_exec` / `sqlite3_close`."),
    ("Batches", ["batch"], "10,000 upserts filled as requests and run by one `ExecuteBatch`; raw builds the same "
     "texts and runs them in one `BEGIN IMMEDIATE`/`COMMIT`; single: one `Upsert` call each (on disk 500 of them, "
     "counter `statements`). `held_bytes`: the heap a filled batch holds, `text_bytes`: its statements' bytes."),
    ("Queries", ["select", "join", "page", "exist"], "The result in a `DACursor` against raw `sqlite3_prepare_v2` + "
     "`sqlite3_step` and SQLiteCpp copying every value of the same statement as text into one vector per column; "
     "each call opens, reads, closes and frees its result. `page`: rows 1,001–1,100 of 100,000 by the indexed key, "
     "`selectall` the whole table. `result_bytes`: the heap one result holds while alive."),
    ("Reading a cursor", ["walk"], "`MoveToNext` over 100,000 rows with `GetInt`, `GetInt`, `GetDouble`, "
     "`GetString` per row, against the same reads (`std::istringstream`) from the raw column vectors."),
    ("Names", ["lock", "intern", "memory"], "A `DAMutex` named like the library's made, locked, unlocked and "
     "destroyed, against a global `std::mutex`; `DAColumnName::Intern` of a known name (time per call of each "
     "thread); 10,000,000 distinct lock names coming and going (`growth_bytes`: the heap they leave behind)."),
    ("Conditions", ["cond"], "100,000 events, `ts` indexed: a retention delete of the oldest 20 % by a range "
     "(`equality`: read all, filter, a batch of deletes by key), a count per type, a keyset page of 50 (`offset`: "
     "the same page at offset 50,000; `session`, `sessionoffset`: both pages through a `DASession` holding the "
     "file); raw runs the same statement text."),
    ("Schema", ["schema"], "A column added to a 100,000-row table: `AddColumn` against the same `ALTER TABLE` raw "
     "and `rewrite` (every row copied into a new table with the column, in one transaction); `Migrate` of a file "
     "already at the step's version against `Select` of an empty table; `Compact` after deleting the older half of "
     "100,000 rows (`before_bytes`, `after_bytes`: the file)."),
    ("Sessions", ["session"], "A `DASession` held open (lib) against the same request per call (percall, a "
     "rollback-journal file) and a raw connection held open in WAL mode running the same text (raw) or reusing "
     "one prepared statement (rawkept); `Readers1`/"
     "`Readers2`: pages of 50 rows read beside a writer going flat out (rows: the reads of one second). `held_bytes`: the "
     "heap an open session holds beyond SQLite's page cache."),
]


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
    *both("keyset page through a session, {l}: offset / keyset", "cond/keyset/{l}/sessionoffset", "session", ">=",
          20),
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
    ("session held (KiB beyond the page cache)", of("session/Select/tmpfs/lib", "held_bytes", 1024), "<=", 1024),
]


def load(path):
    """Every repetition of every result: name -> list of {metric: value}."""
    data, samples = json.load(open(path)), defaultdict(list)
    for run in data["benchmarks"]:
        if run.get("run_type") == "iteration" and not run.get("error_occurred"):
            unit = {"ns": 1e-3, "us": 1.0, "ms": 1e3, "s": 1e6}[run["time_unit"]]
            sample = {k: v for k, v in run.items() if k in ("rows", "statements") or k.endswith("_bytes")}
            sample["real"] = run["real_time"] * unit
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


def table(title, prefixes, text, samples):
    """A row per case and location, a column per impl, lib / the first baseline, the counters."""
    rows, impls = defaultdict(dict), set()
    for name, runs in samples.items():
        section, case, location, impl = name.split("/")
        if section in prefixes:
            number = int(re.sub(r"\D", "", case) or 0)
            rows[(prefixes.index(section), number, case, LOCATIONS.index(location))][impl] = runs
            impls.add(impl)
    order = ["lib", "raw", "sqlitecpp"]
    impls = sorted(impls, key=lambda i: (order.index(i) if i in order else len(order), i))
    base = next((i for i in impls if i != "lib"), "—")
    lines = [f"### {title}", "", text, "", f"| case | location | {' | '.join(impls)} | lib / {base} | counters |",
             "|---" * (len(impls) + 4) + "|"]
    for (section, _, case, location), by in sorted(rows.items()):
        share = f"{median(by['lib']) / median(by[base]):.3f}" if "lib" in by and base in by else "—"
        counted = {impl: {k: v for k, v in runs[0].items() if k not in ("real", "rows")} for impl, runs in by.items()}
        counters = "; ".join(f"{impl}: " + ", ".join(f"{k} {v:,.0f}" for k, v in sorted(counted[impl].items()))
                             for impl in impls if counted.get(impl))
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


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--bench", required=True, help="Google Benchmark's JSON output")
    parser.add_argument("--doc", required=True, help="the report to rewrite")
    args = parser.parse_args()
    context, samples = load(args.bench)
    cpu = next((line.split(":", 1)[1].strip() for line in open("/proc/cpuinfo") if line.startswith("model name")), "?")
    version = lambda package: subprocess.run(["dpkg-query", "-W", "-f=${Version}", package], capture_output=True,
                                             text=True, check=False).stdout or "?"
    lines = ["## Results", "", "Generated by `scripts/bench.sh`; do not edit by hand. Times are medians of the "
             "repetitions, ± half their range.", "", "### Machine", "", "| | |", "|---|---|",
             f"| CPU | {cpu}, {os.cpu_count()} cores |", f"| Kernel | {platform.release()} |",
             f"| Compiler | GCC {context.get('compiler', '?')}, Release (-O3) |",
             f"| SQLite, Google Benchmark, SQLiteCpp | {context.get('sqlite_version', '?')}, "
             f"{version('libbenchmark-dev')}, {version('libsqlitecpp-dev')} |",
             "| Data | tmpfs: a fresh folder on tmpfs; disk: one under the build folder; both removed after the run |",
             f"| Run | {context.get('date', '?')} |", ""] + summary(samples)
    for title, prefixes, text in SECTIONS:
        lines += table(title, prefixes, text, samples)
    text = open(args.doc).read()
    with open(args.doc, "w") as handle:
        handle.write(re.sub(re.escape(BEGIN) + ".*?" + re.escape(END),
                            lambda _: BEGIN + "\n" + "\n".join(lines) + "\n" + END, text, flags=re.S))


if __name__ == "__main__":
    main()
