#include <atomic>
#include <chrono>
#include <cstring>
#include <future>
#include <memory>
#include <string>

#include <gtest/gtest.h>

#include "DAMutex.h"

namespace {

// Another thread locks its own DAMutex made from name: it must stay blocked
// while the lock is held, and get through once unlock() has run.
template <typename Unlock>
void ExpectBlockedUntil(const std::string& name, Unlock unlock)
{
    std::atomic<bool> acquired{false};
    std::future<void> other = std::async(std::launch::async, [name, &acquired] {
        DAMutex mutex(name.c_str());
        mutex.Lock();
        acquired = true;
        mutex.Unlock();
    });
    EXPECT_EQ(other.wait_for(std::chrono::milliseconds(200)), std::future_status::timeout);
    EXPECT_FALSE(acquired);
    unlock();
    EXPECT_EQ(other.wait_for(std::chrono::seconds(5)), std::future_status::ready);
    EXPECT_TRUE(acquired);
}

// Equal names share one lock (the text counts, not the buffer), which can be
// taken again; an unlock without a lock must not release the lock another
// object took; destroying the holder releases it.
TEST(DAMutex, EqualNamesShareOneLockReleasedByUnlockOrDestruction)
{
    char name[] = "7ffd1234abc0";
    DAMutex idle(name);
    auto holder = std::make_unique<DAMutex>(name);
    holder->Lock();
    std::strcpy(name, "000000000000");
    ExpectBlockedUntil("7ffd1234abc0", [&holder] { holder->Unlock(); });
    holder->Lock();
    idle.Unlock();
    ExpectBlockedUntil("7ffd1234abc0", [&holder] { holder.reset(); });
}

}  // namespace
