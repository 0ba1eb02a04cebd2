#include "tools/fleet/Typing.h"

#include <deque>
#include <map>
#include <memory>
#include <set>
#include <string>

#include "CoreTavrin/ResponseImages.h"
#include "CoreTavrin/TAVBag.h"
#include "platform/text/Text.h"
#include "platform/values/Json.h"
#include "tavrind/CachedResultSets.h"
#include "tools/devserver/Bag.h"
#include "tools/devserver/Catalogue.h"
#include "tools/devserver/SearchAnswers.h"
#include "tools/devserver/Service.h"
#include "tools/fleet/Random.h"

namespace tavrin::fleet {

namespace {

constexpr const char* kService = "https://service.example";

/// A response of the development service.
struct Response {
    platform::JsonDocument document;
    std::size_t size; ///< bytes of JSON
    std::vector<std::uint16_t> images;
};

/// The development service without its sockets. Makes each response once.
class Answers {
public:
    const Response& to(const std::string& text)
    {
        if (const auto found = _made.find(text); found != _made.end()) return *found->second;
        platform::Value sets = _answers.search(text);
        devserver::stamp(sets, {.fbq = "1", .maxAge = devserver::Service::kDefaultMaxAge});
        const std::string json = platform::toJson(sets);
        auto document = platform::JsonDocument::parse(json).value();
        auto images = imagesIn(document.root());
        const auto response = std::make_shared<const Response>(std::move(document), json.size(), std::move(images));
        return *_made.emplace(text, response).first->second;
    }
    [[nodiscard]] const TAVBag& bag() const { return _bag; }
    [[nodiscard]] std::size_t imageCount() const { return _images.size(); }

private:
    /// Returns the images that the daemon would load ahead, in its order, by their numbers.
    std::vector<std::uint16_t> imagesIn(platform::JsonView response)
    {
        OrderedImages ordered;
        std::set<std::string> seen;
        enumerateImagesInResponse(
            response, [&](platform::JsonView image) { collectOrderedImages(_bag, image.value(), &seen, ordered); });
        std::vector<std::uint16_t> numbers;
        for (const auto* urls : {&ordered.primary, &ordered.secondary})
            for (const platform::Url& url : *urls)
                numbers.push_back(
                    _images.emplace(url.string(), static_cast<std::uint16_t>(_images.size())).first->second);
        return numbers;
    }

    const devserver::Catalogue _catalogue;
    const devserver::SearchAnswers _answers{_catalogue, kService};
    const TAVBag _bag{devserver::Bag(kService).document(), "Vistrel/1"};
    std::map<std::string, std::shared_ptr<const Response>> _made;
    std::map<std::string, std::uint16_t> _images; ///< numbers by URL
};

/// One user at the keys.
class Visitor {
public:
    Visitor(Answers& answers, const Assumptions& assumptions) : _answers(answers), _assumptions(assumptions) {}

    void type(const replay::TypedQuery& query)
    {
        ++_visit.queries;
        for (const replay::Keystroke& key : query.keys) {
            _now += key.pause;
            receive();
            if (!key.text.empty()) press(key.text);
        }
    }
    /// Waits for the responses that are still missing, and leaves.
    Visit end()
    {
        for (; !_underWay.empty(); _underWay.pop_front()) (void)response(_underWay.front());
        _visit.seconds = platform::toSeconds(_now.time_since_epoch());
        _visit.images.assign(_images.begin(), _images.end());
        return std::move(_visit);
    }

private:
    struct Search {
        platform::Date answered;
        std::string text;
    };

    void press(const std::string& text)
    {
        ++_visit.events; // the skip of this search, or its start
        if (platform::utf16Length(text) < _answers.bag().minimumQueryLength()) return;
        ++_visit.keys;
        if (_cache.find(text, 0, _now)) return;
        ++_visit.searches;
        ++_visit.events; // its end
        _underWay.push_back({_now + platform::durationFromSeconds(_assumptions.latency), text});
    }
    void receive()
    {
        for (; !_underWay.empty() && _underWay.front().answered <= _now; _underWay.pop_front()) {
            const Search& search = _underWay.front();
            for (const platform::JsonView set : response(search).document.root().elements())
                if (set.has("query"))
                    _cache.store(
                        std::make_shared<const CachedResultSet>(search.text, _request, set, "", search.answered));
        }
    }
    const Response& response(const Search& search)
    {
        const Response& response = _answers.to(search.text);
        _visit.answerBytes += static_cast<double>(response.size);
        _images.insert(response.images.begin(), response.images.end());
        return response;
    }

    Answers& _answers;
    const Assumptions& _assumptions;
    const std::shared_ptr<const platform::UrlRequest> _request = std::make_shared<const platform::UrlRequest>();
    CachedResultSets _cache;
    std::deque<Search> _underWay;
    std::set<std::uint16_t> _images;
    platform::Date _now{};
    Visit _visit;
};

} // namespace

Typing::Typing(const std::vector<replay::TypedQuery>& corpus, const Assumptions& assumptions, std::size_t count)
{
    Answers answers;
    Random random(1); // the same visits for every seed of a run
    while (_visits.size() < count) {
        Visitor visitor(answers, assumptions);
        do {
            visitor.type(corpus[random.below(corpus.size())]);
        } while (random.chance(1 - 1 / assumptions.queriesPerVisit));
        _visits.push_back(visitor.end());
    }
    _imageCount = answers.imageCount();
}

} // namespace tavrin::fleet
