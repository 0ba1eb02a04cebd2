#include "tools/devserver/Uploads.h"

#include <array>
#include <optional>

#include <fmt/format.h>
#include <openssl/evp.h>

#include "platform/Error.h"
#include "tools/devserver/Compression.h"

namespace devserver {

using platform::Value;

namespace {

constexpr std::size_t kMaximumKeptBytes = 128u << 20;

std::string sha512(std::string_view text)
{
    std::array<unsigned char, EVP_MAX_MD_SIZE> digest{};
    unsigned length = 0;
    EVP_Digest(text.data(), text.size(), digest.data(), &length, EVP_sha512(), nullptr);
    std::string hexadecimal;
    for (unsigned i = 0; i < length; ++i) hexadecimal += fmt::format("{:02x}", digest[i]);
    return hexadecimal;
}

struct Checked {
    std::string text;
    Value json;
    std::optional<std::string> error;
};

Checked check(const Request& request, const std::string* digest)
{
    const std::string* encoding = findHeader(request.headers, "Content-Encoding");
    if (!encoding || *encoding != "deflate") return {{}, {}, "no header \"Content-Encoding: deflate\""};
    auto text = inflateRaw(request.body, Uploads::kMaximumUnpacked);
    if (!text) return {{}, {}, text.error()};
    Checked checked{std::move(*text), {}, {}};
    auto json = platform::parseJson(checked.text, Uploads::kMaximumUnpacked);
    if (!json)
        checked.error = "not JSON: " + json.error().reason();
    else
        checked.json = std::move(*json);
    if (!digest)
        checked.error = "no header \"X-Quorvane-Digest\"";
    else if (*digest != sha512(checked.text))
        checked.error = "the digest is another one than that of the JSON text";
    return checked;
}

} // namespace

Answer Uploads::receive(const Request& request)
{
    const std::string* digest = findHeader(request.headers, "X-Quorvane-Digest");
    Checked checked = check(request, digest);

    const std::lock_guard lock(_mutex);
    _kept.emplace_back(checked.text.size(),
                       Value::dictionaryOf({{"number", ++_count},
                                            {"path", request.path},
                                            {"query", request.query},
                                            {"size", checked.text.size()},
                                            {"packed_size", request.body.size()},
                                            {"digest", digest ? Value(*digest) : Value()},
                                            {"error", checked.error ? Value(*checked.error) : Value()},
                                            {"json", std::move(checked.json)}}));
    _keptBytes += checked.text.size();
    while (_kept.size() > kKept || (_keptBytes > kMaximumKeptBytes && _kept.size() > 1)) {
        _keptBytes -= _kept.front().first;
        _kept.pop_front();
    }
    if (checked.error) return errorAnswer(400, *checked.error);
    return jsonAnswer(Value::dictionaryOf({{"received", checked.text.size()}}));
}

Value Uploads::list() const
{
    const std::lock_guard lock(_mutex);
    Value::Array uploads;
    for (const auto& [size, upload] : _kept) uploads.push_back(upload);
    return uploads;
}

void Uploads::clear()
{
    const std::lock_guard lock(_mutex);
    _kept.clear();
    _keptBytes = 0;
}

} // namespace devserver
