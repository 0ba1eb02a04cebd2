#include <fstream>
#include <numeric>
#include <set>
#include <sstream>
#include <sys/mman.h>
#include <unistd.h>

#include "platform/values/Json.h"
#include "tavrind/AppWhitelistController.h"
#include "tavrind/decoder.h"
#include "tavrind/encoder.h"
#include "tavrind/mmap_file.h"
#include "tests/support/DaemonFixture.h"
#include "tests/support/TemporaryDirectory.h"

namespace tavrin {
namespace {

using platform::Value;

std::optional<std::string> signatureOf(const std::vector<std::uint32_t>& ids, std::string_view version = "0a1b2c")
{
    const std::string bitmap = bitmapOf(ids);
    return makeSignature(static_cast<std::uint16_t>(bitmap.size()), rle_compress(bitmap), version);
}

TEST(AppSignature, CodesRunsOnlyWhereThatIsShorter)
{
    const std::string ones(38, '\xff');
    const std::string mixed = ones.substr(1) + '\xf0';
    const struct {
        std::string bitmap;
        bool compressed;
        std::string payload;
    } cases[]{
        {"\x50", false, "\x50"},
        {std::string(40, '\xaa'), false, std::string(40, '\xaa')},
        {"", false, ""},
        {std::string(4, '\0'), false, std::string(4, '\0')}, // one run: 4 bytes, which is not shorter
        {std::string(5, '\0'), true, std::string("\0\1\x27\0", 4)},
        {mixed, true, std::string("\0\3\xff\x2b\3\xc0", 6)}, // 300 ones: 256 and 44
        {"\1" + std::string(33, '\0') + "\1\xff", true, std::string("\0\5\6\0\xff\x0e\x08\x48", 8)},
        {std::string(64, '\xff'), true, std::string("\0\2\xff\xff\xc0", 5)},
    };
    for (const auto& c : cases) {
        const RunLengthCoding coding = encodeRun(c.bitmap);
        EXPECT_EQ(coding.compressed, c.compressed) << c.bitmap.size();
        EXPECT_EQ(coding.bytes, c.payload) << c.bitmap.size();
    }
}

TEST(AppSignature, ExpandsNothingThatDoesNotAddUp)
{
    const std::string coded = std::string("MD5.") + std::string("\0\3\xff\x2b\3\xc0", 6);
    EXPECT_EQ(rle_expand(coded, 4, 6, 38, true), std::string(37, '\xff') + '\xf0');
    EXPECT_EQ(rle_expand(coded, 4, 6, 40, true), std::string(37, '\xff') + std::string("\xf0\0\0", 3))
        << "too few bits";
    EXPECT_FALSE(rle_expand(coded, 4, 6, 37, true)) << "too many bits";
    EXPECT_FALSE(rle_expand(coded, 4, 5, 38, true)) << "not as long as its runs";
    EXPECT_FALSE(rle_expand(coded, 5, 6, 38, true)) << "beyond the end";
    EXPECT_FALSE(rle_expand(coded, 99, 6, 38, true));
    EXPECT_FALSE(rle_expand(coded, 4, 1, 38, true));
    EXPECT_EQ(rle_expand("MD5.abc", 4, 3, 3, false), "abc");
    EXPECT_FALSE(rle_expand("MD5.abc", 4, 3, 4, false));

    std::string text = *signatureOf({1, 3, 20}); // 15 bytes: every character counts
    for (char& c : text) {
        const char kept = std::exchange(c, c == 'A' ? 'B' : 'A');
        EXPECT_FALSE(readSignature(text)) << text;
        c = kept;
    }
    for (const char* broken : {"", "AAAA", "0VH2", "====", "0VH2KBssAAGaD9qqUA= "}) EXPECT_FALSE(readSignature(broken));
}

TEST(AppSignature, VersionsAreHexadecimalBytesOfWhichTheLastTwoCount)
{
    const struct {
        const char* text;
        std::optional<unsigned> version;
    } cases[]{{"0a1b2c", 0x1b2c}, {"0a9b2c", 0x1b2c}, {"FFff", 0x7fff}, {"2c", 0x2c},   {"", 0},
              {"0a1", {}},        {"0a1g", {}},       {"0x1b", {}},     {" a1b2c", {}}, {"-1b2", {}}};
    for (const auto& c : cases) {
        const auto signature = signatureOf({1, 3}, c.text);
        EXPECT_EQ(signature ? std::optional(readSignature(*signature)->version) : std::nullopt, c.version) << c.text;
    }
}

TEST(AppSignature, IsAsTheExamplesOfThePageSay)
{
    std::ifstream page(SOURCE_DIR "/docs/formats.md");
    std::set<std::string> examples; // blocks of hexadecimal bytes, as base64 texts
    for (std::string line, before; std::getline(page, line); before = line) {
        if (before != "```") continue;
        std::istringstream words(line);
        std::string bytes;
        for (unsigned byte = 0; words >> std::hex >> byte;) bytes += static_cast<char>(byte);
        const std::string text = platform::toJson(Value(platform::Bytes(bytes)));
        examples.insert(text.substr(1, text.size() - 2));
    }
    std::vector<std::uint32_t> first300(300);
    std::iota(first300.begin(), first300.end(), 0u);
    EXPECT_TRUE(examples.contains(*signatureOf({1, 3})));
    EXPECT_TRUE(examples.contains(*signatureOf(first300, "0a9b2c")));
}

std::string listOf(std::string_view inner, std::string_view compression = "RLE", std::string_view encoding = "bitmap")
{
    return platform::toJson(
        Value::dictionaryOf({{"apps", inner}, {"compression", compression}, {"encoding", encoding}}));
}

TEST(AppWhitelist, GivesNoSignatureForWhatIsNoListOrNamesNothingInstalled)
{
    const std::string sound =
        R"({"version": "0a1b2c", "apps": {"one": [{"encoding_id": 1}], "many": [{"encoding_id": 9}, 5,
        {"encoding_id": 3}], "eight": [{"encoding_id": 8}], "zero": [{"encoding_id": 0}], "huge": [{"encoding_id": 524280}],
        "half": [{"encoding_id": 1.5}], "minus": [{"encoding_id": -1}], "text": [{"encoding_id": "2"}], "none": [],
        "last": [{"encoding_id": 2}, 7], "object": {"encoding_id": 2}, "yes": [{"encoding_id": true}],
        "again": [{"encoding_id": 6}], "twin": [{"encoding_id": 1}], "again": [{"encoding_id": 3}],
        "gone": [{"encoding_id": 2}], "gone": [{"encoding_id": -5}], "giant": [{"encoding_id": 18446744073709551615}],
        "whole": [{"encoding_id": 3.0}]}})";
    using Names = std::vector<std::string>;
    const struct {
        std::string list;
        Names installed;
        std::optional<std::string> bitmap;
    } cases[]{
        {listOf(sound), {"one", "many", "other"}, "\x50"},
        {listOf(sound), {"one", "eight"}, "\x40"},
        {listOf(sound), {"zero"}, ""},
        {listOf(sound), {"one", "huge", "half", "minus", "text", "none", "last", "object", "yes"}, "\x40"},
        {listOf(sound), {"one", "twin", "again", "gone", "giant"}, "\x50"}, // of twice the same name the last counts
        {listOf(sound), {"one", "whole"}, "\x50"},
        {listOf(sound), {"other"}, {}},
        {listOf(sound), {}, {}},
        {listOf(sound, "LZ"), {"one"}, {}},
        {listOf(sound, "RLE", "list"), {"one"}, {}},
        {listOf("{"), {"one"}, {}},
        {listOf(R"({"version": 12, "apps": {"one": [{"encoding_id": 1}]}})"), {"one"}, {}},
        {listOf(R"({"version": "0a1", "apps": {"one": [{"encoding_id": 1}]}})"), {"one"}, {}},
        {listOf(R"({"version": "0a1b", "apps": [{"encoding_id": 1}]})"), {"one"}, {}},
        {R"({"apps": {"version": "0a1b"}, "compression": "RLE", "encoding": "bitmap"})", {"one"}, {}},
        {"[]", {"one"}, {}},
        {"", {"one"}, {}},
    };
    platform::test::TestDevice device;
    for (const auto& c : cases) {
        device.applications.installed.clear();
        for (const std::string& name : c.installed) device.applications.installed.push_back({name, "0"});
        device.applications.installed.push_back({"one", ""}); // without a version it doesn't count
        const auto signature = processWhitelist(c.list, device.applications);
        EXPECT_EQ(signature ? std::optional(readSignature(*signature)->bitmap) : std::nullopt, c.bitmap) << c.list;
    }
    for (std::size_t length = 0; length < sound.size(); ++length)
        EXPECT_FALSE(processWhitelist(listOf(sound.substr(0, length)), device.applications)) << "cut at " << length;

    const platform::FileHandle huge(memfd_create("list", MFD_CLOEXEC));
    ASSERT_EQ(ftruncate(huge.fd(), off_t{40} << 20), 0);
    device.applications.readings = 0;
    const platform::test::LogCapture log;
    EXPECT_FALSE(processWhitelist(mmapFileHandle(huge)->view(), device.applications));
    EXPECT_EQ(log.count("larger than 33554432 bytes"), 1);
    EXPECT_FALSE(processWhitelist("{}", device.applications));
    EXPECT_EQ(device.applications.readings, 0) << "for nothing";
}

