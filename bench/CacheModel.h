#pragma once

#include <algorithm>
#include <optional>
#include <string>
#include <vector>

#include "platform/base/Date.h"
#include "platform/text/Text.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"

namespace tavrin::test {

/// The rules of the query cache once more, each spelled out over a plain list.
class CacheModel {
public:
    struct Entry {
        std::string query; ///< in lower case, as is the input
        std::string input;
        double scale = 0;
        float score = 0;
        std::optional<platform::Date> expires;
        platform::Value set;
        std::size_t queryLength = 0; ///< UTF-16 units, as is the input's
        std::size_t inputLength = 0;
    };

    void put(std::string_view input, double scale, const platform::Value& set, platform::Date now)
    {
        const std::string* query = set["query"].asString();
        if (!query || query->empty()) return;
        Entry entry{platform::lowerCased(*query), platform::lowerCased(input), scale, 0, {}, set};
        entry.queryLength = platform::utf16Length(entry.query);
        entry.inputLength = platform::utf16Length(entry.input);
        if (entry.inputLength > entry.queryLength) return;
        entry.score = static_cast<float>(set["completion_score"].asDouble().value_or(0));
        if (const double age = set["max_age"].asDouble().value_or(0); age != 0)
            entry.expires = now + platform::durationFromSeconds(age);

        const std::size_t cost = platform::jsonSize(set) * 3 / 2;
        if (cost >= 0x200000) return;
        if (_cost + cost >= 0x200000) {
            clear();
            ++flushes;
        }
        _cost += cost;
        std::erase_if(entries, [&](const Entry& other) { return other.query == entry.query; });
        entries.push_back(std::move(entry));
        std::ranges::sort(entries, {}, &Entry::query);
    }

    void clear()
    {
        entries.clear();
        _cost = 0;
    }

    /// What answers; null for nothing. Valid until the next call.
    const Entry* get(std::string_view typed, double scale, platform::Date now)
    {
        const std::string text = platform::lowerCased(typed);
        std::erase_if(entries, [&](const Entry& entry) {
            return entry.query.starts_with(text) && entry.expires && *entry.expires <= now;
        });
        const std::size_t length = platform::utf16Length(text);
        const Entry* best = nullptr;
        for (const Entry& entry : entries) {
            if (!entry.query.starts_with(text) || length < entry.inputLength) continue;
            if (scale > 0 && scale != entry.scale) continue;
            if (best && entry.queryLength > best->queryLength) continue;
            const bool equallyLong = best && entry.queryLength == best->queryLength;
            if (equallyLong && (entry.score <= 0 || entry.score <= best->score)) continue;
            best = &entry;
        }
        return best;
    }

    std::vector<Entry> entries; ///< in order of their queries' bytes
    int flushes = 0;            ///< because of the cost

private:
    std::size_t _cost = 0;
};

} // namespace tavrin::test
