#include "tools/tavrinctl/ImageFiles.h"

#include <gmock/gmock.h>

#include "tests/support/MemoryFiles.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {
namespace {

TEST(ImageFiles, TypesAreToldByTheFirstBytes)
{
    const std::pair<std::string, const char*> cases[]{
        {"\x89PNG\r\n\x1a\n...", "png"},
        {"\xff\xd8\xff\xe0...", "jpeg"},
        {"GIF89a...", "gif"},
        {"RIFF....WEBPVP8", "webp"},
        {"RIFF....WAVE", ""},
        {"<?xml version=\"1.0\"?>\n<svg xmlns=", "svg"},
        {"<!DOCTYPE html>", "html"},
        {"\x89PN", ""},
    };
    for (const auto& [bytes, type] : cases) EXPECT_EQ(imageType(bytes), type) << bytes;
}

TEST(ImageFiles, NamesArePlainWhateverTheServiceSends)
{
    const struct {
        std::string source;
        const char* type;
        std::string name;
    } cases[]{
        {"https://a.example/pictures/zurich.png?size=2", "png", "zurich.png"},
        {"https://a.example/pictures/zurich", "jpeg", "zurich.jpg"},
        {"https://a.example", "png", "image.png"},
        {"https://a.example/..%2F..%2Fetc%2Fpasswd", "", "passwd"},
        {"https://a.example/%2e%2e", "", "image"},
        {"../../.ssh/authorized_keys", "", "_.._.ssh_authorized_keys"},
        {"/etc/passwd", "html", "_etc_passwd"},
        {".hidden", "", "hidden"},
        {"Z\u00fcrich \x1b[31m\n", "", "Z_rich_31m_"},
        {"", "png", "image.png"},
        {std::string("a\0b", 3), "", "a_b"},
        {std::string(500, 'x'), "png", std::string(80, 'x') + ".png"},
    };
    for (const auto& c : cases) EXPECT_EQ(imageFileName(c.source, c.type), c.name) << c.source;
}

TEST(ImageFiles, NothingThatIsThereIsTouched)
{
    platform::test::MemoryFiles files;
    files.directories = {"/out"};
    files.files["/out/a.png"] = "mine";
    std::set<std::filesystem::path> taken;
    const auto save = [&](const std::string& name, const std::string& bytes) {
        return saveImage(files, "/out", name, platform::Bytes(bytes), taken).string();
    };
    EXPECT_EQ(save("a.png", "one"), "/out/a-2.png");
    EXPECT_EQ(save("a.png", "two"), "/out/a-3.png");
    EXPECT_EQ(save("a.png", "one"), "/out/a-4.png") << "two images of an answer are two files";
    EXPECT_EQ(save("b", "three"), "/out/b");
    taken.clear();
    EXPECT_EQ(save("a.png", "two"), "/out/a-3.png") << "once more finds it";
    EXPECT_EQ(files.files.at("/out/a.png"), "mine");
    EXPECT_EQ(files.files.at("/out/a-3.png"), "two");

    files.fault = [](std::string_view operation, const auto&) { return operation == "append" ? ENOSPC : 0; };
    EXPECT_THROW(save("c.png", "four"), Failure);
    EXPECT_FALSE(files.files.contains("/out/c.png")) << "no half of one stays";
}

} // namespace
} // namespace tavrin::ctl
