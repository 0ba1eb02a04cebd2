#include "tests/support/FakeUrlLoader.h"

#include <cstdlib>
#include <unistd.h>

namespace platform::test {

void FakeUrlLoader::Task::respond(int status, std::string body, HttpHeaders headers, std::optional<Url> from)
{
    if (files.download) {
        if (pwrite(files.download.fd(), body.data(), body.size(), 0) < 0) std::abort();
        body.clear();
    }
    finish(Bytes(std::move(body)), UrlResponse{from.value_or(_request.url), true, status, std::move(headers)},
           std::nullopt);
}

void FakeUrlLoader::Task::finish(std::optional<Bytes> data, std::optional<UrlResponse> response,
                                 std::optional<Error> error)
{
    if (finished) return;
    finished = true;
    _queue->async([self = shared_from_this(), data = std::move(data), response = std::move(response),
                   error = std::move(error)]() mutable {
        std::exchange(self->_completion, {})(std::move(data), std::move(response), std::move(error));
    });
}

void FakeUrlLoader::Task::drop()
{
    finished = true;
    _completion = {};
    _queue.reset(); // which may hold the end of this task, if nobody ran it
}

FakeUrlLoader::Session::Session(UrlSessionConfiguration configuration_, std::shared_ptr<Queue> queue)
    : configuration(std::move(configuration_)), _queue(std::move(queue))
{
    if (!configuration.cache) return;
    HttpCacheConfiguration inMemory = *configuration.cache;
    inMemory.directory.clear();
    _cache = HttpCache::make(std::move(inMemory));
}

std::shared_ptr<UrlTask> FakeUrlLoader::Session::dataTask(UrlRequest request, DataCompletion completion)
{
    tasks.push_back(std::make_shared<Task>(tasks.size() + 1, std::move(request), std::move(completion), _queue));
    return tasks.back();
}

std::shared_ptr<UrlTask> FakeUrlLoader::Session::transferTask(UrlRequest request, TransferFiles files,
                                                              DataCompletion completion)
{
    auto task = dataTask(std::move(request), std::move(completion));
    tasks.back()->files = std::move(files);
    return task;
}

FakeUrlLoader::~FakeUrlLoader()
{
    for (const auto& session : sessions)
        for (const auto& task : std::vector(session->tasks)) task->drop();
}

std::shared_ptr<UrlSession> FakeUrlLoader::makeSession(UrlSessionConfiguration configuration,
                                                       std::shared_ptr<Queue> queue)
{
    sessions.push_back(std::make_shared<Session>(std::move(configuration), std::move(queue)));
    return sessions.back();
}

bool FakeUrlLoader::cancelAll()
{
    bool any = false;
    for (const auto& session : sessions) {
        for (const auto& task : std::vector(session->tasks)) {
            any = any || !task->finished;
            task->cancel();
        }
    }
    return any;
}

} // namespace platform::test
