// The reader of archives: any bytes are an archive, perhaps one without members and with a problem.
#include "fuzz.h"

#include <algorithm>

#include "judgement.h"
#include "patcharchive.h"

namespace {

/// What a hostile archive may unpack to; nothing beyond is read.
constexpr std::size_t MostRead = 1024 * 1024;

void checkMember(ArchiveReader &reader, const Member &member) {
  REQUIRE(member.name.find('\0') == std::string::npos);
  REQUIRE(member.mode <= 07777);
  const bool isLink = member.type == Member::Type::SymbolicLink || member.type == Member::Type::HardLink;
  REQUIRE(isLink || member.linkTarget.empty());
  const std::string content = reader.content(MostRead);
  REQUIRE(content.size() <= MostRead);
  if (member.type == Member::Type::File && reader.problem().empty() && content.size() < MostRead)
    REQUIRE(static_cast<std::int64_t>(content.size()) == member.size);
}

void readAll(const std::string &path, std::size_t &count) {
  ArchiveReader reader(path);
  Member member;
  while (reader.next(member)) {
    checkMember(reader, member);
    ++count;
  }
  REQUIRE(!reader.next(member)); // the end stays the end
  if (reader.problem().empty())
    static_cast<void>(reader.hasEndMark());
}

} // namespace

void check(const std::string &input) {
  static const fuzz::TextFile file;
  file.write(input);
  std::size_t count = 0;
  try {
    readAll(file.path(), count);
    const Listing listing = listArchive(file.path());
    REQUIRE(listing.members.size() == count || !listing.problem.empty());
  } catch (const JudgementError &) {
    REQUIRE(false && "a file that can be read is never beyond judgement");
  }
}
