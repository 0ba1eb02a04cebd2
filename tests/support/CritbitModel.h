#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "tavrind/critbit.h"

namespace tavrin::test {

/// A crit-bit tree and a map with the same contents. Each operation changes or reads both, and returns whether they
/// agree. Values are small numbers; those that the tree released are counted.
class CritbitModel {
public:
    CritbitModel()
    {
        tree.release = [](void* value) { ++released[reinterpret_cast<std::uintptr_t>(value)]; };
        released.clear();
    }
    ~CritbitModel() { critbit_clear(tree); }

    [[nodiscard]] bool insert(const std::string& key, std::uintptr_t value, bool replace)
    {
        int expected = 2;
        if (key.contains('\0')) {
            expected = 0;
        } else if (const auto [entry, added] = map.try_emplace(key, value); !added) {
            expected = entry->second == value ? 0 : 1;
            if (expected == 1 && replace) {
                ++gone[entry->second];
                entry->second = value;
            }
        }
        return critbit_insert(tree, key, reinterpret_cast<void*>(value), replace ? 1 : 0) == expected && agree(key);
    }
    [[nodiscard]] bool remove(const std::string& key)
    {
        const auto found = map.find(key);
        const bool there = found != map.end();
        if (there) {
            ++gone[found->second];
            map.erase(found);
        }
        return critbit_delete(tree, key) == (there ? 1 : 0) && agree(key);
    }
    [[nodiscard]] bool clear()
    {
        for (const auto& [key, value] : map) ++gone[value];
        map.clear();
        critbit_clear(tree);
        return tree.root == 0 && agree("");
    }
    /// Walks the keys with this prefix, and stops after `limit` of them with the answer given.
    [[nodiscard]] bool walk(std::string_view prefix, std::size_t limit = SIZE_MAX, int lastAnswer = 0)
    {
        struct Walk {
            std::vector<std::pair<std::string, std::uintptr_t>> seen;
            std::size_t limit;
            int lastAnswer;
        } walk{{}, limit, lastAnswer};
        const int result = critbit_allprefixed(
            tree, prefix,
            [](const char* key, void* context) {
                auto& state = *static_cast<Walk*>(context);
                state.seen.emplace_back(key, reinterpret_cast<std::uintptr_t>(critbit_value(key)));
                return state.seen.size() < state.limit ? 1 : state.lastAnswer;
            },
            &walk);

        std::vector<std::pair<std::string, std::uintptr_t>> expected;
        auto entry = map.lower_bound(std::string(prefix));
        for (; entry != map.end() && entry->first.starts_with(prefix) && expected.size() < limit; ++entry)
            expected.emplace_back(*entry);
        const bool stopped = expected.size() == limit;
        return walk.seen == expected && result == (!stopped || lastAnswer == 1 ? 1 : lastAnswer == 0 ? 0 : -1);
    }

    critbit_tree tree;
    std::map<std::string, std::uintptr_t> map;

private:
    [[nodiscard]] bool agree(const std::string& key) const
    {
        const auto found = map.find(key);
        void* value = nullptr;
        const bool there = critbit_contains(tree, key, &value) == 1;
        return there == (found != map.end()) && (!there || reinterpret_cast<std::uintptr_t>(value) == found->second) &&
               critbit_contains(tree, key, nullptr) == (there ? 1 : 0) && tree.count == map.size() && released == gone;
    }

    std::map<std::uintptr_t, int> gone;
    static inline thread_local std::map<std::uintptr_t, int> released;
};

} // namespace tavrin::test
