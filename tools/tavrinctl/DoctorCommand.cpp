// tavrinctl doctor: looks at everything that search, feedback and downloads depend on, and says what to do.

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <netdb.h>
#include <set>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVSettings.h"
#include "platform/base/Log.h"
#include "platform/device/DeviceProfile.h"
#include "platform/files/Files.h"
#include "platform/files/Sqlite.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/PropertyList.h"
#include "tools/tavrinctl/Commands.h"
#include "tools/tavrinctl/Findings.h"
#include "tools/tavrinctl/Settings.h"
#include "tools/tavrinctl/StatusText.h"

namespace tavrin::ctl {

namespace fs = std::filesystem;
using platform::Dictionary;
using platform::Value;

namespace {

constexpr const char* kServiceName = "com.quorvane.tavrind";
constexpr const char* kSystemAuthorities = "/etc/ssl/certs/ca-certificates.crt";
constexpr std::size_t kLargestStore = 64u << 20; // bytes
constexpr std::int64_t kSqliteBusy = 5;

/// Returns the directories that the daemon uses; without a daemon, those that one would use in this environment.
platform::Directories directoriesOf(const Value& status)
{
    platform::Directories directories = platform::Directories::fromEnvironment();
    const auto take = [&](const char* name, fs::path& path) {
        if (const std::string* said = status["directories"][name].asString()) path = *said;
    };
    take("caches", directories.caches);
    take("config", directories.config);
    take("state", directories.state);
    take("data", directories.data);
    take("runtime", directories.runtime);
    take("temporary", directories.temporary);
    return directories;
}

/// Looks at a directory; at its nearest existing parent if it is missing, for the daemon will create it there.
Snapshot::Directory lookAt(const std::string& name, fs::path path, bool isOurs)
{
    Snapshot::Directory seen{.name = name, .path = path.string(), .problem = {}, .freeBytes = {}};
    struct stat status{};
    std::error_code ignored;
    int failed = 0;
    while ((failed = lstat(path.c_str(), &status)) != 0 && errno == ENOENT && path != "/") {
        path = path.parent_path();
        isOurs = false; // belongs to others, too
    }
    seen.mustBePrivate = isOurs;
    seen.mode = status.st_mode & 07777;
    if (failed != 0)
        seen.problem = std::strerror(errno);
    else if (!S_ISDIR(status.st_mode) && !(S_ISLNK(status.st_mode) && fs::is_directory(path, ignored)))
        seen.problem = "not a directory";
    else if (isOurs && status.st_uid != geteuid())
        seen.problem = "belongs to another user";
    else if (access(path.c_str(), W_OK | X_OK) != 0)
        seen.problem = std::strerror(errno);
    struct statvfs space{};
    if (statvfs(path.c_str(), &space) == 0)
        seen.freeBytes = static_cast<std::uint64_t>(space.f_bavail) * space.f_frsize;
    return seen;
}

/// Returns why a database can't be read. One that the daemon has locked is in use, so it is not damaged.
std::string problemOfDatabase(const fs::path& path)
{
    auto database = platform::Sqlite::open(path, platform::Sqlite::Access::ReadOnly);
    std::string verdict;
    const auto checked = database ? database->run("PRAGMA quick_check(1)", {},
                                                  [&](const platform::Sqlite::Row& row) { verdict = row.text(0); })
                                  : std::unexpected(database.error());
    if (!checked) return checked.error().code == kSqliteBusy ? "" : checked.error().reason();
    return verdict == "ok" ? "" : verdict;
}

std::string problemOfText(const fs::path& path, platform::FileSystem& files)
{
    const auto bytes = files.read(path, kLargestStore);
    if (!bytes) return bytes.error().code == ENOENT ? "" : bytes.error().reason();
    const auto value = path.extension() == ".plist" ? platform::parsePropertyList(bytes->view(), kLargestStore)
                                                    : platform::parseJson(bytes->view(), kLargestStore);
    if (!value) return value.error().reason();
    return value->asDictionary() ? "" : "not an object";
}

std::vector<Snapshot::File> lookAtFiles(const platform::Directories& directories)
{
    const auto files = platform::makeSystemFiles();
    const fs::path state = directories.state / kServiceName, caches = directories.caches / kServiceName;
    std::vector<Snapshot::File> seen;
    const auto text = [&](const fs::path& path, bool isUsers) {
        seen.push_back({path.string(), problemOfText(path, *files), isUsers});
    };
    const auto database = [&](const fs::path& path) {
        std::error_code ignored;
        if (fs::exists(path, ignored)) seen.push_back({path.string(), problemOfDatabase(path)});
    };
    text(directories.config / (std::string(kServiceName) + ".json"), true);
    text(directories.config / "com.quorvane.lookup.shared.json", true);
    text(directories.config / kServiceName / "device.json", true);
    text(caches / "bag.plist", false);
    for (const char* name : {"counters.json", "feedback-books.json", "activities.json"}) text(state / name, false);
    database(caches / "http" / "index.db");
    database(directories.data / kServiceName / "knowledge" / "app-activities.db");
    std::error_code ignored;
    for (const auto& session : fs::directory_iterator(state / "transfers", ignored))
        database(session.path() / "transfers.db");
    return seen;
}

std::vector<Snapshot::SessionFile> lookAtSessions(const platform::Directories& directories, double now)
{
    std::vector<Snapshot::SessionFile> seen;
    std::error_code ignored;
    for (const auto& file : fs::directory_iterator(directories.caches / kServiceName, ignored)) {
        const std::string name = file.path().filename().string();
        struct stat status{};
        if (!name.starts_with("session.") || lstat(file.path().c_str(), &status) != 0) continue;
        seen.push_back({name, now - static_cast<double>(status.st_mtime), static_cast<std::uint64_t>(status.st_size)});
    }
    return seen;
}

std::vector<std::string> unknownSettingsIn(const platform::Directories& directories)
{
    std::vector<std::string> notes;
    const auto bytes =
        platform::makeSystemFiles()->read(directories.config / (std::string(kServiceName) + ".json"), kLargestStore);
    const auto settings = bytes ? platform::parseJson(bytes->view()).value_or(Value()) : Value();
    if (const Dictionary* all = settings.asDictionary())
        for (const auto& [key, value] : *all)
            if (!knownSetting(key)) notes.push_back(noteOnChange(key));
    return notes;
}

std::vector<std::string> profileProblemsIn(const platform::Directories& directories)
{
    std::vector<std::string> problems;
    const auto bytes =
        platform::makeSystemFiles()->read(directories.config / kServiceName / "device.json", kLargestStore);
    // The check of the stores reports a file that can't be parsed.
    if (const auto profile = bytes ? platform::parseJson(bytes->view()).value_or(Value()) : Value(); !profile.isNull())
        (void)platform::deviceProfileFromValue(profile, problems);
    return problems;
}

Snapshot::Host resolve(const std::string& name)
{
    addrinfo* found = nullptr;
    const int result = getaddrinfo(name.c_str(), nullptr, nullptr, &found);
    if (result == 0) freeaddrinfo(found);
    return {name, result == 0 ? "" : gai_strerror(result)};
}

Snapshot::File lookAtAuthorities(const Value& status)
{
    const std::string* said = status["caFile"].asString();
    Snapshot::File file{said && !said->empty() ? *said : kSystemAuthorities, ""};
    std::error_code ignored;
    const fs::path found = fs::canonical(file.path, ignored); // follows links
    const auto bytes = platform::makeSystemFiles()->read(found.empty() ? fs::path(file.path) : found, kLargestStore);
    if (!bytes)
        file.problem = bytes.error().reason();
    else if (!bytes->view().contains("-----BEGIN"))
        file.problem = "has no certificate";
    return file;
}

Snapshot takeSnapshot(const Options& options)
{
    platform::Log::threshold = platform::LogLevel::Fault; // the findings report failures
    Snapshot snapshot;
    snapshot.now = static_cast<double>(std::time(nullptr));
    snapshot.toolVersion = TAVRIND_VERSION;
    snapshot.address = options.address;
    std::set<std::string> hosts;
    try {
        const auto client = TAVClient::connect(options.address);
        if (!client) throw Failure(client.error().reason());
        (*client)->setTimeout(platform::durationFromSeconds(options.timeout));
        // A daemon that has just started fetches its bag now: the status is read after that.
        (void)valueOf((*client)->configure({options.identifier, options.agent}));
        const auto answer = (*client)->bag();
        snapshot.status = valueOf((*client)->status());
        snapshot.waiting = valueOf((*client)->waiting());
        if (const auto url = snapshot.status["bag"]["lastFetch"]["url"].asString())
            if (const auto parsed = platform::Url::parse(*url)) hosts.insert(parsed->host());
        if (answer && answer->bag) {
            snapshot.bagProblems = bagProblems(*answer->bag);
            for (const auto& url : {answer->bag->searchURL(), answer->bag->feedbackURL(), answer->bag->warmURL()})
                if (url) hosts.insert(url->host());
        }
    } catch (const Failure& failure) {
        snapshot.connectProblem = failure.what();
        if (const auto path = snapshot.connectProblem.find(options.address + ": "); path != std::string::npos)
            snapshot.connectProblem.erase(path, options.address.size() + 2); // the finding names it
        snapshot.status = Value();
    }
    for (const std::string& host : hosts)
        if (!host.empty()) snapshot.hosts.push_back(resolve(host));

    const platform::Directories directories = directoriesOf(snapshot.status);
    for (const auto& [name, path] : {std::pair("caches", directories.caches),
                                     {"config", directories.config},
                                     {"state", directories.state},
                                     {"data", directories.data},
                                     {"runtime", directories.runtime}})
        snapshot.directories.push_back(lookAt(name, path / kServiceName, true));
    snapshot.directories.push_back(lookAt("temporary", directories.temporary, false));
    snapshot.files = lookAtFiles(directories);
    snapshot.sessionFiles = lookAtSessions(directories, snapshot.now);
    snapshot.unknownSettings = unknownSettingsIn(directories);
    snapshot.profileProblems = profileProblemsIn(directories);
    snapshot.authorities = lookAtAuthorities(snapshot.status);
    return snapshot;
}

void examine(const Options& options)
{
    const std::vector<Finding> findings = findingsIn(takeSnapshot(options));
    const int status = statusOf(findings);
    if (options.json) {
        printJson(describe(findings));
    } else {
        for (const Finding& finding : findings) {
            const char* mark = finding.severity == Severity::Fine      ? " "
                               : finding.severity == Severity::Warning ? "!"
                                                                       : "✗";
            const std::string line = fmt::format("{} {:<13} {}", mark, finding.topic, finding.text);
            printLine(finding.severity == Severity::Fine ? line : bold(line));
            if (!finding.advice.empty()) printLine(fmt::format("{:16}{}", "", finding.advice));
        }
        const auto count = [&](Severity severity, std::string_view name) {
            const auto number = std::ranges::count(findings, severity, &Finding::severity);
            return fmt::format("{} {}{}", number, name, number == 1 ? "" : "s");
        };
        printLine(status == 0
                      ? "Everything is in order."
                      : fmt::format("{}, {}.", count(Severity::Error, "error"), count(Severity::Warning, "warning")));
    }
    if (status != 0) throw Failure("", status);
}

} // namespace

void addDoctorCommand(CLI::App& app, Command& chosen)
{
    CLI::App* command = app.add_subcommand("doctor", "Look for what is wrong, and say what to do");
    command->footer("Works without a daemon, too. Exit status: 0 if all is in order, 1 for warnings, 2 for errors.");
    command->callback([&chosen] { chosen = paged(examine); });
}

} // namespace tavrin::ctl
