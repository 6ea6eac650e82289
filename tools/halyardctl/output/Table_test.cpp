#include "output/Table.h"

#include <algorithm>
#include <gtest/gtest.h>

namespace halyard::ctl {
namespace {

using Align = Table::Column::Align;

// The standard output of a test is no terminal.
std::string shown(const std::vector<std::vector<Cell>>& rows) {
    ::testing::internal::CaptureStdout();
    {
        Terminal terminal;
        Table table(terminal, {{"NAME", Align::Left, true}, {"N", Align::Right}, {"LAST"}});
        for (const auto& row : rows) {
            table.add(row);
        }
        table.finish("None.");
    }
    return ::testing::internal::GetCapturedStdout();
}

TEST(TableTest, ColumnsStandUnderTheirTitles) {
    EXPECT_EQ(shown({{"a", "1", "x"}, {"longer", "100", ""}}), "NAME      N  LAST\n"
                                                               "a         1  x\n"
                                                               "longer  100  -\n");
}

TEST(TableTest, NothingIsCutAndNothingColouredAwayFromATerminal) {
    const std::string text(500, 'x');
    EXPECT_TRUE(shown({{{text, Colour::Red}, "1", "x"}}).ends_with("\n" + text + "  1  x\n"));
}

TEST(TableTest, HostileTextTakesOneLine) {
    EXPECT_EQ(shown({{"a\n\x1b[31mb", "1", "x"}}), "NAME          N  LAST\n"
                                                   "a\\n\\x1b[31mb  1  x\n");
}

TEST(TableTest, WithoutRowsThereIsASentence) {
    EXPECT_EQ(shown({}), "None.\n");
}

TEST(TableTest, RowsBehindTheFirstGoThroughAtOnce) {
    std::vector<std::vector<Cell>> rows(1000, {"a", "1", "x"});
    rows.push_back({"a name wider than all before", "2", "y"});
    const std::string text = shown(rows);
    EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 1002);
    EXPECT_TRUE(text.ends_with("a name wider than all before  2  y\n"));
}

} // namespace
} // namespace halyard::ctl
