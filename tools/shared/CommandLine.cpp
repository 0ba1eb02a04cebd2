#include "tools/shared/CommandLine.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <cstring>
#include <memory>

#include <CLI/CLI.hpp>
#include <fmt/format.h>
#include <fmt/ranges.h>

namespace tavrin::tools {

namespace {

char lower(char c)
{
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

/// The number of letters that are wrong, missing, surplus, or swapped with their neighbour.
std::size_t distance(std::string_view a, std::string_view b)
{
    std::vector<std::size_t> before, last(b.size() + 1), row(b.size() + 1);
    for (std::size_t j = 0; j <= b.size(); ++j) last[j] = j;
    for (std::size_t i = 1; i <= a.size(); ++i) {
        row[0] = i;
        for (std::size_t j = 1; j <= b.size(); ++j) {
            const bool same = lower(a[i - 1]) == lower(b[j - 1]);
            row[j] = std::min({last[j] + 1, row[j - 1] + 1, last[j - 1] + (same ? 0 : 1)});
            if (i > 1 && j > 1 && lower(a[i - 1]) == lower(b[j - 2]) && lower(a[i - 2]) == lower(b[j - 1]))
                row[j] = std::min(row[j], before[j - 2] + 1);
        }
        before = std::exchange(last, row);
    }
    return last[b.size()];
}

CLI::Validator number(double low, double high, bool whole)
{
    return CLI::Validator(
        [=](const std::string& text) -> std::string {
            double value = 0;
            const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
            const bool isNumber = error == std::errc() && end == text.data() + text.size();
            if (isNumber && value >= low && value <= high && (!whole || std::trunc(value) == value)) return "";
            return fmt::format("expected a {}number from {} to {}, not \"{}\"", whole ? "whole " : "", low, high, text);
        },
        "");
}

std::vector<std::string> commandsOf(const CLI::App& app)
{
    std::vector<std::string> names;
    for (const CLI::App* command : app.get_subcommands([](const CLI::App*) { return true; }))
        names.push_back(command->get_name());
    return names;
}

/// The options that may stand after the innermost command.
std::vector<std::string> optionsOf(const CLI::App* app)
{
    std::vector<std::string> names;
    for (; app; app = app->get_parent())
        for (const CLI::Option* option : app->get_options())
            for (const std::string& name : option->get_lnames()) names.push_back("--" + name);
    return names;
}

class ReadableHelp final : public CLI::Formatter {
public:
    std::string make_subcommands(const CLI::App* app, CLI::AppFormatMode mode) const override
    {
        std::string text = Formatter::make_subcommands(app, mode);
        const CLI::App* root = app;
        while (root->get_parent()) root = root->get_parent();
        if (root == app) return text;
        const auto options = root->get_options([root](const CLI::Option* option) {
            return option->nonpositional() && option != root->get_help_ptr() && option != root->get_version_ptr();
        });
        return options.empty() ? text : text + make_group("Global options", false, options);
    }
    std::string make_option_opts(const CLI::Option* option) const override
    {
        std::string text;
        if (option->get_type_size() != 0 && !option->get_positional()) text = " " + option->get_type_name();
        if (!option->get_default_str().empty()) text += " [" + option->get_default_str() + "]";
        return text;
    }
};

const CLI::App& innermost(const CLI::App& app)
{
    const CLI::App* command = &app;
    while (!command->get_subcommands().empty()) command = command->get_subcommands().front();
    return *command;
}

} // namespace

std::string nearest(std::string_view typed, const std::vector<std::string>& candidates)
{
    std::string best;
    std::size_t least = std::max<std::size_t>(typed.size() / 4, 1) + 1;
    for (const std::string& candidate : candidates) {
        if (candidate == typed) return "";
        if (const std::size_t letters = distance(typed, candidate); letters < least) {
            least = letters;
            best = candidate;
        }
    }
    return best;
}

std::string didYouMean(std::string_view typed, const std::vector<std::string>& candidates)
{
    const std::string meant = nearest(typed, candidates);
    return meant.empty() ? "" : fmt::format("; did you mean {}?", meant);
}

void takesNumber(CLI::Option* option, const std::string& placeholder, double low, double high)
{
    option->type_name(placeholder)->check(number(low, high, false));
}

void takesWholeNumber(CLI::Option* option, const std::string& placeholder, double low, double high)
{
    option->type_name(placeholder)->check(number(low, high, true));
}

void takesName(CLI::Option* option, const std::string& placeholder, std::vector<std::pair<std::string, int>> names)
{
    option->type_name(placeholder)
        ->transform(CLI::Validator(
            [names = std::move(names)](std::string& text) -> std::string {
                std::string all;
                for (const auto& [name, value] : names) {
                    if (text == name || text == std::to_string(value)) {
                        text = std::to_string(value);
                        return "";
                    }
                    all += (all.empty() ? "" : ", ") + name;
                }
                return fmt::format("expected one of {}, not \"{}\"", all, text);
            },
            ""));
}

void addConnectionOptions(CLI::App& app, std::string& address, std::string& identifier)
{
    app.add_option("--address", address, "The daemon's D-Bus address")->type_name("ADDRESS")->capture_default_str();
    app.add_option("--identifier", identifier, "Client identifier to connect as")
        ->type_name("NAME")
        ->capture_default_str();
}

void useReadableHelp(CLI::App& app)
{
    const auto help = std::make_shared<ReadableHelp>();
    help->column_width(34);
    app.formatter(help);
}

std::string complaint(const CLI::App& app, const CLI::ParseError& error)
{
    const CLI::App& command = innermost(app);
    const std::vector<std::string> left = app.remaining(true);
    const bool unknown = dynamic_cast<const CLI::ExtrasError*>(&error);
    if (!left.empty() && left.front().starts_with("-") && unknown) {
        const std::string& option = left.front();
        return fmt::format("unknown option {}{}", option,
                           didYouMean(option.substr(0, option.find('=')), optionsOf(&command)));
    }
    const std::vector<std::string> commands = commandsOf(command);
    if (!left.empty() && !commands.empty())
        return fmt::format("unknown command {}{}", left.front(), didYouMean(left.front(), commands));
    if (!left.empty() && unknown) return fmt::format("unexpected argument {}", left.front());
    if (!commands.empty() && dynamic_cast<const CLI::RequiredError*>(&error))
        return fmt::format("{} needs a command: {}", command.get_name(), fmt::join(commands, ", "));
    return error.what();
}

int endOfParsing(const CLI::App& app, const CLI::ParseError& error, const std::string& program)
{
    std::string text;
    if (dynamic_cast<const CLI::CallForHelp*>(&error))
        text = app.help();
    else if (dynamic_cast<const CLI::CallForVersion*>(&error))
        text = std::string(error.what()) + "\n";
    std::string problem;
    if (!text.empty()) {
        problem = writeTo(stdout, text);
        if (problem.empty()) return 0;
        fmt::print(stderr, "{}: {}\n", program, problem);
        return kFailed;
    }
    const CLI::App& command = innermost(app);
    const bool named = &command != &app;
    fmt::print(stderr, "{}: {}\nSee \"{}{}{} --help\".\n", program, complaint(app, error), program, named ? " " : "",
               named ? command.get_name() : "");
    return kWrongUsage;
}

std::filesystem::path resolved(const std::string& path)
{
    std::error_code ignored;
    const auto found = std::filesystem::canonical(path, ignored);
    return found.empty() ? std::filesystem::absolute(path) : found;
}

std::size_t controlLength(std::string_view text)
{
    const auto byte = [&](std::size_t i) { return i < text.size() ? static_cast<unsigned char>(text[i]) : 0xff; };
    if (byte(0) < 0x20 || byte(0) == 0x7f) return 1;
    return byte(0) == 0xc2 && byte(1) >= 0x80 && byte(1) < 0xa0 ? 2 : 0; // those beyond ASCII, in UTF-8
}

std::string printable(std::string_view text)
{
    std::string clean;
    clean.reserve(text.size());
    while (!text.empty()) {
        const std::size_t control = controlLength(text);
        clean += control > 0 ? ' ' : text.front();
        text.remove_prefix(std::max<std::size_t>(control, 1));
    }
    return clean;
}

std::string printableJson(std::string_view json)
{
    std::string clean;
    clean.reserve(json.size());
    while (!json.empty()) {
        const std::size_t control = json.front() == '\n' ? 0 : controlLength(json);
        if (control > 0)
            clean += fmt::format("\\u{:04x}", static_cast<unsigned char>(json[control - 1]));
        else
            clean += json.front();
        json.remove_prefix(std::max<std::size_t>(control, 1));
    }
    return clean;
}

std::string writeTo(std::FILE* stream, std::string_view text)
{
    errno = 0;
    const bool written = std::fwrite(text.data(), 1, text.size(), stream) == text.size() && std::fflush(stream) == 0;
    return written ? "" : fmt::format("can't write the output: {}", std::strerror(errno));
}

} // namespace tavrin::tools
