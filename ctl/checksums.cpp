#include "checksums.h"

#include <fstream>

#include "child.h"
#include "judgement.h"
#include "utilities.h"

namespace {

constexpr std::size_t DigestLength = 64;

bool isDigest(const std::string &text) {
  return text.size() == DigestLength && text.find_first_not_of("0123456789abcdef") == std::string::npos;
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
  std::ifstream file(list, std::ios::binary);
  for (std::string line; std::getline(file, line);) {
    const std::string digest = Util::toLower(line.substr(0, DigestLength));
    // Two blanks, or a blank and an asterisk for what was read as binary.
    const bool isEntry = isDigest(digest) && line.size() > DigestLength + 2 && line[DigestLength] == ' ' &&
                         (line[DigestLength + 1] == ' ' || line[DigestLength + 1] == '*');
    if (isEntry && line.substr(DigestLength + 2) == fileName)
      return digest;
  }
  return "";
}
