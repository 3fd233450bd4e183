#ifndef DACOLUMNNAME_H
#define DACOLUMNNAME_H

/// One stable pointer per column name, for names made at run time.
///
/// Requests key values by the column-name pointer, so a name built in a
/// std::string would dangle or, built twice, name the column twice.
/// Intern turns such a text into the process's one pointer for it.
class DAColumnName {
public:
    DAColumnName() = delete;

    /// Returns a NUL-terminated copy of name that lives until the process
    /// ends (it is never freed, not even at exit), the same pointer for
    /// every call with equal text, from any thread. A null name returns
    /// null. A name that is not a plain name (letters, digits, '_', bytes
    /// from 0x80 up, no leading digit, optionally "table.column") returns
    /// null with the error line "INVALID COLUMN NAME, NOT INTERNED", so a
    /// text from data never reaches a statement as SQL (the setters refuse
    /// the null key); the empty name interns as before. Memory grows with the number of distinct names only. Looking
    /// up a name already interned takes a shared lock and no allocation.
    /// Throws std::bad_alloc when memory runs out (nothing is added then).
    static char const* Intern(char const* name);
};

#endif  // DACOLUMNNAME_H
