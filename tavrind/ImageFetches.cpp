#include "tavrind/ImageFetches.h"

namespace tavrin {

bool ImageFetches::join(const platform::Url& url, const ImageGroup& group)
{
    const auto found = _fetches.find(url.string());
    if (found == _fetches.end()) return false;
    Entry& entry = found->second;
    if (!group) return true;
    if (!entry.begun && entry.groups.empty()) _awaited.push_back(found->first);
    entry.groups.push_back(group);
    return true;
}

bool ImageFetches::add(ImageFetch fetch, const ImageGroup& group)
{
    std::deque<std::string>& turns = group ? _awaited : _ahead;
    if (turns.size() >= kWaiting) return false;
    std::string key = fetch.url.string();
    turns.push_back(key);
    Entry& entry = _fetches.emplace(std::move(key), Entry{std::move(fetch), {}}).first->second;
    if (group) entry.groups.push_back(group);
    return true;
}

std::optional<ImageFetch> ImageFetches::next()
{
    if (_underWay == kUnderWay) return std::nullopt;
    for (std::deque<std::string>* turns : {&_awaited, &_ahead}) {
        while (!turns->empty()) {
            const auto found = _fetches.find(turns->front());
            turns->pop_front();
            if (found == _fetches.end() || found->second.begun) continue; // it had moved ahead
            found->second.begun = true;
            ++_underWay;
            return found->second.fetch;
        }
    }
    return std::nullopt;
}

void ImageFetches::end(const platform::Url& url)
{
    const auto found = _fetches.find(url.string());
    if (found == _fetches.end() || !found->second.begun) return;
    --_underWay;
    _fetches.erase(found);
}

} // namespace tavrin
