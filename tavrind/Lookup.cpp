#include "tavrind/Lookup.h"

#include <algorithm>
#include <iterator>
#include <map>
#include <string_view>
#include <unordered_set>
#include <utility>
#include <vector>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVRequest.h"
#include "platform/device/DataDetectorStore.h"
#include "platform/device/Device.h"
#include "platform/files/UserDefaults.h"
#include "platform/text/Text.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tavrind/Assembly.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using platform::Dictionary;
using platform::FileHandle;
using platform::Private;
using platform::Value;

namespace {

std::string identifierOf(Lookup::SourceKind kind)
{
    return std::string(kind == Lookup::Monthly ? kTAVLookupHintsMonthly : kTAVLookupHintsWeekly);
}

std::string versionIn(const Dictionary& versions, const std::string& identifier)
{
    const Value* version = versions.find(identifier);
    return version && version->asString() ? *version->asString() : std::string();
}

float numberIn(const Value& value)
{
    return static_cast<float>(value.asDouble().value_or(0));
}

/// Sums the weights of the keywords that the context contains. Every word counts once, with its last weight.
float keywordScore(const Value& keywords, const platform::LocalizedSearch& context)
{
    std::map<std::string_view, float> weights;
    if (const Value::Array* array = keywords.asArray())
        for (const Value& keyword : *array)
            if (const std::string* word = keyword["word"].asString()) weights[*word] = numberIn(keyword["weight"]);
    float score = 0;
    for (const auto& [word, weight] : weights)
        if (context.contains(word)) score += weight;
    return score;
}

using Words = std::unordered_set<std::string>;

Words wordsIn(std::string_view text, platform::WordFinder& finder)
{
    std::vector<std::string> words = finder.wordsIn(text);
    return {std::move_iterator(words.begin()), std::move_iterator(words.end())};
}

float jaccardIndex(const Words& a, const Words& b)
{
    const auto shared =
        static_cast<std::size_t>(std::ranges::count_if(b, [&](const std::string& word) { return a.contains(word); }));
    const std::size_t all = a.size() + b.size() - shared;
    return all == 0 ? 0 : static_cast<float>(shared) / static_cast<float>(all);
}

/// The text around the looked-up word. Decides which results fit it.
class LookupContext {
public:
    LookupContext(std::string_view text, const std::string& locale)
        : _search(text, locale), _finder(locale), _words(wordsIn(text, _finder))
    {}

    [[nodiscard]] bool keeps(const Value& instructions)
    {
        const float score = keywordScore(instructions["keywords"], _search);
        const float minimum = numberIn(instructions["min_keywords_score"]);
        const std::string* completion = instructions["completion"].asString();
        const bool completes = !completion || completion->empty() || _search.contains(*completion);
        if (score < minimum || !completes) {
            log(kLogLookUp)
                .debug("dropping lookup result. keyword score: {:f} min keyword score: {:f} completion exists: {:d}",
                       score, minimum, completes);
            return false;
        }
        const float subjectMinimum = numberIn(instructions["min_subject_score"]);
        if (subjectMinimum == 0) return true;
        const std::string* subject = instructions["subject"].asString();
        const float index = !subject || subject->empty() ? 0 : jaccardIndex(_words, wordsIn(*subject, _finder));
        if (subjectMinimum > index) {
            log(kLogLookUp)
                .debug("dropping lookup result. jaccard index: {:f} min subject score: {:f}", index, subjectMinimum);
            return false;
        }
        return true;
    }

private:
    platform::LocalizedSearch _search;
    platform::WordFinder _finder;
    const Words _words;
};

} // namespace

void Lookup::filterLookupResultsWithRequest(const TAVLookupRequest& request, Value& response, const std::string& locale)
{
    if (!response.asArray())
        return log(kLogLookUp)
            .error("lookup response is not an array. who knows what this is: {}", Private{platform::toJson(response)});
    if (response.count() == 0)
        return log(kLogLookUp)
            .error("no data to process for lookup response. request: {} response: {}", Private{request.queryString},
                   Private{platform::toJson(response)});
    LookupContext context(request.queryContext.value_or(""), locale);
    for (Value& resultSet : response.mutableArray()) {
        if (!resultSet.asDictionary()) continue;
        Value::Array kept;
        if (const Value::Array* results = resultSet["results"].asArray()) {
            kept.reserve(results->size());
            std::ranges::copy_if(*results, std::back_inserter(kept), [&](const Value& result) {
                const Value& instructions = result["lookup_instructions"];
                return !instructions.asDictionary() || context.keeps(instructions);
            });
        }
        resultSet.mutableDictionary().set("results", std::move(kept));
    }
}

