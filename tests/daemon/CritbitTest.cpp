#include <cstdlib>
#include <pthread.h>
#include <random>

#include <gtest/gtest.h>

#include "tavrind/CritbitTree.h"
#include "tests/support/CritbitModel.h"

namespace tavrin::test {
namespace {

void* value(std::uintptr_t number)
{
    return reinterpret_cast<void*>(number);
}

int allocationsLeft = 0;

TEST(Critbit, WithoutMemoryNothingChanges)
{
    critbit_tree tree;
    tree.allocate = [](std::size_t size) { return allocationsLeft-- > 0 ? std::malloc(size) : nullptr; };
    EXPECT_EQ(critbit_insert(tree, "a", value(1), 1), 0);
    EXPECT_EQ(tree.root, 0u);
    allocationsLeft = 1;
    EXPECT_EQ(critbit_insert(tree, "a", value(1), 1), 2);
    for (const int left : {0, 1}) { // for the node, for the leaf
        allocationsLeft = left;
        EXPECT_EQ(critbit_insert(tree, "ab", value(2), 1), 0) << left;
        EXPECT_EQ(critbit_contains(tree, "ab", nullptr), 0) << left;
        EXPECT_EQ(critbit_contains(tree, "a", nullptr), 1) << left;
        EXPECT_EQ(tree.count, 1u) << left;
    }
    allocationsLeft = 2;
    EXPECT_EQ(critbit_insert(tree, "ab", value(2), 1), 2);
    critbit_clear(tree);
}

TEST(Critbit, TheEmptyTreeTheEmptyKeyAndKeysWithANulAreSound)
{
    CritbitModel model;
    EXPECT_TRUE(model.walk("") && model.remove("") && model.clear());
    EXPECT_TRUE(model.insert("", 1, true) && model.walk(""));
    EXPECT_TRUE(model.insert("x", 2, true) && model.walk("") && model.walk("x"));
    EXPECT_TRUE(model.remove("") && model.remove("x"));
    EXPECT_EQ(model.tree.root, 0u) << "the last key is gone";
    EXPECT_TRUE(model.insert(std::string("a\0b", 3), 1, true) && model.insert("a", 1, true));
    EXPECT_TRUE(model.remove(std::string("a\0b", 3)) && model.remove(std::string("a\0", 2)));
    EXPECT_TRUE(model.walk(std::string_view("a\0", 2)));
    EXPECT_EQ(critbit_insert(model.tree, "a", value(3), 2), 1) << "only the lowest bit of the flag counts";
    EXPECT_TRUE(model.walk("a", 1, 7)) << "ended by the callback";
}

TEST(Critbit, HoldsWhatAMapHolds)
{
    // Few letters make keys that repeat, nest and differ late; all bytes make trees that branch at every bit.
    for (const std::string_view alphabet : {"ab", "\x01\x7f\x80\xff", "abcdefgh \xc3\xa9"}) {
        std::mt19937 random(7);
        const auto upTo = [&](std::size_t limit) { return random() % (limit + 1); };
        const auto key = [&] {
            std::string text;
            for (std::size_t length = upTo(9); length > 0; --length) text += alphabet[upTo(alphabet.size() - 1)];
            return text;
        };
        CritbitModel model;
        for (int i = 0; i < 20'000; ++i) {
            switch (upTo(7)) {
            case 0: ASSERT_TRUE(model.remove(key())); break;
            case 1: ASSERT_TRUE(model.walk(key().substr(0, upTo(4)), 1 + upTo(30))); break;
            case 2: ASSERT_TRUE(upTo(200) > 0 || model.clear()); break;
            default: ASSERT_TRUE(model.insert(key(), 1 + upTo(5), upTo(1))); break;
            }
        }
        ASSERT_TRUE(model.walk("") && model.clear());
    }
}

// Keys that part at every bit of a long one make the deepest tree.
void* useDeepTree(void*)
{
    CritbitModel model;
    const std::string longest(500, 'a');
    for (std::size_t i = 0; i < longest.size(); ++i)
        for (int bit = 0; bit < 8; ++bit) {
            std::string key = longest.substr(0, i + 1);
            key[i] = static_cast<char>(key[i] ^ (1 << bit));
            if (!model.insert(key, 1, true)) return value(1);
        }
    return value(model.insert(longest, 1, true) && model.walk("") && model.walk("aaa") && model.clear() ? 0 : 2);
}

TEST(Critbit, ADeepTreeTakesNoStack)
{
    pthread_attr_t small;
    pthread_attr_init(&small);
    pthread_attr_setstacksize(&small, 128 * 1024);
    pthread_t thread{};
    ASSERT_EQ(pthread_create(&thread, &small, useDeepTree, nullptr), 0);
    void* fault = nullptr;
    pthread_join(thread, &fault);
    pthread_attr_destroy(&small);
    EXPECT_EQ(fault, nullptr);
}

TEST(CritbitTree, KeepsObjectsByTheirAddress)
{
    int one = 1, two = 2;
    CritbitTree<int> tree;
    EXPECT_TRUE(tree.setObject(one, "weather") && tree.setObject(two, "weather today"));
    EXPECT_FALSE(tree.setObject(one, "weather")) << "nothing new";
    EXPECT_TRUE(tree.setObject(two, "weather")) << "in place of the other";
    EXPECT_FALSE(tree.setObject(one, std::string_view("a\0b", 3)));
    EXPECT_EQ(tree.objectForKey("weath"), nullptr);
    std::string seen;
    tree.keysMatchingPrefix("weat", [&](std::string_view key, int& object, bool& stop) {
        seen += key;
        stop = object == 2;
    });
    EXPECT_EQ(seen, "weather");
    tree.removeObjectForKey("weather");
    EXPECT_EQ(tree.count(), 1u);
    tree.removeAllObjects();
    EXPECT_EQ(tree.count(), 0u);
}

} // namespace
} // namespace tavrin::test
