#!/usr/bin/env python3
"""Turns the benchmark JSON and the memory probes into docs/benchmarks.md.

Only the part between the markers "<!-- results:begin -->" and
"<!-- results:end -->" is rewritten; the prose around it is kept. The plot
docs/img/select_per_row.png is drawn with gnuplot.
"""

import argparse
import json
import os
import platform
import re
import statistics
import subprocess
from collections import defaultdict

BEGIN = "<!-- results:begin -->"
END = "<!-- results:end -->"

WRITE_TARGET = 1.05
SELECT_TARGET = 1.3
LINEAR_TARGET = 1.2
WALK_TARGET = 1.5
LOCK_TARGET_NS = 100.0
LOCK_MEMORY_BOUND_KIB = 1024
CURSOR_MEMORY_TARGET = 1.1
PAGE_SPEEDUP_TARGET = 100.0
PAGE_RAW_TARGET = 1.8
INTERN_TARGET_NS = 100.0
BATCH_TARGET = 1.2
BATCH_SINGLE_TARGET = 100.0
BATCH_MEMORY_TARGET = 1.5

UNIT_TO_US = {"ns": 1e-3, "us": 1.0, "ms": 1e3, "s": 1e6}


def load_bench(path):
    """Median over repetitions per (group, case, location, impl)."""
    with open(path) as handle:
        data = json.load(handle)
    samples = defaultdict(list)
    items = defaultdict(list)
    held = defaultdict(list)
    for run in data["benchmarks"]:
        if run.get("run_type") != "iteration" or run.get("error_occurred"):
            continue
        parts = run["run_name"].split("/")
        key = tuple(parts[:4])
        samples[key].append(run["real_time"] * UNIT_TO_US[run["time_unit"]])
        if "items_per_second" in run:
            items[key].append(run["items_per_second"])
        if "result_bytes" in run:
            held[key].append(run["result_bytes"])
    times = {key: statistics.median(values) for key, values in samples.items()}
    rates = {key: statistics.median(values) for key, values in items.items()}
    spread = {key: (min(values), max(values), len(values)) for key, values in samples.items()}
    result_bytes = {key: statistics.median(values) for key, values in held.items()}
    return data.get("context", {}), times, rates, spread, result_bytes


def load_batch(path):
    """Median real and CPU time and counters of the batch cases per (case, location, impl)."""
    with open(path) as handle:
        data = json.load(handle)
    runs = defaultdict(lambda: defaultdict(list))
    for run in data["benchmarks"]:
        parts = run["run_name"].split("/")
        if run.get("run_type") != "iteration" or run.get("error_occurred") or parts[0] != "batch":
            continue
        values = runs[tuple(parts[1:4])]
        values["real"].append(run["real_time"] * UNIT_TO_US[run["time_unit"]])
        values["cpu"].append(run["cpu_time"] * UNIT_TO_US[run["time_unit"]])
        for name in ("statements", "held_bytes", "text_bytes"):
            if name in run:
                values[name].append(run[name])
    return {key: {name: statistics.median(v) for name, v in values.items()} for key, values in runs.items()}


