// The page of a record: what comes from outside is no markup.
#include "transaction/page.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using testing::HasSubstr;
using testing::Not;

Record recordWith(const std::string &text) {
  Record record;
  record.id = "20260309T140500Z-77";
  record.action = "apply";
  record.verdict = "failed";
  record.home = text;
  record.user = text;
  record.patches.push_back({text, "", text, text, text, text, text, text, text});
  record.findings.push_back({text, Severity::Error, text, text, text, text});
  record.steps.push_back({text, 1, text});
  record.files.push_back({text, std::nullopt, std::nullopt, ""});
  record.before.push_back({text, text, text, text});
  record.differences.push_back({text, text, text});
  record.messages.push_back(text);
  record.otherChanges.push_back(text);
  record.installer = {1, text, text};
  return record;
}

TEST(CtlPage, EscapesEveryText) {
  const std::string page = pageOf(recordWith("<b a=\"1\" c='2'>&\x1b\xff"));
  EXPECT_THAT(page, Not(HasSubstr("<b ")));
  EXPECT_THAT(page, Not(HasSubstr("a=\"1\"")));
  EXPECT_THAT(page, Not(HasSubstr("'2'")));
  EXPECT_THAT(page, HasSubstr("&lt;b a=&quot;1&quot; c=&#39;2&#39;&gt;&amp;\\x1B\\xFF"));
  EXPECT_EQ(page.find('\x1b'), std::string::npos);
}

TEST(CtlPage, ShowsCharactersThatTurnANameRound) {
  for (const char *turn : {"\xE2\x80\x8E", "\xE2\x80\xAA", "\xE2\x80\xAE", "\xE2\x81\xA6", "\xE2\x81\xA9"})
    EXPECT_THAT(pageOf(recordWith(std::string("a") + turn + "b")), Not(HasSubstr(turn)));
  EXPECT_THAT(pageOf(recordWith("a\xE2\x80\xAE"
                                "b")),
              HasSubstr("a\\xE2\\x80\\xAEb"));
  EXPECT_THAT(pageOf(recordWith("\xE2\x82\xAC \xE2\x80\x93")), HasSubstr("\xE2\x82\xAC \xE2\x80\x93"));
}

TEST(CtlPage, OfAnInstallationWithoutAnEndSaysSo) {
  Record record = recordWith("plain");
  record.verdict = "";
  EXPECT_THAT(pageOf(record), HasSubstr("<h1 class=\"bad\">interrupted</h1>"));
}

} // namespace
