#include <gmock/gmock.h>

#include "tools/tavrinctl/Characters.h"
#include "tools/tavrinctl/LineEditor.h"
#include "tools/tavrinctl/SearchScreen.h"

namespace tavrin::ctl {
namespace {

TEST(Characters, CountWhatATerminalShows)
{
    using Counts = std::pair<std::size_t, int>;
    const std::pair<std::string_view, Counts> cases[]{{"", {0, 0}},     {"weather", {7, 7}},      {"e\u0301a", {2, 2}},
                                                      {"東京", {2, 4}}, {"👩‍🚀!", {2, 3}}, {"🇨🇭", {1, 2}},
                                                      {"\xffz", {2, 2}}};
    for (const auto& [text, counts] : cases)
        EXPECT_EQ(Counts(charactersOf(text).size(), columnsOf(text)), counts) << text;
    EXPECT_EQ(clipped("weather", 7), "weather");
    EXPECT_EQ(clipped("weather", 4), "wea…");
    EXPECT_EQ(clipped("東京タワー", 4), "東…") << "a wide character isn't cut in two";
    EXPECT_EQ(clipped("weather", 0), "");
    EXPECT_EQ(padded("東", 4), "東  ");
}

using Action = LineEditor::Action;

/// The text with a bar at the cursor.
std::string lineAfter(std::string_view keys)
{
    LineEditor line;
    for (const char key : keys) line.feed(key);
    return line.text().substr(0, line.cursor()) + "|" + line.text().substr(line.cursor());
}

TEST(LineEditor, EditsWhatIsTyped)
{
    const std::pair<std::string_view, std::string_view> cases[]{
        {"weather", "weather|"},
        {"wü\x7f"
         "e",
         "we|"},
        {"e\u0301\x7f", "|"}, // the accent goes with its letter
        {"\x7f\x08\x15", "|"},
        {"one two \x17", "one |"},
        {"one\x15two", "two|"},
        {"東京\033[D\033[DX", "X|東京"},
        {"abc\x01\x06\x0b", "a|"},
        {"abc\033[H\033[3~", "|bc"},
        {"abc\033OD\033OCd\033[F", "abcd|"},
        {"abc\033[1~x\033[4~y", "xabcy|"},
        {"a\033[1;5Cb\033[200~c\033[38;5;1mD", "abcD|"}, // sequences that mean nothing here are skipped whole
        {"a\033b", "ab|"},                               // Esc alone
        {"a\tb", "a b|"},
        {"a\xc3", "a|"},             // the rest of "ü" may come later
        {"a\xc3\xc3\xbc", "aü|"},    // a start without its end
        {"a\xbc\xff\xc0\x80", "a|"}, // no UTF-8
        {"a\xed\xa0\x80z", "az|"},   // half of a pair
        {"a\xc2\x9b"
         "31mb",
         "a31mb|"}, // a control character of two bytes
    };
    for (const auto& [keys, line] : cases) EXPECT_EQ(lineAfter(keys), line) << testing::PrintToString(keys);
    EXPECT_EQ(lineAfter(std::string(5000, 'x')).size(), LineEditor::kLongest + 1);
    EXPECT_EQ(LineEditor("a\033[2Jb").text(), "a [2Jb") << "what the command line gives drives nothing";
}

TEST(LineEditor, TellsWhatAKeyMeans)
{
    const std::pair<std::string_view, Action> cases[]{
        {"x", Action::Edited},     {"\x7f", Action::None},      {"\x03", Action::End},         {"\x04", Action::End},
        {"\x1a", Action::Suspend}, {"\r", Action::Enter},       {"\x0c", Action::Redraw},      {"\033[A", Action::Up},
        {"\033OB", Action::Down},  {"\033[5~", Action::PageUp}, {"\033[6~", Action::PageDown}, {"\033[D", Action::None},
    };
    for (const auto& [keys, action] : cases) {
        LineEditor line;
        Action last = Action::None;
        for (const char key : keys) last = line.feed(key);
        EXPECT_EQ(last, action) << testing::PrintToString(keys);
    }
    EXPECT_EQ(LineEditor("a").feed('\x01'), Action::Moved);
}

TEST(SearchScreen, FitsAnyWindow)
{
    SearchView view{"", 0, std::vector<ScreenLine>(40, {"result"}), 0,
                    std::vector<KeyLine>(20, {"\"key\"", "cache          0.3 ms", "3 results, 1 set"})};
    view.text = "東京タワー " + std::string(300, 'x') + "éé";
    for (view.cursor = 0; view.cursor <= view.text.size(); view.cursor += view.text.size() / 4)
        for (int columns = 1; columns < 100; columns += 7)
            for (int rows = 1; rows < 40; ++rows) {
                const ScreenFrame frame = layOut(view, {columns, rows});
                ASSERT_LE(frame.lines.size(), static_cast<std::size_t>(rows)) << columns << "×" << rows;
                ASSERT_TRUE(frame.cursorColumn >= 0 && frame.cursorColumn < columns) << columns << "×" << rows;
                for (const ScreenLine& line : frame.lines)
                    ASSERT_LE(columnsOf(line.text), columns) << columns << "×" << rows << " " << line.text;
            }
    EXPECT_EQ(layOut({}, {0, 0}).lines.size(), 1u);
    EXPECT_FALSE(drawn(layOut(view, {80, 24}), false).contains('\n')) << "a line end at the bottom scrolls";
}

TEST(SearchScreen, ShowsTheNewestKeysAndAsMuchOfTheAnswerAsFits)
{
    SearchView view{"weather", 7, {}, 0, {}};
    for (int i = 0; i < 40; ++i) view.answer.push_back({"result " + std::to_string(i)});
    for (int i = 0; i < 20; ++i) view.keys.push_back({"key " + std::to_string(i), "…", ""});
    const auto row = [&](std::size_t number, int rows = 24) { return layOut(view, {80, rows}).lines.at(number).text; };
    for (const auto& [number, text] : {std::pair(0, "Search: weather"),
                                       {2, "result 0"},
                                       {15, "  … 27 more lines"},
                                       {17, "key 14                    …  "},
                                       {22, "key 19                    …  "}})
        EXPECT_EQ(row(number), text);
    EXPECT_EQ(row(1, 2), "  … 40 more lines");
    EXPECT_TRUE(drawn(layOut(view, {80, 24}), false).contains("\033[1;16H")) << "the cursor is behind the text";
    view.scrolled = view.answer.size() - answerRows(view.keys.size(), {80, 24});
    EXPECT_EQ(row(15), "result 39") << "the last line of all";
}

TEST(SearchScreen, ANarrowWindowKeepsOutcomesAndTheWayOut)
{
    const KeyLine key{"\"weather tomorrow\"", "network       12.3 ms", "3 results, 1 set"};
    const SearchView view{"weather tomorrow", 16, {}, 0, {key}};
    const ScreenFrame frame = layOut(view, {40, 24});
    EXPECT_EQ(frame.lines.at(22).text, "\"weather tomorro…  network       12.3 ms");
    EXPECT_TRUE(frame.lines.at(23).text.starts_with("Ctrl-C ends")) << frame.lines.at(23).text;
}

} // namespace
} // namespace tavrin::ctl
