#ifndef DABATCHREQUEST_H
#define DABATCHREQUEST_H

#include <cstdint>
#include <string>
#include <vector>

#include "DAAddColumnRequest.h"
#include "DABasePath.h"
#include "DACreateIndexRequest.h"
#include "DACreateRequest.h"
#include "DADeleteRequest.h"
#include "DADropRequest.h"
#include "DAInsertRequest.h"
#include "DASearchIndexRequest.h"
#include "DAUpdateRequest.h"
#include "DAUpsertRequest.h"

struct DAOperations;

/// Many write statements for one database file, which
/// DADatabase::ExecuteBatch runs in one transaction on one connection:
/// all of them land, or none.
///
/// The batch's own location (SetPath) is the file the statements run on.
/// Add writes a request's statement at once, as the request's own
/// operation writes it, and keeps only the statement: the request may be
/// changed or destroyed afterwards. A write (upsert, update, delete,
/// insert) is kept as its shape with its values beside it, bound when the
/// batch runs into one statement prepared per shape, with the effect of
/// the text DASqlGenerator gives. The statements are kept one after
/// another in a single buffer, so a batch holds little more than the
/// statements' own bytes.
///
/// Location rule of Add: a request with no location at all runs at the
/// batch's location. A request whose location is set (both parts) must
/// name the same file as the batch's location at the time of the Add
/// (the joined paths are compared as texts). Anything else is refused: a
/// request naming another file, a request with only one part of its
/// location set, or any located request while the batch's own location is
/// incomplete. A refused Add returns SQLITE_MISUSE (21), logs one error
/// line "Add FAILED[21]: request location <path> is not the batch's <path>"
/// (an incomplete location reads "(incomplete)") and adds nothing.
/// Changing the batch's location later moves every held statement to the
/// new location.
///
/// A batch is filled by one thread at a time (like a cursor); it takes no
/// lock. Any number of batches may execute at once, each on its own
/// connection. Not copyable. No exceptions of its own: std::bad_alloc
/// passes through and leaves the batch as it was before the call.
class DABatchRequest : public DABasePath {
public:
    DABatchRequest() = default;
    ~DABatchRequest() override = default;

    ///@{
    /// Writes the request's statement (as Upsert, Update, Delete,
    /// CreateTable or DropTable would) and keeps it after those held.
    /// Returns 0, or 21 when refused by the location rule above.
    int Add(DAUpsertRequest& request);
    int Add(DAUpdateRequest& request);
    int Add(DADeleteRequest& request);
    int Add(DACreateRequest& request);
    int Add(DADropRequest& request);
    ///@}

    ///@{
    /// Writes the request's statement as CreateIndex or AddColumn would;
    /// the same returns and location rule.
    int Add(DACreateIndexRequest& request);
    int Add(DAAddColumnRequest& request);
    ///@}
    /// Writes the request's statement as Insert would, with Add's rules.
    int Add(DAInsertRequest& request);
    /// Writes the statements of a search index as CreateSearchIndex would
    /// (they run inside the batch's transaction), with Add's rules.
    int Add(DASearchIndexRequest& request);

    /// The number of statements held.
    int GetCount() const { return m_count; }

    /// Drops every statement held and releases their memory. The location
    /// and GetChanges are kept.
    void Clear();

    /// Rows inserted, updated or deleted by the last successful
    /// ExecuteBatch of this batch, as SQLite counts changes (statements
    /// that create or drop tables count 0); 0 before any.
    int GetChanges() const { return m_changes; }

    /// After a successful ExecuteBatch of this batch, one row id per Insert
    /// added, in Add order (-1 for a row an OR IGNORE insert left out);
    /// empty after a failed one and before any.
    void GetRowIds(std::vector<std::int64_t>& ids) const { ids = m_rowIds; }

private:
    // The operation that runs the batch reads the texts and sets the change
    // count.
    friend struct DAOperations;

    template <typename Request>
    int AddStatement(Request& request);

    // 0 when request may join the batch, else logs the refusal and
    // returns SQLITE_MISUSE.
    int CheckLocation(DABasePath& request);

    // Every statement packed (its text, or its shape and values), in Add
    // order.
    std::vector<char> m_texts;
    int m_count = 0;
    int m_changes = 0;
    std::vector<int> m_inserts;  // the 1-based positions of the inserts, ascending
    std::vector<std::int64_t> m_rowIds;
    // Add's scratch for comparing locations.
    std::string m_scratch[4];
};

#endif  // DABATCHREQUEST_H
