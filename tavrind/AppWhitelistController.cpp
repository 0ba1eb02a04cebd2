#include "tavrind/AppWhitelistController.h"

#include <algorithm>
#include <vector>

#include "CoreTavrin/TAVBag.h"
#include "platform/Device.h"
#include "platform/InstalledApplications.h"
#include "platform/UserDefaults.h"
#include "tavrind/Assembly.h"
#include "tavrind/DownloadManager.h"
#include "tavrind/encoder.h"
#include "tavrind/mmap_file.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using platform::Value;

namespace {

constexpr const char* kSignatureKey = "TAVAppWhitelistSignature";
constexpr std::size_t kMaximumWhitelistSize = 32u << 20;

const platform::Log& log()
{
    return TavrinLogForCategory(kLogGeneral);
}

/// The list inside the resource: "version" a text, "apps" a dictionary. Null for anything else.
Value innerList(std::string_view whitelist)
{
    const auto isText = [](const Value& value, std::string_view text) {
        return value.asString() && *value.asString() == text;
    };
    const auto outer = platform::parseJson(whitelist, kMaximumWhitelistSize);
    if (!outer) log().error("app whitelist is broken: {}", outer.error().description());
    if (!outer || !isText((*outer)["compression"], "RLE") || !isText((*outer)["encoding"], "bitmap")) return {};
    const std::string* text = (*outer)["apps"].asString();
    if (!text) return {};
    auto inner = platform::parseJson(*text, kMaximumWhitelistSize);
    if (!inner) log().error("app whitelist is broken: {}", inner.error().description());
    if (!inner || !(*inner)["version"].asString() || !(*inner)["apps"].asDictionary()) return {};
    return std::move(*inner);
}

/// The number of an application, from its entries in the list: the last counts.
std::optional<std::uint32_t> encodingId(const std::string& identifier, const Value& entries)
{
    if (entries.count() == 0 || !entries.asArray()) return std::nullopt;
    const Value& number = entries[entries.count() - 1]["encoding_id"];
    if (!number.isNumber()) return std::nullopt;
    const auto id = number.asInt();
    if (!id || *id < 0 || *id > kMaximumEncodingId) {
        log().error("encoding id {} of {} is no whole number from 0 to {}", platform::toJson(number), identifier,
                    kMaximumEncodingId);
        return std::nullopt;
    }
    return static_cast<std::uint32_t>(*id);
}

} // namespace

std::optional<std::string> processWhitelist(std::string_view whitelist, platform::InstalledApplications& installed)
{
    const Value list = innerList(whitelist);
    if (list.isNull()) return std::nullopt;
    std::vector<std::uint32_t> ids;
    for (const platform::InstalledApplication& application : installed.applications()) {
        if (application.identifier.empty() || application.version.empty()) continue;
        if (const auto id = encodingId(application.identifier, list["apps"][application.identifier]))
            ids.push_back(*id);
    }
    if (ids.empty()) return std::nullopt;
    std::ranges::sort(ids);
    const std::string bitmap = bitmapOf(ids);
    auto signature =
        makeSignature(static_cast<std::uint16_t>(bitmap.size()), rle_compress(bitmap), *list["version"].asString());
    if (!signature) log().error("app whitelist version is not hexadecimal: {}", *list["version"].asString());
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
    : _assembly(assembly), _queue(assembly.device.serialQueue("com.quorvane.tavrind.appWhitelist")),
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
    log().debug("generating app whitelist");
    const auto resource = _assembly.downloadManager->fileHandleForResource(std::string(kTAVInstalledAppWhitelist));
    if (!resource) {
        log().error("error reading app whitelist {}", resource.error().description());
        return std::nullopt;
    }
    const auto whitelist = mmapFileHandle(resource->file);
    if (!whitelist) {
        log().error("mmap failed {}", whitelist.error().description());
        return std::nullopt;
    }
    auto signature = processWhitelist(whitelist->view(), _assembly.device.applications);
    log().debug("installed app signature: {}", signature.value_or("none"));
    return signature;
}

} // namespace tavrin
