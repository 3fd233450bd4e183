#include "DALocationRule.h"

#include <sqlite3.h>

#include "DALog.h"
#include "DASqlGenerator.h"

namespace {

// The joined path of a location, or "(incomplete)" when a part is unset.
std::string JoinedPath(DABasePath& location)
{
    if (!location.IsPathSet()) {
        return "(incomplete)";
    }
    std::string dir;
    std::string file;
    std::string path;
    location.GetPath(dir, file);
    DASqlGenerator().GetDBPath(std::move(dir), std::move(file), path);
    return path;
}

}  // namespace

int DACheckLocation(DABasePath& owner, DABasePath& request, const char* file, const char* func, int line,
                    const char* ownerName, std::string (&scratch)[4])
{
    if (request.IsPathEmpty()) {
        return SQLITE_OK;
    }
    if (request.IsPathSet() && owner.IsPathSet()) {
        // Equal parts name the same file: the usual case, decided without
        // joining.
        request.GetPath(scratch[0], scratch[1]);
        owner.GetPath(scratch[2], scratch[3]);
        if (scratch[0] == scratch[2] && scratch[1] == scratch[3]) {
            return SQLITE_OK;
        }
    }
    const std::string requested = JoinedPath(request);
    const std::string own = JoinedPath(owner);
    if (request.IsPathSet() && owner.IsPathSet() && requested == own) {
        return SQLITE_OK;
    }
    DA_LOG_WHERE(DLOG_ERROR, file, func, line, "%s FAILED[%d]: request location %s is not the %s's %s", func,
                 SQLITE_MISUSE, requested.c_str(), ownerName, own.c_str());
    return SQLITE_MISUSE;
}
