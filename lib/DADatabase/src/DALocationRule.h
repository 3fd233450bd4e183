#ifndef DALOCATIONRULE_H
#define DALOCATIONRULE_H

#include <string>

#include "DABasePath.h"

// The rule by which an owner of one file (a batch, a session) takes
// requests: a request with no location runs at the owner's file; a request
// whose location is set (both parts) must name the owner's file, the joined
// paths compared as texts. Anything else is refused: another file, one
// part only, or any located request while the owner's own location is
// incomplete.
//
// Returns 0 when request may run at owner's file; otherwise logs "<func>
// FAILED[21]: request location <path> is not the <ownerName>'s <path>" (an
// incomplete location reads "(incomplete)") with the fields file, func and
// line, and returns SQLITE_MISUSE (21). scratch: four strings the check may
// overwrite, kept by a caller that checks often so that their capacity is
// reused.
int DACheckLocation(DABasePath& owner, DABasePath& request, const char* file, const char* func, int line,
                    const char* ownerName, std::string (&scratch)[4]);

#endif  // DALOCATIONRULE_H