def batch_tables(batch):
    """The batch section and its summary rows; times scaled to the case's N statements."""
    lines, summary = [], []
    if not batch:
        return lines, summary
    lines += ["### Batches", "",
              "N upserts through one `ExecuteBatch` (filling the requests and the batch included) against raw "
              "SQLite building the same texts and running them with `sqlite3_exec` inside one "
              "`BEGIN IMMEDIATE`/`COMMIT`, and against single `Upsert` calls. Single calls on disk run fewer "
              "statements (counter `statements`); their time is scaled to N. Median real time (CPU time in "
              "brackets).", "",
              "| case | location | batch | raw one transaction | batch / raw | single calls (scaled) | "
              "single / batch | held / text bytes |", "|---|---|---|---|---|---|---|---|"]
    for (case, loc, impl), lib in sorted(batch.items()):
        if impl != "lib":
            continue
        raw, single = batch.get((case, loc, "raw")), batch.get((case, loc, "single"))
        n = lib["statements"]
        ratio = lib["real"] / raw["real"] if raw else None
        scaled = single["real"] * n / single["statements"] if single else None
        memory = lib["held_bytes"] / lib["text_bytes"] if lib.get("text_bytes") else None
        lines.append(f"| `{case}` | {loc} | {fmt_time(lib['real'])} ({fmt_time(lib['cpu'])}) | "
                     + (f"{fmt_time(raw['real'])} ({fmt_time(raw['cpu'])}) | {ratio:.3f} | " if raw else "— | — | ")
                     + (f"{fmt_time(scaled)} ({single['statements']:.0f} run) | {scaled / lib['real']:.0f} | "
                        if single else "— | — | ")
                     + (f"{lib['held_bytes']:.0f} / {lib['text_bytes']:.0f} = {memory:.3f} |" if memory else "— |"))
        if ratio is not None:
            summary.append((f"`ExecuteBatch` {case}, {loc}", fmt_time(lib["real"]), f"raw {fmt_time(raw['real'])}",
                            f"{ratio:.3f}", f"≤ {BATCH_TARGET} × raw", ratio <= BATCH_TARGET))
        if scaled is not None and loc == "disk":
            summary.append((f"`ExecuteBatch` {case} against single calls, disk", fmt_time(lib["real"]),
                            f"single {fmt_time(scaled)}", f"{scaled / lib['real']:.0f}",
                            f"≥ {BATCH_SINGLE_TARGET:.0f} × faster", scaled / lib["real"] >= BATCH_SINGLE_TARGET))
        if memory is not None and loc == "tmpfs":
            summary.append((f"batch memory, {case}", f"{lib['held_bytes'] / 1024:.0f} KiB",
                            f"texts {lib['text_bytes'] / 1024:.0f} KiB", f"{memory:.3f}",
                            f"≤ {BATCH_MEMORY_TARGET} × texts", memory <= BATCH_MEMORY_TARGET))
    lines.append("")
    return lines, summary


def load_memory(path):
    records = []
    with open(path) as handle:
        for line in handle:
            line = line.strip()
            if line:
                records.append(json.loads(line))
    return records


def command_output(command):
    try:
        return subprocess.run(command, capture_output=True, text=True, check=False).stdout.strip()
    except OSError:
        return ""


def data_folder(text, build):
    """A benchmark data folder as the report shows it: under the build
    directory as BUILD_DIR/..., so no machine's own path gets into the
    report; a folder elsewhere by its name only, /dev/shm excepted."""
    path, bracket, rest = text.partition(" [")
    build = os.path.realpath(build)
    if os.path.realpath(path).startswith(build + os.sep):
        path = "BUILD_DIR/" + os.path.relpath(os.path.realpath(path), build)
    elif not path.startswith("/dev/shm/"):
        path = os.path.basename(path)
    return path + bracket + rest


def machine(context, build):
    cpu = "unknown"
    with open("/proc/cpuinfo") as handle:
        for line in handle:
            if line.startswith("model name"):
                cpu = line.split(":", 1)[1].strip()
                break
    compiler = "unknown"
    cache = os.path.join(build, "CMakeCache.txt")
    if os.path.exists(cache):
        with open(cache) as handle:
            for line in handle:
                if line.startswith("CMAKE_CXX_COMPILER:"):
                    path = line.split("=", 1)[1].strip()
                    compiler = command_output([path, "--version"]).splitlines()[0]
    versions = {}
    for package in ("libbenchmark-dev", "libsqlitecpp-dev"):
        versions[package] = command_output(["dpkg-query", "-W", "-f=${Version}", package]) or "?"
    return [
        ("CPU", cpu),
        ("Cores", str(os.cpu_count())),
        ("Kernel", platform.release()),
        ("Compiler", compiler + ", Release (-O3)"),
        ("SQLite", context.get("sqlite_version", "?")),
        ("Google Benchmark", versions["libbenchmark-dev"]),
        ("SQLiteCpp", versions["libsqlitecpp-dev"]),
        ("tmpfs folder", data_folder(context.get("ulo_dir_tmpfs", "?"), build)),
        ("disk folder", data_folder(context.get("ulo_dir_disk", "?"), build)),
        ("Run", context.get("date", "?")),
    ]


def fmt_time(us):
    if us >= 1000:
        return f"{us / 1000:.2f} ms"
    if us >= 1:
        return f"{us:.1f} µs"
    return f"{us * 1000:.1f} ns"


def verdict(ok):
    return "yes" if ok else "**no**"


