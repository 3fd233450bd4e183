#include "DAColumnName.h"

#include <cstring>
#include <mutex>
#include <shared_mutex>
#include <string_view>
#include <unordered_set>

namespace {

// The interned texts: views of copies that are never freed. The table
// itself is made on first use and never destroyed, so a destructor that
// interns or reads a name at exit still finds it.
struct Names {
    std::shared_mutex mutex;
    std::unordered_set<std::string_view> texts;
};

Names& TheNames()
{
    static Names* const names = new Names;  // NOLINT(cppcoreguidelines-owning-memory): lives as long as the process
    return *names;
}

}  // namespace

char const* DAColumnName::Intern(char const* name)
{
    if (name == nullptr) {
        return nullptr;
    }
    const std::string_view text(name);
    Names& names = TheNames();
    {
        const std::shared_lock<std::shared_mutex> reading(names.mutex);
        const auto found = names.texts.find(text);
        if (found != names.texts.end()) {
            return found->data();
        }
    }
    const std::unique_lock<std::shared_mutex> writing(names.mutex);
    const auto found = names.texts.find(text);  // another thread may have added it meanwhile
    if (found != names.texts.end()) {
        return found->data();
    }
    names.texts.reserve(names.texts.size() + 1);  // may throw before the copy exists: nothing leaks
    char* copy = new char[text.size() + 1];  // NOLINT(cppcoreguidelines-owning-memory): never freed by design
    std::memcpy(copy, name, text.size() + 1);
    names.texts.emplace(copy, text.size());
    return copy;
}
