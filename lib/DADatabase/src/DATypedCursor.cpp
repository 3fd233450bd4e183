#include "DATypedCursor.h"

#include <utility>

#include "DALog.h"
#include "DATypedStore.h"

DATypedCursor::DATypedCursor() : m_store(std::make_unique<DATypedStore>())
{
}

DATypedCursor::~DATypedCursor() = default;

DATypedCursor::DATypedCursor(DATypedCursor&& other) noexcept = default;

DATypedCursor& DATypedCursor::operator=(DATypedCursor&& other) noexcept = default;

int DATypedCursor::GetCount() const
{
    return m_store != nullptr ? m_store->rows : 0;
}

void DATypedCursor::MoveToFirst()
{
    if (m_store != nullptr) {
        m_store->position = -1;
    }
}

void DATypedCursor::MoveToLast()
{
    if (m_store != nullptr) {
        m_store->position = m_store->rows;
    }
}

// A moved-from cursor has no store: it moves as an empty one would,
// lines and codes included, and stays where it is.
int DATypedCursor::MoveToNext()
{
    int position = GetPosition() + 1;
    int rc = 0;
    if (position >= GetCount()) {
        DA_LOG(DLOG_INFO, "Last Row");
        position = GetCount() - 1;
        rc = 3;
    }
    if (m_store != nullptr) {
        m_store->position = position;
    }
    return rc;
}

int DATypedCursor::MoveToPrev()
{
    int position = GetPosition() - 1;
    int rc = 0;
    if (position < 0) {
        DA_LOG(DLOG_INFO, "First Row");
        position = 0;
        rc = 2;
    }
    if (m_store != nullptr) {
        m_store->position = position;
    }
    return rc;
}

int DATypedCursor::MoveToPosition(int row)
{
    if (row < 0 || row >= GetCount()) {
        DA_LOG(DLOG_ERROR, "Invalid Position");
        return 1;
    }
    m_store->position = row;
    return 0;
}

int DATypedCursor::GetPosition() const
{
    return m_store != nullptr ? m_store->position : -1;
}

DARow const& DATypedCursor::GetRow() const
{
    static const DARow kNoRow(nullptr);
    return m_store != nullptr ? m_store->row : kNoRow;
}
