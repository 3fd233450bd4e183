// Names: the named lock every request setter takes against a std::mutex; Intern of a known name.

#include <cstdio>
#include <mutex>

#include "DAColumnName.h"
#include "DAMutex.h"
#include "bench.h"

namespace {

int LockOnce(const char* name)
{
    DAMutex mutex(name);
    mutex.Lock();
    mutex.Unlock();
    return 0;
}

// 10M distinct names (addresses 16 bytes apart, as heap objects are).
int TenMillionNames()
{
    char name[32];
    for (unsigned long i = 0; i < 10000000UL; ++i) {
        std::snprintf(name, sizeof name, "%lx", 0x55d000000000UL + i * 16UL);
        LockOnce(name);
    }
    return 0;
}

}  // namespace

void bench::NameCases()
{
    static std::mutex reference;
    static const std::string column = std::string("column_") + "timestamp_ms";
    static const char* const interned = DAColumnName::Intern(column.c_str());
    // lock/{uncontended,4threads}: one name like the library's (a heap address in hexadecimal).
    for (const int threads : {1, 4}) {
        const std::string prefix = threads == 1 ? "lock/uncontended/memory/" : "lock/4threads/memory/";
        bench::Add(prefix + "lib", [] { return LockOnce("55d0c4a3b2e0"); })
            ->Threads(threads)
            ->Unit(benchmark::kNanosecond);
        // A temporary guard: locked and unlocked again within the expression.
        bench::Add(prefix + "stdmutex", [] { return std::lock_guard<std::mutex>(reference), 0; })
            ->Threads(threads)
            ->Unit(benchmark::kNanosecond);
    }
    // growth_bytes: the heap the names leave behind, measured once before the timed runs.
    const double before = bench::HeapInUse();
    TenMillionNames();
    bench::Add("memory/names10000000/memory/lib", TenMillionNames, {{"growth_bytes", bench::HeapInUse() - before}})
        ->Iterations(1);
    const auto intern = [] { return DAColumnName::Intern(column.c_str()) == interned ? 0 : 1; };
    bench::Add("intern/1thread/memory/lib", intern)->Unit(benchmark::kNanosecond);
    bench::Add("intern/2threads/memory/lib", intern)->Threads(2)->Unit(benchmark::kNanosecond);
}
