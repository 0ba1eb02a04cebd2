#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "tools/devserver/Fold.h"

namespace devserver {

/// A kind of results, shown together.
struct Section {
    std::string_view key; ///< "places"; the table's name
    std::string_view name;
    std::string_view bundleIdentifier;
    std::string_view host; ///< of its entries' URLs
    std::string_view type; ///< of its results
};

struct Entry {
    std::string identifier; ///< section and a digest of the URL; stays when other entries come and go
    const Section* section = nullptr;
    std::string title;
    std::string url;
    std::string description;
    unsigned popularity = 0; ///< 1 to 1000
    std::string keywords;    ///< further words that find it
    Folded foldedTitle;
    std::vector<Word> titleWords;
    std::vector<std::string> foldedKeywords;
};

/// What the service can find: tables compiled in from catalogue/. Immutable.
class Catalogue {
public:
    /// Throws std::runtime_error, with table and line, for a row that isn't "title, popularity, description, keywords".
    Catalogue();

    [[nodiscard]] const std::vector<Entry>& entries() const { return _entries; }
    /// Null where there is none.
    [[nodiscard]] const Entry* find(std::string_view identifier) const;

private:
    std::vector<Entry> _entries;
};

[[nodiscard]] const std::vector<Section>& sections();
/// Null where there is none.
[[nodiscard]] const Section* findSection(std::string_view key);

} // namespace devserver
