#include "tools/devserver/Options.h"

#include <cstdlib>

#include <CLI/CLI.hpp>

#include "platform/files/Files.h"

namespace devserver {

Options parseOptions(int argc, char** argv)
{
    Options options;
    options.certificateDirectory = platform::Directories::fromEnvironment().state / "tavrin-devserver";
    CLI::App app(
        "A search service to develop against. It answers over HTTP and HTTPS from a catalogue of its own, fails on "
        "demand (POST /control/faults), and prints its addresses as one line of JSON when it listens.");
    std::string directory = options.certificateDirectory;
    std::string readyFile;
    app.add_option("--address", options.address, "Address to listen on")->capture_default_str();
    app.add_option("--http-port", options.httpPort, "0 is any free port")
        ->check(CLI::Range(0, 65535))
        ->capture_default_str();
    app.add_option("--https-port", options.httpsPort, "0 is any free port")
        ->check(CLI::Range(0, 65535))
        ->capture_default_str();
    app.add_option("--cert-dir", directory, "Where the certificate is, or is made")->capture_default_str();
    app.add_option("--ready-file", readyFile, "A file that gets the line of JSON too");
    CLI::Option* quiet = app.add_flag("-q,--quiet", options.quiet, "Nothing but the line of JSON, and failures");
    app.add_flag("-v,--verbose", options.verbose, "A line on standard error for each request")->excludes(quiet);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        std::exit(app.exit(error));
    }
    options.certificateDirectory = std::filesystem::absolute(directory).lexically_normal();
    if (!readyFile.empty()) options.readyFile = std::filesystem::absolute(readyFile).lexically_normal();
    return options;
}

} // namespace devserver
