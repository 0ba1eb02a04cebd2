// tavrinctl preview: what would leave the device, before it leaves.

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "CoreTavrin/TAVRequest.h"
#include "platform/files/Files.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/tavrinctl/Characters.h"
#include "tools/tavrinctl/Commands.h"
#include "tools/tavrinctl/Events.h"
#include "tools/tavrinctl/RequestRunner.h"

namespace tavrin::ctl {

using platform::Dictionary;
using platform::Value;

namespace {

/// Saves a body byte for byte as DIR/preview-N.deflate, and returns its path.
std::string saveBody(const std::string& directory, std::size_t number, const platform::Bytes& body)
{
    const auto files = platform::makeSystemFiles();
    const auto path =
        std::filesystem::absolute(directory).lexically_normal() / fmt::format("preview-{}.deflate", number);
    auto saved = files->createDirectories(path.parent_path());
    if (saved) saved = files->writeAtomically(path, body.view());
    if (!saved) throw Failure(fmt::format("can't write {}: {}", path.string(), saved.error().reason()));
    return path.string();
}

void printUpload(std::size_t number, const Value& upload, const FlushedBody& body)
{
    const std::string url = said(upload["url"]);
    printLine(
        bold(fmt::format("{}. {}", number,
                         url.empty() ? "nowhere: the bag names no endpoint, so it will be dropped" : "POST " + url)) +
        (upload["open"] == Value(true) ? dim("  (its session has not ended, and may still grow)") : ""));
    if (const Dictionary* headers = upload["headers"].asDictionary())
        for (const auto& [name, value] : *headers)
            printLine(dim(fmt::format("   {}: {}", printable(name), said(value))));
    printLine("   " + summary(body));
    if (const Value::Array* events = body.json["fb"].asArray())
        for (const Value& event : *events)
            printLine(
                fmt::format("   {:>9.3f} s  {}", event["timestamp"].asDouble().value_or(0) / 1000, eventLine(event)));
    else if (!body.json.isNull())
        printLine("   " + printable(platform::toJson(body.json)));
}

void previewUploads(const Options& options, const std::string& directory)
{
    const Value::Array uploads = valueOf(connect(options)->previewUploads());
    Value::Array described;
    for (std::size_t i = 0; i < uploads.size(); ++i) {
        const Value& upload = uploads[i];
        const platform::Bytes bytes = upload["body"].asBytes() ? *upload["body"].asBytes() : platform::Bytes();
        const auto leftOut = upload["bytes"].asUInt();
        const FlushedBody body =
            leftOut ? FlushedBody{.packedSize = *leftOut, .problem = "too much for one preview"} : flushedBody(bytes);
        const std::string path = directory.empty() || leftOut ? "" : saveBody(directory, i + 1, bytes);
        if (!options.json) {
            printUpload(i + 1, upload, body);
            if (!path.empty()) printLine(dim("   saved as " + path));
            continue;
        }
        Value description = describe(body);
        for (const char* key : {"url", "headers", "events", "open", "flusher"})
            if (!upload[key].isNull()) description.mutableDictionary().set(key, upload[key]);
        if (!path.empty()) description.mutableDictionary().set("file", path);
        described.push_back(std::move(description));
    }
    if (options.json) return printJson(Value::dictionaryOf({{"uploads", std::move(described)}}));
    if (uploads.empty())
        printLine("The next upload would carry nothing. \"tavrinctl doctor\" lists uploads that wait.");
}

void printParts(const char* title, const Value& parts)
{
    printLine(bold(title));
    for (std::size_t i = 0; i < parts.count(); ++i)
        printLine(fmt::format("  {} {:<9} {}", padded(said(parts[i]["name"]), 38), said(parts[i]["from"]),
                              said(parts[i]["value"])));
}

void previewSearch(const Options& options, const std::string& query, const std::vector<std::string>& items)
{
    const auto request = TAVSearchRequest::searchRequestWithString(query, StartSearchTrigger::NewCharacter);
    request->queryItems = queryItems(items);
    const Session session = openSession(options);
    request->configuration = std::make_shared<TAVSessionConfiguration>(session.configuration);
    const TAVBagAnswer bag = valueOf(session.client->bag());
    const Value preview = valueOf(session.client->previewRequest(*request));
    const std::string skipped = skipReason(bag, query);
    if (options.json) {
        Value described = preview;
        if (!skipped.empty()) described.mutableDictionary().set("notSent", skipped);
        return printJson(described);
    }
    if (!skipped.empty()) printLine(bold("Would not be sent: " + skipped + ". Otherwise:"));
    printLine(fmt::format("{} {}", said(preview["method"]), said(preview["url"])));
    printParts("Items", preview["items"]);
    printParts("Headers", preview["headers"]);
    printLine(dim("The transport adds Host and Accept-Encoding. A search that memory can answer is not sent at all."));
}

} // namespace

void addPreviewCommand(CLI::App& app, Command& chosen)
{
    CLI::App* preview = app.add_subcommand("preview", "Show what would leave the device, without sending it");
    preview->footer(
        "Each item of a search comes from: the bag's URL, the user (the request), the client, the device, the\n"
        "settings, or by default (the same in all searches).");
    preview->require_subcommand(1);
    CLI::App* uploads = preview->add_subcommand("uploads", "What the next uploads of feedback would carry");
    auto directory = std::make_shared<std::string>();
    uploads->add_option("-o,--output", *directory, "Directory to save each body to, as it would be sent")
        ->type_name("DIRECTORY");
    uploads->callback([&chosen, directory] {
        chosen = paged([directory](const Options& options) { previewUploads(options, *directory); });
    });
    CLI::App* search = preview->add_subcommand("search", "Every item and header of a search, and where it comes from");
    auto query = std::make_shared<std::string>();
    auto items = std::make_shared<std::vector<std::string>>();
    search->add_option("query", *query, "What the user would type")->required();
    addItemOption(*search, *items);
    search->callback([&chosen, query, items] {
        chosen = paged([query, items](const Options& options) { previewSearch(options, *query, *items); });
    });
}

} // namespace tavrin::ctl
