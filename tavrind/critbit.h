#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace tavrin {

/// An ordered map from byte strings to opaque values: a crit-bit tree, which branches only at bits in which keys
/// differ. It finds all keys with a given prefix, in order, without looking at any other.
///
/// Keys may hold any byte except NUL; they compare as unsigned bytes and are copied. Every key takes one allocation of
/// its length plus 9 bytes; every key except the first takes another one of 24 bytes. No operation recurses, or
/// allocates in proportion to what it visits, except that the walk's stack grows with the depth of the tree (at most 8
/// levels for each byte of a key).
///
/// A zeroed tree is empty. The owner must clear the tree before destroying it. Not thread-safe.
struct critbit_tree {
    /// 0, or the address of a node, with the lowest bit set for an internal node.
    std::uintptr_t root = 0;
    std::uint64_t count = 0; ///< keys
    /// Called for every value that leaves the tree; may be null. Must not touch the tree.
    void (*release)(void* value) = nullptr;
    /// Allocates nodes, which are released by `std::free`; null means `std::malloc`. Returns null if no memory is left.
    void* (*allocate)(std::size_t size) = nullptr;
};

/// Returns 1 if the key is present, and then stores its value in `*value` unless `value` is null; else returns 0.
int critbit_contains(const critbit_tree& tree, std::string_view key, void** value);

/// Returns 2 if the key was added. Returns 1 if it existed with another value, which is replaced (and the old value
/// released) only if the lowest bit of `replace` is set. Returns 0, and changes nothing, if it existed with the same
/// value, if no memory is left, or if it is an invalid key: it holds a NUL or is 4 GiB long.
int critbit_insert(critbit_tree& tree, std::string_view key, void* value, int replace);

/// Removes the key, releases its value and returns 1; returns 0 if it is absent.
int critbit_delete(critbit_tree& tree, std::string_view key);

/// Removes all keys in order, and releases each value.
void critbit_clear(critbit_tree& tree);

/// Receives a key of the tree, NUL-terminated; valid until the key is removed. Returns 1 to continue, 0 to stop.
using critbit_callback = int (*)(const char* key, void* context);

/// Calls back for every key that begins with `prefix` (for every key if that is empty), in ascending order of bytes.
/// The callback must not change the tree. Returns 1 if the walk finished, even without a match; 0 if a callback stopped
/// it; -1 if a callback returned anything else, which stops it too.
int critbit_allprefixed(const critbit_tree& tree, std::string_view prefix, critbit_callback callback, void* context);

/// Returns the value of a key that a callback received.
[[nodiscard]] void* critbit_value(const char* key);

} // namespace tavrin
