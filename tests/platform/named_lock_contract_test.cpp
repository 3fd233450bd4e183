// The library against the device's own libulo_util, whose DAMutex may keep
// a lock held until Unlock() and may use the name itself. This program
// defines DAMutex's members (they are out of line in libulo_util.so, so the
// library calls these) and records every construction's name, Lock, Unlock
// and destruction. Every operation that fills a container must build one
// DAMutex named by the %x of the container's address, lock it once and
// unlock it once before destroying it, also when the operation throws.

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <memory>
#include <ostream>
#include <stdexcept>
#include <string>
#include <utility>

#include <gtest/gtest.h>

#include "DACreateIndexRequest.h"
#include "DACreateRequest.h"
#include "DACursor.h"
#include "DAMutex.h"
#include "DAQueryRequest.h"
#include "DAUpsertRequest.h"

namespace {

std::size_t g_made = 0;  // the DAMutex objects made since the last Trace()
std::string g_trace;  // "new#0(name) lock#0 unlock#0 delete#0": #n the nth made

void Record(std::size_t index, const char* what, const char* name = nullptr)
{
    g_trace += (g_trace.empty() ? "" : " ") + std::string(what) + "#" + std::to_string(index) +
        (name != nullptr ? "(" + std::string(name) + ")" : "");
}

}  // namespace

// The stripe field numbers the object; a lock still held when the object
// goes stays held on the device, and shows as "delete-held".
DAMutex::DAMutex(char const* name) : m_stripe(g_made++), m_locked(false)
{
    Record(m_stripe, "new", name != nullptr ? name : "null");
}
DAMutex::~DAMutex()
{
    Record(m_stripe, m_locked ? "delete-held" : "delete");
}
void DAMutex::Lock()
{
    m_locked = true;
    Record(m_stripe, "lock");
}
void DAMutex::Unlock()
{
    m_locked = false;
    Record(m_stripe, "unlock");
}

