// libFuzzer target: fills every request and a cursor from the input,
// generates every statement, and moves through and reads the cursor.
#include <cstddef>
#include <cstdint>
#include <functional>
#include <iterator>
#include <string>
#include <vector>

#include <fuzzer/FuzzedDataProvider.h>

#include "DACursor.h"
#include "DASqlGenerator.h"
#include "dlog.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    static const bool silent = (dlog_set_sink(&dlog_discard_sink, nullptr), true);
    static const char* const kColumns[] = {"a", "b", "_ID", ""};
    FuzzedDataProvider input(data, size);
    DAUpsertRequest upsert;
    DAUpdateRequest update;
    DADeleteRequest remove;
    DASelectRequest select;
    DAJoinRequest join;
    DACreateRequest create;
    DADropRequest drop;
    DACursor cursor;
    std::string out;
    int number = 0;
    double real = 0;
    std::string text;
    const char* column = "";
    DABaseSet* set = nullptr;
    const std::function<void()> actions[] = {
        [&] { set->SetData(column, text.c_str()); },
        [&] { set->SetWhere(column, text.c_str()); },
        [&] { set->SetWhere(column, input.ConsumeIntegral<int>()); },
        [&] { set->SetData(column, input.ConsumeFloatingPoint<double>()); },
        [&] { upsert.SetTable(text.c_str()), update.SetTable(text.c_str()), remove.SetTable(text.c_str()); },
        [&] { select.SetTable(text.c_str()), create.SetTable(text.c_str()), drop.SetTable(text.c_str()); },
        [&] { join.SetLeftJoin(text.c_str(), column), join.SetRightJoin(column, text.c_str()); },
        [&] { create.SetPrimaryKey(column, text.c_str()), create.SetCompositeKey(text.c_str(), column); },
        [&] { create.SetColumnKey(column, text.c_str()); },
        [&] { cursor.SetColumn(input.ConsumeBool() ? column : text.c_str()); },
        [&] { cursor.SetData(column, text.c_str()); },
        [&] { cursor.MoveToPosition(input.ConsumeIntegral<int>()); },
        [&] { input.ConsumeBool() ? cursor.MoveToNext() : cursor.MoveToPrev(); },
        [&] { input.ConsumeBool() ? cursor.MoveToFirst() : cursor.MoveToLast(); },
        [&] { cursor.GetString(column, out), cursor.GetInt(column, number), cursor.GetDouble(text.c_str(), real); },
    };
    while (silent && input.remaining_bytes() > 0) {
        text = input.ConsumeRandomLengthString(40);
        column = kColumns[input.ConsumeIntegralInRange<std::size_t>(0, 3)];
        DABaseSet* const sets[] = {&upsert, &update, &remove, &select, &join};
        set = sets[input.ConsumeIntegralInRange<std::size_t>(0, 4)];
        actions[input.ConsumeIntegralInRange<std::size_t>(0, std::size(actions) - 1)]();
    }
    DASqlGenerator generator;
    std::string sql;
    generator.GetDBPath(out, out, sql);
    generator.GetCheckTableSql(out, sql);
    generator.GetDropTableSql(drop, sql);
    generator.GetCreateTableSql(create, sql);
    generator.GetSelectSql(select, sql);
    generator.GetJoinSql(join, sql);
    generator.GetUpsertSql(upsert, sql);
    generator.GetUpdateSql(update, sql);
    generator.GetDeleteSql(remove, sql);
    std::vector<std::string> columns;
    cursor.GetColumn(columns);
    return 0;
}
