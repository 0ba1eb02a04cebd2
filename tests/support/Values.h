#pragma once

#include <algorithm>
#include <cmath>

#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"

namespace platform::test {

/// Returns whether two trees have the same arrays and keys, and `leaf` holds for all their leaves.
template <class Leaf> bool equalBy(const Value& a, const Value& b, Leaf leaf)
{
    const auto equal = [&](const Value& x, const Value& y) { return equalBy(x, y, leaf); };
    if (a.asArray() && b.asArray()) return std::ranges::equal(*a.asArray(), *b.asArray(), equal);
    if (a.asDictionary() && b.asDictionary()) {
        return a.count() == b.count() && std::ranges::all_of(*a.asDictionary(), [&](const auto& entry) {
                   const Value* other = b.asDictionary()->find(entry.first);
                   return other && equal(entry.second, *other);
               });
    }
    return leaf(a, b);
}

/// Compares two values; NaN equals NaN.
inline bool same(const Value& a, const Value& b)
{
    const auto isNan = [](const Value& value) {
        return value.type() == Value::Type::Double && std::isnan(*value.asDouble());
    };
    return equalBy(a, b, [&](const Value& x, const Value& y) { return x == y || (isNan(x) && isNan(y)); });
}

} // namespace platform::test
