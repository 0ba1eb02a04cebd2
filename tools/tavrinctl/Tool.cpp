#include "tools/tavrinctl/Tool.h"

#include <fmt/format.h>

#include "platform/files/Files.h"
#include "platform/values/Json.h"

namespace tavrin::ctl {

std::unique_ptr<TAVClient> connect(const Options& options)
{
    auto client = TAVClient::connect(options.address);
    if (!client)
        throw Failure(
            fmt::format("no daemon answers at {} ({}).\nStart it with \"systemctl --user start tavrind.socket\", or "
                        "run tavrind; --address selects another socket.",
                        options.address, client.error().reason()));
    (*client)->setTimeout(platform::durationFromSeconds(options.timeout));
    return std::move(*client);
}

Session openSession(const Options& options)
{
    Session session{connect(options), {options.identifier, options.agent}, {}};
    auto endpoint = session.client->configure(session.configuration);
    if (!endpoint && !session.client->connected())
        throw Failure("the daemon refused this client: --identifier and --agent must not be empty");
    session.endpoint = valueOf(std::move(endpoint));
    return session;
}

std::string readFile(const std::string& path, std::size_t maximumSize)
{
    auto bytes = platform::makeSystemFiles()->read(tools::resolved(path), maximumSize);
    if (!bytes) throw Failure("can't read " + bytes.error().reason());
    return std::string(bytes->view());
}

std::string plain(const platform::Value& value)
{
    const std::string* text = value.asString();
    return text ? printable(*text) : printableJson(platform::toJson(value));
}

std::string said(const platform::Value& value)
{
    return value.asString() ? plain(value) : "";
}

} // namespace tavrin::ctl
