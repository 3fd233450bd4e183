#include "DAColumnName.h"

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <mutex>
#include <shared_mutex>
#include <unordered_set>

#include "DALog.h"
#include "DAPlainName.h"

namespace {

// Hash and equality of NUL-terminated texts, so that a lookup needs no
// std::string (and no allocation). The hash takes eight bytes a step: a
// lookup of a known name is dominated by it.
struct TextHash {
    std::size_t operator()(const char* text) const noexcept
    {
        constexpr std::uint64_t kMultiplier = 0x9E3779B97F4A7C15ULL;
        const std::size_t length = std::strlen(text);
        std::uint64_t hash = length * kMultiplier;
        std::size_t done = 0;
        for (; done + sizeof(std::uint64_t) <= length; done += sizeof(std::uint64_t)) {
            std::uint64_t word = 0;
            std::memcpy(&word, text + done, sizeof word);
            hash = (hash ^ word) * kMultiplier;
            hash ^= hash >> 32U;
        }
        std::uint64_t tail = 0;
        std::memcpy(&tail, text + done, length - done);
        hash = (hash ^ tail) * kMultiplier;
        return static_cast<std::size_t>(hash ^ (hash >> 32U));
    }
};

struct TextEqual {
    bool operator()(const char* left, const char* right) const noexcept { return std::strcmp(left, right) == 0; }
};

// The interned copies, which are never freed. The table itself is made on
// first use and never destroyed, so a destructor that interns a name at
// exit still finds it.
struct Names {
    std::shared_timed_mutex mutex;  // readers share it: a known name costs no exclusive lock
    std::unordered_set<const char*, TextHash, TextEqual> texts;
};

Names& TheNames()
{
    static Names* const names = new Names();  // lives as long as the process
    return *names;
}

}  // namespace

char const* DAColumnName::Intern(char const* name)
{
    if (name == nullptr) {
        return nullptr;
    }
    // Checked here, where a name is made from data, so that no such name
    // reaches a statement; the empty name carries no SQL and stays.
    if (*name != '\0' && !DAIsPlainName(name, true)) {
        DA_LOG(DLOG_ERROR, "INVALID COLUMN NAME, NOT INTERNED");
        return nullptr;
    }
    Names& names = TheNames();
    {
        const std::shared_lock<std::shared_timed_mutex> reading(names.mutex);
        const auto found = names.texts.find(name);
        if (found != names.texts.end()) {
            return *found;
        }
    }
    const std::lock_guard<std::shared_timed_mutex> writing(names.mutex);
    const auto found = names.texts.find(name);  // another thread may have added it meanwhile
    if (found != names.texts.end()) {
        return *found;
    }
    const std::size_t size = std::strlen(name) + 1;
    std::unique_ptr<char[]> copy(new char[size]);  // freed only if the insertion throws
    std::memcpy(copy.get(), name, size);
    names.texts.insert(copy.get());
    return copy.release();  // never freed from here on, by design
}
