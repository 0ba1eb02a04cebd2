#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/values/Value.h"

/// What "tavrinctl doctor" finds. Pure functions: DoctorCommand.cpp takes the snapshot.
namespace tavrin::ctl {

/// Everything that the doctor looks at.
struct Snapshot {
    /// A directory that the daemon uses, or one above it.
    struct Directory {
        std::string name; ///< "caches"
        std::string path;
        std::string problem; ///< why it can't be used; empty if it can
        unsigned mode = 0700;
        std::optional<std::uint64_t> freeBytes; ///< of its file system
        bool mustBePrivate = true;
    };
    struct File {
        std::string path;
        std::string problem;  ///< why it can't be read; empty if it can, or if it is missing
        bool isUsers = false; ///< not the daemon's own: it doesn't replace the file
    };
    struct SessionFile {
        std::string name;
        double age = 0; ///< seconds since its last event
        std::uint64_t bytes = 0;
    };
    struct Host {
        std::string name;
        std::string problem; ///< why it can't be resolved; empty if it can
    };

    double now = 0; ///< seconds since 1970
    std::string toolVersion;
    std::string address;
    std::string connectProblem; ///< why no daemon answered; empty if one did
    platform::Value status;     ///< the daemon's; null without a daemon, like the next one
    platform::Value waiting;
    std::vector<std::string> bagProblems;
    std::vector<std::string> unknownSettings;
    std::vector<std::string> profileProblems; ///< of device.json
    std::vector<Host> hosts;                  ///< of the bag and of its URLs
    File authorities;                         ///< certification authorities
    std::vector<Directory> directories;
    std::vector<File> files;
    std::vector<SessionFile> sessionFiles;
};

enum class Severity { Fine, Warning, Error };

struct Finding {
    Severity severity = Severity::Fine;
    std::string topic;  ///< "bag"
    std::string text;   ///< what was found
    std::string advice; ///< what to do; empty if there is nothing to do
};

/// Returns the findings by topic, in the order in which a user should look at them. Each topic has at least one.
[[nodiscard]] std::vector<Finding> findingsIn(const Snapshot& snapshot);

/// Returns the exit status: 0, 1 for warnings, 2 for errors.
[[nodiscard]] int statusOf(const std::vector<Finding>& findings);
[[nodiscard]] platform::Value describe(const std::vector<Finding>& findings);

/// Parses the Date header of a response: seconds since 1970.
[[nodiscard]] std::optional<double> httpDate(const std::string& text);

} // namespace tavrin::ctl