def page_tables(times, result_bytes, locations):
    """The paged-query and column-name sections, and their summary rows."""
    lines, summary = [], []
    rows = []
    for loc in locations:
        key = ("page", "100000", loc)
        lib, raw, whole = (times.get(key + (impl,)) for impl in ("lib", "raw", "selectall"))
        if None not in (lib, raw, whole):
            rows.append((loc, lib, raw, whole, result_bytes.get(key + ("lib",)), result_bytes.get(key + ("selectall",))))
    if rows:
        lines += ["### Paged queries", "",
                  "Rows 1,001–1,100 of the 100,000-row table by its indexed key (`ORDER BY id LIMIT 100 OFFSET "
                  "1000`): `Query` into a `DACursor`; raw: the same statement text through `sqlite3_prepare_v2` + "
                  "`sqlite3_step` copying every value as text; and `Select` of the whole table, what a caller had "
                  "to do before `Query`. Each opens, reads, closes and frees its result. *Held* is the heap the "
                  "result occupies while alive (`mallinfo2`).", "",
                  "| location | `Query` page | raw page | `Select` all | all / page | page / raw | held: page / all |",
                  "|---|---|---|---|---|---|---|"]
        kib = lambda b: f"{b / 1024:.1f} KiB" if b is not None and b < 1 << 20 else (
            f"{b / (1 << 20):.1f} MiB" if b is not None else "—")
        for loc, lib, raw, whole, page_held, all_held in rows:
            lines.append(f"| {loc} | {fmt_time(lib)} | {fmt_time(raw)} | {fmt_time(whole)} | {whole / lib:.0f} × | "
                         f"{lib / raw:.3f} | {kib(page_held)} / {kib(all_held)} |")
            summary.append((f"`Query` page of 100k, {loc}", fmt_time(lib), f"`Select` all {fmt_time(whole)}",
                            f"{whole / lib:.0f} ×", f"≥ {PAGE_SPEEDUP_TARGET:.0f} × faster",
                            whole / lib >= PAGE_SPEEDUP_TARGET))
            summary.append((f"`Query` page vs raw, {loc}", fmt_time(lib), f"raw {fmt_time(raw)}", f"{lib / raw:.3f}",
                            f"≤ {PAGE_RAW_TARGET} × raw", lib / raw <= PAGE_RAW_TARGET))
        lines.append("")
    interned = [(threads, times.get(("intern", "existing", "memory", threads))) for threads in ("1", "2")]
    if interned[0][1] is not None:
        lines += ["### Column names", "",
                  "`DAColumnName::Intern` of a name interned before (a shared lock and a hash lookup), from one "
                  "thread and from two at once (wall time per call of each thread, 2 cores).", "",
                  "| threads | per call | target |", "|---|---|---|"]
        for threads, us in interned:
            if us is not None:
                target = f"< {INTERN_TARGET_NS:.0f} ns" if threads == "1" else "—"
                lines.append(f"| {threads} | {us * 1000:.1f} ns | {target} |")
        lines.append("")
        ns = interned[0][1] * 1000
        summary.append(("`Intern` of a known name", f"{ns:.1f} ns", "—", "—", f"< {INTERN_TARGET_NS:.0f} ns",
                        ns < INTERN_TARGET_NS))
    return lines, summary


