#include "tools/devserver/HttpServer.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstring>
#include <sys/socket.h>
#include <thread>

#include <httplib.h>

#include "tools/devserver/Connections.h"

namespace devserver {
namespace {

constexpr std::size_t kThreads = 48; // a kept-alive connection holds one
constexpr int kBacklog = 128;
constexpr std::size_t kPaddingPiece = 1u << 16;
constexpr const char* kEncodingAsSent = "X-Devserver-Content-Encoding";

/// Has the library read the body as it was sent. The request is its own and not const, it only says so to its
/// callbacks.
void prepareBody(const httplib::Request& request)
{
    auto& headers = const_cast<httplib::Request&>(request).headers;
    // It would unpack the body by itself, and refuse raw DEFLATE.
    if (const auto found = headers.find("Content-Encoding"); found != headers.end()) {
        std::string encoding = found->second;
        headers.erase("Content-Encoding");
        headers.emplace(kEncodingAsSent, std::move(encoding));
    }
    // It would wait for the connection's end, where HTTP says that there is no body.
    if (!request.has_header("Content-Length") && !request.has_header("Transfer-Encoding"))
        headers.emplace("Content-Length", "0");
}

Request convert(const httplib::Request& from, bool secure)
{
    Request request;
    request.method = from.method;
    const std::size_t mark = from.target.find('?');
    request.path = from.target.substr(0, mark);
    if (mark != std::string::npos) request.query = from.target.substr(mark + 1);
    for (const auto& [name, value] : from.headers) {
        // The library adds the ends of the connection as headers.
        if (name.starts_with("REMOTE_") || name.starts_with("LOCAL_")) continue;
        request.headers.emplace_back(name == kEncodingAsSent ? "Content-Encoding" : name, value);
    }
    request.body = from.body;
    request.peer = from.remote_addr;
    request.secure = secure;
    request.connection = connectionBetween(from.local_port, from.remote_port);
    return request;
}

/// A body that is written piece by piece: half of it and then the connection's end, or followed by blanks.
void setStreamedBody(httplib::Response& response, Answer answer)
{
    const std::size_t length = std::max<std::size_t>({answer.body.size(), answer.paddedTo, 2});
    const std::size_t end = answer.cut ? length / 2 : length;
    auto write = [body = std::move(answer.body), end](std::size_t offset, std::size_t, httplib::DataSink& sink) {
        if (offset >= end) return false; // less than was announced: the library closes the connection
        if (offset < body.size()) return sink.write(body.data() + offset, std::min(body.size(), end) - offset);
        return sink.write(std::string(kPaddingPiece, ' ').data(), std::min(kPaddingPiece, end - offset));
    };
    response.set_content_provider(length, answer.contentType, std::move(write));
}

/// A body without an end; the connection's is all that the client gets.
void setEndlessBody(httplib::Response& response, Answer answer)
{
    const std::string type = answer.contentType;
    response.set_chunked_content_provider(type,
                                          [answer = std::move(answer)](std::size_t offset, httplib::DataSink& sink) {
                                              if (offset == 0 && !answer.body.empty())
                                                  return sink.write(answer.body.data(), answer.body.size());
                                              return answer.goesOn() && sink.write(" ", 1);
                                          });
}

void convert(Answer answer, httplib::Response& response)
{
    response.status = answer.status;
    for (const auto& [name, value] : answer.headers) response.set_header(name, value);
    if (answer.goesOn) return setEndlessBody(response, std::move(answer));
    // What is sent whole, the library packs for clients that accept it.
    const bool packed = findHeader(answer.headers, "Content-Encoding") != nullptr;
    if (packed || answer.cut || answer.paddedTo > answer.body.size())
        setStreamedBody(response, std::move(answer));
    else if (!answer.body.empty())
        response.set_content(answer.body, answer.contentType);
}

} // namespace

struct HttpServer::Implementation {
    std::unique_ptr<httplib::Server> server;
    bool secure = false;
    int listening = -1; // the library's descriptor
    int port = 0;
    std::thread thread;
    std::atomic<bool> ended = false;
};

HttpServer::HttpServer(std::optional<tavrin::tools::CertificateFiles> certificate)
    : _implementation(std::make_unique<Implementation>())
{
    Implementation& self = *_implementation;
    self.secure = certificate.has_value();
    if (certificate)
        self.server = std::make_unique<httplib::SSLServer>(certificate->certificate.c_str(), certificate->key.c_str());
    else
        self.server = std::make_unique<httplib::Server>();
    httplib::Server& server = *self.server;
    server.new_task_queue = [] { return new httplib::ThreadPool(kThreads); };
    server.set_keep_alive_max_count(100'000);
    server.set_keep_alive_timeout(60);
    server.set_read_timeout(30);
    server.set_write_timeout(30);
    server.set_payload_max_length(kMaximumBody);
    server.set_tcp_nodelay(true);
    server.set_socket_options([&self](socket_t socket) {
        // Not the library's default, with which two processes share a port.
        const int yes = 1;
        setsockopt(socket, SOL_SOCKET, SO_REUSEADDR, &yes, sizeof yes);
        self.listening = socket;
    });
}

HttpServer::~HttpServer()
{
    stop();
}

std::expected<int, std::string> HttpServer::bind(const std::string& address, int port)
{
    Implementation& self = *_implementation;
    if (!self.server->is_valid()) return std::unexpected("the certificate can't be used");
    errno = 0;
    self.port = port == 0                                  ? self.server->bind_to_any_port(address)
                : self.server->bind_to_port(address, port) ? port
                                                           : -1;
    if (self.port <= 0) {
        if (errno == EADDRINUSE) return std::unexpected("taken");
        return std::unexpected(errno ? std::strerror(errno) : "no such address");
    }
    listen(self.listening, kBacklog); // the library's own is 5
    return self.port;
}

void HttpServer::start(Handler handler)
{
    Implementation& self = *_implementation;
    const auto serve = [handler = std::move(handler), secure = self.secure](const httplib::Request& from,
                                                                            httplib::Response& to) {
        convert(handler(convert(from, secure)), to);
    };
    httplib::Server& server = *self.server;
    server.set_pre_routing_handler([](const httplib::Request& request, httplib::Response&) {
        prepareBody(request);
        return httplib::Server::HandlerResponse::Unhandled;
    });
    server.Get(".*", serve).Post(".*", serve).Put(".*", serve).Patch(".*", serve).Delete(".*", serve);
    self.thread = std::thread([&self] {
        self.server->listen_after_bind();
        self.ended = true;
    });
}

void HttpServer::stop()
{
    Implementation& self = *_implementation;
    if (!self.thread.joinable()) return;
    // The library ignores a stop before its thread has come to listen.
    while (!self.server->is_running() && !self.ended) std::this_thread::yield();
    self.server->stop();
    // It would wait for idle connections until their time is over.
    shutDownConnections(self.port);
    self.thread.join();
}

} // namespace devserver
