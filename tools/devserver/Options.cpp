#include "tools/devserver/Options.h"

#include <cstdlib>

#include <CLI/CLI.hpp>

#include "platform/files/Files.h"
#include "tools/shared/CommandLine.h"

namespace devserver {

Options parseOptions(int argc, char** argv)
{
    Options options;
    options.certificateDirectory = platform::Directories::fromEnvironment().state / "tavrin-devserver";
    CLI::App app("A search service for development. It serves a built-in catalogue over HTTP and HTTPS, fails on "
                 "demand (POST /control/faults), and prints its addresses as one line of JSON once it listens.");
    app.set_version_flag("--version", "tavrin-devserver " TAVRIND_VERSION);
    tavrin::tools::useReadableHelp(app);
    std::string directory = options.certificateDirectory;
    std::string readyFile;
    app.add_option("--address", options.address, "Address to listen on")->type_name("ADDRESS")->capture_default_str();
    const auto addPort = [&app](const char* name, int& port) {
        tavrin::tools::takesWholeNumber(app.add_option(name, port, "0 is any free port")->capture_default_str(), "PORT",
                                        0, 65535);
    };
    addPort("--http-port", options.httpPort);
    addPort("--https-port", options.httpsPort);
    app.add_option("--cert-dir", directory, "Directory of the certificate, which is created if it is missing")
        ->type_name("DIRECTORY")
        ->capture_default_str();
    app.add_option("--ready-file", readyFile, "File to write the line of JSON to as well")->type_name("FILE");
    CLI::Option* quiet = app.add_flag("-q,--quiet", options.quiet, "Print only the line of JSON, and failures");
    app.add_flag("-v,--verbose", options.verbose, "Print a line on standard error for each request")->excludes(quiet);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        std::exit(tavrin::tools::endOfParsing(app, error, "tavrin-devserver"));
    }
    options.certificateDirectory = std::filesystem::absolute(directory).lexically_normal();
    if (!readyFile.empty()) options.readyFile = std::filesystem::absolute(readyFile).lexically_normal();
    return options;
}

} // namespace devserver
