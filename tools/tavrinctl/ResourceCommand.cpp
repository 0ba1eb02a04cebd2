// tavrinctl resource: shows the files that the daemon downloads for its clients.

#include <ctime>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <fmt/chrono.h>
#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "platform/files/Files.h"
#include "tools/tavrinctl/Commands.h"
#include "tools/tavrinctl/Resources.h"

namespace tavrin::ctl {

using platform::Value;

namespace {

void listResources(const Options& options)
{
    const Session session = openSession(options);
    const TAVBagAnswer bag = valueOf(session.client->bag());
    Value::Array list;
    for (const std::string_view name : kTAVResourceIdentifiers) {
        const std::string identifier(name);
        const TAVResourceAnswer answer = valueOf(session.client->resource(identifier));
        if (options.json) {
            list.emplace_back(describe(identifier, answer, bag));
        } else if (answer.file) {
            const auto modified = static_cast<std::time_t>(answer.attributes["modified"].asDouble().value_or(0));
            printLine(fmt::format("{:<26} {:>9} bytes  {:%F %T}", identifier,
                                  answer.attributes["size"].asUInt().value_or(0), fmt::localtime(modified)));
        } else {
            const bool listed = bag.bag && bag.bag->resourceURL(identifier);
            printLine(fmt::format("{:<26} {}", identifier, dim(listed ? "not downloaded yet" : "not in the bag")));
        }
    }
    if (options.json) printJson(list);
}

void fetchResource(const Options& options, const std::string& identifier, const std::string& output)
{
    const Session session = openSession(options);
    const TAVResourceAnswer answer = valueOf(session.client->resource(identifier));
    if (!answer.file) throw Failure(whyNotThere(identifier, answer, valueOf(session.client->bag())));
    if (!output.empty()) {
        const auto path = std::filesystem::absolute(output).lexically_normal();
        if (const auto saved = platform::makeSystemFiles()->copy(path, answer.file); !saved)
            throw Failure(fmt::format("can't write {}: {}", path.string(), saved.error().reason()));
    }
    if (options.json)
        printJson(describe(identifier, answer, {}));
    else if (output.empty())
        copyResource(answer.file, STDOUT_FILENO, isatty(STDOUT_FILENO) == 1);
}

} // namespace

void addResourceCommand(CLI::App& app, Command& chosen)
{
    CLI::App* command =
        app.add_subcommand("resource", "Print a file that the daemon downloaded; list all without a name");
    auto identifier = std::make_shared<std::string>();
    auto output = std::make_shared<std::string>();
    auto* name = command->add_option("name", *identifier, "Key of the resource in the bag");
    command->add_option("-o,--output", *output, "File to write instead of standard output")
        ->type_name("FILE")
        ->needs(name);
    command->footer("With --json prints the file's attributes; its contents are only written to the file of -o.");
    command->callback([&chosen, identifier, output] {
        chosen = [identifier, output](const Options& options) {
            if (identifier->empty()) return listResources(options);
            fetchResource(options, *identifier, *output);
        };
    });
}

} // namespace tavrin::ctl
