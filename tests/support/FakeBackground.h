#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "platform/device/ActivityScheduler.h"
#include "platform/device/DeviceUse.h"
#include "platform/net/BackgroundSession.h"
#include "platform/run/Queue.h"
#include "tests/support/MemoryFiles.h"

namespace platform::test {

/// Background sessions whose transfers a test ends by hand. Bodies are read from the twin of the file system when a
/// task is made.
class FakeBackgroundSessions final : public BackgroundSessions {
public:
    explicit FakeBackgroundSessions(MemoryFiles& files) : _files(files) {}

    class Session;
    class Task final : public BackgroundTask, public std::enable_shared_from_this<Task> {
    public:
        void resume() override { resumed = true; }
        void cancel() override { fail(Error::withReason(std::string(kUrlErrorDomain), kUrlCancelled, "cancelled")); }
        [[nodiscard]] std::uint64_t identifier() const override { return _identifier; }
        [[nodiscard]] const UrlRequest& originalRequest() const override { return _request; }
        [[nodiscard]] Value timingData() const override { return {}; }
        void setNote(Value note) override { _note = std::move(note); }
        [[nodiscard]] Value note() const override { return _note; }
        [[nodiscard]] bool isUpload() const override { return upload; }

        void respond(int status, HttpHeaders headers = {})
        {
            finish(UrlResponse{_request.url, true, status, std::move(headers)}, std::nullopt);
        }
        /// Ends a download with an answer, from where redirects led.
        void deliver(int status, std::string contents, std::optional<Url> from = {})
        {
            if (std::exchange(finished, true)) return;
            _queue->async([self = shared_from_this(), contents = std::move(contents),
                           response = UrlResponse{from.value_or(_request.url), true, status, {}}] {
                const auto delegate = self->_delegate.lock();
                if (!delegate) return;
                const std::filesystem::path file = "/tmp/download-" + std::to_string(self->_identifier);
                self->_files->files[file] = contents;
                delegate->taskDidFinishDownloading(self, file, response);
                self->_files->files.erase(file);
                delegate->taskDidComplete(self, response, std::nullopt);
            });
        }
        void fail(Error error) { finish(std::nullopt, std::move(error)); }

        bool upload = true;
        bool resumed = false;
        bool finished = false;
        std::string body; ///< of an upload

    private:
        friend class Session;
        void finish(std::optional<UrlResponse> response, std::optional<Error> error)
        {
            if (std::exchange(finished, true)) return;
            _queue->async([self = shared_from_this(), response = std::move(response), error = std::move(error)] {
                if (auto delegate = self->_delegate.lock()) delegate->taskDidComplete(self, response, error);
            });
        }

        std::uint64_t _identifier = 0;
        UrlRequest _request;
        Value _note;
        std::weak_ptr<BackgroundSessionDelegate> _delegate;
        std::shared_ptr<Queue> _queue;
        MemoryFiles* _files = nullptr;
    };

    class Session final : public BackgroundSession {
    public:
        Result<std::shared_ptr<BackgroundTask>> uploadTask(UrlRequest request,
                                                           const std::filesystem::path& body) override
        {
            if (refuse)
                return std::unexpected(Error::withReason(std::string(kUrlErrorDomain), kUrlTooLarge, "too many tasks"));
            auto contents = _files->read(body, SIZE_MAX);
            if (!contents) return std::unexpected(contents.error());
            auto task = add(std::move(request));
            task->body = contents->view();
            return task;
        }
        Result<std::shared_ptr<BackgroundTask>> downloadTask(UrlRequest request) override
        {
            auto task = add(std::move(request));
            task->upload = false;
            return task;
        }
        void getTasks(std::move_only_function<void(std::vector<std::shared_ptr<BackgroundTask>>)> callback) override
        {
            std::vector<std::shared_ptr<BackgroundTask>> running;
            for (const auto& task : tasks)
                if (!task->finished) running.push_back(task);
            callback(std::move(running));
        }

