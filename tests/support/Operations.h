#ifndef ULO_TESTS_OPERATIONS_H
#define ULO_TESTS_OPERATIONS_H

// The table of operations every behaviour and fault test draws from. A row
// fills its requests, runs them through a connection source (a per-call
// DADatabase or a DASession opened at the row's file) on the seeded file of
// a directory, and leaves what it read in a cursor. A row changes the file
// in one step at most (its other operations read, repeat it or fail), so
// that after any fault the file is as before the row or as after it; a row
// flagged kSteps is the exception.

#include <sys/stat.h>

#include <filesystem>
#include <functional>
#include <string>

#include "DADatabase.h"
#include "DASession.h"
#include "DAWatch.h"
#include "DatabaseTestUtil.h"

inline const char* const kSeed =
    "CREATE TABLE contacts(_ID INTEGER PRIMARY KEY, name TEXT, phone TEXT);"
    "CREATE TABLE groups(_ID INTEGER PRIMARY KEY, title TEXT);"
    "INSERT INTO contacts(name, phone) VALUES ('Kim', '010'), ('Lee', '011'), ('Park', '012');"
    "INSERT INTO groups(title) VALUES ('Family'), ('Work');"
    "CREATE INDEX contacts_by_name ON contacts(name);";

// A connection source: per-call visits (session null) or a session.
struct Target {
    DADatabase* db;
    DASession* session;
};
#define RUN(target, operation, ...)                                                                                    \
    ((target).session != nullptr ? (target).session->operation(__VA_ARGS__) : (target).db->operation(__VA_ARGS__))
// An operation on a whole file: the session's own, or location per call.
#define RUN_AT(target, location, operation, ...)                                                                       \
    ((target).session != nullptr ? (target).session->operation(__VA_ARGS__)                                            \
                                 : (target).db->operation(location, __VA_ARGS__))

// What a row is to the fault driver: kSteps, it changes the file in more
// than one step (after a fault the file is whole, at any of its steps);
// kHeavy, the loop over every allocation of SQLite's skips it (thousands of
// points, seconds each pass); every other fault kind runs it.
enum RowFlags : unsigned { kSteps = 1U, kHeavy = 2U };

struct Operation {
    const char* name;
    std::function<int(Target&, const std::string& dir, DACursor& cursor)> run;
    unsigned flags = 0;
    const char* expected = nullptr;  // its Summary per call, where stated exactly
    friend void PrintTo(const Operation& row, std::ostream* os) { *os << row.name; }
};

// A request at the seeded file of dir, with a condition.
template <typename R>
R& Make(R& request, const std::string& dir, const char* table, const char* column = "name", const char* value = "Lee")
{
    At(request, dir, table).SetWhere(column, value);
    return request;
}

// Numbers a row computed, as its cursor's one value.
inline void Note(DACursor& cursor, const std::string& text)
{
    cursor.Initialize();
    cursor.SetColumn("noted");
    cursor.SetData("noted", text.c_str());
}

