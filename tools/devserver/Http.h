#pragma once

#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/values/Value.h"

/// What the service sees of HTTP: requests in, answers out. The library that speaks it stays in HttpServer.cpp.
namespace devserver {

using Headers = std::vector<std::pair<std::string, std::string>>;

/// The value of the first header of that name, in any case; null where there is none.
[[nodiscard]] const std::string* findHeader(const Headers& headers, std::string_view name);

struct Request {
    std::string method = "GET";
    std::string path;  ///< percent-encoded, as it came
    std::string query; ///< what follows "?", percent-encoded, as it came
    Headers headers;
    std::string body;
    std::string peer;    ///< the client's address
    bool secure = false; ///< came over TLS
    int connection = -1; ///< the connection's descriptor, to notice that the peer went; -1 if unknown

    /// The decoded value of the first query item of that name; "+" is a blank, as in forms.
    [[nodiscard]] std::optional<std::string> item(std::string_view name) const;
};

struct Answer {
    int status = 200;
    std::string contentType = "application/json";
    std::string body;
    Headers headers;
    std::size_t paddedTo = 0; ///< blanks are sent after the body up to this length
    bool cut = false;         ///< the connection is closed in the middle of the body
    /// Set: after the body, which tells no length, blanks are sent one by one for as long as this says.
    std::function<bool()> goesOn{};
};

[[nodiscard]] Answer jsonAnswer(const platform::Value& value, int status = 200);
/// {"error": text}
[[nodiscard]] Answer errorAnswer(int status, std::string text);

} // namespace devserver
