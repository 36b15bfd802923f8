#include "verification.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <map>
#include <memory>

#include <fcntl.h>
#include <nlohmann/json.hpp>
#include <sys/stat.h>
#include <unistd.h>

#include "filedescriptor.h"
#include "history.h"
#include "judgement.h"
#include "packages.h"
#include "patchprocessor/patchprocessor.h"
#include "text.h"
#include "updatedfiles.h"
#include "utilities.h"

namespace {

constexpr std::size_t BlockSize = 64 * 1024;

const char *typeName(mode_t mode) {
  if (S_ISREG(mode))
    return "a file";
  if (S_ISDIR(mode))
    return "a directory";
  return S_ISLNK(mode) ? "a symbolic link" : "a special file";
}

bool isOfType(Member::Type type, mode_t mode) {
  switch (type) {
  case Member::Type::File:
  case Member::Type::HardLink:
    return S_ISREG(mode);
  case Member::Type::Directory:
    return S_ISDIR(mode);
  case Member::Type::SymbolicLink:
    return S_ISLNK(mode);
  default:
    return !S_ISREG(mode) && !S_ISDIR(mode) && !S_ISLNK(mode);
  }
}

const char *typeName(Member::Type type) {
  switch (type) {
  case Member::Type::File:
  case Member::Type::HardLink:
    return "a file";
  case Member::Type::Directory:
    return "a directory";
  case Member::Type::SymbolicLink:
    return "a symbolic link";
  default:
    return "a special file";
  }
}

[[noreturn]] void cannotRead(const std::string &path, int error) {
  throw JudgementError("cannot read " + path + ": " + strerror(error));
}

/// Looks at a name of the home; false when nothing is there. A directory may also be a link to one: the
/// installer takes it as it is.
bool lookAt(const std::string &path, Member::Type type, struct stat &status) {
  const int result =
      type == Member::Type::Directory ? stat(path.c_str(), &status) : lstat(path.c_str(), &status);
  if (result == 0)
    return true;
  if (errno != ENOENT && errno != ENOTDIR && errno != ELOOP)
    cannotRead(path, errno);
  return false;
}

std::string linkTarget(const std::string &path) {
  std::array<char, 4096> buffer = {};
  const ssize_t length = readlink(path.c_str(), buffer.data(), buffer.size());
  return length < 0 ? "" : std::string(buffer.data(), static_cast<std::size_t>(length));
}

/// Fills `buffer` from the file as far as it goes.
std::size_t readBlock(const FileDescriptor &file, char *buffer, std::size_t size, const std::string &path) {
  std::size_t filled = 0;
  while (filled < size) {
    const ssize_t count = file.read(buffer + filled, size - filled);
    if (count < 0)
      cannotRead(path, errno);
    if (count == 0)
      break;
    filled += static_cast<std::size_t>(count);
  }
  return filled;
}

/// A file of the home beside a member of the archive that is being read.
class Candidate {
public:
  explicit Candidate(const std::string &path)
      : path_(path), file_(std::make_unique<FileDescriptor>(path.c_str(), O_RDONLY | O_NOFOLLOW)) {
    if (!file_->isOpen())
      cannotRead(path, errno);
  }

  /// Compares the next block of the member, an empty one at its end, with the file's.
  void compare(const char *block, std::size_t size) {
    if (!same_)
      return;
    std::array<char, BlockSize> found; // NOLINT(cppcoreguidelines-pro-type-member-init): filled by the read
    const std::size_t there = readBlock(*file_, found.data(), size == 0 ? 1 : size, path_);
    same_ = there == size && memcmp(block, found.data(), size) == 0;
  }
  bool isSame() const { return same_; }

private:
  std::string path_;
  std::unique_ptr<FileDescriptor> file_;
  bool same_ = true;
};

/// Reads the current member of the archive to its end beside the candidates.
void compareContent(ArchiveReader &reader, std::vector<Candidate> &candidates) {
  std::array<char, BlockSize> block; // NOLINT(cppcoreguidelines-pro-type-member-init): filled by the read
  std::size_t size = 0;
  do {
    size = reader.read(block.data(), block.size());
    if (!reader.problem().empty())
      throw JudgementError("the archive cannot be read: " + reader.problem());
    for (Candidate &candidate : candidates)
      candidate.compare(block.data(), size);
  } while (size != 0);
}

const char *const otherContent = "not the content that the archive has";

/// One comparison of an archive with a home.
class Comparison {
public:
  Comparison(const std::string &home, const Patch &patch, Verification &verification)
      : home_(home), patch_(patch), installed_(updatedFiles(patch.members)), verification_(verification) {}

  void run(std::set<std::string> &covered) {
    ArchiveReader reader(patch_.path);
    Member member;
    for (std::size_t i = 0; reader.next(member); ++i) {
      const std::string path = updatedFilePath(member.name);
      const auto last = installed_.find(path);
      if (last != installed_.end() && last->second == i && covered.insert(path).second)
        compare(path, member, reader);
    }
    if (!reader.problem().empty())
      throw JudgementError(patch_.file + ": " + reader.problem());
    if (!hardLinks_.empty())
      compareHardLinks();
  }

private:
  void add(const std::string &path, const char *kind, const std::string &text) {
    verification_.add(path, kind, text);
  }

