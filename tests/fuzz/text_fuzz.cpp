// The reader of lines, and the helpers for texts and paths: a path on the first line, any text below.
#include <cstdlib>
#include <cstring>

#include "file.h"
#include "fuzz.h"
#include "utilities.h"

namespace {

void checkReader(const std::string &content) {
  static const fuzz::TextFile file;
  file.write(content);
  char *buffer = nullptr;
  REQUIRE(Util::readFile(file.path().c_str(), &buffer) == 0);
  REQUIRE(memcmp(buffer, content.c_str(), content.size() + 1) == 0);
  free(buffer);
  std::vector<std::string> lines = {"what was there before"};
  REQUIRE(Util::readFileByLines(file.path().c_str(), lines) == 0);
  REQUIRE(lines == fuzz::lines(content));
  // Written back as the version file is, the lines are read again as they were, with one empty one behind.
  std::string rewritten;
  for (const std::string &line : lines)
    rewritten += line + "\n";
  const bool carriageReturns = fuzz::contains(content, "\r");
  file.write(rewritten);
  std::vector<std::string> again;
  REQUIRE(Util::readFileByLines(file.path().c_str(), again) == 0);
  if (lines.back().empty())
    REQUIRE(carriageReturns || again == lines);
  else
    REQUIRE(carriageReturns || again.size() == lines.size() + 1);
}

void checkTrimming(const std::string &text) {
  std::string once = text;
  Util::trimString(once);
  REQUIRE(once == fuzz::trimmed(text));
  std::string twice = once;
  Util::trimString(twice);
  REQUIRE(twice == once);
}

void checkTokens(const std::string &text, const char *delimiters) {
  const std::vector<std::string> tokens = Util::tokenizeString(text, delimiters);
  REQUIRE(tokens == fuzz::pieces(text, delimiters));
  for (const std::string &token : tokens)
    REQUIRE(!token.empty() && token.find_first_of(delimiters) == std::string::npos);
}

void checkCase(const std::string &text) {
  REQUIRE(Util::toLower(text) == fuzz::lower(text));
  REQUIRE(Util::toLower(Util::toLower(text)) == Util::toLower(text));
  REQUIRE(Util::normalizeProductCode(text) == fuzz::productCode(text));
}

void checkDots(const std::string &text) {
  const std::string without = Util::removeDotFromPath(text);
  const std::size_t dot = text.find("/./");
  REQUIRE(without == (dot == std::string::npos ? text : std::string(text).erase(dot, 2)));
}

void checkPath(const std::string &path) {
  const File file(path);
  const std::string name = file.getName();
  const std::string parent = file.getParentPath();
  const std::string shown = file.getPath();
  REQUIRE(!(file.isFile() && file.isDirectory()));
  REQUIRE(!file.exists() || file.isFile() || file.isDirectory());
  REQUIRE(file.isAbsolute() == fuzz::startsWith(path, "/"));
  if (file.isDirectory()) {
    REQUIRE(shown.back() == '/' && (shown == path || shown == path + "/"));
    const bool isOneName = shown.find('/') == shown.size() - 1;
    REQUIRE(isOneName ? name == shown && parent == shown : parent + name + "/" == shown);
  } else {
    REQUIRE(shown == path);
    const bool endsInSlash = !path.empty() && path.back() == '/';
    REQUIRE(endsInSlash ? name == path && parent == path : parent + name == path);
  }
  const std::string absolute = file.getAbsolutePath();
  REQUIRE(fuzz::startsWith(absolute, "/"));
  REQUIRE(absolute.size() >= shown.size() && absolute.substr(absolute.size() - shown.size()) == shown);
  REQUIRE(File(file).getPath() == shown);
}

} // namespace

void check(const std::string &input) {
  checkReader(input);
  std::string text = input;
  const std::string path = fuzz::upToNul(fuzz::takeLine(text));
  checkPath(path);
  checkDots(path);
  checkDots(text);
  checkTrimming(text);
  checkCase(text);
  for (const char *delimiters : {"\n", "_", ", ", "|", "/", "\n\r", " \t=.x"})
    checkTokens(text, delimiters);
}
