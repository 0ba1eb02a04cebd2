#include "tools/tavrinctl/Resources.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <gmock/gmock.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {
namespace {

using platform::Value;
using testing::HasSubstr;

platform::FileHandle fileOf(std::string_view contents)
{
    platform::FileHandle file(memfd_create("resource", MFD_CLOEXEC));
    EXPECT_EQ(write(file.fd(), contents.data(), contents.size()), static_cast<ssize_t>(contents.size()));
    return file;
}

TAVBagAnswer bagWith(platform::Dictionary entries)
{
    return {std::make_shared<const TAVBag>(std::move(entries), "tavrinctl/1"), {}};
}

TEST(Resource, OneThatIsNotThereSaysWhyAndWhatToDo)
{
    const TAVResourceAnswer missing{{}, {}, makeTAVError(TAVErrorNotFound, "no resource TAVQIFeatures")};
    const TAVResourceAnswer unreadable{{}, {}, makeTAVError(TAVErrorInvalidResponse, "Is a directory")};
    const TAVBagAnswer listing = bagWith({{"TAVQIFeatures", "https://r.example/f?version=3"}});
    const struct {
        const char* identifier;
        const TAVResourceAnswer& answer;
        TAVBagAnswer bag;
        const char* text;
    } cases[]{
        {"TAVQIFeatures", missing, listing,
         "not downloaded yet. The daemon downloads it from https://r.example/f?version=3"},
        {"TAVVistrelModels", missing, listing, "the bag lists no TAVVistrelModels"},
        {"TAVQIFeatures", missing, {}, "defaults read TAVBagURL"},
        {"TAVQIFeatures", unreadable, listing, "can't read TAVQIFeatures: Is a directory"},
        {"bag.plist\x1b[2J", missing, listing,
         "no resource is called bag.plist [2J; there are TAVAutofillTLDWhitelist"},
    };
    for (const auto& c : cases) EXPECT_THAT(whyNotThere(c.identifier, c.answer, c.bag), HasSubstr(c.text));

    EXPECT_EQ(Value(describe("TAVQIFeatures", missing, bagWith({})))["error"],
              Value(whyNotThere("TAVQIFeatures", missing, bagWith({}))));
}

TEST(Resource, DrivesNoTerminalAndFailsOnAFullDisk)
{
    const platform::FileHandle text = fileOf("{\"Zürich\": 1}\r\n\t"), out = fileOf("");
    EXPECT_NO_THROW(copyResource(text, out.fd(), true));
    EXPECT_THROW(copyResource(fileOf("\x1b[2J"), out.fd(), true), Failure);
    EXPECT_THROW(copyResource(fileOf("\xc2\x9b"), out.fd(), true), Failure);
    const platform::FileHandle full(open("/dev/full", O_WRONLY | O_CLOEXEC));
    EXPECT_THROW(copyResource(text, full.fd(), false), Failure);
}

} // namespace
} // namespace tavrin::ctl
