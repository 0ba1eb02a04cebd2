// The tree under the query cache, beside the standard map and a sorted vector with the same keys.

#include <algorithm>
#include <cstdlib>
#include <malloc.h>
#include <map>
#include <random>
#include <string>
#include <vector>

#include <fmt/format.h>

#include "bench/Support.h"
#include "tavrind/critbit.h"

namespace tavrin::bench {

namespace {

constexpr std::size_t kMany = 100'000;
constexpr std::size_t kFew = 500; // as many as a query cache holds, more or less
constexpr int kRounds = 9;

/// Different completed queries of some words, 25 bytes on average, in no order.
std::vector<std::string> makeKeys(std::size_t count)
{
    std::mt19937 random(1);
    const auto upTo = [&](std::size_t limit) { return random() % (limit + 1); };
    std::vector<std::string> words(3000);
    for (std::string& word : words)
        for (std::size_t length = 3 + upTo(6); length > 0; --length) word += static_cast<char>('a' + upTo(25));
    std::map<std::string, int> different;
    while (different.size() < count) {
        std::string key;
        for (std::size_t i = 3 + upTo(1); i > 0; --i) key += words[upTo(words.size() - 1)] + (i > 1 ? " " : "");
        different[key];
    }
    std::vector<std::string> keys;
    for (const auto& [key, nothing] : different) keys.push_back(key);
    std::ranges::shuffle(keys, random);
    return keys;
}

char theValue;
void* const kValue = &theValue;

struct Tree {
    static constexpr const char* name = "crit-bit";
    ~Tree() { critbit_clear(tree); }
    void insert(const std::string& key) { critbit_insert(tree, key, kValue, 1); }
    bool contains(std::string_view key) const { return critbit_contains(tree, key, nullptr) != 0; }
    /// Reads the first 20 keys with this prefix: the sum of their last bytes and values.
    std::size_t read(std::string_view prefix) const
    {
        struct Walk {
            int left = 20;
            std::size_t sum = 0;
        } walk;
        critbit_allprefixed(
            tree, prefix,
            [](const char* key, void* context) {
                auto& state = *static_cast<Walk*>(context);
                state.sum += static_cast<unsigned char>(key[0]) + reinterpret_cast<std::uintptr_t>(critbit_value(key));
                return --state.left > 0 ? 1 : 0;
            },
            &walk);
        return walk.sum;
    }
    critbit_tree tree;
};

struct Map {
    static constexpr const char* name = "std::map";
    void insert(const std::string& key) { map.insert_or_assign(key, kValue); }
    bool contains(std::string_view key) const { return map.contains(key); }
    std::size_t read(std::string_view prefix) const
    {
        int left = 20;
        std::size_t sum = 0;
        for (auto at = map.lower_bound(prefix); at != map.end() && left > 0 && at->first.starts_with(prefix);
             ++at, --left)
            sum += static_cast<unsigned char>(at->first[0]) + reinterpret_cast<std::uintptr_t>(at->second);
        return sum;
    }
    std::map<std::string, void*, std::less<>> map;
};

struct SortedVector {
    static constexpr const char* name = "a sorted vector";
    void insert(const std::string& key)
    {
        const auto at = std::ranges::lower_bound(entries, key, {}, &Entry::first);
        if (at == entries.end() || at->first != key) entries.emplace(at, key, kValue);
    }
    bool contains(std::string_view key) const
    {
        const auto at =
            std::ranges::lower_bound(entries, key, {}, [](const Entry& e) { return std::string_view(e.first); });
        return at != entries.end() && at->first == key;
    }
    void fill(const std::vector<std::string>& keys)
    {
        for (const std::string& key : keys) entries.emplace_back(key, kValue);
        std::ranges::sort(entries);
    }
    using Entry = std::pair<std::string, void*>;
    std::vector<Entry> entries;
};

/// Seconds for each key of an insertion of all.
template <class Container> double insertion(const std::vector<std::string>& keys)
{
    const int repeats = static_cast<int>(std::max<std::size_t>(1, 20'000 / keys.size()));
    double sum = 0;
    for (int i = 0; i < repeats; ++i) {
        Container container;
        const double begin = now();
        for (const std::string& key : keys) container.insert(key);
        sum += now() - begin;
    }
    return sum / static_cast<double>(repeats) / static_cast<double>(keys.size());
}

/// Seconds for each call of `call` over all texts, a hundred thousand calls at least.
template <class Call> double each(const std::vector<std::string>& texts, Call call)
{
    const int repeats = static_cast<int>(std::max<std::size_t>(1, kMany / texts.size()));
    std::size_t sum = 0;
    const double begin = now();
    for (int i = 0; i < repeats; ++i)
        for (const std::string& text : texts) sum += call(text);
    const double end = now();
    if (sum == 0) std::abort(); // every call finds something
    return (end - begin) / static_cast<double>(repeats) / static_cast<double>(texts.size());
}

/// Bytes that a container of all keys takes of the heap for each of them, beyond the key.
template <class Container> double heapForEach(const std::vector<std::string>& keys)
{
    const std::size_t before = mallinfo2().uordblks;
    Container container;
    std::size_t length = 0;
    for (const std::string& key : keys) {
        container.insert(key);
        length += key.size();
    }
    return static_cast<double>(mallinfo2().uordblks - before - length) / static_cast<double>(keys.size());
}

/// Look-up, and insertion where that doesn't move half of the keys each time.
template <class Other> void compareWith(std::vector<Row>& rows, std::vector<std::string> keys, double lookUpLimit = 1)
{
    Tree tree;
    Other other;
    for (const std::string& key : keys) tree.insert(key);
    if constexpr (std::is_same_v<Other, SortedVector>)
        other.fill(keys);
    else
        for (const std::string& key : keys) other.insert(key);
    std::ranges::shuffle(keys, std::mt19937(2));
    const auto what = [&](const char* operation) {
        return fmt::format("{} in the query cache's tree of {} keys, beside {}", operation, keys.size(), Other::name);
    };
    rows.push_back(compare(
        what("look-up"), kRounds, lookUpLimit,
        [&] { return each(keys, [&](const std::string& key) { return tree.contains(key); }); },
        [&] { return each(keys, [&](const std::string& key) { return other.contains(key); }); }));
    if (std::is_same_v<Other, SortedVector> && keys.size() > kFew) return;
    rows.push_back(compare(
        what("insertion"), kRounds, 1, [&] { return insertion<Tree>(keys); }, [&] { return insertion<Other>(keys); }));
}

} // namespace

std::vector<Row> cacheTree()
{
    const OneCore pinned;
    const std::vector<std::string> keys = makeKeys(kMany);
    const std::vector<std::string> few(keys.begin(), keys.begin() + kFew);

    std::vector<Row> rows;
    compareWith<Map>(rows, few);
    compareWith<SortedVector>(rows, few);
    compareWith<Map>(rows, keys);
    compareWith<SortedVector>(rows, keys, 1.2);

    Tree tree;
    Map map;
    std::vector<std::string> prefixes;
    for (const std::string& key : keys) {
        tree.insert(key);
        map.insert(key);
        if (prefixes.size() < 20'000) prefixes.push_back(key.substr(0, 4 + prefixes.size() % 5));
    }
    std::ranges::shuffle(prefixes, std::mt19937(3));
    rows.push_back(compare(
        fmt::format("the first 20 of its {} keys with a prefix of 4 to 8 bytes, beside {}", kMany, Map::name), kRounds,
        1 / 1.3, [&] { return each(prefixes, [&](const std::string& prefix) { return tree.read(prefix); }); },
        [&] { return each(prefixes, [&](const std::string& prefix) { return map.read(prefix); }); }));

    const double ours = heapForEach<Tree>(keys);
    const double beside = heapForEach<Map>(keys);
    rows.push_back({fmt::format("its heap for each of {} keys, beyond the key, beside {}", kMany, Map::name),
                    fmt::format("{:.0f} B", ours), fmt::format("{:.0f} B", beside), ours / beside, 0.8, "×"});
    return rows;
}

} // namespace tavrin::bench
