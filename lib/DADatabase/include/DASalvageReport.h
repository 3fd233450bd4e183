#ifndef DASALVAGEREPORT_H
#define DASALVAGEREPORT_H

#include <cstdint>
#include <string>
#include <vector>

/// What DADatabase::Salvage recovered from a damaged file, table by table,
/// in the order of the file's schema. The caller owns it; Salvage replaces
/// its content on success and leaves it untouched on failure.
struct DASalvageReport {
    /// One table of the source file.
    struct Table {
        std::string name;  ///< the table's name
        std::int64_t rows;  ///< rows copied into the new file
        std::int64_t lost;  ///< rows known to be missing: 0 for an intact table, -1 when the file no longer tells
    };
    std::vector<Table> tables;  ///< every table copied, sqlite_sequence included
};

#endif  // DASALVAGEREPORT_H