  void compare(const std::string &path, const Member &member, ArchiveReader &reader) {
    const std::string target = home_ + path;
    if (member.type != Member::Type::Directory)
      ++verification_.files;
    struct stat status = {};
    if (!lookAt(target, member.type, status))
      return add(path, "missing", "not in the home");
    if (!isOfType(member.type, status.st_mode))
      return add(path, "type",
                 std::string("the archive has ") + typeName(member.type) + ", the home " +
                     typeName(status.st_mode));
    if (member.type == Member::Type::SymbolicLink && linkTarget(target) != member.linkTarget)
      add(path, "content",
          "the link leads to " + linkTarget(target) + ", in the archive to " + member.linkTarget);
    else if (member.type == Member::Type::HardLink)
      hardLinks_[member.linkTarget].push_back(path);
    else if (member.type == Member::Type::File && !isSame(target, status, member, reader))
      add(path, "content", otherContent);
  }

  static bool isSame(const std::string &target, const struct stat &status, const Member &member,
                     ArchiveReader &reader) {
    if (status.st_size != member.size)
      return false;
    std::vector<Candidate> candidates;
    candidates.emplace_back(target);
    compareContent(reader, candidates);
    return candidates.front().isSame();
  }

  /// A hard link of the archive has no content of its own: the member that it names is read once more.
  void compareHardLinks() {
    ArchiveReader reader(patch_.path);
    Member member;
    while (reader.next(member)) {
      const auto links = hardLinks_.find(member.name);
      if (links == hardLinks_.end() || member.type != Member::Type::File)
        continue;
      compareLinks(links->second, reader);
      hardLinks_.erase(links);
    }
    for (const auto &[name, paths] : hardLinks_)
      for (const std::string &path : paths)
        add(path, "content", "a hard link to " + name + ", which the archive does not have");
  }

  void compareLinks(const std::vector<std::string> &paths, ArchiveReader &reader) {
    std::vector<Candidate> candidates;
    for (const std::string &path : paths)
      candidates.emplace_back(home_ + path);
    compareContent(reader, candidates);
    for (std::size_t i = 0; i < paths.size(); ++i)
      if (!candidates[i].isSame())
        add(paths[i], "content", otherContent);
  }

  const std::string &home_;
  const Patch &patch_;
  const std::map<std::string, std::size_t> installed_;
  Verification &verification_;
  std::map<std::string, std::vector<std::string>> hardLinks_; ///< member -> paths that are links to it
};

} // namespace

void verifyFiles(const std::string &home, const Patch &patch, std::set<std::string> &covered,
                 Verification &verification) {
  if (!patch.archiveProblem.empty())
    throw JudgementError(patch.file + ": " + patch.archiveProblem);
  // One that was cut between two members reads well to its end.
  if (!patch.hasEndMark)
    throw JudgementError(patch.file + ": the archive is incomplete: it has no end mark");
  Verification found;
  Comparison(home, patch, found).run(covered);
  std::sort(found.differences.begin(), found.differences.end(),
            [](const Difference &a, const Difference &b) { return a.path < b.path; });
  verification.append(found);
}

void verifyLevel(const std::string &home, const std::string &versionFile, const std::string &wanted,
                 Verification &verification) {
  std::vector<std::string> lines;
  const int error = Util::readFileByLines((home + versionFile).c_str(), lines);
  if (error == ENOENT || error == ENOTDIR)
    return verification.add(versionFile, "level", "there is no version file");
  if (error != 0)
    cannotRead(home + versionFile, error);
  std::size_t levels = 0;
  for (const std::string &line : lines) {
    if (line.rfind("VRMF", 0) != 0)
      continue;
    ++levels;
    std::string level = line.substr(line.find('=') == std::string::npos ? 0 : line.find('=') + 1);
    Util::trimString(level);
    if (level != Version(wanted).getVersionString())
      verification.add(versionFile, "level", "the level is " + level + ", the patch brings " + wanted);
  }
  if (levels == 0)
    verification.add(versionFile, "level", "the version file has no level");
}

void verifyHistory(const std::string &home, const HistoryName &patch, Verification &verification) {
  static const char file[] = "patchlogs/patches.hist";
  const std::vector<HistoryRecord> records = readHistory(home).records;
  // The history pads the name with blanks, so that blanks at its end cannot be told from padding.
  std::string name = patch.name;
  Util::trimString(name);
  const auto last = std::find_if(records.rbegin(), records.rend(), [&](const HistoryRecord &record) {
    return record.product == patch.product && record.platform == patch.platform &&
           record.target == patch.target && record.name == name;
  });
  if (last == records.rend())
    verification.add(file, "history", "no line for " + name);
  else if (last->result != "PASS")
    verification.add(file, "history", "the last line for " + name + " says " + last->result);
}

Verification verifyPatches(const Home &home, const std::vector<Patch> &patches) {
  std::vector<Verification> found(patches.size());
  std::set<std::string> covered;
  std::set<std::string> versionFiles;
  for (std::size_t i = patches.size(); i-- > 0;) {
    const Patch &patch = patches[i];
    const PatchDescriptor &descriptor = *patch.descriptor;
    verifyFiles(home.path(), patch, covered, found[i]);
    const std::string versionFile = versionFileOf(home, patch).substr(home.path().size());
    if (versionFiles.insert(versionFile).second)
      verifyLevel(home.path(), versionFile, descriptor.getVersion()->getDottedVersionString(), found[i]);
    verifyHistory(home.path(),
                  {descriptor.getProductCode(), patch.name.getFullPlatform(), patch.name.getTarget(),
                   descriptor.getPatchName()},
                  found[i]);
  }
  Verification all;
  for (const Verification &one : found)
    all.append(one);
  return all;
}

nlohmann::ordered_json toJson(const Verification &verification) {
  nlohmann::ordered_json differences = nlohmann::ordered_json::array();
  for (const Difference &difference : verification.differences)
    differences.push_back({{"path", jsonText(difference.path)},
                           {"kind", difference.kind},
                           {"text", jsonText(difference.text)}});
  return {{"differences", differences}, {"files", verification.files}};
}
