// Aligned columns.
#include "table.h"

#include <gtest/gtest.h>

namespace {

std::string printed(const Table &table) {
  testing::internal::CaptureStdout();
  table.print();
  return testing::internal::GetCapturedStdout();
}

TEST(CtlTable, AlignsColumnsAndEndsLinesWithoutBlanks) {
  Table table({"A", "LONG", "B"});
  table.add({"first", "x", ""});
  table.add({"y", "", "z"});
  EXPECT_EQ(printed(table), "A      LONG  B\nfirst  x\ny            z\n");
}

TEST(CtlTable, CountsCharactersNotBytes) {
  Table table({"A", "B"});
  table.add({"\xC3\xA9", "x"});
  EXPECT_EQ(printed(table), "A  B\n\xC3\xA9  x\n");
}

TEST(CtlTable, PrintsNothingWithoutRows) {
  const Table table({"A", "B"});
  EXPECT_TRUE(table.isEmpty());
  EXPECT_EQ(printed(table), "");
}

TEST(CtlTable, MissingCellsAreEmpty) {
  Table table({"A", "B"});
  table.add({"x"});
  EXPECT_FALSE(table.isEmpty());
  EXPECT_EQ(printed(table), "A  B\nx\n");
}

} // namespace
