#include "tools/devserver/Http.h"

#include <algorithm>

#include "platform/net/HttpHeaders.h"
#include "platform/net/Url.h"
#include "platform/values/Json.h"

namespace devserver {

const std::string* findHeader(const Headers& headers, std::string_view name)
{
    const auto found = std::ranges::find_if(
        headers, [&](const auto& header) { return platform::equalIgnoringCase(header.first, name); });
    return found == headers.end() ? nullptr : &found->second;
}

std::optional<std::string> Request::item(std::string_view name) const
{
    const auto decode = [](std::string_view text) {
        std::string blanks(text);
        std::ranges::replace(blanks, '+', ' ');
        return platform::percentDecode(blanks);
    };
    for (std::string_view rest = query; !rest.empty();) {
        const std::string_view item = rest.substr(0, rest.find('&'));
        rest.remove_prefix(std::min(rest.size(), item.size() + 1));
        const std::size_t equals = std::min(item.find('='), item.size());
        if (decode(item.substr(0, equals)) == name) return decode(item.substr(std::min(item.size(), equals + 1)));
    }
    return std::nullopt;
}

Answer jsonAnswer(const platform::Value& value, int status)
{
    return {.status = status, .body = platform::toJson(value) + "\n"};
}

Answer errorAnswer(int status, std::string text)
{
    return jsonAnswer(platform::Value::dictionaryOf({{"error", std::move(text)}}), status);
}

} // namespace devserver
