#ifndef DASQLSTATEMENT_H
#define DASQLSTATEMENT_H

// A statement as the library hands it to SQLite: its whole text, or its
// shape (each value a parameter "?") with the values beside it, to be
// bound rather than parsed again.

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include <sqlite3.h>

#include "DAAddColumnRequest.h"
#include "DACreateIndexRequest.h"
#include "DACreateRequest.h"
#include "DADeleteRequest.h"
#include "DADropRequest.h"
#include "DAInsertRequest.h"
#include "DAJoinRequest.h"
#include "DAQueryRequest.h"
#include "DASearchIndexRequest.h"
#include "DASearchRequest.h"
#include "DASelectRequest.h"
#include "DAUpdateRequest.h"
#include "DAUpsertRequest.h"

// The kinds of value a parameter takes: a text (bound as text, as SQLite
// reads a text literal), a 64-bit integer, NULL, a blob.
enum class DAParamKind : unsigned char { Text, Integer, Null, Blob };

// Parameter values packed one after another (kind, size, bytes), read in
// place: a batch keeps thousands of them in one buffer, and a session
// binds from one without a copy.
class DASqlParamsView {
public:
    DASqlParamsView(const char* begin, const char* end) : m_begin(begin), m_end(end) {}

    // Calls visit(kind, bytes, size) for each value in order; an integer's
    // bytes are its std::int64_t.
    template <typename Visit>
    void ForEach(Visit visit) const
    {
        for (const char* at = m_begin; at != m_end;) {
            const auto kind = static_cast<DAParamKind>(*at++);
            std::size_t size = 0;
            for (unsigned shift = 0;; shift += 7U) {  // the size, 7 bits a byte
                const auto byte = static_cast<unsigned char>(*at++);
                size |= static_cast<std::size_t>(byte & 0x7FU) << shift;
                if (byte < 0x80U) {
                    break;
                }
            }
            visit(kind, at, size);
            at += size;
        }
    }

    // Binds the values to stmt's parameters 1..n, each as its kind; texts
    // and blobs are not copied, so the bytes must outlive the statement's
    // use. Returns 0, or the first binding's failure.
    int Bind(sqlite3_stmt* stmt) const;

    // Appends shape to text with each "?" replaced by its value as the
    // generator writes it: 'a''b', 42, NULL, X'00FF'. The shape holds
    // one "?" per value, and no other.
    void Render(const char* shape, std::string& text) const;

private:
    const char* m_begin;
    const char* m_end;
};

// An owned, growing list of packed parameter values.
class DASqlParams {
public:
    void Clear()
    {
        m_bytes.clear();
        m_count = 0;
    }
    void Add(DAParamKind kind, const void* bytes, std::size_t size);
    void AddText(const std::string& text) { Add(DAParamKind::Text, text.data(), text.size()); }
    void AddInteger(std::int64_t value) { Add(DAParamKind::Integer, &value, sizeof value); }
    void AddNull() { Add(DAParamKind::Null, nullptr, 0); }

    std::size_t Count() const { return m_count; }
    const std::string& Bytes() const { return m_bytes; }
    DASqlParamsView View() const { return {m_bytes.data(), m_bytes.data() + m_bytes.size()}; }

private:
    std::string m_bytes;
    std::size_t m_count = 0;
};

// A statement read in place: its text, or its shape and values.
struct DASqlView {
    const char* sql;
    bool shaped;
    DASqlParamsView values;
};

// What the generator writes: with shaped false, the statement's text
// (what DASqlGenerator gives); with shaped true, its shape in sql and the
// values in params, exactly what DASplitLiterals takes out of that text.
// A request whose text would not split so (more literals than
// parameters, an update without conditions whose values hold " AND", a
// name with a quote, a "?" or another byte a split refuses) comes back as
// text, shaped false.
struct DASqlStatement {
    std::string sql;
    DASqlParams params;
    bool shaped = false;

    // The statement as text: sql itself, or the shape with its values
    // written in.
    std::string Text() const;

    DASqlView View() const { return {sql.c_str(), shaped, params.View()}; }
};

// Statements packed one after another in a byte buffer, as a batch holds
// them: a flag, the text or shape with its NUL, and when shaped the size
// of the values and the values.
std::size_t DAPackedSize(const DASqlStatement& statement);
// Appends statement packed; the buffer should have room for
// DAPackedSize more bytes, so that nothing throws half-way.
void DAPackStatement(const DASqlStatement& statement, std::vector<char>& buffer);
// The statement packed at at; next is set to where the one after it
// begins.
DASqlView DAUnpackStatement(const char* at, const char*& next);

///@{
// Writes the request's statement into out (cleared first), as text or,
// when out.shaped is set on entry and the form takes values, as shape and
// values. Schema statements are always text.
void DAWriteSql(DAQueryRequest& request, DASqlStatement& out);
void DAWriteSql(DASelectRequest& request, DASqlStatement& out);
void DAWriteSql(DAJoinRequest& request, DASqlStatement& out);
void DAWriteSql(DAUpsertRequest& request, DASqlStatement& out);
void DAWriteSql(DAUpdateRequest& request, DASqlStatement& out);
void DAWriteSql(DADeleteRequest& request, DASqlStatement& out);
void DAWriteSql(DAInsertRequest& request, DASqlStatement& out);
void DAWriteSql(DASearchRequest& request, DASqlStatement& out);
void DAWriteSql(DACreateRequest& request, DASqlStatement& out);
void DAWriteSql(DADropRequest& request, DASqlStatement& out);
void DAWriteSql(DACreateIndexRequest& request, DASqlStatement& out);
void DAWriteSql(DAAddColumnRequest& request, DASqlStatement& out);
void DAWriteSql(DASearchIndexRequest& request, DASqlStatement& out);
///@}

#endif  // DASQLSTATEMENT_H
