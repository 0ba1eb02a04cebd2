#include "tools/fleet/Traffic.h"

namespace tavrin::fleet {

Traffic::Traffic(Duration end, Duration bin)
    : _bin(bin), _answered(static_cast<std::size_t>((end + bin - Duration(1)) / bin)), _refused(_answered.size())
{}

void Traffic::answered(Kind kind, Duration at, unsigned count, double up, double down)
{
    const auto index = static_cast<std::size_t>(kind);
    _answered[binOf(at)][index] += count;
    if (at < kWarmUp) return;
    _totals[index].requests += count;
    _totals[index].up += up;
    _totals[index].down += down;
}

void Traffic::refused(Kind kind, Duration at, unsigned count)
{
    _refused[binOf(at)][static_cast<std::size_t>(kind)] += count;
}

double Traffic::requests(std::size_t bin, std::optional<Kind> kind) const
{
    double sum = 0;
    for (std::size_t i = 0; i < kKinds.size(); ++i)
        if (!kind || static_cast<std::size_t>(*kind) == i) sum += _answered[bin][i] + _refused[bin][i];
    return sum;
}

} // namespace tavrin::fleet
