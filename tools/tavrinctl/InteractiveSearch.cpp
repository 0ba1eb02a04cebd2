// tavrinctl search --interactive: shows the daemon's answer to each key.

#include "tools/tavrinctl/InteractiveSearch.h"

#include <algorithm>
#include <csignal>
#include <deque>

#include "CoreTavrin/TAVRequest.h"
#include "tools/tavrinctl/LineEditor.h"
#include "tools/tavrinctl/RequestRunner.h"
#include "tools/tavrinctl/SearchScreen.h"
#include "tools/tavrinctl/Terminal.h"

namespace tavrin::ctl {

namespace {

constexpr std::size_t kKeysKept = 10; // more than fit on the screen

/// Connects the terminal and the daemon.
class InteractiveSearch {
public:
    using MakeRequest = std::function<std::shared_ptr<TAVSearchRequest>(const std::string&)>;

    InteractiveSearch(const Options& options, const std::string& text, const MakeRequest& makeRequest)
        : _makeRequest(makeRequest), _runner(options), _line(text)
    {}

    /// Returns the signal that ended it, or 0.
    int run()
    {
        if (!_line.text().empty()) search();
        const auto ended = [this] {
            takeInput();
            if (_changed && !_ended) draw();
            return _ended;
        };
        if (!_runner.takeAnswers(ended, _terminal.descriptor())) throw Failure("the daemon closed the connection");
        return _signal;
    }

private:
    void takeInput()
    {
        const Terminal::Input input = _terminal.read();
        _signal = input.signal;
        _ended = input.ended || input.signal != 0;
        _changed = _changed || input.resized;

        bool edited = false; // keys that arrive together, as in a paste, are one edit
        for (const char key : input.keys) {
            if (_ended) return;
            edited = act(_line.feed(key)) || edited;
        }
        if (edited) search();
    }

    /// Returns true if the text is to be searched for.
    bool act(LineEditor::Action action)
    {
        using Action = LineEditor::Action;
        if (action != Action::None) _changed = true;
        const std::size_t page = std::max<std::size_t>(room(), 2) - 1;
        switch (action) {
        case Action::Edited:
        case Action::Enter: return true;
        case Action::End: _ended = true; break;
        case Action::Suspend: _terminal.suspend(); break;
        case Action::Up: scrollTo(_scrolled - std::min<std::size_t>(_scrolled, 1)); break;
        case Action::Down: scrollTo(_scrolled + 1); break;
        case Action::PageUp: scrollTo(_scrolled - std::min(_scrolled, page)); break;
        case Action::PageDown: scrollTo(_scrolled + page); break;
        default: break;
        }
        return false;
    }

    void scrollTo(std::size_t line) { _scrolled = std::min(line, _answer.size() - std::min(_answer.size(), room())); }
    [[nodiscard]] std::size_t room() const { return answerRows(_keys.size(), _terminal.size()); }

    void search()
    {
        _changed = true;
        const std::string& text = _line.text();
        if (text.empty()) {
            _wanted = nullptr; // ignores the answer to an earlier text
            return showAnswer({});
        }
        _wanted = _runner.send(*_makeRequest(text), text, [this](const Exchange& exchange) {
            _changed = true;
            for (Key& key : _keys)
                if (key.queryId == exchange.queryId) key.line = keyLine(exchange);
            if (_wanted.get() == &exchange) showAnswer(answerLines(exchange));
        });
        _keys.push_back({_wanted->queryId, keyLine(*_wanted)});
        if (_keys.size() > kKeysKept) _keys.pop_front();
    }

    void showAnswer(std::vector<ScreenLine> lines)
    {
        _answer = std::move(lines);
        _scrolled = 0;
    }

    [[nodiscard]] SearchView view() const
    {
        SearchView view{_line.text(), _line.cursor(), _answer, _scrolled, {}};
        for (const Key& key : _keys) view.keys.push_back(key.line);
        return view;
    }

    void draw()
    {
        _terminal.show(drawn(layOut(view(), _terminal.size()), colours()));
        _changed = false;
    }

    struct Key {
        std::int64_t queryId;
        KeyLine line;
    };

    const MakeRequest& _makeRequest;
    RequestRunner _runner; // before the terminal, which stays untouched without a daemon
    Terminal _terminal;
    LineEditor _line;
    std::shared_ptr<Exchange> _wanted; // the latest key's
    std::deque<Key> _keys;             // the newest last
    std::vector<ScreenLine> _answer;
    std::size_t _scrolled = 0;
    bool _changed = true;
    bool _ended = false;
    int _signal = 0;
};

} // namespace

void searchInteractively(const Options& options, const std::string& text,
                         const std::function<std::shared_ptr<TAVSearchRequest>(const std::string&)>& request)
{
    const int signal = InteractiveSearch(options, text, request).run();
    if (signal == 0) return;
    // The terminal is restored; die from the signal, so that the shell sees it.
    std::signal(signal, SIG_DFL);
    std::raise(signal);
}

} // namespace tavrin::ctl