        /// Takes up a task of an earlier process.
        void adopt(Task& task)
        {
            task._delegate = _delegate;
            task._queue = _queue;
        }

        BackgroundSessionConfiguration configuration;
        std::vector<std::shared_ptr<Task>> tasks;
        bool refuse = false; ///< makes no uploads

    private:
        friend class FakeBackgroundSessions;
        std::shared_ptr<Task> add(UrlRequest request)
        {
            auto task = std::make_shared<Task>();
            task->_identifier = tasks.size() + 1;
            task->_request = std::move(request);
            task->_delegate = _delegate;
            task->_queue = _queue;
            task->_files = _files;
            tasks.push_back(task);
            return task;
        }
        MemoryFiles* _files = nullptr;
        std::weak_ptr<BackgroundSessionDelegate> _delegate;
        std::shared_ptr<Queue> _queue;
    };

    std::shared_ptr<BackgroundSession> make(BackgroundSessionConfiguration configuration,
                                            std::weak_ptr<BackgroundSessionDelegate> delegate,
                                            std::shared_ptr<Queue> delegateQueue) override
    {
        auto session = std::make_shared<Session>();
        session->configuration = configuration;
        session->_files = &_files;
        session->_delegate = std::move(delegate);
        session->_queue = std::move(delegateQueue);
        sessions[configuration.identifier] = session;
        return session;
    }

    std::map<std::string, std::shared_ptr<Session>> sessions;

private:
    MemoryFiles& _files;
};

/// A scheduler whose activities a test runs by hand.
class FakeActivityScheduler final : public ActivityScheduler {
public:
    class Run final : public Activity {
    public:
        Run(std::string identifier, ActivityCriteria criteria, ActivityState state)
            : _identifier(std::move(identifier)), _criteria(criteria), _state(state)
        {}
        [[nodiscard]] const std::string& identifier() const override { return _identifier; }
        [[nodiscard]] ActivityState state() const override { return _state; }
        bool setState(ActivityState state) override
        {
            if (refuse) return false;
            _state = state;
            return true;
        }
        [[nodiscard]] bool shouldDefer() const override { return false; }
        void setCriteria(ActivityCriteria criteria) override { _criteria = criteria; }
        [[nodiscard]] ActivityCriteria criteria() const override { return _criteria; }

        bool refuse = false; ///< accepts no change of state

    private:
        std::string _identifier;
        ActivityCriteria _criteria;
        ActivityState _state;
    };

    void registerActivity(const std::string& identifier, ActivityCriteria criteria, Handler handler) override
    {
        auto checkIn = std::make_shared<Run>(identifier, criteria, ActivityState::CheckIn);
        handler(checkIn);
        registered[identifier] = {checkIn->criteria(), std::move(handler)};
    }
    void unregister(const std::string& identifier) override { registered.erase(identifier); }

    /// Calls the handler of an activity as the scheduler does when it is due.
    std::shared_ptr<Run> run(const std::string& identifier, bool refuse = false)
    {
        auto& [criteria, handler] = registered.at(identifier);
        auto activity = std::make_shared<Run>(identifier, criteria, ActivityState::Run);
        activity->refuse = refuse;
        handler(activity);
        return activity;
    }

    std::map<std::string, std::pair<ActivityCriteria, Handler>> registered;
};

/// A use of the device that a test sets.
struct FakeDeviceUse final : DeviceUseSource {
    explicit FakeDeviceUse(Executor& executor_) : executor(executor_) {}
    void ask(Answer answer) override
    {
        ++asked;
        executor.execute(Priority::Default, [this, answer = std::move(answer)]() mutable { answer(found = now); });
    }
    [[nodiscard]] DeviceUse last() override { return found; }

    Executor& executor;
    DeviceUse now;
    DeviceUse found;
    int asked = 0;
};

} // namespace platform::test
