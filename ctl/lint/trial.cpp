#include "lint/trial.h"

#include <algorithm>
#include <ctime>
#include <filesystem>
#include <set>

#include "judgement.h"
#include "temporaryfolder.h"
#include "text.h"

namespace {

constexpr std::chrono::minutes TarLimit{10};
constexpr const char *SystemPath = "/usr/sbin:/usr/bin:/sbin:/bin";
constexpr std::size_t LongestName = 255; ///< of a component: no longer path is plain

std::string absolute(const std::string &path) {
  std::error_code error;
  const std::string result = std::filesystem::absolute(path, error);
  if (error)
    throw JudgementError("cannot find the current directory: " + error.message());
  return result;
}

std::uintmax_t sizeOf(const Patch &patch) {
  std::uintmax_t size = 0;
  for (const Member &member : patch.members)
    size += static_cast<std::uintmax_t>(std::max<std::int64_t>(member.size, 0));
  return size;
}

/// An archive that claims to be larger than the file system is not tried: that would fill it.
void requireSpace(const Patch &patch, const std::string &folder) {
  std::error_code error;
  const std::filesystem::space_info space = std::filesystem::space(folder, error);
  const std::uintmax_t needed = sizeOf(patch);
  if (!error && needed > space.available)
    throw JudgementError("no room in " + folder + " to unpack " + patch.path + ": it needs " +
                         std::to_string(needed) + " bytes");
}

/// Files and directories whose names, modes and times tar takes without a word.
bool isPlain(const Member &member, std::time_t now) {
  const bool isOpen = member.type == Member::Type::Directory && (member.mode & 0700U) == 0700U;
  return (member.type == Member::Type::File || isOpen) && member.name.size() <= LongestName &&
         member.name.compare(0, 1, "/") != 0 && ("/" + member.name + "/").find("/../") == std::string::npos &&
         member.time >= 0 && member.time <= now;
}

/// Whether no member stands in the way of another one: each has a path of its own, none lies below a file.
bool areApart(const std::vector<Member> &members) {
  std::set<std::string> paths;
  std::set<std::string> files;
  for (const Member &member : members) {
    const std::string path = relativePath(member.name);
    if (!paths.insert(path).second)
      return false;
    if (member.type == Member::Type::File)
      files.insert(path);
  }
  return std::all_of(paths.begin(), paths.end(), [&files](const std::string &path) {
    for (std::size_t slash = path.find('/'); slash != std::string::npos; slash = path.find('/', slash + 1))
      if (files.count(path.substr(0, slash)) != 0)
        return false;
    return true;
  });
}

/// Whether tar can say nothing while it writes that it does not say while it reads. An archive whose members
/// are larger than itself is compressed or has holes, and could be of any size.
bool isPlain(const Patch &patch) {
  std::error_code error;
  const std::uintmax_t size = std::filesystem::file_size(patch.path, error);
  const std::time_t now = std::time(nullptr);
  return !error && patch.archiveProblem.empty() && patch.hasEndMark && sizeOf(patch) <= size &&
         std::all_of(patch.members.begin(), patch.members.end(),
                     [now](const Member &member) { return isPlain(member, now); }) &&
         areApart(patch.members);
}

} // namespace

ChildResult tryTar(const Patch &patch) {
  const TemporaryFolder folder;
  std::vector<std::string> words = {"tar", "-xf", absolute(patch.path)};
  // Ten thousand files that are made and removed cost more than all else, also for the installation that
  // comes next: some file systems do not use a place again soon.
  if (isPlain(patch))
    words = {"sh", "-c", "exec tar -xOf \"$1\" >/dev/null", "sh", words.back()};
  else
    requireSpace(patch, folder.path());
  const ChildResult tar = runChild(words, {SystemPath, {"LC_ALL=C"}, folder.path(), TarLimit});
  if (tar.status == 127)
    throw JudgementError("cannot run tar: " + tar.err);
  return tar;
}
