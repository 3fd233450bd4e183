#ifndef DAREQUESTPARTS_H
#define DAREQUESTPARTS_H

#include <vector>

#include "DABaseSet.h"

// The statement writer's reads of a request's data and conditions, by
// reference: the public getters copy, which for a blob or a data map of
// long texts costs more than writing the statement. A reference is valid
// until the request changes; like the getters, no member lock is taken.
struct DARequestParts {
    static const DAValueMap& Data(const DABaseSet& request) { return request.m_dataMap; }
    static const DAValueMap& Where(const DABaseSet& request) { return request.m_whereMap; }
    static const std::vector<DABaseSet::TypedValue>& Typed(const DABaseSet& request) { return request.m_typed; }

    static bool HasConditions(const DABaseSet& request) { return !request.m_conditions.empty(); }

    // Calls visit(column, condition) for each listed condition in call
    // order; condition has DABaseSet::Condition's fields but its column.
    template <typename Visit>
    static void ForEachCondition(const DABaseSet& request, Visit visit)
    {
        for (const auto& condition : request.m_conditions) {
            const char* column = condition.column.Get();
            visit(column != nullptr ? column : "", condition);
        }
    }
};

#endif  // DAREQUESTPARTS_H