std::shared_ptr<Lookup> Lookup::make(Assembly& assembly)
{
    auto lookup = std::make_shared<Lookup>(assembly);
    const std::weak_ptr weak = lookup;
    const auto handleFile = [weak](const platform::Notification& notification) {
        if (const auto self = weak.lock()) self->_handleHintsFile(notification);
    };
    platform::NotificationCenter& notifications = assembly.notificationCenter;
    lookup->_observers[0] = notifications.observe(TAVFileDownloadCompletedNotification, handleFile);
    lookup->_observers[1] = notifications.observe(TAVFileDeletedNotification, handleFile);
    lookup->_observers[2] = notifications.observe("TAVStartup", [weak](const platform::Notification&) {
        if (const auto self = weak.lock()) self->_reprocessHintsFiles();
    });
    assembly.downloadManager->setLookupResources(lookup);
    return lookup;
}

Lookup::Lookup(Assembly& assembly)
    : _assembly(assembly), _queue(assembly.device.serialQueue("com.quorvane.tavrin.Lookup", rank::kManager))
{}

bool Lookup::lookupEnabled() const
{
    return !_assembly.device.lookupDefaults.boolean("LookupSuggestionsDisabled");
}

void Lookup::_drainQueue()
{
    _queue->sync([] {});
}

void Lookup::_handleHintsFile(const platform::Notification& notification)
{
    const auto identifier = notification.get<std::string>("identifier");
    for (const SourceKind kind : {Monthly, Weekly}) {
        if (identifier != identifierOf(kind)) continue;
        const auto location = notification.get<std::filesystem::path>("url");
        _handleHintsFile(location.empty() ? std::nullopt : std::optional(location), kind);
    }
}

void Lookup::_handleHintsFile(const std::optional<std::filesystem::path>& location, SourceKind kind)
{
    log(kLogLookUp)
        .debug("processing lookup hints for location: {} sourceKind: {}", location ? location->string() : "none",
               static_cast<int>(kind));
    std::shared_ptr<FileHandle> file;
    if (location) {
        auto opened = _assembly.fileManager.openForReading(*location);
        if (opened)
            file = std::make_shared<FileHandle>(std::move(*opened));
        else
            log(kLogLookUp)
                .error("error trying to open hints file: {} at location: {}", opened.error().description(),
                       location->string());
    }
    _queue->async([weak = weak_from_this(), file, kind] {
        const auto self = weak.lock();
        if (!self) return;
        const Dictionary versions = self->_assembly.downloadManager->resourceVersions();
        self->_pushDDSourceFile(file.get(), kind, versionIn(versions, identifierOf(kind)));
    });
}

void Lookup::_reprocessHintsFiles()
{
    log(kLogLookUp).debug("reprocessing lookup hints files");
    _queue->async([weak = weak_from_this()] {
        const auto self = weak.lock();
        if (!self) return;
        const Dictionary versions = self->_assembly.downloadManager->resourceVersions();
        for (const SourceKind kind : {Monthly, Weekly}) self->_reprocessHintsFile(kind, versions);
    });
}

void Lookup::_reprocessHintsFile(SourceKind kind, const Dictionary& versions)
{
    _queue->assertOnQueue();
    const std::string identifier = identifierOf(kind);
    const std::string version = versionIn(versions, identifier);
    const auto signature = _assembly.device.dataDetectors.clientSignature(kind);
    if (signature && *signature == version) return;
    log(kLogLookUp)
        .info("signature ({}) does not match version ({}), DD for kind: {} requires reprocessing",
              signature.value_or(""), version, static_cast<int>(kind));
    const auto resource = _assembly.downloadManager->fileHandleForResource(identifier);
    if (!resource)
        return log(kLogLookUp)
            .info("reprocess file doesn't exist or there was an error. file: none error: {}",
                  resource.error().description());
    _pushDDSourceFile(&resource->file, kind, version);
}

void Lookup::_pushDDSourceFile(const FileHandle* file, SourceKind kind, const std::string& version)
{
    _queue->assertOnQueue();
    const auto pushed = _assembly.device.dataDetectors.setSource(kind, file, version);
    if (pushed) return;
    log(kLogLookUp).error("failed to push data to data detectors");
    log(kLogLookUp).error("data detectors: {}", pushed.error().description());
}

} // namespace tavrin
