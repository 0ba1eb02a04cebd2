#include "CoreTavrin/TAVSettings.h"

#include <algorithm>
#include <array>

namespace tavrin {

namespace {

constexpr std::string_view kAnyText = "…";

constexpr std::array kKnownSettings{
    KnownSetting{"TAVBagURL", "string", "where the bag is fetched from", "at every fetch"},
    KnownSetting{"TAVSharedSession", "boolean", "all clients share one session", "at start"},
    KnownSetting{"TAVSessionSizeLimit", "number", "bytes of a session file", "at start"},
    KnownSetting{"TAVSessionMaxAge", "number", "seconds that a session file is kept", "at start"},
    KnownSetting{"TavrinFirstUseOfTheDay_…", "number", "a client's last day of use", "with every session", true},
    KnownSetting{"TAVPersistSessions", "boolean", "known clients survive a restart", "at start"},
    KnownSetting{"sessions", "object", "the known clients", "at start", true},
    KnownSetting{"TAVNoQueryCache", "boolean", "no answers from memory", "when a client first connects"},
    KnownSetting{"TAVNoParallax", "boolean", "no TCP Fast Open, no TLS session tickets", "at start"},
    KnownSetting{"TAVDebugParameters", "string", "name=value&… for every request", "at start"},
    KnownSetting{"TAVLogPrivateData", "boolean", "the log shows what users typed and saw", "at start"},
    KnownSetting{"TraceEnabled", "boolean", "trace points", "at start"},
    KnownSetting{"TAVAppWhitelistSignature", "string", "the signature of the installed applications", "at start", true},
    KnownSetting{"TAVDownloadDelay", "number", "seconds until a resource is downloaded; for development",
                 "at every download"},
    KnownSetting{"download_resources", "object", "the URLs of the downloaded resources", "at start", true},
    KnownSetting{"TAVHashtagImagesVisible", "boolean", "what the bag says about images of hashtags", "–", true},
};

} // namespace

std::span<const KnownSetting> knownSettings()
{
    return kKnownSettings;
}

const KnownSetting* knownSetting(std::string_view key)
{
    const auto found = std::ranges::find_if(kKnownSettings, [key](const KnownSetting& known) {
        if (!known.key.ends_with(kAnyText)) return known.key == key;
        return key.starts_with(known.key.substr(0, known.key.size() - kAnyText.size()));
    });
    return found == kKnownSettings.end() ? nullptr : &*found;
}

} // namespace tavrin
