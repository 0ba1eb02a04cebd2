#include "platform/net/HttpHeaders.h"

#include <algorithm>
#include <strings.h>

#include "platform/net/UrlSession.h"

namespace platform {

namespace {

auto named(std::string_view name)
{
    return [name](const HttpHeaders::Entry& entry) {
        return entry.first.size() == name.size() && strncasecmp(entry.first.data(), name.data(), name.size()) == 0;
    };
}

} // namespace

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