struct AppWhitelistControllerTest : test::DaemonTest {
    static constexpr const char* kKey = "TAVAppWhitelistSignature";
    const std::string resource = "/caches/com.quorvane.tavrind/TAVInstalledAppWhitelist";
    const std::string list =
        listOf(R"({"version": "0a1b2c", "apps": {"one": [{"encoding_id": 1}], "three": [{"encoding_id": 3}]}})");

    std::string signature() { return assembly().appWhitelistController->whitelistSignature(); }
    void changeApplications(const std::vector<std::string>& names)
    {
        device.applications.installed.clear();
        for (const std::string& name : names) device.applications.installed.push_back({name, "0"});
        device.applications.handler();
        device.drain();
    }
    platform::test::LogCapture log;
};

TEST_F(AppWhitelistControllerTest, InstalledApplicationsOfTheListBecomeAHeaderThatOutlivesTheDaemon)
{
    device.files.files[resource] = list;
    for (const char* other : {"TAVVistrelModels", "TAVLookupHintsWeekly"})
        device.files.files["/caches/com.quorvane.tavrind/" + std::string(other)] = "another resource";
    start();
    EXPECT_EQ(log.count("generating app whitelist"), 1) << "nothing is stored";
    EXPECT_EQ(signature(), "");

    changeApplications({"one", "unlisted"});
    EXPECT_EQ(signature(), *signatureOf({1}));
    changeApplications({"one", "three"});
    EXPECT_EQ(device.userDefaults.value(kKey), Value(*signatureOf({1, 3})));
    start();
    EXPECT_EQ(log.count("generating app whitelist"), 3) << "the stored one is used";
    auto connection = client();
    deliverBag();
    search(*connection, 1, "weather");
    const std::string* header = lastTask()->originalRequest().headers.find("X-Quorvane-Whitelisted-App-Signature");
    EXPECT_EQ(header ? *header : "", *signatureOf({1, 3}));

    device.files.files[resource] = "no list";
    changeApplications({"one"});
    EXPECT_EQ(signature(), "");
    EXPECT_TRUE(device.userDefaults.value(kKey).isNull());
    device.files.files.erase(resource);
    device.userDefaults.set(kKey, "c3RvcmVk");
    changeApplications({"one"});
    EXPECT_EQ(log.count("error reading app whitelist"), 1);
    EXPECT_TRUE(device.userDefaults.value(kKey).isNull());
}

