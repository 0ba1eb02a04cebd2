#include <filesystem>
#include <fstream>
#include <map>
#include <unistd.h>

#include "fuzz/Check.h"
#include "platform/files/Files.h"
#include "platform/net/HttpCachePolicy.h"
#include "platform/net/HttpCacheStore.h"
#include "tests/support/TemporaryDirectory.h"

using namespace platform;

namespace {

namespace fs = std::filesystem;

constexpr const char* kIndex = "index.db";
constexpr HttpCacheStore::Limits kLimits{.capacity = 1u << 20, .minimumMappedSize = 64};
const Date kNow = dateFromSecondsSince1970(1767225600);

UrlRequest requestFor(const std::string& key)
{
    return {.url = *Url::parse(key)};
}

StoredResponse answerFor(const std::string& key, std::size_t size)
{
    StoredResponse stored;
    stored.response = {
        .url = *Url::parse(key), .statusCode = 200, .headers = {{"Cache-Control", "max-age=60"}, {"ETag", "\"1\""}}};
    stored.body = Bytes(std::string(size, 'b'));
    stored.requested = stored.received = kNow;
    return stored;
}

/// The rules must have an answer for whatever a service says, and keep to it.
void judge(HttpHeaders headers)
{
    const UrlRequest plain = requestFor("http://a/");
    UrlRequest request = plain;
    request.headers = headers;
    StoredResponse stored = answerFor("http://a/", 4);
    stored.response.headers = headers;
    (void)cacheUse(request);
    const auto fields = selectingFields(stored.response, request);
    const auto lifetime = freshnessLifetime(stored.response, kNow);
    check(lifetime.count() >= 0 && currentAge(stored, kNow).count() >= 0);
    if (!fields) return check(!isStorable(request, stored.response, kNow));
    stored.selecting = *fields;
    const bool answered = reuse(stored, request, kNow) == Reuse::Answer;
    check(!answered || lifetime > currentAge(stored, kNow));
    const UrlResponse notModified{.url = plain.url, .statusCode = 304, .headers = std::move(headers)};
    (void)confirmationRequest(stored, plain);
    (void)confirms(notModified, stored);
    check(confirmed(stored, notModified, kNow, kNow).body == stored.body);
}

/// Returns the header fields of the lines. Skips lines with a NUL: the loader doesn't hand them on.
HttpHeaders fieldsIn(std::string_view lines)
{
    HttpHeaders headers;
    while (!lines.empty()) {
        const std::string_view line = takeLine(lines);
        const auto colon = line.find(':');
        if (colon != std::string_view::npos && !line.contains('\0'))
            headers.add(std::string(line.substr(0, colon)), std::string(line.substr(colon + 1)));
    }
    return headers;
}

FileSystem& files()
{
    static const std::unique_ptr<FileSystem> system = makeSystemFiles();
    return *system;
}

/// The files of a cache that keeps two responses, by name. They are made once: that takes longer than to use them.
const std::map<std::string, std::string>& soundCache()
{
    static const auto contents = [] {
        const test::TemporaryDirectory directory;
        {
            auto store = HttpCacheStore::open(files(), directory.path, kLimits).value();
            for (const std::size_t body : {10u, 100u}) {
                const std::string key = "http://a/" + std::to_string(body);
                check(store->put(key, answerFor(key, body)).has_value());
            }
        }
        std::map<std::string, std::string> read;
        for (const auto& entry : fs::directory_iterator(directory.path)) {
            std::ifstream file(entry.path(), std::ios::binary);
            read[entry.path().filename()].assign(std::istreambuf_iterator<char>(file), {});
        }
        return read;
    }();
    return contents;
}

/// Checks that a stored response is found unchanged or not at all, and that a cache that opens also works.
void use(const fs::path& directory)
{
    auto store = HttpCacheStore::open(files(), directory, kLimits);
    check(store.has_value(), store ? "" : store.error().description());
    (void)(*store)->keys();
    for (const std::size_t size : {10u, 100u}) {
        const std::string key = "http://a/" + std::to_string(size);
        const auto found = (*store)->find(key);
        if (found && *found)
            check((*found)->body == answerFor(key, size).body && (*found)->response.headers.size() == 2, key);
        if (!found && Sqlite::isDamage(found.error())) check((*store)->reset().has_value());
        auto kept = (*store)->put(key, answerFor(key, size));
        if (!kept) {
            const auto begun = (*store)->reset();
            check(begun.has_value(), kept.error().description());
            kept = (*store)->put(key, answerFor(key, size));
            check(kept.has_value(), kept ? "" : kept.error().description());
        }
        const auto again = (*store)->find(key);
        check((again && *again && (*again)->body.size() == size) || (!again && Sqlite::isDamage(again.error())));
    }
}

} // namespace

/// An input that begins with "SQLite" is a whole index. One that begins with "~" has changes to a sound index, three
/// bytes each: an offset of two bytes, and the new value of the byte there. Any other is header fields, a line each.
void runInput(std::string_view input)
{
    if (!input.starts_with("~") && !input.starts_with("SQLite")) return judge(fieldsIn(input));

    const test::TemporaryDirectory directory;
    std::string index(input);
    if (input.starts_with("~")) {
        for (const auto& [name, contents] : soundCache()) test::writeFile(directory / name, contents);
        index = soundCache().at(kIndex);
        const auto byte = [&](std::size_t at) { return std::size_t{static_cast<unsigned char>(input[at])}; };
        for (std::size_t i = 1; i + 3 <= input.size(); i += 3)
            index[(byte(i) << 8 | byte(i + 1)) % index.size()] = input[i + 2];
    }
    test::writeFile(directory / kIndex, index);
    use(directory.path);
}
