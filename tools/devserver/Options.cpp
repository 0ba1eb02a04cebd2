#include "tools/devserver/Options.h"

#include <cstdlib>

#include <CLI/CLI.hpp>

#include "platform/files/Files.h"

namespace devserver {

Options parseOptions(int argc, char** argv)
{
    Options options;
    options.certificateDirectory = platform::Directories::fromEnvironment().state / "tavrin-devserver";
    CLI::App app("A search service for development. It serves a built-in catalogue over HTTP and HTTPS, fails on "
                 "demand (POST /control/faults), and prints its addresses as one line of JSON once it listens.");
    app.set_version_flag("--version", "tavrin-devserver " TAVRIND_VERSION);
    std::string directory = options.certificateDirectory;
    std::string readyFile;
    app.add_option("--address", options.address, "Address to listen on")->capture_default_str();
    app.add_option("--http-port", options.httpPort, "0 is any free port")
        ->check(CLI::Range(0, 65535))
        ->capture_default_str();
    app.add_option("--https-port", options.httpsPort, "0 is any free port")
        ->check(CLI::Range(0, 65535))
        ->capture_default_str();
    app.add_option("--cert-dir", directory, "Directory of the certificate, which is created if it is missing")
        ->capture_default_str();
    app.add_option("--ready-file", readyFile, "File to write the line of JSON to as well");
    CLI::Option* quiet = app.add_flag("-q,--quiet", options.quiet, "Print only the line of JSON, and failures");
    app.add_flag("-v,--verbose", options.verbose, "Print a line on standard error for each request")->excludes(quiet);
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
