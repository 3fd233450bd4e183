#ifndef DAPLAINNAME_H
#define DAPLAINNAME_H

// The one rule for names that the library pastes into SQL unquoted and that
// an application may build at run time (columns in conditions and select
// lists, index and table names of schema requests): letters, digits, '_'
// and bytes from 0x80 up, not starting with a digit. With qualified, two
// such names joined by one '.' ("events.ts") pass too. Null and the empty
// text fail. Such a name can never close a literal, start a comment or
// carry a second statement.
bool DAIsPlainName(char const* name, bool qualified = false);

#endif  // DAPLAINNAME_H
