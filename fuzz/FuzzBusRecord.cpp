#include <cstring>
#include <sys/socket.h>

#include <systemd/sd-bus.h>

#include "fuzz/Records.h"
#include "platform/base/WriteAll.h"
#include "platform/ipc/BusValue.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tests/support/BusMessages.h"

using platform::Value;
using platform::ipc::BusMessage;

namespace {

/// Writes JSON as values of any D-Bus types. An object with one key that begins with "@" stands for a value of that
/// type: {"@u": 7}, {"@v": "in a variant of its own"}, {"@a(sd)": [["a", 1]]}. Entries of a dictionary may also be an
/// array of pairs, which may have a key twice: {"@a{sv}": [["class", "A"], ["class", "B"]]}. Each function returns
/// false if D-Bus has no such value.
class TypedWriter {
public:
    explicit TypedWriter(sd_bus_message* message) : _message(message) {}

    bool append(std::string_view type, const Value& value)
    {
        if (type.empty()) return false;
        switch (type.front()) {
        case 'v': return variant(value);
        case 'a': return type.starts_with("a{") ? entries(type.substr(1), value) : elements(type.substr(1), value);
        case '(': return structure(type, value);
        default: return type.size() == 1 && basic(type.front(), value);
        }
    }

private:
    bool variant(const Value& value)
    {
        const Value* contents = &value;
        std::string type = "a{sv}";
        if (const auto* dictionary = value.asDictionary()) {
            const auto first = dictionary->begin();
            if (dictionary->size() == 1 && first->first.starts_with('@')) {
                type = first->first.substr(1);
                contents = &first->second;
            }
        } else {
            type = value.asArray() ? "av" : value.asString() ? "s" : value.asBool() ? "b" : value.asInt() ? "x" : "d";
        }
        return open('v', type) && append(type, *contents) && close();
    }
    bool elements(std::string_view type, const Value& value)
    {
        if (!open('a', type)) return false;
        if (value.asArray())
            for (const Value& element : *value.asArray())
                if (!append(type, element)) return false;
        return close();
    }
    bool entries(std::string_view type, const Value& value)
    {
        if (type.size() < 4 || !open('a', type)) return false;
        const auto entry = [&](const Value& key, const Value& element) {
            return open('e', type.substr(1, type.size() - 2)) && append(type.substr(1, 1), key) &&
                   append(type.substr(2, type.size() - 3), element) && close();
        };
        if (value.asDictionary())
            for (const auto& [key, element] : *value.asDictionary())
                if (!entry(key, element)) return false;
        if (value.asArray())
            for (const Value& pair : *value.asArray())
                if (!entry(pair[0], pair[1])) return false;
        return close();
    }
    /// Of basic types and variants.
    bool structure(std::string_view type, const Value& value)
    {
        const std::string_view members = type.substr(1, type.size() - 2);
        if (!open('r', members)) return false;
        for (std::size_t i = 0; i < members.size(); ++i)
            if (!append(members.substr(i, 1), value[i])) return false;
        return close();
    }
    bool basic(char type, const Value& value)
    {
        const auto number = value.asInt().value_or(0);
        const auto unsignedNumber = value.asUInt().value_or(static_cast<std::uint64_t>(number));
        const std::string text = platform::ipc::busText(value.asString() ? *value.asString() : "");
        const int flag = value.asBool().value_or(false);
        const double real = value.asDouble().value_or(0);
        const void* bits = &unsignedNumber; // the first bytes are the low ones
        switch (type) {
        case 'b': bits = &flag; break;
        case 'd': bits = &real; break;
        case 's':
        case 'o':
        case 'g': bits = text.c_str(); break;
        case 'h': return false;
        default: break;
        }
        return sd_bus_message_append_basic(_message, type, bits) >= 0;
    }
    bool open(char type, std::string_view contents)
    {
        return sd_bus_message_open_container(_message, type, std::string(contents).c_str()) >= 0;
    }
    bool close() { return sd_bus_message_close_container(_message) >= 0; }

    sd_bus_message* const _message;
};

/// Returns a message with the dictionary, ready to be read; null if D-Bus has no such message.
BusMessage typedMessage(const Value& dictionary)
{
    BusMessage message = platform::test::newBusMessage();
    if (!TypedWriter(message.get()).append("a{sv}", dictionary)) return {};
    return sd_bus_message_seal(message.get(), 1, 0) >= 0 ? std::move(message) : BusMessage();
}

/// A connection over which messages with any body arrive.
class Wire {
public:
    Wire()
    {
        // What a server says before the first message.
        constexpr std::string_view kGreeting = "DATA\r\nOK 0123456789abcdef0123456789abcdef\r\n";
        int ends[2] = {};
        check(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) == 0);
        _peer = ends[1];
        check(sd_bus_new(&_bus) >= 0 && sd_bus_set_fd(_bus, ends[0], ends[0]) >= 0 &&
              sd_bus_negotiate_fds(_bus, 0) >= 0 && sd_bus_start(_bus) >= 0);
        check(platform::writeAll(_peer, kGreeting));
    }
    /// Returns the message with this body of the type "a{sv}".
    BusMessage receive(std::string_view body)
    {
        check(platform::writeAll(_peer, head(body.size()) + std::string(body)));
        sd_bus_message* message = nullptr;
        while (!message) check(sd_bus_process(_bus, &message) >= 0);
        return BusMessage(message);
    }

private:
    static std::string head(std::size_t size)
    {
        const auto number = [](std::size_t value) {
            std::string bytes(4, '\0');
            const auto narrow = static_cast<std::uint32_t>(value);
            std::memcpy(bytes.data(), &narrow, 4);
            return bytes;
        };
        std::string fields;
        const auto field = [&](char code, char type, std::string_view text) {
            fields.resize((fields.size() + 7) / 8 * 8);
            fields += {code, 1, type, 0};
            fields += type == 'g' ? std::string(1, static_cast<char>(text.size())) : number(text.size());
            fields += text;
            fields += '\0';
        };
        field(1, 'o', "/a");
        field(2, 's', "a.b");
        field(3, 's', "C");
        field(8, 'g', "a{sv}");
        std::string bytes{'l', SD_BUS_MESSAGE_SIGNAL, 1, 1};
        bytes += number(size) + number(1) + number(fields.size()) + fields;
        bytes.resize((bytes.size() + 7) / 8 * 8);
        return bytes;
    }

    sd_bus* _bus = nullptr;
    int _peer = -1;
};

} // namespace

/// A record as a bus message: JSON in the form of `TypedWriter`, or else the bytes of a message's body. It is read
/// straight as it is by way of a dictionary, and can be written again.
void runInput(std::string_view input)
{
    static Wire& wire = *new Wire();
    BusMessage message;
    if (input.starts_with('{') || input.starts_with('[')) {
        const auto json = platform::parseJson(input);
        if (json) message = typedMessage(*json);
    } else {
        message = wire.receive(input);
    }
    if (!message) return;

    bool direct = false;
    const std::string difference = platform::test::differenceOfRoads(message, tavrin::tavrindRecordClasses, direct);
    check(difference.empty(), difference);
    if (!direct) return;
    const platform::ipc::RecordArguments records{.which = 1, .classes = tavrin::tavrindRecordClasses};
    const auto read = platform::test::decodedFromStart(message, SIZE_MAX, records);
    fuzz::checkRoundTrips(*read->message.record(0));
    const std::string written = platform::test::differenceOfMessages(read->message.records[0]);
    check(written.empty(), written);
}
