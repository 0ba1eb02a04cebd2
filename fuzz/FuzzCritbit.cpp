#include <algorithm>

#include "fuzz/Check.h"
#include "tests/support/CritbitModel.h"

/// Each line is an operation on a tree: its first byte says which, the rest is the key or prefix. The tree must do what
/// a map does.
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    tavrin::test::CritbitModel model;
    std::string_view rest = textOf(data, size);
    while (!rest.empty()) {
        const std::string line(rest.substr(0, rest.find('\n')));
        rest.remove_prefix(std::min(rest.size(), line.size() + 1));
        if (line.empty()) continue;
        const std::string key = line.substr(1);
        switch (line[0]) {
        case '-': check(model.remove(key), key); break;
        case '?': check(model.walk(key), key); break;
        case '3': check(model.walk(key, 3), key); break;
        case '!': check(model.clear()); break;
        case '=': check(model.insert(key, 9, true), key); break;
        default: check(model.insert(key, static_cast<unsigned char>(line[0]), line[0] & 1), key); break;
        }
    }
    check(model.walk("") && model.clear());
    return 0;
}
