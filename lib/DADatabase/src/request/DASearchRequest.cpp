#include "DASearchRequest.h"

#include <algorithm>
#include <utility>

#include "DALog.h"
#include "DAMemberLock.h"
#include "DAPlainName.h"

namespace {

// FTS5's snippet() shows at most 64 tokens.
constexpr int kMostWords = 64;

}  // namespace

void DASearchRequest::SetIndex(char const* name)
{
    if (!DA_KEEP_NAMES(DAIsPlainName(name))) {
        return;
    }
    m_index.Assign(name);
}

void DASearchRequest::SetText(char const* text)
{
    m_text = text != nullptr ? text : "";
}

void DASearchRequest::AddSnippet(char const* column, char const* before, char const* after, int words, char const* as)
{
    if (!DA_KEEP_NAMES(DAIsPlainName(column) && DAIsPlainName(as))) {
        return;
    }
    Snippet snippet{column, before != nullptr ? before : "", after != nullptr ? after : "",
                    std::clamp(words, 1, kMostWords), as};
    DA_MEMBER_LOCK(m_snippets);
    m_snippets.push_back(std::move(snippet));
}

void DASearchRequest::GetIndex(std::string& name)
{
    m_index.CopyTo(name);
}

void DASearchRequest::GetSnippets(std::vector<Snippet>& out)
{
    out = m_snippets;
}
