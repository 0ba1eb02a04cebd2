#include "tools/devserver/Uploads.h"

#include <algorithm>
#include <array>

#include <fmt/format.h>
#include <openssl/evp.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "tools/devserver/SearchFigures.h"
#include "tools/devserver/SessionShape.h"
#include "tools/shared/CommandLine.h"

namespace devserver {

using platform::Value;

namespace {

constexpr std::size_t kMaximumKeptBytes = 128u << 20;

std::string sha512(std::string_view text)
{
    std::array<unsigned char, EVP_MAX_MD_SIZE> digest{};
    unsigned length = 0;
    EVP_Digest(text.data(), text.size(), digest.data(), &length, EVP_sha512(), nullptr);
    std::string hexadecimal;
    for (unsigned i = 0; i < length; ++i) hexadecimal += fmt::format("{:02x}", digest[i]);
    return hexadecimal;
}

std::optional<std::string> shapeProblem(const Upload& upload)
{
    if (upload.path == "/feedback") {
        if (auto problem = sessionShapeProblem(upload.json)) return "not a session: " + *problem;
    } else if (!upload.json.asDictionary()) {
        return "the JSON is no object";
    }
    return std::nullopt;
}

/// Counts the events that a device has recorded. When it uploads, it makes up to two more.
std::size_t recordedEvents(const Value& session)
{
    const auto* events = session["fb"].asArray();
    return !events ? 0 : std::ranges::count_if(*events, [](const Value& event) {
        const std::string* type = event["type"].asString();
        return !type || (*type != "session_missing_results" && *type != "session_missing_suggestions");
    });
}

} // namespace

Answer Upload::answer() const
{
    if (problem) return errorAnswer(400, *problem);
    return jsonAnswer(Value::dictionaryOf({{"received", size}}));
}

Upload checkUpload(const Request& request)
{
    Upload upload{.path = request.path, .query = request.query, .packedSize = request.body.size()};
    if (const std::string* digest = findHeader(request.headers, "X-Quorvane-Digest")) upload.digest = *digest;
    const auto refused = [&upload](std::string problem) {
        upload.problem = std::move(problem);
        return std::move(upload);
    };

    const std::string* encoding = findHeader(request.headers, "Content-Encoding");
    if (!encoding || *encoding != "deflate") return refused("no header \"Content-Encoding: deflate\"");
    const auto text = tavrin::tools::inflateRaw(request.body, tavrin::tools::kMaximumUpload);
    if (!text) return refused(text.error());
    upload.size = text->size();
    upload.digestFits = upload.digest && *upload.digest == sha512(*text);
    auto json = platform::parseJson(*text, tavrin::tools::kMaximumUpload);
    if (json) upload.json = std::move(*json);
    if (!upload.digest) return refused("no header \"X-Quorvane-Digest\"");
    if (!upload.digestFits) return refused("the digest is not that of the JSON text");
    if (!json) return refused("not JSON: " + json.error().reason());
    upload.problem = shapeProblem(upload);
    return upload;
}

Uploads::Seen& Uploads::_seen(const std::string& digest)
{
    const auto [found, isNew] = _digests.try_emplace(digest);
    if (isNew) _digestsByAge.push_back(digest);
    if (_digestsByAge.size() > kDigests) {
        _digests.erase(_digestsByAge.front());
        _digestsByAge.pop_front();
    }
    return found->second;
}

std::string Uploads::add(Upload upload, const Answer& answer)
{
    const std::string* agent = upload.json["agent"].asString();
    const std::size_t events = upload.json["fb"].count(), recorded = recordedEvents(upload.json);
    const bool taken = answer.status == 200; // devices count it as sent, even if the rest of the answer is cut

    const platform::MutexLock lock(_mutex);
    // A wrong digest does not identify the upload, so its repeats are not counted.
    Seen none;
    Seen& seen = upload.digestFits ? _seen(*upload.digest) : none;
    const std::uint64_t repeat = seen.received++;
    ++_totals.received;
    if (repeat > 0) ++_totals.repeats;
    if (taken) {
        ++_totals.taken;
        if (seen.taken++ == 0) {
            _totals.events += events;
            _totals.recorded += recorded;
        }
    }

    std::string line = fmt::format("upload {}: {}{}, {}, {}, {} bytes packed to {}, {}{}", ++_lastNumber, upload.path,
                                   upload.query.empty() ? "" : "?" + upload.query,
                                   agent ? "agent " + *agent : "no agent", fmt::format("{} events", events),
                                   upload.size, upload.packedSize, upload.digestFits ? "digest ok" : "digest wrong",
                                   repeat > 0 ? fmt::format(", repeat {}", repeat) : "");
    line += fmt::format(" → {}{}", answer.status, answer.cut ? ", cut" : "");
    if (upload.problem) line += ": " + *upload.problem;

    _kept.push_back({upload.size, Value::dictionaryOf({{"number", _lastNumber},
                                                       {"path", upload.path},
                                                       {"query", upload.query},
                                                       {"size", upload.size},
                                                       {"packed_size", upload.packedSize},
                                                       {"digest", upload.digest ? Value(*upload.digest) : Value()},
                                                       {"digest_ok", upload.digestFits},
                                                       {"repeat", repeat},
                                                       {"status", answer.status},
                                                       {"cut", answer.cut},
                                                       {"agent", agent ? Value(*agent) : Value()},
                                                       {"events", events},
                                                       {"searches", searchFigures(upload.json)},
                                                       {"error", upload.problem ? Value(*upload.problem) : Value()},
                                                       {"json", std::move(upload.json)}})});
    _keptBytes += upload.size;
    while (_kept.size() > kKept || (_keptBytes > kMaximumKeptBytes && _kept.size() > 1)) {
        _keptBytes -= _kept.front().size;
        _kept.pop_front();
    }
    return tavrin::tools::printable(line);
}

Value Uploads::list() const
{
    const platform::MutexLock lock(_mutex);
    Value::Array uploads;
    for (const Kept& kept : _kept) uploads.push_back(kept.value);
    return uploads;
}

Value Uploads::summaries() const
{
    Value::Array summaries;
    const Value uploads = list();
    for (const Value& upload : *uploads.asArray()) {
        platform::Dictionary summary;
        for (const auto& [key, value] : *upload.asDictionary())
            if (key != "json") summary.set(key, value);
        summaries.push_back(std::move(summary));
    }
    return summaries;
}

Value Uploads::find(std::uint64_t number) const
{
    const platform::MutexLock lock(_mutex);
    const auto found = std::ranges::find_if(_kept, [&](const Kept& k) { return k.value["number"].asUInt() == number; });
    return found == _kept.end() ? Value() : found->value;
}

Value Uploads::totals() const
{
    const platform::MutexLock lock(_mutex);
    return Value::dictionaryOf({{"received", _totals.received},
                                {"taken", _totals.taken},
                                {"refused", _totals.received - _totals.taken},
                                {"repeats", _totals.repeats},
                                {"events", _totals.events},
                                {"recorded", _totals.recorded}});
}

void Uploads::clear()
{
    const platform::MutexLock lock(_mutex);
    _totals = {};
    _digests.clear();
    _digestsByAge.clear();
    _kept.clear();
    _keptBytes = 0;
}

} // namespace devserver
