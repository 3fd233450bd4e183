// Watching: how soon another process learns of a commit, what watching costs a writer, and a session's wait
// for another process's lock; docs/benchmarks.md lists the cases.

#include <poll.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <thread>
#include <vector>

#include "DADatabase.h"
#include "DASession.h"
#include "DAWatch.h"
#include "bench.h"

namespace {

using Clock = std::chrono::steady_clock;  // one clock for every process on the machine

std::int64_t Now()
{
    return std::chrono::duration_cast<std::chrono::nanoseconds>(Clock::now().time_since_epoch()).count();
}

template <typename T>
bool Send(int fd, T value)
{
    return write(fd, &value, sizeof value) == sizeof value;
}

template <typename T>
bool Receive(int fd, T& value)
{
    return read(fd, &value, sizeof value) == sizeof value;
}

// Commits an upsert per iteration (per call, or through an unsynced session) while another process waits on a
// watch; that process reports when its Wait returned after each commit. Counters: median and p95 of the time
// from the commit's return to the Wait's (0 when the watcher woke first), in ms.
void Latency(benchmark::State& state, const bench::Location& at, bool held)
{
    const std::string file = held ? "latency_session.db" : "latency.db";
    int toWatcher[2];
    int fromWatcher[2];
    if (bench::RawExec(at.Path(file.c_str()), "CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT)") != SQLITE_OK ||
        pipe(toWatcher) != 0 || pipe(fromWatcher) != 0) {
        state.SkipWithError("setup failed");
        return;
    }
    auto upsert = bench::Request<DAUpsertRequest>(at, file.c_str(), "t");
    if (fork() == 0) {
        DAWatch watch;
        std::vector<std::string> changed;
        Send(fromWatcher[1], watch.Open(*upsert) + watch.AddTable("t"));
        // Asleep on the watch until a commit wakes it; then the commit's time (0 ends).
        for (std::int64_t committed = 1; committed != 0;) {
            changed.clear();
            while (changed.empty() && watch.Wait(-1, changed) == SQLITE_OK) {}
            const std::int64_t woke = Now();
            if (!Receive(toWatcher[0], committed) ||
                !Send(fromWatcher[1], std::max<std::int64_t>(woke - committed, 0))) {
                break;
            }
        }
        _exit(0);
    }
    int ready = -1;
    DASession session;
    session.SetSyncOnCommit(false);
    if (!Receive(fromWatcher[0], ready) || ready != 0 || (held && session.Open(*upsert) != SQLITE_OK)) {
        state.SkipWithError("the watcher did not start");
    }
    std::vector<double> latencies;
    int k = 0;
    for (auto _ : state) {
        upsert->ClearData();
        upsert->SetData("k", ++k);
        if ((held ? session.Upsert(*upsert) : DADatabase().Upsert(*upsert)) != SQLITE_OK) {
            state.SkipWithError("upsert failed");
            break;
        }
        std::int64_t latency = 0;
        Send(toWatcher[1], Now());
        Receive(fromWatcher[0], latency);
        latencies.push_back(latency / 1e6);
    }
    upsert->SetData("v", "last");  // wakes the watcher for the end
    (held ? session.Upsert(*upsert) : DADatabase().Upsert(*upsert));
    Send(toWatcher[1], std::int64_t{0});
    wait(nullptr);
    for (int fd : {toWatcher[0], toWatcher[1], fromWatcher[0], fromWatcher[1]}) {
        close(fd);
    }
    std::sort(latencies.begin(), latencies.end());
    if (!latencies.empty()) {
        state.counters["median_ms"] = latencies[latencies.size() / 2];
        state.counters["p95_ms"] = latencies[latencies.size() * 95 / 100];
    }
}

}  // namespace

