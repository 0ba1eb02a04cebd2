#include "platform/run/QueueOrder.h"

#include <array>
#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <execinfo.h>
#include <map>
#include <unistd.h>
#include <utility>
#include <vector>

#include <fmt/format.h>

#include "platform/base/Mutex.h"

namespace platform {

namespace {

constexpr int kMaximumLabels = 256;
constexpr int kMaximumFrames = 32;

std::atomic<bool> enforced = false;
constinit thread_local bool syncForbidden = false;

/// How a `sync` of one label on another came about, when it was first seen.
struct Edge {
    explicit Edge(std::string way_) : way(std::move(way_)) { frames.resize(backtrace(frames.data(), kMaximumFrames)); }
    std::string way;
    std::vector<void*> frames = std::vector<void*>(kMaximumFrames);
};

void print(const Edge& edge)
{
    std::fprintf(stderr, "  way: %s\n", edge.way.c_str());
    backtrace_symbols_fd(edge.frames.data(), static_cast<int>(edge.frames.size()), STDERR_FILENO);
}

/// Which label was nested in which. Labels are never forgotten: there are as many as the source has.
class Graph {
public:
    int indexOf(const std::string& label)
    {
        MutexLock lock(_mutex);
        const auto [found, isNew] = _indices.try_emplace(label, static_cast<int>(_labels.size()));
        if (isNew) _labels.push_back(label);
        if (_labels.size() > kMaximumLabels) {
            std::fprintf(stderr, "queue %s: more labels than the order of queues can check\n", label.c_str());
            std::abort();
        }
        return found->second;
    }

    [[nodiscard]] bool has(int from, int to) const { return _seen[from][to].load(std::memory_order_relaxed); }

    void add(int from, int to, std::string way)
    {
        MutexLock lock(_mutex);
        if (has(from, to)) return;
        Edge edge(std::move(way));
        std::vector<int> path{to};
        if (findPath(path, from)) abortWithCircle(path, edge);
        _edges.emplace(std::pair(from, to), std::move(edge));
        _seen[from][to] = true;
    }

private:
    /// Extends a path to one that ends at `end`; returns false if there is none.
    bool findPath(std::vector<int>& path, int end) const REQUIRES(_mutex)
    {
        std::array<bool, kMaximumLabels> visited{};
        return findPath(path, end, visited);
    }
    bool findPath(std::vector<int>& path, int end, std::array<bool, kMaximumLabels>& visited) const REQUIRES(_mutex)
    {
        const int last = path.back();
        if (last == end) return true;
        if (std::exchange(visited[last], true)) return false;
        for (int next = 0; next < static_cast<int>(_labels.size()); ++next) {
            if (!has(last, next)) continue;
            path.push_back(next);
            if (findPath(path, end, visited)) return true;
            path.pop_back();
        }
        return false;
    }

    [[noreturn]] void abortWithCircle(const std::vector<int>& path, const Edge& edge) const REQUIRES(_mutex)
    {
        std::fprintf(stderr, "queue %s: sync closes a circle\n", _labels[path.front()].c_str());
        print(edge);
        for (std::size_t i = 1; i < path.size(); ++i) print(_edges.at({path[i - 1], path[i]}));
        std::abort();
    }

    Mutex _mutex;
    std::map<std::string, int> _indices GUARDED_BY(_mutex);
    std::vector<std::string> _labels GUARDED_BY(_mutex);
    std::map<std::pair<int, int>, Edge> _edges GUARDED_BY(_mutex);
    std::array<std::array<std::atomic<bool>, kMaximumLabels>, kMaximumLabels>
        _seen{}; ///< the edges; read by any thread
};

Graph& graph()
{
    static Graph& graph = *new Graph; // threads may use queues while the process exits
    return graph;
}

std::string wayTo(const QueueOrder::Place& place, QueueOrder::Way way)
{
    return way() + " > " + place.label;
}

[[noreturn]] void abortWith(const std::string& what, const QueueOrder::Place& place, QueueOrder::Way way)
{
    std::fprintf(stderr, "queue %s: %s\n", place.label.c_str(), what.c_str());
    print(Edge(wayTo(place, way)));
    std::abort();
}

} // namespace

void QueueOrder::enforce()
{
    enforced = true;
}

QueueOrder::ForbidSync::ForbidSync() : _outer(std::exchange(syncForbidden, true)) {}
QueueOrder::ForbidSync::~ForbidSync()
{
    syncForbidden = _outer;
}

QueueOrder::Place::Place(std::string label_, Rank rank_)
    : label(std::move(label_)), rank(rank_), index(enforced ? graph().indexOf(label) : -1)
{}

void QueueOrder::checkSync(const Place* from, const Place& to, Way way)
{
    if (!to.isChecked()) return;
    if (syncForbidden) abortWith("sync on a thread that may not wait", to, way);
    if (heldMutexes > 0) abortWith("sync under a mutex", to, way);
    if (to.rank == Rank::Root) abortWith("sync on a root", to, way);
    if (!from || !from->isChecked()) return;
    if (from->rank != Rank::None && to.rank != Rank::None && to.rank <= from->rank)
        abortWith(fmt::format("sync up the ranks, from rank {} to rank {}", std::to_underlying(from->rank),
                              std::to_underlying(to.rank)),
                  to, way);
    if (!graph().has(from->index, to.index)) graph().add(from->index, to.index, wayTo(to, way));
}

void QueueOrder::checkSuspension(const Place& place, bool isNested, Way way)
{
    if (!place.isChecked()) return;
    if (isNested) abortWith("suspendUntil inside a sync", place, way);
    if (place.rank != Rank::Root && place.rank != Rank::None) abortWith("suspendUntil on no root", place, way);
}

} // namespace platform
