#include "tools/tavrinctl/Books.h"

#include <cstdint>
#include <utility>

#include <fmt/format.h>
#include <fmt/ranges.h>

#include "platform/values/Dictionary.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

using platform::Value;

namespace {

constexpr std::pair<const char*, const char*> kPlaces[] = {
    {"open", "open"}, {"closed", "closed"},    {"uploading", "uploading"},
    {"sent", "sent"}, {"notSent", "not sent"}, {"unknown", "unknown"},
};

std::int64_t number(const Value& value)
{
    return value.asInt().value_or(0);
}

} // namespace

std::vector<std::string> bookLines(const Value& books)
{
    std::int64_t dropped = 0;
    std::vector<std::string> reasons;
    if (const auto* byReason = books["dropped"].asDictionary())
        for (const auto& [reason, events] : *byReason) {
            dropped += number(events);
            if (number(events) != 0) reasons.push_back(fmt::format("{} {}", number(events), printable(reason)));
        }

    std::int64_t sum = dropped;
    std::vector<std::string> terms;
    for (const auto& [key, name] : kPlaces) {
        sum += number(books[key]);
        terms.push_back(fmt::format("{} {}", number(books[key]), name));
    }
    terms.push_back(fmt::format("{} dropped", dropped));

    std::vector<std::string> lines{fmt::format("{} recorded = {}", number(books["recorded"]), fmt::join(terms, " + "))};
    if (!reasons.empty()) lines.push_back(fmt::format("dropped: {}", fmt::join(reasons, ", ")));
    const std::int64_t missing = number(books["recorded"]) - sum;
    if (missing == 0)
        lines.emplace_back("the books close");
    else
        lines.push_back(fmt::format("the books don't close: {} {}", missing > 0 ? missing : -missing,
                                    missing > 0 ? "missing" : "too many"));
    return lines;
}

} // namespace tavrin::ctl
