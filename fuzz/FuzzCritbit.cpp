#include <algorithm>

#include "fuzz/Check.h"
#include "tests/support/CritbitModel.h"

/// The input is a list of operations on a tree: a byte that says which, one with the length of the key or prefix, and
/// its bytes, of any value. The tree must do what a map does.
void runInput(std::string_view input)
{
    tavrin::test::CritbitModel model;
    while (input.size() >= 2) {
        const char operation = input[0];
        const std::size_t length = static_cast<unsigned char>(input[1]);
        const std::string key(input.substr(2, length));
        input.remove_prefix(std::min(input.size(), 2 + length));
        switch (operation) {
        case '-': check(model.remove(key), key); break;
        case '?': check(model.walk(key), key); break;
        case '3': check(model.walk(key, 3), key); break;
        case '!': check(model.walk(key, 2, 5), key); break;
        case '0': check(model.clear()); break;
        case '=': check(model.insert(key, 9, true), key); break;
        default: check(model.insert(key, static_cast<unsigned char>(operation), operation & 1), key); break;
        }
    }
    check(model.walk("") && model.clear());
}
