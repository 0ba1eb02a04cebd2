#include <chrono>
#include <csignal>
#include <cstdio>
#include <exception>
#include <expected>
#include <filesystem>
#include <system_error>

#include <fmt/format.h>

#include "platform/files/Files.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"
#include "tools/devserver/HttpServer.h"
#include "tools/devserver/Options.h"
#include "tools/devserver/Service.h"
#include "tools/shared/Certificate.h"
#include "tools/shared/CommandLine.h"

namespace {

using namespace devserver;

/// Returns the host for URLs that clients on this machine use.
std::string hostFor(const std::string& address)
{
    if (address == "0.0.0.0") return "127.0.0.1";
    if (address == "::") return "[::1]";
    return address.find(':') == address.npos ? address : "[" + address + "]";
}

std::string bindFailure(const std::string& address, int port, const std::string& reason, std::string_view option)
{
    if (reason == "taken")
        return fmt::format("port {} is taken: give another with {}, or 0 for any free one", port, option);
    return fmt::format("can't listen on {}, port {}: {}; see --address and {}", address, port, reason, option);
}

void printRequest(const Request& request, const Answer& answer, std::chrono::steady_clock::time_point begin)
{
    const std::chrono::duration<double, std::milli> taken = std::chrono::steady_clock::now() - begin;
    fmt::print(stderr, "{} {}{}{} {} {} bytes {:.1f} ms\n", request.method, tavrin::tools::printable(request.path),
               request.query.empty() ? "" : "?", tavrin::tools::printable(request.query), answer.status,
               answer.body.size(), taken.count());
}

void printUpload(const std::string& line)
{
    std::fputs((line + "\n").c_str(), stdout);
    std::fflush(stdout);
}

std::expected<void, std::string> run(const Options& options, const sigset_t& signals)
{
    const auto certificate = tavrin::tools::provideCertificate(options.certificateDirectory, options.address,
                                                               std::chrono::system_clock::now());
    if (!certificate) return std::unexpected(certificate.error());

    if (!options.readyFile.empty()) { // a file of an earlier run has wrong addresses
        std::error_code ignored;
        std::filesystem::remove(options.readyFile, ignored);
    }

    HttpServer http;
    HttpServer https(*certificate);
    const auto httpPort = http.bind(options.address, options.httpPort);
    if (!httpPort)
        return std::unexpected(bindFailure(options.address, options.httpPort, httpPort.error(), "--http-port"));
    const auto httpsPort = https.bind(options.address, options.httpsPort);
    if (!httpsPort)
        return std::unexpected(bindFailure(options.address, options.httpsPort, httpsPort.error(), "--https-port"));

    const std::string host = hostFor(options.address);
    const std::string base = fmt::format("https://{}:{}", host, *httpsPort);
    Service service(base);
    const auto handler = [&](const Request& request) {
        const auto begin = std::chrono::steady_clock::now();
        Answer answer = service.answer(request);
        if (options.verbose) printRequest(request, answer, begin);
        return answer;
    };
    const std::string ready =
        platform::toJson(platform::Value::dictionaryOf({{"http", fmt::format("http://{}:{}", host, *httpPort)},
                                                        {"https", base},
                                                        {"ca", certificate->certificate.string()}})) +
        "\n";
    std::expected<void, std::string> result;
    if (!options.readyFile.empty())
        if (const auto written = platform::makeSystemFiles()->writeAtomically(options.readyFile, ready); !written)
            result = std::unexpected(
                fmt::format("can't write {}: {}", options.readyFile.string(), written.error().reason()));
    if (result) {
        std::fputs(ready.c_str(), stdout);
        std::fflush(stdout);
        if (!options.quiet) {
            fmt::print(stderr,
                       "tavrin-devserver: {} entries; the bag is at {}/bag, the console at http://{}:{}/console\n"
                       "  set SSL_CERT_FILE={} so that clients trust it; see tavrin-devserver(1)\n",
                       service.catalogue.entries().size(), base, host, *httpPort, certificate->certificate.string());
            service.onUpload = printUpload;
        }
        http.start(handler); // after the line of JSON, which must be the first
        https.start(handler);
        int signal = 0;
        sigwait(&signals, &signal);
    }
    service.stop();
    http.stop();
    https.stop();
    return result;
}

} // namespace

int main(int argc, char** argv)
{
    const Options options = parseOptions(argc, argv);
    // Blocked before the first thread starts, so that only sigwait receives them.
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGINT);
    sigaddset(&signals, SIGTERM);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
    std::signal(SIGPIPE, SIG_IGN); // the reader may close the pipe after the first line
    try {
        const auto result = run(options, signals);
        if (result) return 0;
        fmt::print(stderr, "tavrin-devserver: {}\n", result.error());
    } catch (const std::exception& error) {
        fmt::print(stderr, "tavrin-devserver: {}\n", error.what());
    }
    return 1;
}