inline const Operation kOperations[] = {
    {"create_table",
     [](Target& t, const std::string& dir, DACursor&) {
         DACreateRequest create;
         DADropRequest drop;
         At(create, dir, "notes").SetColumnKey("text", "TEXT");
         const int rc = RUN(t, CreateTable, create) * 10 + RUN(t, DropTable, At(drop, dir, "gone"));
         return rc * 10 + RUN(t, CreateTable, At(create, dir, "contacts_by_name"));  // an index's name
     },
     0,
     "11 / / ok|0/contacts;contacts_by_name;groups;notes/1|Kim|010;2|Lee|011;3|Park|012/1|Family;2|Work\n"
     "4 DADatabase.cpp:CreateTable > createTable SUCCESS[0]\n"
     "6 DADatabase.cpp:DropTable > DropTable FAILED[1]: no such table: gone\n"
     "6 DADatabase.cpp:CreateTable > createTable FAILED[1]: there is already an index named contacts_by_name"},
    {"drop_table",
     [](Target& t, const std::string& dir, DACursor&) {
         DADropRequest drop;
         return RUN(t, DropTable, At(drop, dir, "groups"));
     },
     0,
     "0 / / ok|0/contacts;contacts_by_name/1|Kim|010;2|Lee|011;3|Park|012/\n"
     "4 DADatabase.cpp:DropTable > DropTable SUCCESS[0]"},
    {"upsert",
     [](Target& t, const std::string& dir, DACursor&) {
         DAUpsertRequest upsert;
         At(upsert, dir, "contacts").SetData("_ID", 1);
         upsert.SetData("name", "Cho");
         upsert.SetBlob("phone", "099", 3);  // bound, and when it fails SQLite's text all the same
         const int rc = RUN(t, Upsert, upsert);
         return rc * 10 + RUN(t, Upsert, At(upsert, dir, "people"));
     },
     0,
     "1 / / ok|0/contacts;contacts_by_name;groups/1|Cho|099;2|Lee|011;3|Park|012/1|Family;2|Work\n"
     "4 DADatabase.cpp:Upsert > Upsert SUCCESS[0]\n"
     "6 DADatabase.cpp:Upsert > Upsert FAILED[1]: no such table: people"},
    {"update",  // a range; the second changes the same rows again, the failing one leaves the count alone
     [](Target& t, const std::string& dir, DACursor& cursor) {
         DAUpdateRequest update;
         At(update, dir, "contacts").SetData("name", "Han");
         update.SetWhere("_ID", DACompare::GreaterEqual, 2);
         update.SetWhere("_ID", DACompare::LessEqual, 3);
         int changes = -1;
         const int rc = RUN(t, Update, update) * 10 + RUN(t, Update, update, changes);
         const int failed = RUN(t, Update, At(update, dir, "people"), changes);
         Note(cursor, std::to_string(changes));
         return rc * 10 + failed;
     },
     0,
     "1 / noted 2 / ok|0/contacts;contacts_by_name;groups/1|Kim|010;2|Han|011;3|Han|012/1|Family;2|Work\n"
     "4 DADatabase.cpp:Update > update SUCCESS[0]\n"
     "4 DADatabase.cpp:Update > update SUCCESS[0]\n"
     "6 DADatabase.cpp:Update > update FAILED[1]: no such table: people"},
    {"delete",  // the second finds nothing
     [](Target& t, const std::string& dir, DACursor& cursor) {
         DADeleteRequest remove;
         At(remove, dir, "contacts").SetWhere("_ID", DACompare::Less, std::int64_t{2});
         int changes = -1;
         const int rc = RUN(t, Delete, remove) * 100 + RUN(t, Delete, remove, changes) * 10;
         const int failed = RUN(t, Delete, At(remove, dir, "people"), changes);
         Note(cursor, std::to_string(changes));
         return rc + failed;
     },
     0,
     "1 / noted 0 / ok|0/contacts;contacts_by_name;groups/2|Lee|011;3|Park|012/1|Family;2|Work\n"
     "4 DADatabase.cpp:Delete > delete SUCCESS[0]\n"
     "4 DADatabase.cpp:Delete > delete SUCCESS[0]\n"
     "6 DADatabase.cpp:Delete > delete FAILED[1]: no such table: people"},
    {"insert",  // the new row's id; a clash fails with 19 (the id kept) unless ignored (then -1)
     [](Target& t, const std::string& dir, DACursor& cursor) {
         DAInsertRequest insert;
         At(insert, dir, "contacts").SetData("name", "Yoo");
         std::int64_t id = -2;
         int rc = RUN(t, Insert, insert, id);
         std::string ids = std::to_string(id);
         insert.SetData("_ID", 1);
         rc = rc * 100 + RUN(t, Insert, insert, id);
         ids += " " + std::to_string(id);
         insert.SetIgnoreExisting();
         rc += RUN(t, Insert, insert, id);
         Note(cursor, ids + " " + std::to_string(id));
         return rc;
     },
     0,
     "19 / noted 4 4 -1 / "
     "ok|0/contacts;contacts_by_name;groups/1|Kim|010;2|Lee|011;3|Park|012;4|Yoo|NULL/1|Family;2|Work\n"
     "4 DADatabase.cpp:Insert > Insert SUCCESS[0]\n"
     "6 DADatabase.cpp:Insert > Insert FAILED[19]: UNIQUE constraint failed: contacts._ID\n"
     "4 DADatabase.cpp:Insert > Insert SUCCESS[0]"},
    {"select",  // the failing one leaves the cursor as it was
     [](Target& t, const std::string& dir, DACursor& cursor) {
         DASelectRequest r;
         return RUN(t, Select, Make(r, dir, "contacts"), cursor) * 10 + RUN(t, Select, Make(r, dir, "people"), cursor);
     },
     0,
     "1 / _ID name phone 2 Lee 011 / "
     "ok|0/contacts;contacts_by_name;groups/1|Kim|010;2|Lee|011;3|Park|012/1|Family;2|Work\n"
     "6 DADatabase.cpp:Select > SELECT FAILED[1]: no such table: people"},
    {"same_shapes_other_values",  // a session binds these into the statement it kept
     [](Target& t, const std::string& dir, DACursor& cursor) {
         std::string seen;
         int rc = 0;
         for (const char* name : {"Kim", "Nobody", "Kim"}) {
             DASelectRequest r;
             rc += RUN(t, Select, Make(r, dir, "contacts", "name", name), cursor);
             seen += std::to_string(cursor.GetCount()) + " ";
         }
         DABatchRequest more;  // ids 10..21, so that integers of two digits tell rows apart
         for (int id = 10; id < 22; ++id) {
             DAUpsertRequest row;
             At(row, dir, "contacts").SetData("_ID", id);
             At(more, dir).Add(row);
         }
         rc += RUN(t, ExecuteBatch, more);
         for (int above : {11, 2, 17}) {
             DAQueryRequest r;
             At(r, dir, "contacts").SetWhere("_ID", DACompare::Greater, above);
             r.SetLimit(12, above % 2);
             rc += RUN(t, Query, r, cursor);
             seen += std::to_string(cursor.GetCount()) + " ";
         }
         Note(cursor, seen);
         return rc;
     },
     0,
     "0 / noted 1 -1 1 9 12 3  / "
     "ok|0/contacts;contacts_by_name;groups/"
     "1|Kim|010;2|Lee|011;3|Park|012;10|NULL|NULL;11|NULL|NULL;12|NULL|NULL;13|NULL|NULL;14|NULL|NULL;15|NULL|NULL;16|"
     "NULL|NULL;17|NULL|NULL;18|NULL|NULL;19|NULL|NULL;20|NULL|NULL;21|NULL|NULL/1|Family;2|Work\n"
     "4 DADatabase.cpp:ExecuteBatch > ExecuteBatch SUCCESS[0]: 12 statements"},
    {"join_select",
     [](Target& t, const std::string& dir, DACursor& cursor) {
         DAJoinRequest r;
         At(r, dir).SetLeftJoin("contacts", "_ID");
         r.SetRightJoin("groups", "_ID");
         const int rc = RUN(t, JoinSelect, r, cursor);
         r.SetLeftJoin("people", "_ID");
         return rc * 10 + RUN(t, JoinSelect, r, cursor);
     },
     0,
     "1 / _ID name phone _ID title 1 Kim 010 1 Family 1 Lee 011 1 Work / "
     "ok|0/contacts;contacts_by_name;groups/1|Kim|010;2|Lee|011;3|Park|012/1|Family;2|Work\n"
     "6 DADatabase.cpp:JoinSelect > JoinSelect FAILED[1]: no such table: people"},
    {"query_second_page",
     [](Target& t, const std::string& dir, DACursor& cursor) {
         DAQueryRequest r;
         At(r, dir, "contacts").SetOrderBy("name", true);
         r.SetLimit(2, 3);  // past the end: the cursor emptied
         cursor.SetColumn("mine");
         int rc = RUN(t, Query, r, cursor) * 10 + cursor.GetCount() + 1;
         r.SetLimit(2, 1);
         rc = rc * 10 + RUN(t, Query, r, cursor);
         r.SetOrderBy("age");
         return rc * 10 + RUN(t, Query, r, cursor);
     },
     0,
     "1 / _ID name phone 2 Lee 011 1 Kim 010 / "
     "ok|0/contacts;contacts_by_name;groups/1|Kim|010;2|Lee|011;3|Park|012/1|Family;2|Work\n"
     "6 DADatabase.cpp:Query > QUERY FAILED[1]: no such column: age"},
    {"check_exist_table",
     [](Target& t, const std::string& dir, DACursor& cursor) {
         bool groups = false;
         bool people = true;
         DABasePath at;
         At(at, dir);
         const int rc =
             RUN_AT(t, at, CheckExistTable, "groups", groups) * 10 + RUN_AT(t, at, CheckExistTable, "people", people);
         Note(cursor, groups && !people ? "yes" : "no");
         return rc;
     },
     0, "0 / noted yes / ok|0/contacts;contacts_by_name;groups/1|Kim|010;2|Lee|011;3|Park|012/1|Family;2|Work"},
    {"create_index",  // again: nothing changes; on a missing table: fails
     [](Target& t, const std::string& dir, DACursor&) {
         DACreateIndexRequest index;
         At(index, dir, "contacts").SetName("by_phone");
         index.AddColumn("phone", true);
         index.AddColumn("name");
         const int rc = RUN(t, CreateIndex, index) * 10 + RUN(t, CreateIndex, index);
         return rc * 10 + RUN(t, CreateIndex, At(index, dir, "people"));
     },
     0,
     "1 / / ok|0/by_phone;contacts;contacts_by_name;groups/1|Kim|010;2|Lee|011;3|Park|012/1|Family;2|Work\n"
     "4 DADatabase.cpp:CreateIndex > CreateIndex SUCCESS[0]\n"
     "4 DADatabase.cpp:CreateIndex > CreateIndex SUCCESS[0]\n"
     "6 DADatabase.cpp:CreateIndex > CreateIndex FAILED[1]: no such table: main.people"},
    {"add_column",  // the second fails: the column is there
     [](Target& t, const std::string& dir, DACursor&) {
         DAAddColumnRequest column;
         At(column, dir, "contacts").SetColumn("level", "INTEGER");
         column.SetDefault("0");
         return RUN(t, AddColumn, column) * 10 + RUN(t, AddColumn, column);
     },
     0,
     "1 / / ok|0/contacts;contacts_by_name;groups/1|Kim|010|0;2|Lee|011|0;3|Park|012|0/1|Family;2|Work\n"
     "4 DADatabase.cpp:AddColumn > AddColumn SUCCESS[0]\n"
     "6 DADatabase.cpp:AddColumn > AddColumn FAILED[1]: duplicate column name: level"},
    {"migrate_and_compact",
     [](Target& t, const std::string& dir, DACursor& cursor) {
         DABatchRequest step;
         DADeleteRequest remove;
         At(step, dir).Add(Make(remove, dir, "contacts"));
         DABasePath at;
         At(at, dir);
         int version = -1;
         std::int64_t bytes[2] = {-1, -1};
         DABatchRequest failing;  // its second request fails
         DADropRequest drop;
         At(failing, dir).Add(remove);
         failing.Add(At(drop, dir, "gone"));
         int rc = RUN(t, Migrate, step, 3) + RUN(t, Migrate, step, 0);  // too new, below 1: refused
         rc = rc * 10 + RUN(t, Migrate, step, 1) * 10 + RUN(t, Migrate, step, 1);  // the second is skipped
         rc = rc * 10 + RUN(t, Migrate, failing, 2);
         rc = rc * 10 + RUN_AT(t, at, GetVersion, version) +
             (t.session != nullptr ? t.session->Compact() : t.db->Compact(at)) +
             RUN_AT(t, at, GetSpace, bytes[0], bytes[1]);
         Note(cursor, std::to_string(version) + " " + std::to_string(bytes[0]) + " " + std::to_string(bytes[1]));
         return rc;
     },
     0,
     "42010 / noted 1 16384 0 / ok|1/contacts;contacts_by_name;groups/1|Kim|010;3|Park|012/1|Family;2|Work\n"
     "6 DADatabase.cpp:Migrate > Migrate FAILED[21]: file at version 0, step for version 3\n"
     "6 DADatabase.cpp:Migrate > Migrate FAILED[21]: step for version 0, versions start at 1\n"
     "4 DADatabase.cpp:Migrate > Migrate SUCCESS[0]: version 1\n"
     "4 DADatabase.cpp:Migrate > Migrate SKIPPED: file at version 1\n"
     "6 DADatabase.cpp:Migrate > Migrate FAILED[1] at 2/2: no such table: gone\n"
     "4 DADatabase.cpp:Compact > Compact SUCCESS[0]"},
    {"search_index_by_migration_then_dropped",
     [](Target& t, const std::string& dir, DACursor& cursor) {
         DASearchIndexRequest index;
         At(index, dir, "contacts").SetName("names");
         index.AddColumn("name");
         DABatchRequest step;
         At(step, dir).Add(index);
         DASearchRequest search;
         At(search, dir, "contacts").SetIndex("names");
         search.SetText("LE");
         search.SetPrefixLast();
         search.AddSnippet("name", "<", ">", 2, "hit");
         int rc = RUN(t, Migrate, step, 1) * 10 + RUN(t, Search, search, cursor);
         DABasePath at;
         rc = rc * 10 + RUN_AT(t, At(at, dir), DropSearchIndex, "names");
         return rc * 10 + RUN(t, Search, search, cursor) + RUN(t, CreateSearchIndex, index);
     },
     kSteps | kHeavy,
     "1 / _ID name phone hit 2 Lee 011 <Lee> / "
     "ok|1/"
     "contacts;contacts_by_name;groups;ulo_search_names;ulo_search_names_config;ulo_search_names_content;ulo_search_"
     "names_data;ulo_search_names_delete;ulo_search_names_docsize;ulo_search_names_idx;ulo_search_names_insert;ulo_"
     "search_names_update/1|Kim|010;2|Lee|011;3|Park|012/1|Family;2|Work\n"
     "4 DADatabase.cpp:Migrate > Migrate SUCCESS[0]: version 1\n"
     "4 DADatabase.cpp:DropSearchIndex > DropSearchIndex SUCCESS[0]\n"
     "6 DADatabase.cpp:Search > SEARCH FAILED[1]: no such table: ulo_search_names\n"
     "4 DADatabase.cpp:CreateSearchIndex > CreateSearchIndex SUCCESS[0]"},
    {"search_index_refused_then_its_table_dropped",  // again: no change; a bad column, table or name: nothing
     [](Target& t, const std::string& dir, DACursor& cursor) {
         DASearchIndexRequest index;
         At(index, dir, "groups").SetName("titles");
         index.AddColumn("title");
         // Unsigned: under a fault the codes are larger and the digits wrap.
         unsigned rc = RUN(t, CreateSearchIndex, index) * 10U + RUN(t, CreateSearchIndex, index);
         index.SetName("other");
         index.AddColumn("nope");
         rc = rc * 10 + RUN(t, CreateSearchIndex, index);
         rc = rc * 10 + RUN(t, CreateSearchIndex, At(index, dir, "missing"));
         index.SetName("bad name");  // refused, the name kept
         DADropRequest drop;
         DASearchRequest search;
         At(search, dir, "groups").SetIndex("titles");
         search.SetText("work");
         rc = rc * 10 + RUN(t, DropTable, At(drop, dir, "groups"));
         rc = rc * 10 + RUN(t, Search, search, cursor);  // fails as a query does
         DABasePath at;
         At(at, dir);
         rc = rc * 10 + RUN_AT(t, at, DropSearchIndex, "titles_data");  // the index "titles"' own table
         for (const char* name : {"titles;", "titles"}) {  // the second removes everything, its table gone
             rc = rc * 100 + RUN_AT(t, at, DropSearchIndex, name);
         }
         return static_cast<int>(rc);
     },
     kSteps | kHeavy,
     "110112100 / / ok|0/contacts;contacts_by_name/1|Kim|010;2|Lee|011;3|Park|012/\n"
     "4 DADatabase.cpp:CreateSearchIndex > CreateSearchIndex SUCCESS[0]\n"
     "4 DADatabase.cpp:CreateSearchIndex > CreateSearchIndex SUCCESS[0]\n"
     "6 DADatabase.cpp:CreateSearchIndex > CreateSearchIndex FAILED[1]: no such column: nope\n"
     "6 DADatabase.cpp:CreateSearchIndex > CreateSearchIndex FAILED[1]: no such table: missing\n"
     "6 DASearchIndexRequest.cpp:SetName > INVALID NAME, NOT STORED\n"
     "4 DADatabase.cpp:DropTable > DropTable SUCCESS[0]\n"
     "6 DADatabase.cpp:Search > SEARCH FAILED[1]: no such table: groups\n"
     "6 DADatabase.cpp:DropSearchIndex > DropSearchIndex FAILED[1]: table ulo_search_titles_data may not be dropped\n"
     "6 DADatabase.cpp:DropSearchIndex > DropSearchIndex FAILED[21]: invalid name\n"
     "4 DADatabase.cpp:DropSearchIndex > DropSearchIndex SUCCESS[0]"},
    {"keeping_rows_counters_row_ids_applied_steps",
     [](Target& t, const std::string& dir, DACursor& cursor) {
         DAUpsertRequest keep;  // updates row 1 in place: its phone stays
         At(keep, dir, "contacts").SetData("_ID", 1);
         keep.SetData("name", "Cho");
         keep.AddConflictKey("_ID");
         DAUpsertRequest replace;  // replaces row 2: its phone is gone
         At(replace, dir, "contacts").SetData("_ID", 2);
         replace.SetData("name", "Min");
         DAUpdateRequest counter;
         Make(counter, dir, "groups", "title", "Work").SetIncrement("_ID", 10);
         DAInsertRequest added;
         DAInsertRequest ignored;
         At(added, dir, "groups").SetData("title", "Club");
         At(ignored, dir, "groups").SetData("_ID", 1);
         ignored.SetIgnoreExisting();
         DABatchRequest step;
         At(step, dir).Add(added);
         step.Add(counter);
         step.Add(ignored);
         step.Add(added);
         bool applied[2] = {false, true};
         int rc = RUN(t, Upsert, keep) + RUN(t, Upsert, replace) + RUN(t, Update, counter);
         rc = rc * 10 + RUN(t, Migrate, step, 1, applied[0]) + RUN(t, Migrate, step, 1, applied[1]);
         rc = rc * 10 + RUN(t, ExecuteBatch, step);
         std::vector<std::int64_t> ids;
         step.GetRowIds(ids);
         std::string state = std::to_string(applied[0]) + std::to_string(applied[1]);
         for (const std::int64_t id : ids) {
             state += " " + std::to_string(id);
         }
         Note(cursor, state);
         return rc;
     },
     kSteps,
     "0 / noted 10 24 -1 33 / "
     "ok|1/contacts;contacts_by_name;groups/1|Cho|010;2|Min|NULL;3|Park|012/"
     "1|Family;13|Club;23|Club;24|Club;32|Work;33|Club\n"
     "4 DADatabase.cpp:Upsert > Upsert SUCCESS[0]\n"
     "4 DADatabase.cpp:Upsert > Upsert SUCCESS[0]\n"
     "4 DADatabase.cpp:Update > update SUCCESS[0]\n"
     "4 DADatabase.cpp:Migrate > Migrate SUCCESS[0]: version 1\n"
     "4 DADatabase.cpp:Migrate > Migrate SKIPPED: file at version 1\n"
     "4 DADatabase.cpp:ExecuteBatch > ExecuteBatch SUCCESS[0]: 4 statements"},
    {"unwatch",  // removes the triggers and counters a watch installed; refuses a name that is not plain
     [](Target& t, const std::string& dir, DACursor&) {
         DAWatch watch;
         DABasePath at;
         const int rc = watch.Open(At(at, dir)) + watch.AddTable("contacts");
         watch.Close();
         return rc * 100 + RUN_AT(t, at, Unwatch, "contacts") * 10 + RUN_AT(t, at, Unwatch, "a b");
     },
     kSteps | kHeavy,
     "21 / / ok|0/contacts;contacts_by_name;groups/1|Kim|010;2|Lee|011;3|Park|012/1|Family;2|Work\n"
     "4 DAWatch.cpp:AddTable > AddTable SUCCESS[0]\n"
     "4 DADatabase.cpp:Unwatch > Unwatch SUCCESS[0]\n"
     "6 DADatabase.cpp:Unwatch > Unwatch FAILED[21]: table name is not a plain name"},
    {"backup_check_rebuild_restore",  // the restored rows read at once, on every connection
     [](Target& t, const std::string& dir, DACursor& cursor) {
         DABasePath at;
         DABasePath copy;
         At(at, dir);
         copy.SetPath(dir.c_str(), "copy.db");
         DADeleteRequest remove;
         DASelectRequest select;
         std::vector<std::string> problems;
         DASession* s = t.session;
         int rc = RUN_AT(t, at, Backup, copy);
         rc = rc * 10 + RUN(t, Delete, At(remove, dir, "contacts"));  // every row, back with the restore
         rc = rc * 10 + RUN_AT(t, at, CheckIntegrity, true, problems) +
             (s != nullptr ? s->RebuildIndexes() + s->Restore(copy)
                           : t.db->RebuildIndexes(at) + t.db->Restore(copy, at));
         rc = rc * 100 + RUN_AT(t, at, Backup, at);  // onto itself: 21
         rc = rc * 10 + RUN_AT(t, at, Backup, copy);  // the restore left no log
         return rc * 10 + RUN(t, Select, Make(select, dir, "contacts"), cursor) + static_cast<int>(problems.size());
     },
     kSteps | kHeavy,
     "2100 / _ID name phone 2 Lee 011 / "
     "ok|0/contacts;contacts_by_name;groups/1|Kim|010;2|Lee|011;3|Park|012/1|Family;2|Work\n"
     "4 DADatabase.cpp:Backup > Backup SUCCESS[0]: 4 pages\n"
     "4 DADatabase.cpp:Delete > delete SUCCESS[0]\n"
     "4 DADatabase.cpp:CheckIntegrity > CheckIntegrity SUCCESS[0]: 0 problems\n"
     "4 DADatabase.cpp:RebuildIndexes > RebuildIndexes SUCCESS[0]: 0 recreated\n"
     "4 DADatabase.cpp:Restore > Restore SUCCESS[0]: 4 pages\n"
     "6 DADatabase.cpp:Backup > Backup FAILED[21]: the copy would replace its own source DIR/t.db\n"
     "4 DADatabase.cpp:Backup > Backup SUCCESS[0]: 4 pages"},
    {"hostile_texts",  // quotes, format and comment characters, UTF-8, SQL: as values and conditions, as given
     [](Target& t, const std::string& dir, DACursor& cursor) {
         const char* const name = "Kim's \"x\" %s%n ;-- /* \\ \xC3\xA9 \xF0\x9F\x98\x80\t' OR 1=1 --";
         const char* const phone = "'); DROP TABLE contacts; --";
         DAUpsertRequest upsert;
         At(upsert, dir, "contacts").SetData("name", name);
         upsert.SetData("phone", phone);
         DAUpdateRequest update;
         Make(update, dir, "contacts", "name", name).SetWhere("phone", phone);
         update.SetData("phone", name);
         DASelectRequest select;
         DADeleteRequest remove;
         const int rc = RUN(t, Upsert, upsert) + RUN(t, Update, update);
         return rc + RUN(t, Select, Make(select, dir, "contacts", "phone", name), cursor) +
             RUN(t, Delete, Make(remove, dir, "contacts", "name", name));
     },
     kSteps,
     "0 / _ID name phone 4 Kim's \"x\" %s%n ;-- /* \\ \xC3\xA9 \xF0\x9F\x98\x80\t' OR 1=1 -- Kim's \"x\" %s%n ;-- /* "
     "\\ \xC3\xA9 \xF0\x9F\x98\x80\t' OR 1=1 -- / "
     "ok|0/contacts;contacts_by_name;groups/1|Kim|010;2|Lee|011;3|Park|012/1|Family;2|Work\n"
     "4 DADatabase.cpp:Upsert > Upsert SUCCESS[0]\n"
     "4 DADatabase.cpp:Update > update SUCCESS[0]\n"
     "4 DADatabase.cpp:Delete > delete SUCCESS[0]"},
    {"batch",  // the second rolls back; a create counts no change
     [](Target& t, const std::string& dir, DACursor&) {
         DABatchRequest batch;
         DACreateRequest create;
         DAUpsertRequest upsert;
         DAUpdateRequest update;
         DADeleteRequest remove;
         DADropRequest drop;
         create.SetPath((dir + "/").c_str(), "t.db");  // the same file, written otherwise
         create.SetTable("notes");
         create.SetColumnKey("text", "TEXT");
         At(upsert, dir, "groups").SetData("title", "Club");
         At(batch, dir).Add(create);
         batch.Add(upsert);
         Make(update, dir, "contacts", "name", "Kim").SetData("phone", "099");
         batch.Add(update);
         batch.Add(Make(remove, dir, "contacts"));
         const int rc = RUN(t, ExecuteBatch, batch) * 100 + batch.GetChanges();
         batch.Add(At(drop, dir, "gone"));
         return rc * 10 + RUN(t, ExecuteBatch, batch);
     },
     0,
     "31 / / ok|0/contacts;contacts_by_name;groups;notes/1|Kim|099;3|Park|012/1|Family;2|Work;3|Club\n"
     "4 DADatabase.cpp:ExecuteBatch > ExecuteBatch SUCCESS[0]: 4 statements\n"
     "6 DADatabase.cpp:ExecuteBatch > ExecuteBatch FAILED[1] at 5/5: no such table: gone"},
};

