// Memory cases, one measurement per process so that one cannot mask
// another (scripts/bench.sh runs each mode in a fresh process):
//
//   ulo_db_memory_probe prepare DIR ROWS    creates DIR/query.db with sel_ROWS
//   ulo_db_memory_probe cursor DIR ROWS     Select of sel_ROWS into a DACursor
//   ulo_db_memory_probe raw DIR ROWS        the same rows as raw column vectors
//   ulo_db_memory_probe sqlitecpp DIR ROWS  the same through SQLiteCpp
//   ulo_db_memory_probe locks COUNT         COUNT distinct DAMutex names
//
// Each prints one JSON object on standard output. Sizes are in KiB, from
// /proc/self/status: "peak" is VmHWM at the end minus VmRSS before the
// measured work, "held" is VmRSS with the result still alive minus the same.

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "DADatabase.h"
#include "DAMutex.h"
#include "DASqlGenerator.h"
#include "bench_data.h"
#include "dlog.h"

namespace {

constexpr const char* kQueryFile = "query.db";

void PrintResult(const char* mode, int rows, long before, std::size_t values)
{
    const long hwm = bench::ReadStatusKiB("VmHWM");
    const long rss = bench::ReadStatusKiB("VmRSS");
    std::printf("{\"mode\": \"%s\", \"rows\": %d, \"values\": %zu, \"rss_before_kib\": %ld, \"hwm_kib\": %ld, "
                "\"rss_after_kib\": %ld, \"peak_kib\": %ld, \"held_kib\": %ld}\n",
                mode, rows, values, before, hwm, rss, hwm - before, rss - before);
}

int Query(const std::string& mode, const std::string& dir, int rows)
{
    DASelectRequest request;
    request.SetPath(dir.c_str(), kQueryFile);
    const std::string table = bench::SelectTable(rows);
    request.SetTable(table.c_str());
    std::string sql;
    DASqlGenerator().GetSelectSql(request, sql);
    const std::string path = dir + "/" + kQueryFile;

    const long before = bench::ReadStatusKiB("VmRSS");
    if (mode == "cursor") {
        DACursor cursor;
        DADatabase db;
        if (db.Select(request, cursor) != 0 || cursor.GetCount() != rows) {
            std::fprintf(stderr, "cursor select failed\n");
            return 1;
        }
        std::vector<std::string> names;
        cursor.GetColumn(names);
        PrintResult("cursor", rows, before, names.size() * static_cast<std::size_t>(cursor.GetCount()));
        return 0;
    }
    bench::RawColumns columns;
    const int rc = mode == "raw" ? bench::RawSelect(path, sql, columns) : bench::SqliteCppSelect(path, sql, columns);
    if (rc != 0 || columns.empty() || columns[0].size() != static_cast<std::size_t>(rows)) {
        std::fprintf(stderr, "%s select failed\n", mode.c_str());
        return 1;
    }
    PrintResult(mode.c_str(), rows, before, columns.size() * columns[0].size());
    return 0;
}

// COUNT distinct names, each made, locked, unlocked and destroyed once;
// resident memory sampled ten times on the way.
int Locks(long count)
{
    char name[32];
    const long before = bench::ReadStatusKiB("VmRSS");
    std::printf("{\"mode\": \"locks\", \"names\": %ld, \"rss_before_kib\": %ld, \"samples\": [", count, before);
    const long step = count / 10 > 0 ? count / 10 : 1;
    const char* separator = "";
    for (long i = 0; i < count; ++i) {
        // Distinct addresses 16 bytes apart, as heap objects would be.
        std::snprintf(name, sizeof name, "%lx", 0x55d000000000UL + static_cast<unsigned long>(i) * 16UL);
        DAMutex mutex(name);
        mutex.Lock();
        mutex.Unlock();
        if ((i + 1) % step == 0) {
            std::printf("%s[%ld, %ld]", separator, i + 1, bench::ReadStatusKiB("VmRSS") - before);
            separator = ", ";
        }
    }
    std::printf("], \"hwm_kib\": %ld, \"growth_kib\": %ld}\n", bench::ReadStatusKiB("VmHWM"),
                bench::ReadStatusKiB("VmRSS") - before);
    return 0;
}

}  // namespace

int main(int argc, char** argv)
{
    dlog_set_sink(dlog_discard_sink, nullptr);
    const std::string mode = argc > 1 ? argv[1] : "";
    if (mode == "locks" && argc == 3) {
        return Locks(std::atol(argv[2]));
    }
    if (argc != 4) {
        std::fprintf(stderr, "usage: %s prepare|cursor|raw|sqlitecpp DIR ROWS | locks COUNT\n", argv[0]);
        return 2;
    }
    const std::string dir = argv[2];
    const int rows = std::atoi(argv[3]);
    if (mode == "prepare") {
        return bench::CreateQueryDatabase(dir + "/" + kQueryFile, {rows}, false) ? 0 : 1;
    }
    if (mode == "cursor" || mode == "raw" || mode == "sqlitecpp") {
        return Query(mode, dir, rows);
    }
    std::fprintf(stderr, "unknown mode %s\n", mode.c_str());
    return 2;
}
