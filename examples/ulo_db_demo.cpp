// A tour of libulo_db on a real database file: create two related tables,
// write, query, join, list a table sorted and a page at a time, store a
// 64-bit time stamp, name columns at run time, check and drop, write in a
// batch, keep an event journal for a week (retention by a range, counts per
// type, keyset pages), upgrade a schema in versioned steps, compact the
// file, run requests through a session that holds it open and watch a table
// from a second process, printing each step's result code, the statement
// the library generated, every result as a table, and the library's own log
// lines as they are written.
//
//   ulo_db_demo [directory]     (default: /tmp/ulo_db_demo, created if missing)
//
// Running it again on the same folder gives the same output: every write is
// an insert-or-replace on a keyed table, the scratch table is dropped, and
// the upgrade starts from a new file.

#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "DAColumnName.h"
#include "DADatabase.h"
#include "DASession.h"
#include "DASqlGenerator.h"
#include "DAWatch.h"
#include "dlog.h"

namespace {

const char* const kDefaultDir = "/tmp/ulo_db_demo";
const char* const kFile = "demo.db";

// Column names are kept by pointer in the requests: named constants make
// that explicit (string literals would do as well).
const char* const kId = "id";
const char* const kTitle = "title";
const char* const kPhone = "phone";
const char* const kName = "name";
const char* const kGroupId = "group_id";
const char* const kGroupTitle = "groups.title";

int g_unexpected = 0;

// Shows the library's log lines inline with the demo's output.
void PrintLogLine(int /*logId*/, int prio, const char* tag, const char* text, void* /*user*/)
{
    static const char letters[] = "??VDIWEFS";
    const char letter = (prio >= 0 && prio < 9) ? letters[prio] : '?';
    std::printf("    log %c/%s: %s\n", letter, tag, text);
}

void Step(const char* title, const std::string& sql)
{
    std::printf("\n== %s\n   SQL: %s\n", title, sql.c_str());
}

void Result(int rc, int expected)
{
    std::printf("   result: %d%s\n", rc, rc == expected ? "" : "  <-- unexpected");
    if (rc != expected) {
        ++g_unexpected;
    }
}

// Prints the cursor as an aligned table, walking it as an application would.
void PrintCursor(DACursor& cursor)
{
    std::vector<std::string> columns;
    if (cursor.GetColumn(columns) != 0) {
        std::printf("   (no rows)\n");
        return;
    }
    std::vector<std::vector<std::string>> rows;
    cursor.MoveToFirst();
    while (cursor.MoveToNext() == 0) {
        std::vector<std::string> row;
        for (const std::string& column : columns) {
            std::string value;
            cursor.GetString(column.c_str(), value);
            row.push_back(value);
        }
        rows.push_back(row);
    }
    std::vector<size_t> widths;
    for (size_t i = 0; i < columns.size(); ++i) {
        size_t width = columns[i].size();
        for (const auto& row : rows) {
            width = std::max(width, row[i].size());
        }
        widths.push_back(width);
    }
    auto printRow = [&](const std::vector<std::string>& cells) {
        std::printf("   |");
        for (size_t i = 0; i < cells.size(); ++i) {
            std::printf(" %-*s |", static_cast<int>(widths[i]), cells[i].c_str());
        }
        std::printf("\n");
    };
    printRow(columns);
    std::printf("   |");
    for (size_t width : widths) {
        std::printf("%s|", std::string(width + 2, '-').c_str());
    }
    std::printf("\n");
    for (const auto& row : rows) {
        printRow(row);
    }
    std::printf("   %d row(s)\n", cursor.GetCount() < 0 ? 0 : cursor.GetCount());
}

template <typename Request>
void SetLocation(Request& request, const char* dir, const char* table)
{
    request.SetPath(dir, kFile);
    request.SetTable(table);
}

// Shows the statement a write request stands for, runs it, and prints the
// result, which every write of the demo expects to be 0.
template <typename Request>
void Write(DADatabase& db, const char* title, Request& request,
           void (DASqlGenerator::*generate)(Request&, std::string&), int (DADatabase::*run)(Request&))
{
    std::string sql;
    (DASqlGenerator().*generate)(request, sql);
    Step(title, sql);
    Result((db.*run)(request), SQLITE_OK);
}

void CreateTables(DADatabase& db, const char* dir)
{
    DACreateRequest groups;
    SetLocation(groups, dir, "groups");
    groups.SetPrimaryKey(kId, "INTEGER");
    groups.SetColumnKey(kTitle, "TEXT");
    Write(db, "Create the table groups (keyed by id)", groups, &DASqlGenerator::GetCreateTableSql,
          &DADatabase::CreateTable);

    DACreateRequest contacts;
    SetLocation(contacts, dir, "contacts");
    contacts.SetPrimaryKey(kPhone, "TEXT");
    contacts.SetColumnKey(kName, "TEXT");
    contacts.SetColumnKey(kGroupId, "INTEGER");
    Write(db, "Create the table contacts (keyed by phone, group_id refers to groups)", contacts,
          &DASqlGenerator::GetCreateTableSql, &DADatabase::CreateTable);
}

void WriteRows(DADatabase& db, const char* dir)
{
    const struct {
        int id;
        const char* title;
    } groups[] = {{1, "Family"}, {2, "Work"}};
    for (const auto& group : groups) {
        DAUpsertRequest upsert;
        SetLocation(upsert, dir, "groups");
        upsert.SetData(kId, group.id);
        upsert.SetData(kTitle, group.title);
        Write(db, "Upsert a group", upsert, &DASqlGenerator::GetUpsertSql, &DADatabase::Upsert);
    }

    const struct {
        const char* phone;
        const char* name;
        int group;
    } contacts[] = {{"010-1111", "Kim", 1}, {"010-2222", "Lee", 2}, {"010-3333", "Park", 1}, {"010-4444", "Choi", 1}};
    for (const auto& contact : contacts) {
        DAUpsertRequest upsert;
        SetLocation(upsert, dir, "contacts");
        upsert.SetData(kPhone, contact.phone);
        upsert.SetData(kName, contact.name);
        upsert.SetData(kGroupId, contact.group);
        Write(db, "Upsert a contact", upsert, &DASqlGenerator::GetUpsertSql, &DADatabase::Upsert);
    }

    DAUpdateRequest update;
    SetLocation(update, dir, "contacts");
    update.SetData(kName, "Kim Min-ji");
    update.SetWhere(kPhone, "010-1111");
    Write(db, "Update Kim's name", update, &DASqlGenerator::GetUpdateSql, &DADatabase::Update);

    DADeleteRequest remove;
    SetLocation(remove, dir, "contacts");
    remove.SetWhere(kPhone, "010-3333");
    Write(db, "Delete Park", remove, &DASqlGenerator::GetDeleteSql, &DADatabase::Delete);
}

void Query(DADatabase& db, DASqlGenerator& generator, const char* dir)
{
    std::string sql;
    DACursor cursor;

    DASelectRequest all;
    SetLocation(all, dir, "contacts");
    generator.GetSelectSql(all, sql);
    Step("Select every contact", sql);
    Result(db.Select(all, cursor), SQLITE_OK);
    PrintCursor(cursor);

    DASelectRequest family;
    SetLocation(family, dir, "contacts");
    family.SetWhere(kGroupId, 1);
    generator.GetSelectSql(family, sql);
    Step("Select the contacts of group 1, reading typed values", sql);
    Result(db.Select(family, cursor), SQLITE_OK);
    while (cursor.MoveToNext() == 0) {
        std::string name;
        int group = 0;
        cursor.GetString(kName, name);
        cursor.GetInt(kGroupId, group);
        std::printf("   %s is in group %d\n", name.c_str(), group);
    }

    DAJoinRequest join;
    join.SetPath(dir, kFile);
    join.SetLeftJoin("contacts", kGroupId);
    join.SetRightJoin("groups", kId);
    join.SetWhere(kGroupTitle, "Family");
    generator.GetJoinSql(join, sql);
    Step("Inner join contacts with groups, Family only", sql);
    Result(db.JoinSelect(join, cursor), SQLITE_OK);
    PrintCursor(cursor);

    DASelectRequest missing;
    SetLocation(missing, dir, "no_such_table");
    generator.GetSelectSql(missing, sql);
    Step("Select from a table that does not exist (fails on purpose)", sql);
    Result(db.Select(missing, cursor), SQLITE_ERROR);
}

// A list screen's way of reading: sorted by name, two rows at a time, until
// a page comes back empty.
void ListByPages(DADatabase& db, DASqlGenerator& generator, const char* dir)
{
    const int pageSize = 2;
    for (int page = 0;; ++page) {
        DAQueryRequest query;
        SetLocation(query, dir, "contacts");
        query.SetOrderBy(kName);
        query.SetLimit(pageSize, page * pageSize);
        std::string sql;
        generator.GetQuerySql(query, sql);
        DACursor cursor;
        Step(("Contacts by name, page " + std::to_string(page + 1)).c_str(), sql);
        Result(db.Query(query, cursor), SQLITE_OK);
        PrintCursor(cursor);
        if (cursor.GetCount() < pageSize) {
            break;
        }
    }
}

// Milliseconds since 1970 pass int: SetData(std::int64_t) stores them and
// GetInt64 reads them back.
void TimeStamps(DADatabase& db, DASqlGenerator& generator, const char* dir)
{
    DACreateRequest events;
    SetLocation(events, dir, "events");
    events.SetPrimaryKey(kId, "INTEGER");
    events.SetColumnKey("at_ms", "INTEGER");
    Write(db, "Create the table events", events, &DASqlGenerator::GetCreateTableSql, &DADatabase::CreateTable);

    const std::int64_t stamp = 1700000000123;  // 2023-11-14 22:13:20.123 UTC
    DAUpsertRequest upsert;
    SetLocation(upsert, dir, "events");
    upsert.SetData(kId, 1);
    upsert.SetData("at_ms", stamp);
    Write(db, "Store a millisecond time stamp", upsert, &DASqlGenerator::GetUpsertSql, &DADatabase::Upsert);

    DASelectRequest select;
    SetLocation(select, dir, "events");
    std::string sql;
    generator.GetSelectSql(select, sql);
    DACursor cursor;
    Step("Read it back with GetInt64", sql);
    Result(db.Select(select, cursor), SQLITE_OK);
    std::int64_t read = 0;
    if (cursor.MoveToNext() == 0 && cursor.GetInt64("at_ms", read) == 0) {
        std::printf("   at_ms = %lld (%s)\n", static_cast<long long>(read), read == stamp ? "as stored" : "changed");
    }
}

// Column names made at run time (here from a counter; in an application
// from a configuration) must outlive the request: DAColumnName gives one
// lasting pointer per name, so a name rebuilt later is the same key.
void RunTimeNames(DADatabase& db, DASqlGenerator& generator, const char* dir)
{
    const int slots = 3;
    DACreateRequest create;
    SetLocation(create, dir, "slots");
    create.SetPrimaryKey(kId, "INTEGER");
    for (int i = 1; i <= slots; ++i) {
        create.SetColumnKey(DAColumnName::Intern(("slot_" + std::to_string(i)).c_str()), "INTEGER");
    }
    Write(db, "Create a table whose columns are named at run time", create, &DASqlGenerator::GetCreateTableSql,
          &DADatabase::CreateTable);

    DAUpsertRequest upsert;
    SetLocation(upsert, dir, "slots");
    upsert.SetData(kId, 1);
    for (int round = 0; round < 2; ++round) {  // the second round finds the same keys: nothing changes
        for (int i = 1; i <= slots; ++i) {
            upsert.SetData(DAColumnName::Intern(("slot_" + std::to_string(i)).c_str()), i * 10 + round);
        }
    }
    // The statement lists columns in the order of the names' addresses,
    // which differs from run to run; the data map is shown sorted instead.
    DAValueMap data;
    upsert.GetDataMap(data);
    std::vector<std::string> entries;
    for (const auto& entry : data) {
        entries.push_back(std::string(entry.first) + "=" + entry.second);
    }
    std::sort(entries.begin(), entries.end());
    std::printf("\n== Fill it from names built again in every round\n   data:");
    for (const std::string& entry : entries) {
        std::printf(" %s", entry.c_str());
    }
    std::printf(" (%zu columns, each once)\n", entries.size());
    Result(db.Upsert(upsert), SQLITE_OK);

    DASelectRequest select;
    SetLocation(select, dir, "slots");
    DACursor cursor;
    std::string sql;
    generator.GetSelectSql(select, sql);
    Step("Read the row back", sql);
    Result(db.Select(select, cursor), SQLITE_OK);
    PrintCursor(cursor);
}

void CheckAndDrop(DADatabase& db, DASqlGenerator& generator, const char* dir)
{
    std::string sql;
    DABasePath location;
    location.SetPath(dir, kFile);
    for (const char* table : {"contacts", "notes"}) {
        bool exists = false;
        generator.GetCheckTableSql(table, sql);
        Step("Check whether a table exists", sql);
        Result(db.CheckExistTable(location, table, exists), SQLITE_OK);
        std::printf("   %s exists: %s\n", table, exists ? "yes" : "no");
    }

    DACreateRequest notes;
    SetLocation(notes, dir, "notes");
    notes.SetColumnKey("body", "TEXT");
    Write(db, "Create a scratch table", notes, &DASqlGenerator::GetCreateTableSql, &DADatabase::CreateTable);

    DADropRequest drop;
    SetLocation(drop, dir, "notes");
    Write(db, "Drop the scratch table", drop, &DASqlGenerator::GetDropTableSql, &DADatabase::DropTable);
}

// Many writes as one batch: one open, one transaction, one commit, all or
// nothing, instead of one open and one commit per write.
void WriteBatch(DADatabase& db, DASqlGenerator& generator, const char* dir)
{
    const int readings = 200;
    DABatchRequest batch;
    batch.SetPath(dir, kFile);
    DACreateRequest create;
    SetLocation(create, dir, "readings");
    create.SetPrimaryKey(kId, "INTEGER");
    create.SetColumnKey("value", "REAL");
    batch.Add(create);
    std::string first;
    for (int i = 1; i <= readings; ++i) {
        DAUpsertRequest upsert;  // no location: it runs at the batch's
        upsert.SetTable("readings");
        upsert.SetData(kId, i);
        upsert.SetData("value", i * 0.25);
        if (i == 1) {
            generator.GetUpsertSql(upsert, first);
        }
        batch.Add(upsert);
    }
    Step("Batch: create readings and upsert 200 rows in one transaction", first + "  (first of 200)");
    std::printf("   statements held: %d\n", batch.GetCount());
    Result(db.ExecuteBatch(batch), SQLITE_OK);
    std::printf("   rows changed: %d\n", batch.GetChanges());
    std::printf("   files opened: 1 and commits: 1, against %d of each as single calls\n", batch.GetCount());

    DABatchRequest broken;
    broken.SetPath(dir, kFile);
    DAUpsertRequest good;
    good.SetTable("readings");
    good.SetData(kId, readings + 1);
    good.SetData("value", 0.5);
    DAUpsertRequest bad;
    bad.SetTable("no_such_table");
    bad.SetData(kId, 1);
    broken.Add(good);
    broken.Add(bad);
    generator.GetUpsertSql(bad, first);
    Step("Batch whose second statement fails (on purpose): nothing of it lands", first);
    Result(db.ExecuteBatch(broken), SQLITE_ERROR);
    DASelectRequest all;
    SetLocation(all, dir, "readings");
    DACursor cursor;
    db.Select(all, cursor);
    std::printf("   readings rows: %d\n", cursor.GetCount());

    DADropRequest drop;
    SetLocation(drop, dir, "readings");
    Write(db, "Drop readings", drop, &DASqlGenerator::GetDropTableSql, &DADatabase::DropTable);
}

// A firmware update's schema upgrade: one step per version (a table, an
// added column, an index), run in order at every start. The first start
// brings a new file from version 0 to 3; the second finds it up to date
// and skips every step.
void Upgrade(DADatabase& db, DASqlGenerator& generator, const char* dir)
{
    const char* const file = "upgrade.db";
    std::remove((std::string(dir) + "/" + file).c_str());  // a new file at each demo run
    DACreateRequest table;
    table.SetTable("events");
    table.SetColumnKey("ts", "INTEGER");
    DAAddColumnRequest level;
    level.SetTable("events");
    level.SetColumn("level", "INTEGER");
    level.SetDefault("0");
    DACreateIndexRequest index;
    index.SetTable("events");
    index.SetName("events_ts");
    index.AddColumn("ts", true);
    std::string sql[3];
    generator.GetCreateTableSql(table, sql[0]);
    generator.GetAddColumnSql(level, sql[1]);
    generator.GetCreateIndexSql(index, sql[2]);
    for (int start = 1; start <= 2; ++start) {
        for (int version = 1; version <= 3; ++version) {
            DABatchRequest step;
            step.SetPath(dir, file);
            version == 1 ? step.Add(table) : version == 2 ? step.Add(level) : step.Add(index);
            const std::string title =
                "Start " + std::to_string(start) + ": Migrate to version " + std::to_string(version);
            Step(title.c_str(), sql[version - 1]);
            Result(db.Migrate(step, version), SQLITE_OK);
        }
    }
    DABasePath location;
    location.SetPath(dir, file);
    int version = -1;
    Result(db.GetVersion(location, version), SQLITE_OK);
    std::printf("   %s is at version %d\n", file, version);
}

// Deleted rows (here the dropped readings) leave free pages in the file
// until Compact gives them back.
void Space(DADatabase& db, DASqlGenerator& generator, const char* dir)
{
    DABasePath location;
    location.SetPath(dir, kFile);
    std::int64_t fileBytes = 0;
    std::int64_t freeBytes = 0;
    const auto print = [&] {
        Result(db.GetSpace(location, fileBytes, freeBytes), SQLITE_OK);
        std::printf("   file: %lld bytes, free: %lld bytes\n", static_cast<long long>(fileBytes),
                    static_cast<long long>(freeBytes));
    };
    std::string sql;
    generator.GetCompactSql(location, sql);
    Step("Space before compacting", "PRAGMA page_count, freelist_count, page_size");
    print();
    Step("Compact: rewrite the file without its free pages", sql);
    Result(db.Compact(location), SQLITE_OK);
    print();
}

// An event journal kept for a week: events go in with Insert (in a batch),
// a retention pass deletes the older ones by a range condition, a count per
// type summarises the rest, and keyset pages list them newest first.
void Retention(DADatabase& db, DASqlGenerator& generator, const char* dir)
{
    const std::int64_t day = 24LL * 3600 * 1000;
    const std::int64_t now = 1700000000123;
    DACreateRequest create;
    SetLocation(create, dir, "journal");
    create.SetPrimaryKey(kId, "INTEGER");
    create.SetColumnKey("at_ms", "INTEGER");
    create.SetColumnKey("type", "TEXT");
    Write(db, "Create the table journal", create, &DASqlGenerator::GetCreateTableSql, &DADatabase::CreateTable);

    DABatchRequest batch;
    batch.SetPath(dir, kFile);
    const char* const types[] = {"alarm", "door", "alarm", "info"};
    std::string sql;
    for (int i = 0; i < 10; ++i) {  // one event a day for ten days
        DAInsertRequest insert;
        insert.SetTable("journal");
        insert.SetData(kId, i + 1);
        insert.SetData("at_ms", now - (9 - i) * day);
        insert.SetData("type", types[i % 4]);
        generator.GetInsertSql(insert, sql);
        batch.Add(insert);
    }
    Step("Insert ten days of events in one batch", sql + "  (last of 10)");
    Result(db.ExecuteBatch(batch), SQLITE_OK);

    DAInsertRequest again;  // the same id once more: kept out, no failure
    SetLocation(again, dir, "journal");
    again.SetData(kId, 1);
    again.SetData("type", "door");
    again.SetIgnoreExisting();
    generator.GetInsertSql(again, sql);
    Step("Insert an event whose id exists, ignoring it", sql);
    std::int64_t rowId = 0;
    Result(db.Insert(again, rowId), SQLITE_OK);
    std::printf("   row id: %lld (-1: the row was there)\n", static_cast<long long>(rowId));

    DADeleteRequest old;
    SetLocation(old, dir, "journal");
    old.SetWhere("at_ms", DACompare::Less, now - 7 * day);
    generator.GetDeleteSql(old, sql);
    Step("Retention pass: delete what is older than a week", sql);
    int removed = 0;
    Result(db.Delete(old, removed), SQLITE_OK);
    std::printf("   rows deleted: %d\n", removed);

    DAQueryRequest perType;
    SetLocation(perType, dir, "journal");
    perType.AddColumn("type");
    perType.AddAggregate(DAAggregate::Count, nullptr, "n");
    perType.AddAggregate(DAAggregate::Max, "at_ms", "newest");
    perType.AddGroupBy("type");
    perType.SetOrderBy("n", true);
    perType.SetOrderBy("type");
    generator.GetQuerySql(perType, sql);
    DACursor cursor;
    Step("Count the events per type", sql);
    Result(db.Query(perType, cursor), SQLITE_OK);
    PrintCursor(cursor);

    std::int64_t last = INT64_MAX;
    for (int page = 1; page <= 2; ++page) {  // the next page starts below the last time stamp shown
        DAQueryRequest events;
        SetLocation(events, dir, "journal");
        events.SetWhere("at_ms", DACompare::Less, last);
        events.SetOrderBy("at_ms", true);
        events.SetLimit(3);
        generator.GetQuerySql(events, sql);
        Step(("Newest events, keyset page " + std::to_string(page)).c_str(), sql);
        Result(db.Query(events, cursor), SQLITE_OK);
        PrintCursor(cursor);
        cursor.MoveToLast();
        cursor.MoveToPrev();
        cursor.GetInt64("at_ms", last);
    }

    DADropRequest drop;
    SetLocation(drop, dir, "journal");
    Write(db, "Drop journal", drop, &DASqlGenerator::GetDropTableSql, &DADatabase::DropTable);
}

// The same requests through a session that holds the file open: no
// location on the requests, the write-ahead log on, and the second select
// of the same shape runs the statement the first one prepared.
void Session(DASqlGenerator& generator, const char* dir)
{
    DABasePath location;
    location.SetPath(dir, kFile);
    DASession session;
    Step("Open a session on the file", "PRAGMA journal_mode=WAL; PRAGMA synchronous=FULL");
    Result(session.Open(location), SQLITE_OK);

    DAUpsertRequest upsert;  // no location: the session's file
    upsert.SetTable("contacts");
    upsert.SetData(kPhone, "010-5555");
    upsert.SetData(kName, "Yoon");
    upsert.SetData(kGroupId, 2);
    std::string sql;
    generator.GetUpsertSql(upsert, sql);
    Step("Session: upsert a contact", sql);
    Result(session.Upsert(upsert), SQLITE_OK);

    for (const char* phone : {"010-5555", "010-1111"}) {
        DASelectRequest select;
        select.SetTable("contacts");
        select.SetWhere(kPhone, phone);
        generator.GetSelectSql(select, sql);
        Step("Session: select a contact by phone", sql);
        DACursor cursor;
        Result(session.Select(select, cursor), SQLITE_OK);
        PrintCursor(cursor);
    }
    Step("Close the session: the log goes back into the file", "(a checkpoint, then the log removed)");
    session.Close();
    std::printf("   open: %s\n", session.IsOpen() ? "yes" : "no");
}

// A watch in a second process: the child watches the contacts table and
// waits, the parent writes; the child reports what it saw. Nothing of the
// watch remains in the file after Unwatch.
void Watch(DADatabase& db, const char* dir)
{
    DABasePath location;
    location.SetPath(dir, kFile);
    Step("Watch contacts from a second process (fork)", "triggers counting into \"ulo_db-watch\"");
    int ready[2] = {-1, -1};
    if (pipe(ready) != 0) {
        Result(errno, 0);
        return;
    }
    const pid_t child = fork();
    if (child == 0) {
        close(ready[0]);
        DAWatch watch;
        int rc = watch.Open(location) + watch.AddTable("contacts");
        const char started = 'w';
        rc += write(ready[1], &started, 1) == 1 ? 0 : 1;
        std::vector<std::string> changed;
        rc += watch.Wait(5000, changed);
        std::printf("   watcher (pid %d): changed =", static_cast<int>(getpid()));
        for (const std::string& table : changed) {
            std::printf(" %s", table.c_str());
        }
        std::printf("\n");
        _exit(rc == 0 && changed.size() == 1 ? 0 : 1);
    }
    close(ready[1]);
    char started = 0;
    const bool watching = child > 0 && read(ready[0], &started, 1) == 1;
    close(ready[0]);
    DAUpsertRequest upsert;
    SetLocation(upsert, dir, "contacts");
    upsert.SetData(kPhone, "010-6666");
    upsert.SetData(kName, "Jang");
    upsert.SetData(kGroupId, 1);
    Step("Upsert a contact in this process", "INSERT OR REPLACE INTO contacts ...");
    Result(watching ? db.Upsert(upsert) : -1, SQLITE_OK);
    int status = -1;
    if (child > 0) {
        waitpid(child, &status, 0);
    }
    Step("The watcher saw it", "(exit status of the second process)");
    Result(WIFEXITED(status) ? WEXITSTATUS(status) : -1, 0);
    Step("Unwatch contacts: the triggers and the counter table go", "DROP TRIGGER ...; DROP TABLE \"ulo_db-watch\"");
    Result(db.Unwatch(location, "contacts"), SQLITE_OK);
}

}  // namespace

int main(int argc, char** argv)
{
    const char* dir = argc > 1 ? argv[1] : kDefaultDir;
    if (mkdir(dir, 0755) != 0 && errno != EEXIST) {
        std::fprintf(stderr, "cannot create %s: %s\n", dir, std::strerror(errno));
        return 2;
    }
    std::setvbuf(stdout, nullptr, _IOLBF, 0);
    dlog_set_sink(PrintLogLine, nullptr);

    std::printf("libulo_db demo on %s/%s\n", dir, kFile);
    DADatabase db;
    DASqlGenerator generator;
    CreateTables(db, dir);
    WriteRows(db, dir);
    Query(db, generator, dir);
    ListByPages(db, generator, dir);
    TimeStamps(db, generator, dir);
    RunTimeNames(db, generator, dir);
    CheckAndDrop(db, generator, dir);
    WriteBatch(db, generator, dir);
    Retention(db, generator, dir);
    Upgrade(db, generator, dir);
    Space(db, generator, dir);
    Session(generator, dir);
    Watch(db, dir);

    std::printf("\n%s\n", g_unexpected == 0 ? "Every step gave the expected result." : "Some steps failed.");
    return g_unexpected == 0 ? 0 : 1;
}