void bench::WatchCases(const Location& at)
{
    const std::string name = "/" + at.name + "/";
    for (const bool held : {false, true}) {
        benchmark::RegisterBenchmark(("watch/latency" + name + (held ? "session" : "percall")).c_str(),
                                     [at, held](benchmark::State& state) { Latency(state, at, held); })
            ->Iterations(200)
            ->UseRealTime()
            ->Unit(benchmark::kMicrosecond);
    }
    // watched and unwatched: the same upsert into a watched table or an unwatched one of one file.
    const std::string path = at.Path("watched.db");
    std::string tables;
    for (int i = 0; i < 10; ++i) {
        tables += "CREATE TABLE w" + std::to_string(i) + "(k INTEGER PRIMARY KEY, v TEXT);";
    }
    if (RawExec(path, tables + "CREATE TABLE u(k INTEGER PRIMARY KEY, v TEXT);") != SQLITE_OK) {
        return;
    }
    auto watch = std::make_shared<DAWatch>();
    auto w0 = Request<DAUpsertRequest>(at, "watched.db", "w0");
    watch->Open(*w0);
    for (int i = 0; i < 10; ++i) {
        watch->AddTable(("w" + std::to_string(i)).c_str());
    }
    auto unwatched = Request<DAUpsertRequest>(at, "watched.db", "u");
    for (const auto& request : {w0, unwatched}) {
        request->SetData("k", 1);
        request->SetData("v", "value");
    }
    auto session = std::make_shared<DASession>();
    session->SetSyncOnCommit(false);
    session->Open(*w0);
    for (const auto& [impl, request] : {std::pair{"watched", w0}, std::pair{"unwatched", unwatched}}) {
        Add("watch/write" + name + impl, [request = request] { return DADatabase().Upsert(*request); });
        Add("watch/sessionwrite" + name + impl, [session, request = request] { return session->Upsert(*request); });
    }
    // checked: the watched writes with a Check (untimed) before each, so that each commit marks its counter.
    auto seen = std::make_shared<std::vector<std::string>>();
    const auto check = [watch, seen] { return watch->Check(*seen); };
    Add(
        "watch/write" + name + "checked", [w0] { return DADatabase().Upsert(*w0); }, {}, check);
    Add(
        "watch/sessionwrite" + name + "checked", [session, w0] { return session->Upsert(*w0); }, {}, check);
    // check10: Check after a commit to one of 10 watched tables (the commit untimed).
    auto changed = std::make_shared<std::vector<std::string>>();
    Add(
        "watch/check10" + name + "lib",
        [watch, changed] { return watch->Check(*changed) != SQLITE_OK ? 1
                               : changed->size() == 1                 ? 0
                                                                      : 2; }, {},
        [session, w0] { return session->Upsert(*w0); });
    // idle: wake-ups of a watch's descriptor over 10 s while nothing is written.
    benchmark::RegisterBenchmark(("watch/idle" + name + "lib").c_str(),
                                 [watch](benchmark::State& state) {
                                     int wakeups = 0;
                                     for (auto _ : state) {
                                         const auto end = Clock::now() + std::chrono::seconds(10);
                                         std::vector<std::string> ignored;
                                         watch->Check(ignored);  // past every earlier commit
                                         for (pollfd fd{watch->GetFd(), POLLIN, 0}; Clock::now() < end;) {
                                             const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
                                                 end - Clock::now());
                                             if (poll(&fd, 1, static_cast<int>(left.count()) + 1) > 0) {
                                                 ++wakeups;
                                                 watch->Check(ignored);
                                             }
                                         }
                                     }
                                     state.counters["wakeups"] = wakeups;
                                 })
        ->Iterations(1)
        ->UseRealTime()
        ->Unit(benchmark::kMillisecond);
    // busy: a session write meeting another process's 20 ms write (the file's lock held by BEGIN IMMEDIATE).
    benchmark::RegisterBenchmark(("watch/busy" + name + "session").c_str(),
                                 [session, w0, path](benchmark::State& state) {
                                     for (auto _ : state) {
                                         state.PauseTiming();
                                         int locked[2];
                                         if (pipe(locked) != 0) {
                                             break;
                                         }
                                         if (fork() == 0) {
                                             OnFile(path, [&](sqlite3* db) {
                                                 sqlite3_exec(db, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr);
                                                 Send(locked[1], 1);
                                                 std::this_thread::sleep_for(std::chrono::milliseconds(20));
                                                 return sqlite3_exec(db, "COMMIT", nullptr, nullptr, nullptr);
                                             });
                                             _exit(0);
                                         }
                                         int ready = 0;
                                         Receive(locked[0], ready);
                                         state.ResumeTiming();
                                         const int rc = session->Upsert(*w0);
                                         state.PauseTiming();
                                         wait(nullptr);
                                         close(locked[0]);
                                         close(locked[1]);
                                         state.ResumeTiming();
                                         if (rc != SQLITE_OK) {
                                             state.SkipWithError("upsert failed");
                                         }
                                     }
                                 })
        ->Iterations(20)
        ->UseRealTime()
        ->Unit(benchmark::kMillisecond);
}
