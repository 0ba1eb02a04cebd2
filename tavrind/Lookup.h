#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/run/NotificationCenter.h"
#include "platform/values/Dictionary.h"
#include "tavrind/DownloadManager.h"

namespace platform {
class FileHandle;
class Queue;
} // namespace platform

namespace tavrin {

struct Assembly;
struct TAVLookupRequest;

/// Keeps the lookup hints that are downloaded installed in the device's data-detector store.
///
/// A hints file is installed when it was downloaded, and taken away when it was deleted. At start-up those that the
/// store doesn't have in the version at hand are installed again. What fails is logged, and not tried again before
/// that.
///
/// Any thread.
class Lookup : public LookupResources, public std::enable_shared_from_this<Lookup> {
public:
    /// Kinds of source in the data-detector store.
    enum SourceKind : int { Weekly = 2, Monthly = 3 };

    /// Begins to follow the hints files, and tells the download manager of it.
    static std::shared_ptr<Lookup> make(Assembly& assembly);
    explicit Lookup(Assembly& assembly);

    /// True, unless the shared setting "LookupSuggestionsDisabled" is.
    [[nodiscard]] bool lookupEnabled() const override;
    /// "c-d-b" for the path /a/b/c/d or one that goes on from there. A shorter one is logged, and has none.
    [[nodiscard]] std::optional<std::string> signatureFromURL(const platform::Url& url) const override;

    /// Leaves out of a lookup's decoded answer, an array of result sets, those results whose "lookup_instructions"
    /// don't fit the text around the word: its keywords are too light, its completion doesn't occur, or too few words
    /// are also in its subject. Texts are compared as `locale` ("de_CH") does, without regard to case; the words of the
    /// subject as they stand. What isn't of that form is kept.
    static void filterLookupResultsWithRequest(const TAVLookupRequest& request, platform::Value& response,
                                               const std::string& locale);

    /// Runs what is queued, and returns then.
    void _drainQueue();

private:
    void _handleHintsFile(const platform::Notification& notification);
    void _handleHintsFile(const std::optional<std::filesystem::path>& location, SourceKind kind);
    void _reprocessHintsFiles();
    void _reprocessHintsFile(SourceKind kind, const platform::Dictionary& versions);
    void _pushDDSourceFile(const platform::FileHandle* file, SourceKind kind, const std::string& version);

    Assembly& _assembly;
    const std::shared_ptr<platform::Queue> _queue; // every push into the store runs on it
    platform::NotificationCenter::Token _observers[3];
};

} // namespace tavrin