def build_tables(times, rates, spread, memory, result_bytes=None, batch=None):
    lines = []
    summary = []
    locations = [loc for loc in ("tmpfs", "disk") if any(k[2] == loc for k in times)]

    # Writes.
    lines += ["### Write operations", "",
              "Per call: open, execute one statement, close. Raw: the same path and statement text through "
              "`sqlite3_open` / `sqlite3_exec` / `sqlite3_close`. Median of the repetitions (min–max in brackets).",
              "", "| case | location | library | raw SQLite | ratio | target | met? |", "|---|---|---|---|---|---|---|"]
    for loc in locations:
        for case in ("Upsert", "Update", "Delete", "CreateTable", "DropTable"):
            lib, raw = times.get(("write", case, loc, "lib")), times.get(("write", case, loc, "raw"))
            if lib is None or raw is None:
                continue
            ratio = lib / raw
            target = f"≤ {WRITE_TARGET}" if loc == "tmpfs" else "—"
            met = verdict(ratio <= WRITE_TARGET) if loc == "tmpfs" else "—"
            lo, hi, _ = spread[("write", case, loc, "lib")]
            rlo, rhi, _ = spread[("write", case, loc, "raw")]
            lines.append(f"| `{case}` | {loc} | {fmt_time(lib)} ({fmt_time(lo)}–{fmt_time(hi)}) | "
                         f"{fmt_time(raw)} ({fmt_time(rlo)}–{fmt_time(rhi)}) | {ratio:.3f} | {target} | {met} |")
            if loc == "tmpfs":
                summary.append((f"`{case}`, tmpfs", fmt_time(lib), f"raw {fmt_time(raw)}", f"{ratio:.3f}",
                                f"≤ {WRITE_TARGET} × raw", ratio <= WRITE_TARGET))
    lines.append("")

    # Queries.
    lines += ["### Queries", "",
              "`Select` of N rows (four columns: integer, integer, real, text) into a `DACursor`; raw: "
              "`sqlite3_prepare_v2` + `sqlite3_step`, every value copied as text into one "
              "`std::vector<std::string>` per column; SQLiteCpp: the same copy through `SQLite::Statement`. "
              "Each includes open, close and freeing the result.", "",
              "| case | location | library | raw SQLite | SQLiteCpp | lib / raw | lib / SQLiteCpp | per row (lib, raw, SQLiteCpp) |",
              "|---|---|---|---|---|---|---|---|"]
    per_row = defaultdict(dict)
    sizes = sorted({int(k[1]) for k in times if k[0] == "select"})
    for loc in locations:
        for group, size in [("select", n) for n in sizes] + [("join", 100000)]:
            key = (group, str(size), loc)
            lib, raw, cpp = (times.get(key + (impl,)) for impl in ("lib", "raw", "sqlitecpp"))
            if None in (lib, raw, cpp):
                continue
            name = f"`Select` {size:,}" if group == "select" else f"`JoinSelect` {size:,}"
            rows = [t * 1000 / size for t in (lib, raw, cpp)]
            if group == "select":
                per_row[loc][size] = rows
            lines.append(f"| {name} | {loc} | {fmt_time(lib)} | {fmt_time(raw)} | {fmt_time(cpp)} | "
                         f"{lib / raw:.3f} | {lib / cpp:.3f} | {rows[0]:.0f} / {rows[1]:.0f} / {rows[2]:.0f} ns |")
            if group == "select" and size == 100000:
                ok = lib / raw <= SELECT_TARGET and lib <= cpp
                summary.append((f"`Select` 100k, {loc}", fmt_time(lib),
                                f"raw {fmt_time(raw)}, SQLiteCpp {fmt_time(cpp)}",
                                f"{lib / raw:.3f} / {lib / cpp:.3f}", f"≤ {SELECT_TARGET} × raw and ≤ SQLiteCpp", ok))
    for loc in locations:
        lib, raw = times.get(("exist", "CheckExistTable", loc, "lib")), times.get(("exist", "CheckExistTable", loc, "raw"))
        if lib is not None and raw is not None:
            lines.append(f"| `CheckExistTable` | {loc} | {fmt_time(lib)} | {fmt_time(raw)} | — | {lib / raw:.3f} | — | — |")
    lines.append("")

    # Linearity.
    lines += ["### `Select` time per row against N", "",
              "![Select time per row](img/select_per_row.png)", "",
              "| location | impl | " + " | ".join(f"{n:,}" for n in sizes) + " | 1M / 10k |",
              "|---|---|" + "---|" * len(sizes) + "---|"]
    for loc in locations:
        for index, impl in enumerate(("library", "raw SQLite", "SQLiteCpp")):
            values = [per_row[loc].get(n, [None] * 3)[index] for n in sizes]
            growth = None
            if 1000000 in per_row[loc] and 10000 in per_row[loc]:
                growth = per_row[loc][1000000][index] / per_row[loc][10000][index]
            cells = " | ".join(f"{v:.0f} ns" if v is not None else "—" for v in values)
            lines.append(f"| {loc} | {impl} | {cells} | {growth:.3f} |" if growth else f"| {loc} | {impl} | {cells} | — |")
            if index == 0 and growth is not None:
                summary.append((f"`Select` per row 1M vs 10k, {loc}", f"{per_row[loc][1000000][0]:.0f} vs "
                                f"{per_row[loc][10000][0]:.0f} ns", "—", f"{growth:.3f}", f"≤ {LINEAR_TARGET}",
                                growth <= LINEAR_TARGET))
    lines.append("")

    # Walk.
    lib, raw = times.get(("walk", "100000", "memory", "lib")), times.get(("walk", "100000", "memory", "raw"))
    if lib is not None and raw is not None:
        lines += ["### Reading a cursor", "",
                  "A full `MoveToNext` walk over 100,000 rows with `GetInt`, `GetInt`, `GetDouble`, `GetString` per "
                  "row, against the same values read from the raw column vectors with the same conversions "
                  "(`std::istringstream` extraction, string assignment). In memory; no file is touched.", "",
                  "| case | library | raw vectors | ratio | per value (lib, raw) |", "|---|---|---|---|---|",
                  f"| walk 100k × 4 | {fmt_time(lib)} | {fmt_time(raw)} | {lib / raw:.3f} | "
                  f"{lib * 1000 / 400000:.0f} / {raw * 1000 / 400000:.0f} ns |", ""]
        summary.append(("cursor walk, typed reads", fmt_time(lib), f"raw {fmt_time(raw)}", f"{lib / raw:.3f}",
                        f"≤ {WALK_TARGET} × raw", lib / raw <= WALK_TARGET))

    # Locks.
    lock_rows = []
    for case, label in (("uncontended", "uncontended"), ("4threads", "4 threads, one name")):
        lib, std = rates.get(("lock", case, "memory", "lib")), rates.get(("lock", case, "memory", "stdmutex"))
        if lib and std:
            lock_rows.append((label, 1e9 / lib, 1e9 / std))
    if lock_rows:
        lines += ["### The named lock", "",
                  "`DAMutex` made, locked, unlocked and destroyed; reference: lock and unlock of one global "
                  "`std::mutex`. Under 4 threads the time is wall time per operation of all threads together "
                  "(2 cores).", "",
                  "| case | `DAMutex` | `std::mutex` | target |", "|---|---|---|---|"]
        for label, lib_ns, std_ns in lock_rows:
            target = f"< {LOCK_TARGET_NS:.0f} ns" if label == "uncontended" else "—"
            lines.append(f"| {label} | {lib_ns:.1f} ns | {std_ns:.1f} ns | {target} |")
            if label == "uncontended":
                summary.append(("named lock, uncontended", f"{lib_ns:.1f} ns", f"std::mutex {std_ns:.1f} ns", "—",
                                f"< {LOCK_TARGET_NS:.0f} ns", lib_ns < LOCK_TARGET_NS))
        lines.append("")

    # Memory.
    cursor_rows = [m for m in memory if m.get("mode") in ("cursor", "raw", "sqlitecpp")]
    if cursor_rows:
        lines += ["### Memory", "",
                  "Resident memory of 1,000,000 rows × 4 values, each measured in a fresh process "
                  "(`/proc/self/status`): *peak* is VmHWM after the query minus VmRSS before it, *held* is VmRSS with "
                  "the result alive minus the same. Both include SQLite's page cache while the query runs.", "",
                  "| location | library cursor peak / held | raw vectors peak / held | SQLiteCpp peak / held | "
                  "cursor / raw (peak) | cursor / raw (held) |", "|---|---|---|---|---|---|"]
        by = {(m["location"], m["mode"]): m for m in cursor_rows}
        for loc in locations:
            cur, raw, cpp = by.get((loc, "cursor")), by.get((loc, "raw")), by.get((loc, "sqlitecpp"))
            if not cur or not raw:
                continue
            mib = lambda kib: f"{kib / 1024:.1f} MiB"
            cpp_cell = f"{mib(cpp['peak_kib'])} / {mib(cpp['held_kib'])}" if cpp else "—"
            peak_ratio = cur["peak_kib"] / raw["peak_kib"]
            held_ratio = cur["held_kib"] / raw["held_kib"]
            lines.append(f"| {loc} | {mib(cur['peak_kib'])} / {mib(cur['held_kib'])} | "
                         f"{mib(raw['peak_kib'])} / {mib(raw['held_kib'])} | {cpp_cell} | {peak_ratio:.3f} | "
                         f"{held_ratio:.3f} |")
            summary.append((f"1M-row cursor memory, {loc}", mib(cur["peak_kib"]), f"raw {mib(raw['peak_kib'])}",
                            f"{peak_ratio:.3f}", f"≤ {CURSOR_MEMORY_TARGET} × raw", peak_ratio <= CURSOR_MEMORY_TARGET))
        lines.append("")
    locks = [m for m in memory if m.get("mode") == "locks"]
    if locks:
        record = locks[0]
        samples = record["samples"]
        lines += [f"Named lock memory: {record['names']:,} distinct names made, locked, unlocked and destroyed in "
                  "one process; resident memory growth over the start, sampled every 10%:", "",
                  "| names | " + " | ".join(f"{n // 1000000}M" for n, _ in samples) + " |",
                  "|---|" + "---|" * len(samples),
                  "| growth (KiB) | " + " | ".join(str(kib) for _, kib in samples) + " |", ""]
        growth = max(kib for _, kib in samples)
        summary.append((f"named lock memory, {record['names'] // 1000000}M names", f"+{growth} KiB", "—", "—",
                        f"bounded (≤ {LOCK_MEMORY_BOUND_KIB} KiB, no trend)",
                        growth <= LOCK_MEMORY_BOUND_KIB and samples[-1][1] - samples[0][1] <= 64))

    page_lines, page_summary = page_tables(times, result_bytes or {}, locations)
    lines += page_lines
    summary += page_summary
    batch_lines, batch_summary = batch_tables(batch)
    lines += batch_lines
    summary += batch_summary

    head = ["### Summary against the targets", "",
            "| case | library | baseline(s) | ratio | target | met? |", "|---|---|---|---|---|---|"]
    for case, lib, base, ratio, target, ok in summary:
        head.append(f"| {case} | {lib} | {base} | {ratio} | {target} | {verdict(ok)} |")
    head.append("")
    return head + lines, per_row


