#include "tavrind/critbit.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <memory_resource>
#include <vector>

namespace tavrin {

namespace {

using Link = std::uintptr_t; // the address of an Internal plus 1, or that of an External

/// Separates keys by one bit: those without it are under child 0.
struct Internal {
    Link child[2];
    std::uint32_t byte;     // index of the first byte in which the keys of the two subtrees differ
    std::uint8_t otherBits; // all bits except the highest differing one

    /// Returns the child for a key whose byte at `byte` is `c`.
    [[nodiscard]] int direction(unsigned char c) const { return (1 + (otherBits | c)) >> 8; }
    /// Returns the child for a key. A key that ends before `byte` has a NUL there.
    [[nodiscard]] int direction(std::string_view key) const
    {
        return direction(byte < key.size() ? static_cast<unsigned char>(key[byte]) : 0);
    }
};
static_assert(sizeof(void*) != 8 || sizeof(Internal) == 24);

/// A key and its value; the key's bytes and a NUL follow the struct.
struct External {
    void* value;

    [[nodiscard]] char* key() { return reinterpret_cast<char*>(this + 1); }
    [[nodiscard]] std::string_view keyView() { return key(); }
};

bool isInternal(Link link)
{
    return link & 1;
}

Internal& internal(Link link)
{
    return *reinterpret_cast<Internal*>(link - 1);
}

External& external(Link link)
{
    return *reinterpret_cast<External*>(link);
}

/// Returns the only leaf that can hold `key`.
External& bestLeaf(Link link, std::string_view key)
{
    while (isInternal(link)) {
        const Internal& node = internal(link);
        link = node.child[node.direction(key)];
    }
    return external(link);
}

void* allocate(const critbit_tree& tree, std::size_t size)
{
    return tree.allocate ? tree.allocate(size) : std::malloc(size);
}

External* makeLeaf(const critbit_tree& tree, std::string_view key, void* value)
{
    void* memory = allocate(tree, sizeof(External) + key.size() + 1);
    if (!memory) return nullptr;
    auto* leaf = new (memory) External{value};
    std::memcpy(leaf->key(), key.data(), key.size());
    leaf->key()[key.size()] = '\0';
    return leaf;
}

void freeLeaf(const critbit_tree& tree, Link link)
{
    External& leaf = external(link);
    if (tree.release) tree.release(leaf.value);
    std::free(&leaf);
}

} // namespace

int critbit_contains(const critbit_tree& tree, std::string_view key, void** value)
{
    if (!tree.root) return 0;
    External& leaf = bestLeaf(tree.root, key);
    if (leaf.keyView() != key) return 0;
    if (value) *value = leaf.value;
    return 1;
}

int critbit_insert(critbit_tree& tree, std::string_view key, void* value, int replace)
{
    if (key.contains('\0') || key.size() >= std::numeric_limits<std::uint32_t>::max()) return 0;
    if (!tree.root) {
        External* leaf = makeLeaf(tree, key, value);
        if (!leaf) return 0;
        tree.root = reinterpret_cast<Link>(leaf);
        tree.count = 1;
        return 2;
    }

    External& neighbour = bestLeaf(tree.root, key);
    const auto [ours, theirs] = std::ranges::mismatch(key, neighbour.keyView());
    const auto at = static_cast<std::size_t>(ours - key.begin());
    const unsigned char ourByte = at < key.size() ? static_cast<unsigned char>(key[at]) : 0;
    const auto theirByte = static_cast<unsigned char>(neighbour.key()[at]);
    if (ourByte == theirByte) {
        if (neighbour.value == value) return 0;
        if (replace & 1) {
            if (tree.release) tree.release(neighbour.value);
            neighbour.value = value;
        }
        return 1;
    }

    auto* node = static_cast<Internal*>(allocate(tree, sizeof(Internal)));
    if (!node) return 0;
    External* leaf = makeLeaf(tree, key, value);
    if (!leaf) {
        std::free(node);
        return 0;
    }
    node->byte = static_cast<std::uint32_t>(at);
    node->otherBits = static_cast<std::uint8_t>(255 - std::bit_floor(static_cast<unsigned>(ourByte ^ theirByte)));
    const int direction = node->direction(theirByte);

    // The nodes above it separate keys at an earlier bit.
    Link* link = &tree.root;
    while (isInternal(*link)) {
        Internal& above = internal(*link);
        if (above.byte > node->byte || (above.byte == node->byte && above.otherBits > node->otherBits)) break;
        link = &above.child[above.direction(key)];
    }
    node->child[direction] = *link;
    node->child[1 - direction] = reinterpret_cast<Link>(leaf);
    *link = reinterpret_cast<Link>(node) + 1;
    ++tree.count;
    return 2;
}

int critbit_delete(critbit_tree& tree, std::string_view key)
{
    if (!tree.root) return 0;
    Link* link = &tree.root;
    Link* parentLink = nullptr;
    int direction = 0;
    while (isInternal(*link)) {
        parentLink = link;
        Internal& node = internal(*link);
        direction = node.direction(key);
        link = &node.child[direction];
    }
    if (external(*link).keyView() != key) return 0;

    freeLeaf(tree, *link);
    --tree.count;
    if (!parentLink) {
        tree.root = 0;
        return 1;
    }
    Internal& parent = internal(*parentLink);
    *parentLink = parent.child[1 - direction];
    std::free(&parent);
    return 1;
}

void critbit_clear(critbit_tree& tree)
{
    // Each iteration frees the first leaf and its node, or rotates a node down to the right until the first leaf is a
    // child of the root. A node is rotated at most once, so the loop is linear in the number of nodes and needs no
    // stack.
    while (isInternal(tree.root)) {
        Internal& node = internal(tree.root);
        const Link first = node.child[0];
        if (isInternal(first)) {
            node.child[0] = internal(first).child[1];
            internal(first).child[1] = tree.root;
            tree.root = first;
        } else {
            freeLeaf(tree, first);
            tree.root = node.child[1];
            std::free(&node);
        }
    }
    if (tree.root) freeLeaf(tree, tree.root);
    tree.root = 0;
    tree.count = 0;
}

int critbit_allprefixed(const critbit_tree& tree, std::string_view prefix, critbit_callback callback, void* context)
{
    if (!tree.root) return 1;
    Link top = tree.root; // the subtree of all keys with the prefix
    Link link = tree.root;
    while (isInternal(link)) {
        const Internal& node = internal(link);
        const bool inside = node.byte < prefix.size();
        link = node.child[node.direction(prefix)];
        if (inside) top = link;
    }
    if (!external(link).keyView().starts_with(prefix)) return 1;

    std::array<std::byte, 1024> memory;
    std::pmr::monotonic_buffer_resource arena(memory.data(), memory.size());
    std::pmr::vector<Link> later(&arena); // subtrees left to visit, the next one last
    later.reserve(64);
    for (link = top;; link = later.back(), later.pop_back()) {
        while (isInternal(link)) {
            later.push_back(internal(link).child[1]);
            link = internal(link).child[0];
        }
        const int answer = callback(external(link).key(), context);
        if (answer != 1) return answer == 0 ? 0 : -1;
        if (later.empty()) return 1;
    }
}

void* critbit_value(const char* key)
{
    return reinterpret_cast<const External*>(key)[-1].value;
}

} // namespace tavrin
