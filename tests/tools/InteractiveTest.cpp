#include <gmock/gmock.h>

#include "CoreTavrin/TAVReply.h"
#include "tools/tavrinctl/Characters.h"
#include "tools/tavrinctl/LineEditor.h"
#include "tools/tavrinctl/Results.h"
#include "tools/tavrinctl/SearchScreen.h"

namespace tavrin::ctl {
namespace {

using Action = LineEditor::Action;
using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

TEST(Characters, CountWhatATerminalShows)
{
    const struct {
        std::string_view text;
        std::size_t characters;
        int columns;
    } cases[]{{"", 0, 0},
              {"weather", 7, 7},
              {"Zürich", 6, 6},
              {"e\u0301a", 2, 2},
              {"東京", 2, 4},
              {"👩‍🚀!", 2, 3},
              {"🇨🇭", 1, 2},
              {"\xff"
               "a",
               2, 2}};
    for (const auto& c : cases) {
        EXPECT_EQ(charactersOf(c.text).size(), c.characters) << c.text;
        EXPECT_EQ(columnsOf(c.text), c.columns) << c.text;
    }
    EXPECT_EQ(clipped("weather", 7), "weather");
    EXPECT_EQ(clipped("weather", 4), "wea…");
    EXPECT_EQ(clipped("東京タワー", 4), "東…") << "a wide character isn't cut in two";
    EXPECT_EQ(clipped("weather", 0), "");
    EXPECT_EQ(padded("東", 4), "東  ");
}

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
        {"Zürich 東京 👍", "Zürich 東京 👍|"},
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
    LineEditor line("a");
    EXPECT_EQ(line.feed('\x01'), Action::Moved);
}

SearchView fullView()
{
    SearchView view{"weather", 7, {}, 0, {}};
    for (int i = 0; i < 40; ++i) view.answer.push_back({"result " + std::to_string(i)});
    for (int i = 0; i < 20; ++i) view.keys.push_back("key " + std::to_string(i));
    return view;
}

TEST(SearchScreen, FitsAnyWindow)
{
    SearchView view = fullView();
    view.text = "東京タワー " + std::string(300, 'x') + "éé";
    for (view.cursor = 0; view.cursor <= view.text.size(); view.cursor += view.text.size() / 4)
        for (int columns = 1; columns < 100; columns += 3)
            for (int rows = 1; rows < 40; ++rows) {
                const ScreenFrame frame = layOut(view, {columns, rows});
                ASSERT_LE(frame.lines.size(), static_cast<std::size_t>(rows)) << columns << "×" << rows;
                ASSERT_TRUE(frame.cursorColumn >= 0 && frame.cursorColumn < columns) << columns << "×" << rows;
                for (const ScreenLine& line : frame.lines)
                    ASSERT_LE(columnsOf(line.text), columns) << columns << "×" << rows << " " << line.text;
            }
    EXPECT_EQ(layOut({}, {0, 0}).lines.size(), 1u);
}

TEST(SearchScreen, ShowsTheNewestKeysAndAsMuchOfTheAnswerAsFits)
{
    const auto row = [](const ScreenFrame& frame, int number) {
        return frame.lines.at(static_cast<std::size_t>(number)).text;
    };
    const ScreenFrame frame = layOut(fullView(), {80, 24});
    ASSERT_EQ(frame.lines.size(), 24u);
    EXPECT_EQ(row(frame, 0), "Search: weather");
    EXPECT_EQ(frame.cursorColumn, 15);
    EXPECT_EQ(row(frame, 2), "result 0");
    EXPECT_EQ(row(frame, 15), "  … 27 more lines");
    EXPECT_EQ(row(frame, 17), "key 14");
    EXPECT_EQ(row(frame, 22), "key 19");
    EXPECT_THAT(row(frame, 23), HasSubstr("Ctrl-C"));

    SearchView scrolled = fullView();
    scrolled.scrolled = scrolled.answer.size() - answerRows(scrolled.keys.size(), {80, 24});
    EXPECT_EQ(row(layOut(scrolled, {80, 24}), 15), "result 39") << "the last line of all";

    EXPECT_EQ(layOut(fullView(), {80, 1}).lines.size(), 1u);
    EXPECT_EQ(row(layOut(fullView(), {80, 2}), 1), "  … 40 more lines");
    const std::string bytes = drawn(layOut(fullView(), {80, 24}), false);
    EXPECT_EQ(bytes.find('\n'), std::string::npos) << "a line end at the bottom scrolls";
    EXPECT_THAT(bytes, HasSubstr("\033[1;16H"));
    EXPECT_THAT(bytes, AllOf(HasSubstr("\033[24;1H\033[K"), Not(HasSubstr("\033[J"))))
        << "clearing behind a full line takes its last character";
}

TEST(SearchScreen, MarksWhereAnswersCameFrom)
{
    Exchange exchange;
    exchange.query = "wea";
    EXPECT_THAT(keyLine(exchange), HasSubstr("…")) << "under way";

    auto reply = std::make_shared<TAVReply>();
    reply->rawResponse =
        platform::Bytes(std::string(R"([{"results": [{"title": "We\u001b[2J", "section_name": "A"}]}])"));
    exchange.answer = TAVAnswer{1, reply, std::nullopt};
    exchange.latency = 12.34;
    EXPECT_EQ(mark(exchange), "answered") << "a reply that isn't verbose doesn't tell";
    reply->httpRequest = std::make_shared<TAVHTTPRequest>();
    EXPECT_THAT(keyLine(exchange), testing::AllOf(HasSubstr("cache"), HasSubstr("12.3 ms"), HasSubstr("1 result")));
    EXPECT_EQ(describe(exchange)["source"], platform::Value("cache"));
    reply->httpResponse = std::make_shared<TAVHTTPResponse>();
    EXPECT_THAT(keyLine(exchange), HasSubstr("network"));
    EXPECT_EQ(answerLines(exchange), (std::vector<ScreenLine>{{"A", ScreenLine::Style::Bold}, {"  We [2J"}}))
        << "drives no terminal";

    exchange.answer->reply = nullptr;
    exchange.skipReason = "shorter than the bag's minimum of 4";
    EXPECT_THAT(keyLine(exchange), testing::AllOf(HasSubstr("skipped"), HasSubstr("minimum")));
    EXPECT_EQ(answerLines(exchange).front().text, exchange.skipReason);
}

} // namespace
} // namespace tavrin::ctl
