#pragma once

#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/values/Value.h"

/// HTTP requests and answers, independent of the HTTP library, which only HttpServer.cpp uses.
namespace devserver {

using Headers = std::vector<std::pair<std::string, std::string>>;

/// Returns the value of the first header of that name, ignoring case; null if there is none.
[[nodiscard]] const std::string* findHeader(const Headers& headers, std::string_view name);

struct Request {
    std::string method = "GET";
    std::string path;  ///< percent-encoded, as received
    std::string query; ///< the part after "?", percent-encoded, as received
    Headers headers;
    std::string body;
    std::string peer;    ///< the client's address
    bool secure = false; ///< received over TLS
    int connection = -1; ///< the connection's socket, to detect that the peer disconnects; -1 if unknown

    /// Returns the decoded value of the first query item of that name; nullopt if there is none. "+" decodes to a
    /// blank, as in forms.
    [[nodiscard]] std::optional<std::string> item(std::string_view name) const;
};

struct Answer {
    int status = 200;
    std::string contentType = "application/json";
    std::string body;
    Headers headers;
    std::size_t paddedTo = 0; ///< length to which the body is padded with blanks
    bool cut = false;         ///< the connection is closed in the middle of the body
    /// If set, the body has no length: it continues with the texts that this returns, which must not be empty. At
    /// nullopt the connection is closed. May block.
    std::function<std::optional<std::string>()> more{};
};

[[nodiscard]] Answer jsonAnswer(const platform::Value& value, int status = 200);
/// Returns an answer with the body {"error": text}.
[[nodiscard]] Answer errorAnswer(int status, std::string text);

} // namespace devserver
