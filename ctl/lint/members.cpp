// Members: their names, types, modes, times and owners.
#include <algorithm>
#include <ctime>

#include "lint/rules.h"
#include "lint/subject.h"
#include "text.h"

namespace {

constexpr std::size_t LongestComponent = 255;
/// The system takes paths of 4,095 bytes; the rest is for the home and its temporary directory.
constexpr std::size_t LongestPath = 3800;
/// Clocks differ.
constexpr std::int64_t MostSecondsAhead = 60;

std::vector<std::string> componentsOf(const std::string &name) {
  std::vector<std::string> components;
  for (std::size_t start = 0; start <= name.size();) {
    const std::size_t end = std::min(name.find('/', start), name.size());
    components.push_back(name.substr(start, end - start));
    start = end + 1;
  }
  return components;
}

bool climbs(const std::string &name) {
  if (name.find("..") == std::string::npos)
    return false;
  const std::vector<std::string> components = componentsOf(name);
  return std::find(components.begin(), components.end(), "..") != components.end();
}

bool isLong(const std::string &name) {
  if (name.size() <= LongestComponent)
    return false;
  const std::vector<std::string> components = componentsOf(name);
  return name.size() > LongestPath ||
         std::any_of(components.begin(), components.end(),
                     [](const std::string &component) { return component.size() > LongestComponent; });
}

bool isUpdatedFile(const Member &member) {
  return member.type == Member::Type::File && isUpdated(relativePath(member.name));
}

bool isOdd(char c) {
  const auto byte = static_cast<unsigned char>(c);
  return byte <= ' ' || byte == 0x7F || c == '%';
}

/// Tells each member that the predicate holds for.
template <class Predicate, class Text>
void findMembers(const Subject &subject, Finder &found, Predicate predicate, Text textOf) {
  for (const Member &member : subject.patch.members)
    if (predicate(member))
      found(member.name, textOf(member));
}

auto type(Member::Type type) {
  return [type](const Member &member) { return member.type == type; };
}

auto saying(const char *text) {
  return [text](const Member &) { return text; };
}

} // namespace

bool explainsTar(const Member &member) {
  return member.type == Member::Type::HardLink || member.type == Member::Type::Special ||
         climbs(member.name) || isLong(member.name);
}

void linkMember(const Subject &subject, Finder &found) {
  findMembers(subject, found, type(Member::Type::SymbolicLink),
              [](const Member &member) { return "a symbolic link to \"" + member.linkTarget + "\""; });
}

void hardLinkMember(const Subject &subject, Finder &found) {
  findMembers(subject, found, type(Member::Type::HardLink),
              [](const Member &member) { return "a hard link to the member \"" + member.linkTarget + "\""; });
}

void specialMember(const Subject &subject, Finder &found) {
  findMembers(subject, found, type(Member::Type::Special), saying("neither a file nor a directory"));
}

void unsafeName(const Subject &subject, Finder &found) {
  findMembers(
      subject, found,
      [](const Member &member) { return climbs(member.name) || member.name.compare(0, 1, "/") == 0; },
      [](const Member &member) {
        return climbs(member.name) ? "the name climbs out of its directory" : "the name is absolute";
      });
}

void longName(const Subject &subject, Finder &found) {
  findMembers(
      subject, found, [](const Member &member) { return isLong(member.name); },
      [](const Member &member) {
        return "the name has " + std::to_string(member.name.size()) + " bytes, or one part has more than " +
               std::to_string(LongestComponent);
      });
}

void updatedFilesNoDirectory(const Subject &subject, Finder &found) {
  const auto tree = subject.byPath.find("updated_files");
  if (tree != subject.byPath.end() && tree->second->type == Member::Type::File)
    found(tree->second->name, "a file in place of the directory of new files");
}

void closedDirectory(const Subject &subject, Finder &found) {
  findMembers(
      subject, found,
      [](const Member &member) {
        return member.type == Member::Type::Directory && (member.mode & 0700U) != 0700U;
      },
      [](const Member &member) { return "its mode " + octalMode(member.mode) + " shuts out its owner"; });
}

void futureTime(const Subject &subject, Finder &found) {
  const std::int64_t latest = static_cast<std::int64_t>(time(nullptr)) + MostSecondsAhead;
  findMembers(
      subject, found,
      [latest](const Member &member) {
        return member.time > latest && member.type != Member::Type::SymbolicLink;
      },
      [](const Member &member) { return "its time is " + utcTime(member.time); });
}

void noUpdatedFiles(const Subject &subject, Finder &found) {
  const std::vector<Member> &members = subject.patch.members;
  const bool hasTree = std::any_of(members.begin(), members.end(),
                                   [](const Member &member) { return isUpdated(relativePath(member.name)); });
  if (!members.empty() && !hasTree)
    found("", "no directory updated_files");
}

void oddName(const Subject &subject, Finder &found) {
  findMembers(
      subject, found,
      [](const Member &member) { return std::any_of(member.name.begin(), member.name.end(), isOdd); },
      saying("the name has a blank, a control character or a \"%\""));
}

void setIdMember(const Subject &subject, Finder &found) {
  findMembers(
      subject, found,
      [](const Member &member) { return isUpdatedFile(member) && (member.mode & 06000U) != 0; },
      [](const Member &member) { return "its mode is " + octalMode(member.mode); });
}

void foreignOwner(const Subject &subject, Finder &found) {
  findMembers(
      subject, found,
      [](const Member &member) { return isUpdatedFile(member) && (member.user != 0 || member.group != 0); },
      [](const Member &member) {
        return "it belongs to user " + std::to_string(member.user) + " and group " +
               std::to_string(member.group);
      });
}
