// tavrinctl images: saves the images of an answer as files.

#include <chrono>
#include <set>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "CoreTavrin/ResponseImages.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "platform/files/Files.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/shared/CommandLine.h"
#include "tools/tavrinctl/Commands.h"
#include "tools/tavrinctl/ImageFiles.h"
#include "tools/tavrinctl/RequestRunner.h"

namespace tavrin::ctl {

using platform::Dictionary;
using platform::Value;

namespace {

struct ImagesOptions {
    std::string query;
    std::vector<std::string> urls;
    std::vector<std::string> identifiers;
    std::string directory = ".";
    double within = 10; ///< seconds
};

/// Returns the images of the answer to the query, then those given by URL and identifier, without duplicates.
Value::Array wanted(const Options& options, const ImagesOptions& imagesOptions)
{
    Value::Array images;
    if (!imagesOptions.query.empty()) {
        RequestRunner runner(options);
        const Exchange exchange = runner.run(
            *TAVSearchRequest::searchRequestWithString(imagesOptions.query, StartSearchTrigger::NewCharacter),
            imagesOptions.query);
        if (exchange.outcome() != Outcome::Answered)
            throw Failure("the search for the images failed: " + summary(exchange));
        if (const auto& text = exchange.answer->reply->rawResponse)
            if (const auto document = platform::JsonDocument::parse(text->view()))
                images = collectResponseImageIdentifiers(document->root());
        if (images.empty())
            throw Failure(fmt::format("the answer to \"{}\" has no images: try another query, or use --url or --id",
                                      imagesOptions.query));
    }
    for (const std::string& url : imagesOptions.urls) {
        if (!platform::Url::parse(url)) throw Failure(fmt::format("\"{}\" is not a valid URL", url), 2);
        images.push_back(Dictionary{{"url", url}});
    }
    for (const std::string& identifier : imagesOptions.identifiers) images.push_back(Dictionary{{"id", identifier}});

    Value::Array once;
    std::set<std::string> seen;
    for (Value& image : images)
        if (seen.insert(platform::toJson(image)).second) once.push_back(std::move(image));
    return once;
}

std::string textOf(const Value& value)
{
    const std::string* text = value.asString();
    return text ? *text : "";
}

/// Returns the image's URL, or its identifier if it has no URL.
std::string nameOf(const Value& image)
{
    return image["url"].isNull() ? textOf(image["id"]) : textOf(image["url"]);
}

/// Creates the directory if it is missing. Throws `Failure` if that fails.
std::filesystem::path directoryAt(platform::FileSystem& files, const std::string& path)
{
    std::error_code ignored;
    const auto found = std::filesystem::canonical(path, ignored); // follows links
    auto directory = found.empty() ? std::filesystem::absolute(path).lexically_normal() : found;
    if (const auto made = files.createDirectories(directory); !made)
        throw Failure(fmt::format("can't create the directory {}: choose another with -o", made.error().reason()));
    return directory;
}

void loadImages(const Options& options, const ImagesOptions& imagesOptions)
{
    const auto files = platform::makeSystemFiles();
    const Value::Array images = wanted(options, imagesOptions);
    const std::filesystem::path directory = directoryAt(*files, imagesOptions.directory);

    const Session session = openSession(options);
    const auto endpoint = valueOf(TAVEndpointClient::connect(session.endpoint));
    endpoint->setTimeout(platform::durationFromSeconds(options.timeout));
    const auto begin = std::chrono::steady_clock::now();
    const auto loaded = valueOf(endpoint->loadImages(images, platform::durationFromSeconds(imagesOptions.within)));
    const std::chrono::duration<double, std::milli> latency = std::chrono::steady_clock::now() - begin;

    std::set<std::filesystem::path> saved;
    Value::Array described;
    std::size_t bytes = 0;
    for (const Value& image : images) {
        Dictionary description = *image.asDictionary();
        auto found = loaded.find(textOf(image["url"]));
        if (found == loaded.end()) found = loaded.find(textOf(image["id"]));
        if (found == loaded.end()) {
            description.set("missing", true);
            if (!options.json) printLine(fmt::format("{:>9}  {}", "missing", printable(nameOf(image))));
        } else {
            const std::string_view type = imageType(found->second.view());
            const auto path = saveImage(*files, directory, imageFileName(found->first, type), found->second, saved);
            bytes += found->second.size();
            description.set("file", path.string());
            description.set("bytes", found->second.size());
            description.set("type", type.empty() ? "unknown" : type);
            if (!options.json)
                printLine(fmt::format("{:>9}  {}{}", found->second.size(), path.filename().string(),
                                      type.empty() || type == "html" ? dim(" not a known image format") : ""));
        }
        described.emplace_back(std::move(description));
    }
    if (options.json)
        printJson(Dictionary{{"images", std::move(described)},
                             {"directory", directory.string()},
                             {"loaded", saved.size()},
                             {"missing", images.size() - saved.size()},
                             {"bytes", bytes},
                             {"latency_ms", latency.count()}});
    else if (!saved.empty())
        printLine(dim(fmt::format("{} of {} images, {} bytes, in {}, within {:.1f} ms", saved.size(), images.size(),
                                  bytes, printable(directory.string()), latency.count())));
    if (saved.empty())
        throw Failure(
            fmt::format("none of {} images arrived within {:g} s. The daemon's log shows why (tavrind --log-level "
                        "info); wait longer with --within",
                        images.size(), imagesOptions.within));
}

} // namespace

void addImagesCommand(CLI::App& app, Command& chosen)
{
    auto options = std::make_shared<ImagesOptions>();
    CLI::App* command = app.add_subcommand("images", "Save the images of an answer");
    command->add_option("query", options->query, "What to search for");
    command->add_option("--url", options->urls, "URL of an image; may be repeated")
        ->type_name("URL")
        ->allow_extra_args(false);
    command
        ->add_option("--id", options->identifiers,
                     "Identifier of an image, which the bag maps to a URL; may be repeated")
        ->type_name("ID")
        ->allow_extra_args(false);
    command->add_option("-o,--output", options->directory, "Directory to save to; existing files are never overwritten")
        ->type_name("DIRECTORY")
        ->capture_default_str();
    tools::takesNumber(command->add_option("--within", options->within, "How long to wait for the images, in seconds")
                           ->capture_default_str(),
                       "SECONDS", 0, 60);
    command->callback([options, &chosen] {
        if (options->query.empty() && options->urls.empty() && options->identifiers.empty())
            throw CLI::ValidationError("give a query, --url or --id");
        chosen = [options](const Options& common) { loadImages(common, *options); };
    });
}

} // namespace tavrin::ctl