namespace {

// The events since the last call.
std::string Trace()
{
    g_made = 0;
    return std::exchange(g_trace, "");
}

// The name of the one lock the last calls took, which must lie in object:
// the %x of an address inside it.
template <typename T>
std::string NameIn(const T& object)
{
    const std::string trace = Trace();
    const std::size_t open = trace.find('('), close = trace.find(')');
    const std::string name = close != std::string::npos ? trace.substr(open + 1, close - open - 1) : "";
    const auto address = static_cast<std::uintptr_t>(std::strtoull(name.c_str(), nullptr, 16));
    const auto start = reinterpret_cast<std::uintptr_t>(&object);
    char hex[32];
    std::snprintf(hex, sizeof hex, "%lx", static_cast<unsigned long>(address));
    EXPECT_TRUE(trace == "new#0(" + name + ") lock#0 unlock#0 delete#0" && name == hex && address >= start &&
                address < start + sizeof(T))
        << "not one lock named by an address inside the object: " << trace;
    return name;
}

// The objects the operations fill.
struct Objects {
    std::unique_ptr<DAUpsertRequest> upsert;
    std::unique_ptr<DACreateRequest> create;
    std::unique_ptr<DACursor> cursor;
    std::unique_ptr<DAQueryRequest> query;
    std::unique_ptr<DACreateIndexRequest> index;
};

enum Container { kData, kWhere, kKeys, kColumns, kOrder, kConditions, kSelect, kGroups, kIndexed, kContainers };

struct Filling {
    const char* name;
    Container container;
    std::function<void(Objects&)> run;
    const char* throws;  // the std::logic_error's text when the operation throws one
};

void PrintTo(const Filling& filling, std::ostream* out)
{
    *out << filling.name;
}

const char* const kNull = nullptr;
const char* const kBadString = "basic_string: construction from null is not valid";
const char* const kBadValue = "DABaseSet: a null value cannot be stored";

const Filling kFillings[] = {
    {"SetData_text", kData, [](Objects& o) { o.upsert->SetData("c", "x"); }, nullptr},
    {"SetData_int64", kData, [](Objects& o) { o.upsert->SetData("c", std::int64_t{1} << 40); }, nullptr},
    {"SetData_null_text", kData, [](Objects& o) { o.upsert->SetData("c", kNull); }, kBadValue},
    {"SetWhere_text", kWhere, [](Objects& o) { o.upsert->SetWhere("c", "x"); }, nullptr},
    {"SetWhere_int64", kWhere, [](Objects& o) { o.upsert->SetWhere("c", std::int64_t{-1}); }, nullptr},
    {"SetWhere_null_text", kWhere, [](Objects& o) { o.upsert->SetWhere("c", kNull); }, kBadValue},
    {"SetColumnKey", kKeys, [](Objects& o) { o.create->SetColumnKey("c", "TEXT"); }, nullptr},
    {"SetColumnKey_null_type", kKeys, [](Objects& o) { o.create->SetColumnKey("c", nullptr); },
     "DACreateRequest::SetColumnKey: the column type is null"},
    {"Cursor_SetColumn", kColumns, [](Objects& o) { o.cursor->SetColumn("d"); }, nullptr},
    {"Cursor_SetColumn_null", kColumns, [](Objects& o) { o.cursor->SetColumn(nullptr); }, kBadString},
    {"Cursor_SetData", kColumns, [](Objects& o) { o.cursor->SetData("c", "v"); }, nullptr},
    {"Cursor_SetData_null", kColumns, [](Objects& o) { o.cursor->SetData("c", nullptr); }, kBadString},
    {"Cursor_Initialize", kColumns, [](Objects& o) { o.cursor->Initialize(); }, nullptr},
    {"SetOrderBy", kOrder, [](Objects& o) { o.query->SetOrderBy("c", true); }, nullptr},
    {"SetWhere_compare", kConditions, [](Objects& o) { o.upsert->SetWhere("c", DACompare::Less, 2.5); }, nullptr},
    {"AddAggregate", kSelect, [](Objects& o) { o.query->AddAggregate(DAAggregate::Count, nullptr, "n"); }, nullptr},
    {"AddGroupBy", kGroups, [](Objects& o) { o.query->AddGroupBy("c"); }, nullptr},
    {"Index_AddColumn", kIndexed, [](Objects& o) { o.index->AddColumn("c", true); }, nullptr},
};

class NamedLockContract : public ::testing::TestWithParam<Filling> {
protected:
    // Each container's lock name: its constructor's lock (constructors
    // clear their containers under it), or else the lock a first call takes.
    void SetUp() override
    {
        Trace();
        m.upsert = std::make_unique<DAUpsertRequest>();
        m_names[kData] = NameIn(*m.upsert);
        m.create = std::make_unique<DACreateRequest>();
        m_names[kKeys] = NameIn(*m.create);
        m.cursor = std::make_unique<DACursor>();
        m_names[kColumns] = NameIn(*m.cursor);
        m.query = std::make_unique<DAQueryRequest>();
        const std::string queryData = NameIn(*m.query);
        m.cursor->SetColumn("c");
        Trace();
        m.upsert->SetWhere("w", 0);
        m_names[kWhere] = NameIn(*m.upsert);
        m.query->SetOrderBy("o");
        m_names[kOrder] = NameIn(*m.query);
        m.upsert->SetWhereNull("w");
        m_names[kConditions] = NameIn(*m.upsert);
        m.query->AddColumn("s");
        m_names[kSelect] = NameIn(*m.query);
        m.query->AddGroupBy("g");
        m_names[kGroups] = NameIn(*m.query);
        m.index = std::make_unique<DACreateIndexRequest>();
        m.index->AddColumn("i");
        m_names[kIndexed] = NameIn(*m.index);
        EXPECT_NE(m_names[kData], m_names[kWhere]);
        EXPECT_NE(queryData, m_names[kOrder]);
        ASSERT_FALSE(HasFailure());
    }

    Objects m;
    std::string m_names[kContainers];
};

TEST_P(NamedLockContract, OneLockNamedByTheContainerReleasedOnEveryWayOut)
{
    const Filling& c = GetParam();
    std::string error;
    try {
        c.run(m);
    } catch (const std::logic_error& thrown) {
        error = thrown.what();
    }
    EXPECT_EQ("new#0(" + m_names[c.container] + ") lock#0 unlock#0 delete#0", Trace());
    EXPECT_EQ(c.throws != nullptr ? c.throws : "", error);
}

INSTANTIATE_TEST_SUITE_P(Every, NamedLockContract, ::testing::ValuesIn(kFillings),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
