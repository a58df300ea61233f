#include "cli/TextTable.h"

#include <gtest/gtest.h>
#include <sstream>

namespace vela {
namespace {

std::string printed(const TextTable& table, bool colour) {
    std::ostringstream out;
    table.print(out, colour);
    return out.str();
}

TEST(TextTableTest, ColumnsAreAsWideAsTheirWidestCell) {
    TextTable table({"KEY", "VALUE", "FROM"});
    table.add({"a", "a long value", "x"});
    table.add({"longer", "b", "y"});
    EXPECT_EQ(printed(table, false), "KEY     VALUE         FROM\n"
                                     "a       a long value  x\n"
                                     "longer  b             y\n");
}

TEST(TextTableTest, NoLineEndsInBlanks) {
    TextTable table({"KEY", "VALUE"});
    table.add({"a", "long value"});
    EXPECT_EQ(printed(table, false), "KEY  VALUE\na    long value\n");
}

TEST(TextTableTest, CharactersCountAndNotBytes) {
    TextTable table({"K", "V"});
    table.add({"\xc3\xbc\xc3\xbc", "x"});
    EXPECT_EQ(printed(table, false), "K   V\n\xc3\xbc\xc3\xbc  x\n");
}

TEST(TextTableTest, ColourMarksTheHeadingsAndDimRows) {
    TextTable table({"K", "V"});
    table.add({"a", "1"});
    table.add({"b", "2"}, true);
    EXPECT_EQ(printed(table, true), "\033[1mK  V\033[0m\na  1\n\033[2mb  2\033[0m\n");
    EXPECT_EQ(printed(table, false), "K  V\na  1\nb  2\n");
}

TEST(TextTableTest, ATableWithoutRowsHasItsHeadings) { EXPECT_EQ(printed(TextTable({"A", "B"}), false), "A  B\n"); }

TEST(TextTableTest, PagesHaveTheHeadingsOnceAndTheWidthsOfTheFirst) {
    TextTable table({"SEQ", "NAME", "X"});
    std::ostringstream out;
    table.add({"9", "longer", "x"});
    table.printPage(out, false);
    EXPECT_EQ(out.str(), "SEQ  NAME    X\n9    longer  x\n");
    out.str("");
    table.add({"10", "a", "y"});
    table.add({"1000", "longest", "z"});
    table.printPage(out, false);
    EXPECT_EQ(out.str(), "10   a       y\n1000  longest  z\n");
}

TEST(TextTableTest, APageWithoutNewRowsIsNothingButTheFirst) {
    TextTable table({"A", "B"});
    std::ostringstream out;
    table.printPage(out, false);
    table.printPage(out, false);
    EXPECT_EQ(out.str(), "A  B\n");
}

TEST(TextTableTest, ColourMarksTheHeadingsAndDimRowsOfPages) {
    TextTable table({"K", "V"});
    std::ostringstream out;
    table.add({"a", "1"});
    table.printPage(out, true);
    table.add({"b", "2"}, true);
    table.add({"c", "3"});
    table.printPage(out, true);
    EXPECT_EQ(out.str(), "\033[1mK  V\033[0m\na  1\n\033[2mb  2\033[0m\nc  3\n");
}

} // namespace
} // namespace vela
