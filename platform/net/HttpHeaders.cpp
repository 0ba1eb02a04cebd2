#include "platform/net/HttpHeaders.h"

#include <algorithm>
#include <iterator>
#include <set>

#include "platform/net/UrlSession.h"

namespace platform {

namespace {

char asciiLower(char c)
{
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

auto named(std::string_view name)
{
    return [name](const HttpHeaders::Entry& entry) { return equalIgnoringCase(entry.first, name); };
}

} // namespace

bool equalIgnoringCase(std::string_view a, std::string_view b)
{
    return std::ranges::equal(a, b, {}, asciiLower, asciiLower);
}

std::string_view withoutBlanks(std::string_view text)
{
    const auto first = text.find_first_not_of(" \t");
    if (first == std::string_view::npos) return {};
    return text.substr(first, text.find_last_not_of(" \t") - first + 1);
}

const std::string* HttpHeaders::find(std::string_view name) const
{
    const auto found = std::ranges::find_if(_entries, named(name));
    return found == _entries.end() ? nullptr : &found->second;
}

std::string HttpHeaders::list(std::string_view name) const
{
    std::string all;
    for (const Entry& entry : _entries)
        if (named(name)(entry)) all += (all.empty() ? "" : ", ") + entry.second;
    return all;
}

void HttpHeaders::set(std::string name, std::string value)
{
    remove(name);
    add(std::move(name), std::move(value));
}

void HttpHeaders::remove(std::string_view name)
{
    std::erase_if(_entries, named(name));
}

void HttpHeaders::replaceBy(HttpHeaders others)
{
    // The names are in a set, because a service may send thousands of fields.
    const auto precedes = [](std::string_view a, std::string_view b) {
        return std::ranges::lexicographical_compare(a, b, {}, asciiLower, asciiLower);
    };
    std::set<std::string_view, decltype(precedes)> names(precedes);
    for (const Entry& entry : others._entries) names.insert(entry.first);
    std::erase_if(_entries, [&](const Entry& entry) { return names.contains(entry.first); });
    std::ranges::move(others._entries, std::back_inserter(_entries));
}

} // namespace platform
