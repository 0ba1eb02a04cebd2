#include "tools/devserver/Catalogue.h"

#include <algorithm>
#include <charconv>
#include <stdexcept>

#include <fmt/format.h>

#include "catalogue_tables.h"
#include "platform/net/Url.h"
#include "platform/values/Dictionary.h"

namespace devserver {
namespace {

std::uint32_t digest(std::string_view text) // FNV-1a
{
    std::uint32_t hash = 2166136261u;
    for (const char c : text) hash = (hash ^ static_cast<unsigned char>(c)) * 16777619u;
    return hash;
}

std::string urlOf(const Section& section, std::string_view title)
{
    std::string slug = lowerCased(title);
    std::ranges::replace(slug, ' ', '-');
    return fmt::format("https://{}/{}", section.host, platform::percentEncodePathSegment(slug));
}

std::vector<std::string_view> split(std::string_view text, char separator)
{
    std::vector<std::string_view> parts;
    for (;;) {
        const std::size_t at = text.find(separator);
        parts.push_back(text.substr(0, at));
        if (at == text.npos) return parts;
        text.remove_prefix(at + 1);
    }
}

Entry readRow(const Section& section, std::string_view row)
{
    const auto columns = split(row, '\t');
    if (columns.size() != 4) throw std::runtime_error(fmt::format("{} columns instead of 4", columns.size()));
    Entry entry;
    entry.section = &section;
    entry.title = columns[0];
    const auto [end, error] =
        std::from_chars(columns[1].data(), columns[1].data() + columns[1].size(), entry.popularity);
    if (error != std::errc() || end != columns[1].data() + columns[1].size() || entry.popularity < 1 ||
        entry.popularity > 1000)
        throw std::runtime_error("the popularity is not a number from 1 to 1000");
    entry.description = columns[2];
    entry.keywords = columns[3];
    entry.url = urlOf(section, entry.title);
    entry.identifier = fmt::format("{}.{:08x}", section.key, digest(entry.url));
    entry.foldedTitle = fold(entry.title);
    entry.titleWords = wordsOf(entry.foldedTitle.text);
    const Folded keywords = fold(entry.keywords);
    for (const Word& word : wordsOf(keywords.text))
        entry.foldedKeywords.push_back(keywords.text.substr(word.begin, word.end - word.begin));
    return entry;
}

} // namespace

const std::vector<Section>& sections()
{
    static const std::vector<Section> all{
        {"weather", "Weather", "com.quorvane.weather", "weather.example", "weather"},
        {"places", "Places", "com.quorvane.places", "places.example", "place"},
        {"apps", "Apps", "com.quorvane.store", "apps.example", "app"},
        {"articles", "Articles", "com.quorvane.articles", "encyclopedia.example", "article"},
        {"music", "Music", "com.quorvane.music", "music.example", "music"},
        {"films", "Films", "com.quorvane.films", "films.example", "film"},
        {"recipes", "Recipes", "com.quorvane.recipes", "recipes.example", "recipe"},
        {"animals", "Animals", "com.quorvane.animals", "animals.example", "animal"},
        {"flights", "Flights", "com.quorvane.flights", "flights.example", "flight"},
        {"words", "Dictionary", "com.quorvane.dictionary", "dictionary.example", "definition"},
    };
    return all;
}

const Section* findSection(std::string_view key)
{
    const auto found = std::ranges::find(sections(), key, &Section::key);
    return found == sections().end() ? nullptr : &*found;
}

Catalogue::Catalogue()
{
    for (const auto& [name, table] : kCatalogueTables) {
        const Section* section = findSection(name.substr(0, name.find('.')));
        if (!section) throw std::runtime_error(fmt::format("catalogue: no section for {}", name));
        std::size_t line = 0;
        for (const std::string_view row : split(table, '\n')) {
            ++line;
            if (row.empty() || row.starts_with('#')) continue;
            try {
                _entries.push_back(readRow(*section, row));
            } catch (const std::runtime_error& error) {
                throw std::runtime_error(fmt::format("catalogue: {}:{}: {}", name, line, error.what()));
            }
        }
    }
}

const Entry* Catalogue::find(std::string_view identifier) const
{
    const auto found = std::ranges::find(_entries, identifier, &Entry::identifier);
    return found == _entries.end() ? nullptr : &*found;
}

} // namespace devserver
