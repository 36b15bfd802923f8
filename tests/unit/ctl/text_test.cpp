// Byte strings made printable.
#include "text.h"

#include <gtest/gtest.h>

namespace {

TEST(CtlText, WellFormedUtf8Stays) {
  EXPECT_EQ(jsonText("plain"), "plain");
  EXPECT_EQ(jsonText("\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80"), "\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80");
}

TEST(CtlText, BytesThatAreNoUtf8AreWrittenInHex) {
  EXPECT_EQ(jsonText("a\xFFz"), "a\\xFFz");
  EXPECT_EQ(jsonText("\xC3"), "\\xC3");                            // cut
  EXPECT_EQ(jsonText("\xC0\xAF"), "\\xC0\\xAF");                   // overlong
  EXPECT_EQ(jsonText("\xED\xA0\x80"), "\\xED\\xA0\\x80");          // a surrogate
  EXPECT_EQ(jsonText("\xF4\x90\x80\x80"), "\\xF4\\x90\\x80\\x80"); // beyond the last character
}

TEST(CtlText, BackslashIsDoubled) {
  EXPECT_EQ(jsonText("a\\xFF"), "a\\\\xFF");
}

TEST(CtlText, EveryByteComesBack) {
  std::string bytes;
  for (int byte = 0; byte < 256; ++byte)
    bytes += static_cast<char>(byte);
  bytes += "\xC3\xA9\\x41\\";
  EXPECT_EQ(bytesOfJsonText(jsonText(bytes)), bytes);
}

TEST(CtlText, TerminalTextHasNoControlCharacters) {
  EXPECT_EQ(terminalText("a\x1b[31m\n\x7f"), "a\\x1B[31m\\x0A\\x7F");
  EXPECT_EQ(jsonText("\t"), "\t");
}

TEST(CtlText, RelativePathsLoseDotsAndSlashes) {
  EXPECT_EQ(relativePath("./updated_files//bin/./tool"), "updated_files/bin/tool");
  EXPECT_EQ(relativePath("/abs/x/"), "abs/x");
  EXPECT_EQ(relativePath("./"), "");
}

TEST(CtlText, TimesAreUtcAndModesOctal) {
  EXPECT_EQ(utcTime(0), "1970-01-01T00:00:00Z");
  EXPECT_EQ(utcTime(1173131324), "2007-03-05T21:48:44Z");
  EXPECT_EQ(octalMode(0755), "0755");
  EXPECT_EQ(octalMode(0106755), "6755");
}

} // namespace
