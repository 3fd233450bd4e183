#include "DAMutex.h"

#include <cstdint>
#include <cstring>
#include <mutex>

namespace {

// Constant-initialised, so usable before and after any other static object.
std::mutex g_stripes[DAMutex::kStripeCount];

std::uint64_t Mix(std::uint64_t hash, std::uint64_t word)
{
    hash = (hash ^ word) * 0xff51afd7ed558ccdULL;
    return hash ^ (hash >> 32U);
}

std::size_t StripeOf(char const* name)
{
    // Eight bytes at a time, multiplied and folded: equal texts give equal
    // stripes, and the hexadecimal address names the database library uses
    // spread evenly over the table. A byte-at-a-time hash is a chain of one
    // multiplication per character, and this runs for every value a query
    // stores.
    if (name == nullptr) {
        name = "";
    }
    std::size_t length = std::strlen(name);
    std::uint64_t hash = 0x9e3779b97f4a7c15ULL ^ length;
    for (; length >= sizeof(std::uint64_t); length -= sizeof(std::uint64_t), name += sizeof(std::uint64_t)) {
        std::uint64_t word = 0;
        std::memcpy(&word, name, sizeof word);
        hash = Mix(hash, word);
    }
    std::uint64_t tail = 0;
    std::memcpy(&tail, name, length);
    hash = Mix(hash, tail);
    return static_cast<std::size_t>(hash % DAMutex::kStripeCount);
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
