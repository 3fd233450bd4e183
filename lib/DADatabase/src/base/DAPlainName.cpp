#include "DAPlainName.h"

#include "DALog.h"

namespace {

bool IsNameByte(unsigned char byte)
{
    return (byte >= 'a' && byte <= 'z') || (byte >= 'A' && byte <= 'Z') || (byte >= '0' && byte <= '9') ||
        byte == '_' || byte >= 0x80;
}

// One plain name from text; returns where it ends, or null when none starts
// there.
const unsigned char* SkipName(const unsigned char* text)
{
    if (*text >= '0' && *text <= '9') {
        return nullptr;
    }
    const unsigned char* end = text;
    while (IsNameByte(*end)) {
        ++end;
    }
    return end != text ? end : nullptr;
}

}  // namespace

bool DAIsPlainName(char const* name, bool qualified)
{
    if (name == nullptr) {
        return false;
    }
    const unsigned char* end = SkipName(reinterpret_cast<const unsigned char*>(name));
    if (end != nullptr && qualified && *end == '.') {
        end = SkipName(end + 1);
    }
    return end != nullptr && *end == '\0';
}

bool DAKeepNames(bool plain, const char* file, const char* func, int line)
{
    if (!plain) {
        DA_LOG_WHERE(DLOG_ERROR, file, func, line, "INVALID NAME, NOT STORED");
    }
    return plain;
}
