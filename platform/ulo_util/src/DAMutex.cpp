#include "DAMutex.h"

#include <cstdint>
#include <mutex>

namespace {

// Constant-initialised, so usable before and after any other static object.
std::mutex g_stripes[DAMutex::kStripeCount];

std::size_t StripeOf(char const* name)
{
    // FNV-1a: cheap, and spreads the hexadecimal address names the database
    // library uses evenly over the table.
    std::uint32_t hash = 2166136261U;
    if (name != nullptr) {
        for (const char* p = name; *p != '\0'; ++p) {
            hash ^= static_cast<unsigned char>(*p);
            hash *= 16777619U;
        }
    }
    return hash % DAMutex::kStripeCount;
}

}  // namespace

DAMutex::DAMutex(char const* name) : m_stripe(StripeOf(name)), m_locked(false)
{
}

DAMutex::~DAMutex()
{
    Unlock();
}

void DAMutex::Lock()
{
    g_stripes[m_stripe].lock();
    m_locked = true;
}

void DAMutex::Unlock()
{
    if (m_locked) {
        m_locked = false;
        g_stripes[m_stripe].unlock();
    }
}
