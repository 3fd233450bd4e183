// libFuzzer target: fills every request and a cursor from the input,
// generates every statement, and moves through and reads the cursor.
#include <cstddef>
#include <cstdint>
#include <functional>
#include <iterator>
#include <string>

#include <fuzzer/FuzzedDataProvider.h>

#include "DACursor.h"
#include "DASqlGenerator.h"
#include "dlog.h"

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
    DABaseSet* const sets[] = {&upsert, &update, &remove, &select, &join};
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
        [&] { cursor.GetDouble(t, real), cursor.GetInt(c, number), cursor.GetString(c, text); },  // t is text: last
    };
    while (silent && input.remaining_bytes() > 0) {
        text = input.ConsumeRandomLengthString(40);
        t = text.c_str();
        c = kColumns[input.ConsumeIntegralInRange<std::size_t>(0, 3)];
        set = sets[input.ConsumeIntegralInRange<std::size_t>(0, 4)];
        actions[input.ConsumeIntegralInRange<std::size_t>(0, std::size(actions) - 1)]();
    }
    DASqlGenerator generator;
    std::string sql;
    generator.GetDBPath(text, text, sql), generator.GetCheckTableSql(text, sql), generator.GetDropTableSql(drop, sql);
    generator.GetCreateTableSql(create, sql), generator.GetSelectSql(select, sql), generator.GetJoinSql(join, sql);
    generator.GetUpsertSql(upsert, sql), generator.GetUpdateSql(update, sql), generator.GetDeleteSql(remove, sql);
    return 0;
}
