// tavrinctl activity: the activities that applications reported. Needs no daemon.

#include <cerrno>
#include <charconv>
#include <ctime>

#include <CLI/CLI.hpp>
#include <fmt/chrono.h>
#include <fmt/format.h>

#include "platform/device/AppActivities.h"
#include "platform/files/Files.h"
#include "platform/net/UrlScheme.h"
#include "tools/tavrinctl/Commands.h"

namespace tavrin::ctl {

using platform::AppActivity;
using platform::Date;
using platform::Value;

namespace {

std::filesystem::path directory()
{
    return platform::Directories::fromEnvironment().data / "com.quorvane.tavrind" / "knowledge";
}

Date now()
{
    return std::chrono::time_point_cast<platform::Duration>(std::chrono::system_clock::now());
}

/// Parses seconds since 1970, or a date with an optional time, which is UTC if it ends with "Z".
Date dateOf(const std::string& text)
{
    constexpr std::int64_t kLatest = 9'000'000'000; // in 2255; a date can't hold much more
    const auto inRange = [](std::int64_t seconds) { return seconds >= 0 && seconds <= kLatest; };
    std::int64_t seconds = 0;
    const auto number = std::from_chars(text.data(), text.data() + text.size(), seconds);
    if (number.ec == std::errc() && number.ptr == text.data() + text.size() && inRange(seconds))
        return Date(std::chrono::seconds(seconds));
    for (const char* format :
         {"%Y-%m-%dT%H:%M:%S", "%Y-%m-%dT%H:%M", "%Y-%m-%d %H:%M:%S", "%Y-%m-%d %H:%M", "%Y-%m-%d"}) {
        std::tm time{};
        time.tm_isdst = -1; // not known
        const char* after = strptime(text.c_str(), format, &time);
        if (!after) continue;
        const std::string_view zone = after;
        const int day = time.tm_mday;
        if (zone.empty() || zone == "Z") {
            const std::time_t when = zone.empty() ? std::mktime(&time) : timegm(&time);
            if (time.tm_mday == day && inRange(when)) return Date(std::chrono::seconds(when));
        }
    }
    throw Failure(
        fmt::format("\"{}\" is not a date; write 2026-01-31T12:00, 2026-01-31T12:00:00Z or seconds since 1970", text),
        2);
}

std::string dateText(Date date)
{
    const auto seconds = std::chrono::floor<std::chrono::seconds>(date).time_since_epoch().count();
    return fmt::format("{:%F %T}", fmt::localtime(static_cast<std::time_t>(seconds)));
}

Value describe(const AppActivity& activity)
{
    const auto text = [](const std::optional<std::string>& part) { return part ? Value(*part) : Value(); };
    return Value::dictionaryOf(
        {{"start", std::chrono::floor<std::chrono::seconds>(activity.start).time_since_epoch().count()},
         {"app", activity.bundleIdentifier},
         {"identifier", text(activity.relatedUniqueIdentifier)},
         {"url", text(activity.contentUrl)},
         {"public", activity.publiclyIndexable}});
}

std::string line(const AppActivity& activity)
{
    std::string links;
    for (const auto& link : {activity.relatedUniqueIdentifier, activity.contentUrl})
        if (link) links += "  " + printable(*link);
    return fmt::format("{}  {:<10}  {:<{}}{}", dateText(activity.start),
                       activity.publiclyIndexable ? "public" : "not public", printable(activity.bundleIdentifier),
                       links.empty() ? 0 : 32, links);
}

bool isUrl(std::string_view text)
{
    const auto colon = text.find(':');
    return colon != std::string_view::npos && platform::isUrlScheme(text.substr(0, colon));
}

struct ActivityOptions {
    std::string app, url, identifier, at;
    bool isPublic = false;
};

void add(const Options& options, const ActivityOptions& mine)
{
    if (mine.app.empty())
        throw Failure("--app must not be empty: it is the application's identifier, org.example.News", 2);
    if (!mine.url.empty() && !isUrl(mine.url))
        throw Failure(fmt::format("\"{}\" is not a URL; write https://news.example/today, or news://item/42", mine.url),
                      2);
    AppActivity activity{.start = mine.at.empty() ? now() : dateOf(mine.at),
                         .bundleIdentifier = mine.app,
                         .publiclyIndexable = mine.isPublic};
    if (!mine.identifier.empty()) activity.relatedUniqueIdentifier = mine.identifier;
    if (!mine.url.empty()) activity.contentUrl = mine.url;
    const auto files = platform::makeSystemFiles();
    if (const auto added = platform::AppActivities(*files, directory()).add(activity, now()); !added)
        throw Failure(fmt::format("the activity was not added: {}", added.error().reason()));
    if (options.json) return printJson(describe(activity));
    printLine(line(activity));
    if (!mine.isPublic) printLine("The daemon never records an activity that is not public; use --public.");
}

void listActivities(const Options& options)
{
    const auto files = platform::makeSystemFiles();
    auto activities =
        platform::AppActivities(*files, directory()).queryAppActivitiesAfterDate(Date::min(), Date::max(), SIZE_MAX);
    if (!activities && activities.error().domain == platform::kPosixErrorDomain && activities.error().code == ENOENT)
        activities.emplace();
    if (!activities)
        throw Failure(fmt::format("can't read the activities in {}: {}. If the error persists, remove the database",
                                  directory().string(), activities.error().reason()));
    if (options.limit > 0 && activities->size() > options.limit)
        activities->erase(activities->begin(), activities->end() - static_cast<std::ptrdiff_t>(options.limit));
    if (options.json) {
        Value::Array all;
        for (const AppActivity& activity : *activities) all.push_back(describe(activity));
        return printJson(all);
    }
    for (const AppActivity& activity : *activities) printLine(line(activity));
    if (activities->empty()) printLine("No activities yet. \"tavrinctl activity add\" adds one.");
}

} // namespace

void addActivityCommands(CLI::App& app, Command& chosen)
{
    auto options = std::make_shared<ActivityOptions>();
    CLI::App* activity = app.add_subcommand("activity", "Activities that applications reported; needs no daemon");
    activity->require_subcommand(1);

    CLI::App* adding = activity->add_subcommand("add", "Report an activity as an application does");
    adding->add_option("--app", options->app, "The application's identifier, org.example.News")
        ->type_name("ID")
        ->required();
    adding->add_option("--url", options->url, "URL of the content")->type_name("URL");
    adding->add_option("--identifier", options->identifier, "Unique identifier of the content within the application")
        ->type_name("ID");
    adding->add_flag(
        "--public,!--not-public", options->isPublic,
        "Whether everyone may see the content; the daemon records only public activities. Default: not public");
    adding
        ->add_option(
            "--at", options->at,
            "Start of the activity: 2026-01-31T12:00 (UTC with a final \"Z\") or seconds since 1970; default: now")
        ->type_name("TIME");
    adding->footer("The daemon records activities twice a day, while the device is not in use.");
    adding->callback([&chosen, options] { chosen = [options](const Options& common) { add(common, *options); }; });

    activity->add_subcommand("list", "List the activities of the last days, the latest last; at most --limit")
        ->callback([&chosen] { chosen = paged(listActivities); });
}

} // namespace tavrin::ctl
