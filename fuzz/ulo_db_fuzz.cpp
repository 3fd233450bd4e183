// libFuzzer target: fills every request and a cursor from the input,
// generates every statement, and moves through and reads the cursor; every
// statement, and the input's last text, is split as a session would keep
// it, and must come back whole from its shape and literals, as must the
// shape and values written for a request.
#include <cstddef>
#include <cstdint>
#include <functional>
#include <iterator>
#include <string>

#include <fuzzer/FuzzedDataProvider.h>

#include "DACursor.h"
#include "DASqlGenerator.h"
#include "DASqlStatement.h"
#include "DAStatementCache.h"
#include "dlog.h"

namespace {

// A text that splits must be its shape with the literals put back.
void CheckSplit(const std::string& sql, std::string& shape, DASqlParams& values)
{
    if (!DASplitLiterals(sql.c_str(), shape, values)) {
        return;
    }
    std::string back;
    values.View().Render(shape.c_str(), back);
    if (back != sql.substr(0, sql.find('\0'))) {
        __builtin_trap();
    }
}

// The shape and values written for request must give back its text.
template <typename Request>
void CheckShapes(Request& request, const std::string& sql)
{
    DASqlStatement written;
    written.shaped = true;
    DAWriteSql(request, written);
    if (written.Text() != sql) {
        __builtin_trap();
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    static const bool silent = (dlog_set_sink(&dlog_discard_sink, nullptr), true);
    static const char* const kColumns[] = {"a", "b", "_ID", ""};  // keys are compared by address
    FuzzedDataProvider input(data, size);
    DAUpsertRequest upsert;
    DAUpdateRequest update;
    DADeleteRequest remove;
    DASelectRequest select;
    DAJoinRequest join;
    DACreateRequest create;
    DADropRequest drop;
    DACursor cursor;
    DAQueryRequest query;
    DAInsertRequest insert;
    DABaseSet* const sets[] = {&upsert, &update, &remove, &select, &join, &query, &insert};
    std::string text;
    const char* t = "";
    const char* c = "";
    DABaseSet* set = nullptr;
    int number = 0;
    double real = 0;
    const std::function<void()> actions[] = {
        [&] { set->SetWhere(c, t), set->SetWhere(c, input.ConsumeIntegral<int>()), set->SetData(c, 0.5 * size); },
        [&] { upsert.SetTable(t), update.SetTable(t), remove.SetTable(t), select.SetTable(t), drop.SetTable(t); },
        [&] { join.SetLeftJoin(t, c), join.SetRightJoin(c, t), create.SetTable(t), create.SetPrimaryKey(c, t); },
        [&] { create.SetCompositeKey(t, c), create.SetColumnKey(c, t), set->SetData(c, t); },
        [&] { cursor.SetColumn(input.ConsumeBool() ? c : t), cursor.SetData(c, t); },
        [&] { cursor.MoveToPosition(input.ConsumeIntegral<int>()), cursor.MoveToNext(), cursor.MoveToPrev(); },
        [&] { input.ConsumeBool() ? cursor.MoveToFirst() : cursor.MoveToLast(); },
        [&] {
            const auto op = static_cast<DACompare>(input.ConsumeIntegralInRange(0, 6));
            set->SetWhere(t, op, c), set->SetWhere(c, op, input.ConsumeIntegral<std::int64_t>());
            set->SetWhere(c, op, input.ConsumeFloatingPoint<double>()), set->SetWhereIn(c, {t, c});
            set->SetWhereNull(input.ConsumeBool() ? c : t, input.ConsumeBool());
        },
        [&] {
            const auto function = static_cast<DAAggregate>(input.ConsumeIntegralInRange(0, 4));
            query.AddColumn(t), query.AddAggregate(function, input.ConsumeBool() ? nullptr : t, c);
            query.AddGroupBy(t), query.SetOrderBy(t), query.SetLimit(input.ConsumeIntegral<int>(), number);
            query.SetTable(t), insert.SetTable(t), insert.SetIgnoreExisting(input.ConsumeBool());
        },
        [&] { cursor.GetDouble(t, real), cursor.GetInt(c, number), cursor.GetString(c, text); },  // t is text: last
    };
    while (silent && input.remaining_bytes() > 0) {
        text = input.ConsumeRandomLengthString(40);
        t = text.c_str();
        c = kColumns[input.ConsumeIntegralInRange<std::size_t>(0, 3)];
        set = sets[input.ConsumeIntegralInRange<std::size_t>(0, std::size(sets) - 1)];
        actions[input.ConsumeIntegralInRange<std::size_t>(0, std::size(actions) - 1)]();
    }
    DASqlGenerator generator;
    std::string sql;
    generator.GetDBPath(text, text, sql), generator.GetCheckTableSql(text, sql), generator.GetDropTableSql(drop, sql);
    generator.GetCreateTableSql(create, sql), generator.GetSelectSql(select, sql), generator.GetJoinSql(join, sql);
    generator.GetUpsertSql(upsert, sql), generator.GetUpdateSql(update, sql), generator.GetDeleteSql(remove, sql);
    std::string shape;
    DASqlParams values;
    CheckSplit(text, shape, values);
    generator.GetQuerySql(query, sql), CheckShapes(query, sql), generator.GetInsertSql(insert, sql);
    CheckShapes(insert, sql), generator.GetSelectSql(select, sql), CheckShapes(select, sql);
    generator.GetUpdateSql(update, sql), CheckShapes(update, sql), generator.GetDeleteSql(remove, sql);
    CheckShapes(remove, sql), generator.GetUpsertSql(upsert, sql), CheckShapes(upsert, sql);
    generator.GetJoinSql(join, sql), CheckShapes(join, sql);
    return 0;
}
