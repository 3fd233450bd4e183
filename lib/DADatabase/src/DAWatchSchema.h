#ifndef DAWATCHSCHEMA_H
#define DAWATCHSCHEMA_H

// What watching keeps in a file, named once: the table of change counters
// (its name has a '-', which a plain name never has, so no application
// table can be called so) and three triggers per watched table that count
// every row inserted, updated or deleted.

#include <string>

constexpr const char* kDAWatchTable = "ulo_db-watch";
constexpr const char* const kDAWatchEvents[] = {"insert", "update", "delete"};

// The name of table's trigger for event ("ulo_db-watch/<table>/<event>").
inline std::string DAWatchTrigger(const std::string& table, const char* event)
{
    return std::string(kDAWatchTable) + "/" + table + "/" + event;
}

#endif  // DAWATCHSCHEMA_H
