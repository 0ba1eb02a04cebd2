#include "tools/devserver/Console.h"

#include <algorithm>
#include <fstream>
#include <iterator>
#include <optional>
#include <string>
#include <string_view>

#include "console_files.h"
#include "tools/devserver/Control.h"

namespace devserver {
namespace {

constexpr const char* kChartLibrary = "/usr/share/javascript/chart.js/chart.min.js";

constexpr std::pair<std::string_view, const char*> kTypes[] = {
    {".html", "text/html; charset=utf-8"},   {".js", "text/javascript; charset=utf-8"},
    {".css", "text/css; charset=utf-8"},     {".svg", "image/svg+xml"},
    {".md", "text/markdown; charset=utf-8"},
};

/// Everything comes from this service, and no text of a request can become code.
const Headers kHeaders{
    {"Content-Security-Policy", "default-src 'none'; script-src 'self'; style-src 'self'; img-src 'self'; "
                                "connect-src 'self'; base-uri 'none'; form-action 'none'; frame-ancestors 'none'; "
                                "require-trusted-types-for 'script'"},
    {"X-Content-Type-Options", "nosniff"},
    {"Referrer-Policy", "no-referrer"},
    {"Cross-Origin-Opener-Policy", "same-origin"},
    {"Cross-Origin-Resource-Policy", "same-origin"},
    {"Cache-Control", "no-store"},
};

std::string chartLibrary()
{
    std::ifstream file(kChartLibrary, std::ios::binary);
    return file ? std::string(std::istreambuf_iterator<char>(file), {}) : "// The package libjs-chart.js is missing.\n";
}

std::optional<std::string> contentsOfFile(std::string_view name)
{
    if (name == "chart.js") return chartLibrary();
    const auto* file = std::ranges::find(kConsoleFiles, name, &std::pair<std::string_view, std::string_view>::first);
    if (file == std::end(kConsoleFiles)) return std::nullopt;
    return std::string(file->second);
}

} // namespace

Answer consoleAnswer(const Request& request)
{
    if (auto refused = refusedAsStrange(request)) return std::move(*refused);
    if (request.method != "GET" && request.method != "HEAD") return errorAnswer(405, "only GET and HEAD are allowed");
    std::string_view name = std::string_view(request.path).substr(std::string_view("/console").size());
    name = name.size() <= 1 ? "index.html" : name.substr(1);
    auto contents = contentsOfFile(name);
    if (!contents) return errorAnswer(404, "no such file of the console");
    const auto* type = std::ranges::find_if(kTypes, [&](const auto& t) { return name.ends_with(t.first); });
    return {.contentType = type->second, .body = std::move(*contents), .headers = kHeaders};
}

} // namespace devserver
