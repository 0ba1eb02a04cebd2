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

/// Installs downloaded lookup hints in the device's data-detector store.
///
/// A hints file is installed after its download and removed after its deletion. At start-up, a file is installed again
/// if the store has another version. Failures are logged; the next start-up tries again. Any thread.
class Lookup : public LookupResources, public std::enable_shared_from_this<Lookup> {
public:
    /// Kinds of source in the data-detector store.
    enum SourceKind : int { Weekly = 2, Monthly = 3 };

    /// Starts observing the hints files, and registers with the download manager. The assembly must outlive it.
    static std::shared_ptr<Lookup> make(Assembly& assembly);
    explicit Lookup(Assembly& assembly);

    /// Returns true unless the shared setting "LookupSuggestionsDisabled" is true.
    [[nodiscard]] bool lookupEnabled() const override;

    /// Filters a decoded answer, an array of result sets: removes the results whose "lookup_instructions" don't fit the
    /// text around the looked-up word. The reasons are that the keywords in the text weigh too little, that it does not
    /// contain the completion, or that it shares too few words with the subject. Keywords and completion are searched
    /// by the rules of `locale` ("de_CH"), ignoring case; words of the subject must be equal. Results without
    /// instructions stay.
    static void filterLookupResultsWithRequest(const TAVLookupRequest& request, platform::Value& response,
                                               const std::string& locale);

    /// Blocks until all queued work has run.
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
