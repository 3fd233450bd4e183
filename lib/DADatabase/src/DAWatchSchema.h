#ifndef DAWATCHSCHEMA_H
#define DAWATCHSCHEMA_H

// What watching keeps in a file, named once: the table of change counters
// (its name has a '-', which a plain name never has, so no application
// table can be called so) and three triggers per watched table that mark
// it changed.

#include <string>

constexpr const char* kDAWatchTable = "ulo_db-watch";
constexpr const char* const kDAWatchEvents[] = {"insert", "update", "delete"};

// The name of table's trigger for event ("ulo_db-watch/<table>/<event>").
inline std::string DAWatchTrigger(const std::string& table, const char* event)
{
    return std::string(kDAWatchTable) + "/" + table + "/" + event;
}

// The statements that make table's three triggers (after dropping the ones
// there when replace is set). A trigger adds 1 to the counter only when a
// watch has seen its value (changes = seen), so a burst of commits between
// two Checks writes the counter's page once, not once per commit or row.
inline std::string DAWatchTriggers(const std::string& table, bool replace)
{
    std::string sql;
    for (const char* event : kDAWatchEvents) {
        const std::string name = "\"" + DAWatchTrigger(table, event) + "\"";
        if (replace) {
            sql += "DROP TRIGGER IF EXISTS " + name + ";";
        }
        sql.append("CREATE TRIGGER IF NOT EXISTS ").append(name).append(" AFTER ").append(event);
        sql.append(" ON ").append(table).append(" BEGIN UPDATE \"").append(kDAWatchTable);
        sql.append("\" SET changes = changes + 1 WHERE name = '").append(table).append("' AND changes = seen; END;");
    }
    return sql;
}

#endif  // DAWATCHSCHEMA_H