// dir (made if missing) with the seeded t.db.
inline std::string Seeded(const std::string& dir)
{
    mkdir(dir.c_str(), 0700);
    RawDb(dir + "/t.db").Run(kSeed);
    return dir;
}

// dir/t.db replaced by a copy of seed, with nothing beside it.
inline void Reseed(const std::string& dir, const std::string& seed)
{
    for (const auto& entry : std::filesystem::directory_iterator(dir)) {
        std::filesystem::remove_all(entry.path());
    }
    std::filesystem::copy_file(seed, dir + "/t.db", std::filesystem::copy_options::overwrite_existing);
}

// The file as a fresh connection sees it: whole or not, its version, its
// tables and rows.
inline std::string Content(const std::string& dir)
{
    RawDb db(dir + "/t.db");
    std::string out = db.Query("SELECT * FROM pragma_integrity_check, pragma_user_version") + "/" +
        db.Query("SELECT name FROM sqlite_master ORDER BY name");
    for (const char* table : {"contacts", "groups"}) {
        out += "/" + (out.find(table) != std::string::npos ? db.Query(std::string("SELECT * FROM ") + table) : "");
    }
    return out;
}

// The cursor's names, then its rows (one value after another): a cursor
// cut short by a failed step is a prefix.
inline Strings Cells(DACursor& cursor)
{
    Strings out;
    cursor.GetColumn(out);
    const Strings names = out;
    for (cursor.MoveToFirst(); cursor.MoveToNext() == 0;) {
        for (const std::string& name : names) {
            std::string value;
            cursor.GetString(name.c_str(), value);
            out.push_back(value);
        }
    }
    return out;
}

// What a row gave, as one text: its code, the cells it read, the file, its
// lines.
inline std::string Summary(int rc, DACursor& cursor, const std::string& dir, const Strings& lines)
{
    std::string out = std::to_string(rc) + " /";
    for (const std::string& cell : Cells(cursor)) {
        out += " " + cell;
    }
    out += " / " + Content(dir);
    for (const std::string& line : lines) {
        out += "\n" + Replaced(line, dir, "DIR");
    }
    return out;
}

#endif  // ULO_TESTS_OPERATIONS_H