TEST_F(AppWhitelistControllerTest, OneComputationRunsAtATime)
{
    device.userDefaults.set(kKey, "c3RvcmVk");
    device.files.files[resource] = list;
    start();
    device.applications.onReading = [&] {
        if (device.applications.readings > 1) return;
        device.applications.handler();
        device.drain(); // another worker takes it up
        EXPECT_EQ(log.count("generating app whitelist"), 1);
        EXPECT_EQ(signature(), "c3RvcmVk") << "until the new one is there";
    };
    changeApplications({"one"});
    EXPECT_EQ(device.applications.readings, 1);
    EXPECT_EQ(signature(), *signatureOf({1}));
    changeApplications({});
    EXPECT_EQ(device.applications.readings, 2) << "the next change counts again";
    EXPECT_EQ(signature(), "");
}

TEST(MappedFile, OutlivesItsHandleAndAnEmptyOneIsAnError)
{
    platform::FileHandle file(memfd_create("list", MFD_CLOEXEC));
    EXPECT_EQ(mmapFileHandle(file).error().code, EINVAL);
    ASSERT_EQ(write(file.fd(), "mapped", 6), 6);
    const auto bytes = mmapFileHandle(file);
    ASSERT_EQ(ftruncate(file.fd(), off_t{65} << 20), 0);
    EXPECT_EQ(mmapFileHandle(file).error().code, EFBIG);
    file = {};
    EXPECT_EQ(bytes->view(), "mapped");
    EXPECT_EQ(mmapFileHandle(file).error().code, EBADF);
}

/// A mapping would end the process here.
TEST(MappedFile, AFileThatAnotherProgramCutsShortStaysReadable)
{
    const platform::test::TemporaryDirectory directory;
    const std::string list(100'000, 'x');
    platform::test::writeFile(directory / "list", list);
    const auto bytes = mmapFileHandle(*platform::makeSystemFiles()->openForReading(directory / "list"));
    std::filesystem::resize_file(directory / "list", 0);
    EXPECT_EQ(bytes->view(), list);
}

} // namespace
} // namespace tavrin
