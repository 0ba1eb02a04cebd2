#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "tools/devserver/Fold.h"

namespace devserver {

/// A section of results.
struct Section {
    std::string_view key; ///< "places"; the table's name
    std::string_view name;
    std::string_view bundleIdentifier;
    std::string_view host; ///< host of its entries' URLs
    std::string_view type; ///< type of its results
};

struct Entry {
    std::string identifier; ///< section and digest of the URL; does not depend on other entries
    const Section* section = nullptr;
    std::string title;
    std::string url;
    std::string description;
    unsigned popularity = 0; ///< 1 to 1000
    std::string keywords;    ///< further words that match the entry
    Folded foldedTitle;
    std::vector<Word> titleWords;
    std::vector<std::string> foldedKeywords;
};

/// All entries that the service can find: the tables of catalogue/, compiled in. Immutable: any thread.
class Catalogue {
public:
    /// Throws std::runtime_error, naming table and line, if a row isn't "title, popularity, description, keywords".
    Catalogue();

    [[nodiscard]] const std::vector<Entry>& entries() const { return _entries; }
    /// Returns the entry with this identifier, or null.
    [[nodiscard]] const Entry* find(std::string_view identifier) const;

private:
    std::vector<Entry> _entries;
};

[[nodiscard]] const std::vector<Section>& sections();
/// Returns the section with this key, or null.
[[nodiscard]] const Section* findSection(std::string_view key);

} // namespace devserver