def plot(per_row, img_dir):
    os.makedirs(img_dir, exist_ok=True)
    data_path = os.path.join(img_dir, ".select_per_row.dat")
    with open(data_path, "w") as handle:
        for loc in ("tmpfs", "disk"):
            handle.write(f"# {loc}: rows lib raw sqlitecpp (ns per row)\n")
            for size in sorted(per_row.get(loc, {})):
                lib, raw, cpp = per_row[loc][size]
                handle.write(f"{size} {lib:.2f} {raw:.2f} {cpp:.2f}\n")
            handle.write("\n\n")
    png = os.path.join(img_dir, "select_per_row.png")
    script = f"""
set terminal pngcairo size 900,560 noenhanced font ',11'
set output '{png}'
set title 'Select: time per row against N (lower is better)'
set logscale x
set xlabel 'rows selected (N)'
set ylabel 'ns per row (4 values)'
set key top right
set grid
set yrange [0:*]
plot '{data_path}' index 0 using 1:2 with linespoints lw 2 title 'library, tmpfs', \\
     '' index 0 using 1:3 with linespoints lw 2 title 'raw SQLite, tmpfs', \\
     '' index 0 using 1:4 with linespoints lw 2 title 'SQLiteCpp, tmpfs', \\
     '' index 1 using 1:2 with linespoints dt 2 lw 2 title 'library, disk', \\
     '' index 1 using 1:3 with linespoints dt 2 lw 2 title 'raw SQLite, disk', \\
     '' index 1 using 1:4 with linespoints dt 2 lw 2 title 'SQLiteCpp, disk'
"""
    try:
        subprocess.run(["gnuplot"], input=script, text=True, check=True)
    except (OSError, subprocess.CalledProcessError) as error:
        print(f"gnuplot failed: {error}")
    finally:
        os.remove(data_path)


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("--bench", required=True)
    parser.add_argument("--memory", required=True)
    parser.add_argument("--build", required=True)
    parser.add_argument("--doc", required=True)
    parser.add_argument("--img", required=True)
    args = parser.parse_args()

    context, times, rates, spread, result_bytes = load_bench(args.bench)
    memory = load_memory(args.memory)
    tables, per_row = build_tables(times, rates, spread, memory, result_bytes, load_batch(args.bench))
    plot(per_row, args.img)

    generated = ["## Results", "", "Generated by `scripts/bench.sh` from the run below; do not edit by hand.", "",
                 "### Machine", "", "| | |", "|---|---|"]
    generated += [f"| {key} | {value} |" for key, value in machine(context, args.build)]
    generated += [""] + tables
    block = BEGIN + "\n" + "\n".join(generated) + "\n" + END

    if os.path.exists(args.doc):
        with open(args.doc) as handle:
            text = handle.read()
    else:
        text = "# Benchmarks\n\n" + BEGIN + "\n" + END + "\n"
    if BEGIN in text and END in text:
        text = re.sub(re.escape(BEGIN) + ".*?" + re.escape(END), lambda _: block, text, flags=re.S)
    else:
        text = text.rstrip("\n") + "\n\n" + block + "\n"
    with open(args.doc, "w") as handle:
        handle.write(text)


if __name__ == "__main__":
    main()
