#include "platform/values/Dictionary.h"

#include <algorithm>
#include <bit>
#include <cstring>
#include <random>

#include "platform/values/Value.h"

namespace platform {

namespace {

/// Up to this many entries, a linear search is as fast as hashing.
constexpr std::size_t kLinearLimit = 8;

struct HashKey {
    std::uint64_t k0;
    std::uint64_t k1;
};

HashKey randomHashKey()
{
    std::random_device device;
    const auto word = [&device] { return std::uint64_t{device()} << 32 | device(); };
    const std::uint64_t k0 = word();
    return {k0, word()};
}

/// SipHash-1-3, keyed with a random number of this process: an attacker can't choose keys that collide.
std::uint64_t hashOf(std::string_view text)
{
    static const HashKey key = randomHashKey();
    std::uint64_t v0 = key.k0 ^ 0x736f6d6570736575;
    std::uint64_t v1 = key.k1 ^ 0x646f72616e646f6d;
    std::uint64_t v2 = key.k0 ^ 0x6c7967656e657261;
    std::uint64_t v3 = key.k1 ^ 0x7465646279746573;
    const auto round = [&] {
        v0 += v1, v1 = std::rotl(v1, 13) ^ v0, v0 = std::rotl(v0, 32);
        v2 += v3, v3 = std::rotl(v3, 16) ^ v2;
        v0 += v3, v3 = std::rotl(v3, 21) ^ v0;
        v2 += v1, v1 = std::rotl(v1, 17) ^ v2, v2 = std::rotl(v2, 32);
    };
    const auto take = [&](std::uint64_t word) { v3 ^= word, round(), v0 ^= word; };

    const char* bytes = text.data();
    std::size_t left = text.size();
    for (; left >= 8; bytes += 8, left -= 8) {
        std::uint64_t word;
        std::memcpy(&word, bytes, 8);
        take(word);
    }
    std::uint64_t last = std::uint64_t{text.size()} << 56;
    for (std::size_t i = 0; i < left; ++i) last |= std::uint64_t{static_cast<unsigned char>(bytes[i])} << (8 * i);
    take(last);
    v2 ^= 0xff;
    round(), round(), round();
    return v0 ^ v1 ^ v2 ^ v3;
}

} // namespace

/// An open-addressing hash table of positions in the entries, at most half full.
struct Dictionary::Index {
    struct Slot {
        std::uint32_t position = kFree;
        std::uint32_t hash = 0; ///< the part of the hash that doesn't choose the slot
    };
    static constexpr std::uint32_t kFree = UINT32_MAX;

    std::vector<Slot> slots;

    Index(const std::vector<Entry>& entries, std::size_t capacity)
        : slots(std::bit_ceil(std::max(capacity, entries.size()) * 2))
    {
        for (std::size_t position = 0; position < entries.size(); ++position) add(entries[position].first, position);
    }

    [[nodiscard]] bool holds(std::size_t count) const { return count * 2 <= slots.size(); }

    void add(std::string_view key, std::size_t position)
    {
        const std::uint64_t hash = hashOf(key);
        std::size_t at = hash & (slots.size() - 1);
        while (slots[at].position != kFree) at = (at + 1) & (slots.size() - 1);
        slots[at] = {static_cast<std::uint32_t>(position), static_cast<std::uint32_t>(hash >> 32)};
    }

    [[nodiscard]] std::optional<std::size_t> find(std::string_view key, const std::vector<Entry>& entries) const
    {
        const std::uint64_t hash = hashOf(key);
        for (std::size_t at = hash & (slots.size() - 1);; at = (at + 1) & (slots.size() - 1)) {
            const Slot& slot = slots[at];
            if (slot.position == kFree) return std::nullopt;
            if (slot.hash == static_cast<std::uint32_t>(hash >> 32) && entries[slot.position].first == key)
                return slot.position;
        }
    }
};

Dictionary::Dictionary() = default;
Dictionary::Dictionary(Dictionary&& other) noexcept
    : _entries(std::exchange(other._entries, {})), _index(std::move(other._index))
{}
Dictionary::~Dictionary() = default;

Dictionary::Dictionary(std::initializer_list<Entry> entries)
{
    reserve(entries.size());
    for (const auto& [key, value] : entries) set(key, value);
}

Dictionary::Dictionary(const Dictionary& other)
    : _entries(other._entries), _index(other._index ? std::make_unique<Index>(*other._index) : nullptr)
{}

Dictionary& Dictionary::operator=(const Dictionary& other)
{
    return *this = Dictionary(other);
}

Dictionary& Dictionary::operator=(Dictionary&& other) noexcept
{
    // Destroys the old contents last: `other` may be part of them.
    Dictionary taken(std::move(other));
    _entries.swap(taken._entries);
    _index.swap(taken._index);
    return *this;
}

std::optional<std::size_t> Dictionary::positionOf(std::string_view key) const
{
    if (_index) return _index->find(key, _entries);
    for (std::size_t position = 0; position < _entries.size(); ++position)
        if (_entries[position].first == key) return position;
    return std::nullopt;
}

const Value* Dictionary::find(std::string_view key) const
{
    const auto position = positionOf(key);
    return position ? &_entries[*position].second : nullptr;
}

void Dictionary::set(std::string key, Value value)
{
    if (const auto position = positionOf(key)) {
        _entries[*position].second = std::move(value);
        return;
    }
    _entries.emplace_back(std::move(key), std::move(value));
    if (_index && _index->holds(_entries.size()))
        _index->add(_entries.back().first, _entries.size() - 1);
    else if (_entries.size() > kLinearLimit)
        _index = std::make_unique<Index>(_entries, _entries.capacity());
}

bool Dictionary::remove(std::string_view key)
{
    const auto position = positionOf(key);
    if (!position) return false;
    _entries.erase(_entries.begin() + static_cast<std::ptrdiff_t>(*position));
    _index = _entries.size() > kLinearLimit ? std::make_unique<Index>(_entries, _entries.size()) : nullptr;
    return true;
}

void Dictionary::reserve(std::size_t count)
{
    _entries.reserve(count);
}

bool operator==(const Dictionary& a, const Dictionary& b)
{
    if (a.size() != b.size()) return false;
    for (const auto& [key, value] : a) {
        const Value* other = b.find(key);
        if (!other || !(*other == value)) return false;
    }
    return true;
}

} // namespace platform
