#include "tavrind/AppWhitelistController.h"

#include <algorithm>
#include <unordered_map>
#include <vector>

#include "CoreTavrin/TAVBag.h"
#include "platform/device/Device.h"
#include "platform/device/InstalledApplications.h"
#include "platform/files/UserDefaults.h"
#include "platform/values/Json.h"
#include "tavrind/Assembly.h"
#include "tavrind/DownloadManager.h"
#include "tavrind/encoder.h"
#include "tavrind/mmap_file.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using platform::JsonDocument;
using platform::JsonView;
using platform::Value;

namespace {

constexpr const char* kSignatureKey = "TAVAppWhitelistSignature";
constexpr std::size_t kMaximumWhitelistSize = 32u << 20;

std::optional<JsonDocument> parsed(std::string_view json)
{
    auto document = JsonDocument::parse(json, kMaximumWhitelistSize);
    if (document) return std::move(*document);
    log(kLogGeneral).error("app whitelist is broken: {}", document.error().description());
    return std::nullopt;
}

/// Returns the list inside the resource: "version" is a text, "apps" a dictionary. Returns nothing for anything else.
std::optional<JsonDocument> innerList(std::string_view whitelist)
{
    const auto outer = parsed(whitelist);
    if (!outer) return std::nullopt;
    const JsonView resource = outer->root();
    const auto text = resource["apps"].asString();
    if (resource["compression"].asString() != "RLE" || resource["encoding"].asString() != "bitmap" || !text)
        return std::nullopt;
    auto inner = parsed(*text);
    if (!inner || !inner->root()["version"].asString() || !inner->root()["apps"].isDictionary()) return std::nullopt;
    return inner;
}

/// Returns the number of an application: the one in the last of its entries in the list.
std::optional<std::uint32_t> encodingId(std::string_view identifier, const Value& entries)
{
    if (entries.count() == 0 || !entries.asArray()) return std::nullopt;
    const Value& number = entries[entries.count() - 1]["encoding_id"];
    if (!number.isNumber()) return std::nullopt;
    const auto id = number.asInt();
    if (!id || *id < 0 || *id > kMaximumEncodingId) {
        log(kLogGeneral)
            .error("encoding id {} of {} is not a whole number from 0 to {}", platform::toJson(number), identifier,
                   kMaximumEncodingId);
        return std::nullopt;
    }
    return static_cast<std::uint32_t>(*id);
}

} // namespace

std::optional<std::string> processWhitelist(std::string_view whitelist, platform::InstalledApplications& installed)
{
    const auto list = innerList(whitelist);
    if (!list) return std::nullopt;
    const std::vector<platform::InstalledApplication> applications = installed.applications();
    std::unordered_map<std::string_view, std::optional<std::uint32_t>> found; // installed, and its id if listed
    found.reserve(applications.size());
    for (const platform::InstalledApplication& application : applications)
        if (!application.identifier.empty() && !application.version.empty()) found.try_emplace(application.identifier);
    list->root()["apps"].eachEntry([&](std::string_view identifier, JsonView entries) {
        const auto application = found.find(identifier);
        if (application != found.end()) application->second = encodingId(identifier, entries.value());
    });
    std::vector<std::uint32_t> ids;
    for (const auto& [identifier, id] : found)
        if (id) ids.push_back(*id);
    if (ids.empty()) return std::nullopt;
    std::ranges::sort(ids);
    const std::string bitmap = bitmapOf(ids);
    const std::string_view version = *list->root()["version"].asString();
    auto signature = makeSignature(static_cast<std::uint16_t>(bitmap.size()), rle_compress(bitmap), version);
    if (!signature) log(kLogGeneral).error("app whitelist version is not hexadecimal: {}", version);
    return signature;
}

std::shared_ptr<AppWhitelistController> AppWhitelistController::make(Assembly& assembly)
{
    auto controller = std::make_shared<AppWhitelistController>(assembly);
    assembly.device.applications.onChange([weak = std::weak_ptr(controller)] {
        if (const auto self = weak.lock()) self->_generateSoon();
    });
    if (controller->_whitelistSignature.empty()) controller->_generateSoon();
    return controller;
}

AppWhitelistController::AppWhitelistController(Assembly& assembly)
    : _assembly(assembly), _queue(assembly.device.serialQueue("com.quorvane.tavrind.appWhitelist", rank::kStore)),
      _whitelistSignature(assembly.userDefaults.string(kSignatureKey).value_or(""))
{}

std::string AppWhitelistController::whitelistSignature() const
{
    return _queue->sync([this] { return _whitelistSignature; });
}

void AppWhitelistController::_generateSoon()
{
    _assembly.device.globalQueue(platform::Priority::Background)->async([weak = weak_from_this()] {
        if (const auto self = weak.lock()) self->_generateWhitelistSignature();
    });
}

void AppWhitelistController::_generateWhitelistSignature()
{
    if (_generating.exchange(true)) return;
    const auto signature = _generate();
    _assembly.userDefaults.set(kSignatureKey, signature ? Value(*signature) : Value());
    _queue->sync([&] { _whitelistSignature = signature.value_or(""); });
    _generating = false;
}

std::optional<std::string> AppWhitelistController::_generate()
{
    log(kLogGeneral).debug("generating app whitelist");
    const auto resource = _assembly.downloadManager->fileHandleForResource(std::string(kTAVInstalledAppWhitelist));
    if (!resource) {
        log(kLogGeneral).error("error reading app whitelist {}", resource.error().description());
        return std::nullopt;
    }
    const auto whitelist = mmapFileHandle(resource->file);
    if (!whitelist) {
        log(kLogGeneral).error("mmap failed {}", whitelist.error().description());
        return std::nullopt;
    }
    auto signature = processWhitelist(whitelist->view(), _assembly.device.applications);
    log(kLogGeneral).debug("installed app signature: {}", signature.value_or("none"));
    return signature;
}

} // namespace tavrin
