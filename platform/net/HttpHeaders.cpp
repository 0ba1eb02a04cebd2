#include "platform/net/HttpHeaders.h"

#include <algorithm>

#include "platform/net/UrlSession.h"

namespace platform {

namespace {

auto named(std::string_view name)
{
    return [name](const HttpHeaders::Entry& entry) { return equalIgnoringCase(entry.first, name); };
}

} // namespace

bool equalIgnoringCase(std::string_view a, std::string_view b)
{
    const auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; };
    return std::ranges::equal(a, b, {}, lower, lower);
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

} // namespace platform
