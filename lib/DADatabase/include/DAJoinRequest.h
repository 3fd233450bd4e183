#ifndef DAJOINREQUEST_H
#define DAJOINREQUEST_H

#include <string>

#include "DABaseSet.h"
#include "DAOwnedString.h"

/// A select of every column of an inner join of two tables on
/// left.column = right.column (DADatabase::JoinSelect), narrowed by the where
/// map. The data map is ignored. Condition names that exist in both tables
/// must be qualified by the caller ("groups.title"). Names are written into
/// SQL as given: they must be identifiers the caller controls.
class DAJoinRequest : public DABaseSet {
public:
    DAJoinRequest() = default;
    ~DAJoinRequest() override = default;

    ///@{
    /// Each non-null argument replaces its part; a null one leaves it as is.
    void SetLeftJoin(char const* table, char const* column);
    void SetRightJoin(char const* table, char const* column);
    ///@}

    ///@{
    /// Assign table and column only when both are set; otherwise neither
    /// output is touched.
    void GetLeftJoin(std::string& table, std::string& column);
    void GetRightJoin(std::string& table, std::string& column);
    ///@}

private:
    DAOwnedString m_leftTable;
    DAOwnedString m_leftColumn;
    DAOwnedString m_rightTable;
    DAOwnedString m_rightColumn;
};

#endif  // DAJOINREQUEST_H
