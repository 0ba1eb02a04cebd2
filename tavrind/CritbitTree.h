#pragma once

#include <cstdint>
#include <string_view>

#include "tavrind/critbit.h"

namespace tavrin {

/// Maps texts to objects, in the order of the texts' bytes, and finds all texts that begin with a prefix. A text that
/// holds a NUL can't be a key: it is neither stored nor found.
///
/// The tree does not own the objects. Its user must keep each object alive until its key is removed or gets another
/// object. Not thread-safe.
template <class Object> class CritbitTree {
public:
    CritbitTree()
    {
        _tree.release = [](void*) {};
    }
    ~CritbitTree() { removeAllObjects(); }
    CritbitTree(const CritbitTree&) = delete;
    CritbitTree& operator=(const CritbitTree&) = delete;

    /// Stores the object, replacing any other under the key. Returns false if nothing changed: the key has this object
    /// already, or the object could not be stored.
    bool setObject(Object& object, std::string_view key) { return critbit_insert(_tree, key, pointer(object), 1) != 0; }
    /// Returns null if the key is absent.
    [[nodiscard]] Object* objectForKey(std::string_view key) const
    {
        void* object = nullptr;
        critbit_contains(_tree, key, &object);
        return static_cast<Object*>(object);
    }
    void removeObjectForKey(std::string_view key) { critbit_delete(_tree, key); }
    void removeAllObjects() { critbit_clear(_tree); }
    [[nodiscard]] std::uint64_t count() const { return _tree.count; }

    /// Calls `block(std::string_view key, Object& object, bool& stop)` for every key that begins with the prefix, in
    /// order, until it sets `stop`. The key is valid during the call only. The block must not change the tree.
    template <class Block> void keysMatchingPrefix(std::string_view prefix, Block block) const
    {
        const auto callback = [](const char* key, void* context) {
            bool stop = false;
            (*static_cast<Block*>(context))(std::string_view(key), *static_cast<Object*>(critbit_value(key)), stop);
            return stop ? 0 : 1;
        };
        critbit_allprefixed(_tree, prefix, callback, &block);
    }

private:
    static void* pointer(Object& object) { return const_cast<void*>(static_cast<const void*>(&object)); }
    critbit_tree _tree;
};

} // namespace tavrin
