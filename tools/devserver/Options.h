#pragma once

#include <filesystem>
#include <string>

namespace devserver {

struct Options {
    std::string address = "127.0.0.1";
    int httpPort = 8080;
    int httpsPort = 8443;
    std::filesystem::path certificateDirectory; ///< absolute
    std::filesystem::path readyFile;            ///< empty if not wanted
    bool quiet = false;
    bool verbose = false;
};

/// Parses the command line. Ends the process for --help and for invalid options.
[[nodiscard]] Options parseOptions(int argc, char** argv);

} // namespace devserver
