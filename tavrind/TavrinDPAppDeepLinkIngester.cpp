#include "tavrind/TavrinDPAppDeepLinkIngester.h"

#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "platform/device/AppActivities.h"
#include "platform/device/Device.h"
#include "platform/privacy/PrivacyRecorder.h"
#include "platform/run/Clock.h"
#include "platform/run/Transactions.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"
#include "tavrind/Assembly.h"
#include "tavrind/DownloadManager.h"
#include "tavrind/mmap_file.h"
#include "tavrind/TavrinDPPeriodicTask.h"
#include "tavrind/TavrinDPPeriodicTaskManager.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using namespace std::chrono_literals;

namespace {

constexpr std::chrono::seconds kPeriod = 12h;
constexpr std::chrono::seconds kReach = 24h;
constexpr std::size_t kMaximumEvents = 100;
constexpr std::size_t kMaximumListSize = 32u << 20;

/// Reads a resource that holds a list of texts under `key`; `name` is for the log. Returns an empty list if it can't be
/// read.
DeepLinks::List fetchList(const DownloadManager& downloads, std::string_view resource, std::string_view key,
                          std::string_view name)
{
    log(kLogGeneral).debug("fetch crowdsourcing {}", name);
    const auto file = downloads.fileHandleForResource(std::string(resource));
    if (!file) {
        log(kLogGeneral).error("error reading crowdsourcing {} {}", name, file.error().description());
        return {};
    }
    const auto contents = mmapFileHandle(file->file);
    if (!contents) {
        log(kLogGeneral).error("mmap failed {}", contents.error().description());
        return {};
    }
    const auto document = platform::parseJson(contents->view(), kMaximumListSize);
    const platform::Value::Array* texts = document ? (*document)[key].asArray() : nullptr;
    if (!texts) {
        log(kLogGeneral)
            .error("failed to fetch the {} from the stream {}", name,
                   document ? fmt::format("no array \"{}\"", key) : document.error().description());
        return {};
    }
    DeepLinks::List list;
    for (const platform::Value& text : *texts)
        if (text.asString()) list.insert(*text.asString());
    return list;
}

} // namespace

void TavrinDPAppDeepLinkIngester::scheduleMaintenance()
{
    scheduleMaintenanceWithName("com.quorvane.Tavrin.DeepLinkIngest");
}

void TavrinDPAppDeepLinkIngester::scheduleMaintenanceWithName(std::string name)
{
    const auto handler = [weak = weak_from_this(), name] {
        const auto self = weak.lock();
        if (!self) return;
        const auto transaction = self->_assembly.device.transactions.begin(name);
        const platform::Date now = self->_assembly.device.clock.wallNow();
        self->ingestStartingOn(now - kReach, now);
    };
    _assembly.periodicTaskManager->registerTask(
        TavrinDPPeriodicTask::taskWithName(_assembly, std::move(name), kPeriod.count(), handler));
}

void TavrinDPAppDeepLinkIngester::ingestStartingOn(platform::Date start, platform::Date end)
{
    const platform::Device& device = _assembly.device;
    const auto events = platform::AppActivities(device.files, device.directories.data / knowledgeDirectoryPath)
                            .queryAppActivitiesAfterDate(start, end, kMaximumEvents);
    if (!events) log(kLogGeneral).log("no app activities: {}", events.error().description());
    const auto entries = events ? DeepLinks::deepLinksFor(*events) : std::vector<DeepLinkEntry>();
    _assembly.diagnosticData.addValue(static_cast<std::int64_t>(entries.size()),
                                      "com.quorvane.tavrind.dp.eligiblelinks");

    const auto blacklist = _fetchCrowdsourcingBlacklist();
    const auto whitelist = _fetchCrowdsourcingWhitelist();
    const FilteredDeepLinks filtered = DeepLinks::_normalizeAndFilterDeepLinks(entries, blacklist, whitelist);
    _count(filtered);
    _record(filtered.submission);
}

DeepLinks::List TavrinDPAppDeepLinkIngester::_fetchCrowdsourcingWhitelist() const
{
    return fetchList(*_assembly.downloadManager, kTAVCrowdsourcingWhitelist, "static_apps_whitelist", "whitelist");
}

DeepLinks::List TavrinDPAppDeepLinkIngester::_fetchCrowdsourcingBlacklist() const
{
    return fetchList(*_assembly.downloadManager, kTAVCrowdsourcingBlacklist, "static_deeplinks_blacklist", "blacklist");
}

void TavrinDPAppDeepLinkIngester::_count(const FilteredDeepLinks& filtered)
{
    TavrinDiagnosticDataReporter& counters = _assembly.diagnosticData;
    counters.addValue(filtered.whitelistedButDenied, "com.quorvane.tavrind.dp.normalizedlink.whitelisted.blacklisted");
    counters.addValue(filtered.notWhitelistedButDenied,
                      "com.quorvane.tavrind.dp.normalizedlink.notwhitelisted.blacklisted");
    counters.addValue(filtered.urls + filtered.bundleIdentifiers, "com.quorvane.tavrind.dp.normalizedlink");
    counters.addValue(filtered.bundleIdentifiers, "com.quorvane.tavrind.dp.normalizedlink.bundleids");
    counters.addValue(filtered.urls, "com.quorvane.tavrind.dp.normalizedlink.urls");
}

void TavrinDPAppDeepLinkIngester::_record(const DeepLinkSubmission& submission)
{
    TavrinDiagnosticDataReporter& counters = _assembly.diagnosticData;
    const platform::Device& device = _assembly.device;
    platform::PrivacyRecorder recorder(device.files, device.clock, device.directories.state / kRecorderDirectory);
    std::int64_t sent = 0;
    for (const std::string& identifier : DeepLinks::recordingOrder(submission, _random)) {
        const std::set<std::string>& links = submission.at(identifier);
        const auto recorded = recorder.record(fmt::format("{}.{}", appDeepLinkKey, identifier), links);
        if (!recorded) {
            log(kLogGeneral).log("deep links not recorded: {}", recorded.error().description());
            counters.addValue(1, "com.quorvane.tavrind.dp.record.app.failure");
            break;
        }
        const auto count = static_cast<std::int64_t>(*recorded); // fewer than all if the budget is spent
        counters.addValue(count, "com.quorvane.tavrind.dp.sentlinks.app");
        counters.addValue(1, "com.quorvane.tavrind.dp.record.app.success");
        sent += count;
    }
    counters.addValue(sent, "com.quorvane.tavrind.dp.sentlinks");
    counters.addValue(1, "com.quorvane.tavrind.dp.record");
}

} // namespace tavrin
