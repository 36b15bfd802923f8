#include "checksums.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <vector>

#include "child.h"
#include "judgement.h"
#include "utilities.h"

namespace {

constexpr std::size_t DigestLength = 64;

bool isDigest(const std::string &text) {
  return text.size() == DigestLength && text.find_first_not_of("0123456789abcdef") == std::string::npos;
}

/// Two blanks, or a blank and an asterisk for what was read as binary, stand behind the digest.
bool isEntryOf(const std::string &line, const std::string &fileName) {
  return line.size() > DigestLength + 2 && isDigest(Util::toLower(line.substr(0, DigestLength))) &&
         line[DigestLength] == ' ' && (line[DigestLength + 1] == ' ' || line[DigestLength + 1] == '*') &&
         line.substr(DigestLength + 2) == fileName;
}

/// None of a list that does not exist.
std::vector<std::string> linesOf(const std::string &list) {
  std::ifstream file(list, std::ios::binary);
  if (!file && errno != ENOENT)
    throw JudgementError("cannot read " + list + ": " + strerror(errno));
  std::vector<std::string> lines;
  for (std::string line; std::getline(file, line);)
    lines.push_back(line);
  if (file.bad())
    throw JudgementError("cannot read " + list);
  return lines;
}

} // namespace

std::string sha256OfFile(const std::string &path) {
  // The program marks a name with odd characters by a backslash in front of the digest.
  const ChildResult sum = runChild({"sha256sum", "--", path}, {"/usr/bin:/bin", {"LC_ALL=C"}});
  const std::size_t start = sum.out.rfind('\\', 0) == 0 ? 1 : 0;
  const std::string digest = sum.out.substr(start, DigestLength);
  if (sum.status != 0 || !isDigest(digest))
    throw JudgementError("no checksum of " + path + ": " + sum.err);
  return digest;
}

std::string listedChecksum(const std::string &list, const std::string &fileName) {
  for (const std::string &line : linesOf(list))
    if (isEntryOf(line, fileName))
      return Util::toLower(line.substr(0, DigestLength));
  return "";
}

std::string checksumListWith(const std::string &list, const std::string &fileName,
                             const std::string &digest) {
  std::string text;
  for (const std::string &line : linesOf(list))
    if (!isEntryOf(line, fileName))
      text += line + "\n";
  return text + digest + "  " + fileName + "\n";
}
