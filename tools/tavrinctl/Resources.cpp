#include "tools/tavrinctl/Resources.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <unistd.h>

#include <fmt/format.h>
#include <fmt/ranges.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "platform/values/Dictionary.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

namespace {

bool drivesTerminals(std::string_view text)
{
    for (; !text.empty(); text.remove_prefix(1))
        if (tools::controlLength(text) > 0 && !std::string_view("\n\r\t").contains(text.front())) return true;
    return false;
}

} // namespace

std::string whyNotThere(const std::string& identifier, const TAVResourceAnswer& answer, const TAVBagAnswer& bag)
{
    if (answer.file) return "";
    const std::string name = printable(identifier);
    if (std::ranges::find(kTAVResourceIdentifiers, identifier) == kTAVResourceIdentifiers.end())
        return fmt::format("no resource is called {}; there are {}", name, fmt::join(kTAVResourceIdentifiers, ", "));
    if (answer.error && answer.error->code != TAVErrorNotFound)
        return fmt::format("the daemon can't read {}: {}", name, printable(answer.error->reason()));
    if (!bag.bag)
        return fmt::format("{} is missing, because the daemon has no bag, which lists the resources.\nCheck its URL: "
                           "tavrinctl defaults read TAVBagURL",
                           name);
    const auto url = bag.bag->resourceURL(identifier);
    if (!url)
        return fmt::format(
            "the bag lists no {}, so the daemon does not download it; \"tavrinctl bag --json\" shows the bag", name);
    return fmt::format(
        "{} is not downloaded yet. The daemon downloads it from {}\none to 61 minutes after it gets a bag, "
        "on a network that is not metered; its log shows failures.",
        name, printable(url->string()));
}

platform::Dictionary describe(const std::string& identifier, const TAVResourceAnswer& answer, const TAVBagAnswer& bag)
{
    platform::Dictionary description{{"identifier", identifier}};
    if (std::string reason = whyNotThere(identifier, answer, bag); !reason.empty()) {
        description.set("error", std::move(reason));
        return description;
    }
    for (const char* key : {"size", "modified", "created"}) description.set(key, answer.attributes[key]);
    return description;
}

void copyResource(const platform::FileHandle& file, int output, bool terminal)
{
    const auto failed = [](const char* what) { return Failure(fmt::format("{}: {}", what, std::strerror(errno))); };
    std::array<char, 64 * 1024> chunk;
    for (off_t offset = 0;;) {
        const ssize_t count = pread(file.fd(), chunk.data(), chunk.size(), offset);
        if (count < 0) throw failed("can't read the resource");
        if (count == 0) return;
        offset += count;
        std::string_view left(chunk.data(), static_cast<std::size_t>(count));
        if (terminal && drivesTerminals(left)) throw Failure("the resource is not plain text; save it with -o FILE");
        while (!left.empty()) {
            const ssize_t written = write(output, left.data(), left.size());
            if (written < 0 && errno != EINTR) throw failed("can't write the resource");
            left.remove_prefix(static_cast<std::size_t>(std::max<ssize_t>(written, 0)));
        }
    }
}

} // namespace tavrin::ctl
