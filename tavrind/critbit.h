#pragma once

#include <cstdint>
#include <string_view>

namespace tavrin {

/// An ordered map from byte strings to opaque values: a crit-bit tree, which branches only at bits in which keys
/// differ. It finds all keys with a given prefix, in order, without looking at any other.
///
/// Keys are of any bytes but NUL, compare as unsigned bytes and are copied. A key takes one allocation of its length
/// and 9 bytes; each further key one more of 24. No operation recurses or allocates in proportion to what it visits,
/// but for the walk, whose stack grows with the depth of the tree (8 levels for each byte of a key, at most).
///
/// A tree that is zeroed is empty; whoever owns one clears it in the end. Not thread-safe.
struct critbit_tree {
    /// 0, or the address of a node, its lowest bit set for an internal node.
    std::uintptr_t root = 0;
    std::uint64_t count = 0; ///< keys
    /// Called for a value that leaves the tree; may be null. Must not touch the tree.
    void (*release)(void* value) = nullptr;
};

/// 1, and the value in `*value` unless that is null, if the key is there; else 0.
int critbit_contains(const critbit_tree& tree, std::string_view key, void** value);

/// 2: the key was added. 1: it was there; its value was replaced (the old one released) if the lowest bit of `replace`
/// is set, else left alone. 0: it was there with this very value, or there is no memory, or it can't be a key (it holds
/// a NUL or is 4 GiB long); nothing changed.
int critbit_insert(critbit_tree& tree, std::string_view key, void* value, int replace);

/// 1 if the key was there and is removed, its value released; else 0.
int critbit_delete(critbit_tree& tree, std::string_view key);

/// Removes all keys in order, each value released.
void critbit_clear(critbit_tree& tree);

/// Gets a key of the tree, NUL-terminated, in place: valid until the key is removed. Returns 1 to go on, 0 to stop.
using critbit_callback = int (*)(const char* key, void* context);

/// Calls back for each key that begins with `prefix` (with every key, for an empty one), in ascending order of bytes.
/// The callback must not change the tree. 1: all were visited, be it none. 0: the callback stopped the walk. -1: it
/// returned something else, which stopped it too.
int critbit_allprefixed(const critbit_tree& tree, std::string_view prefix, critbit_callback callback, void* context);

/// The value of a key, as a callback got it.
[[nodiscard]] void* critbit_value(const char* key);

} // namespace tavrin
