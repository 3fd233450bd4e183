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

// The name setters' one refusal: plain is whether every name the setter
// takes is plain; when not, logs "INVALID NAME, NOT STORED" (error) under
// file, func and line, and the setter keeps nothing.
bool DAKeepNames(bool plain, const char* file, const char* func, int line);
#define DA_KEEP_NAMES(plain) DAKeepNames((plain), DA_FILE_NAME, __func__, __LINE__)

#endif  // DAPLAINNAME_H
