#include "lint/subject.h"

#include <filesystem>

#include "checksums.h"
#include "judgement.h"
#include "temporaryfolder.h"
#include "text.h"

namespace {

/// Findings of one rule on one patch that are told in full.
constexpr std::size_t MostTold = 20;
constexpr std::chrono::minutes TarLimit{10};
constexpr const char *SystemPath = "/usr/sbin:/usr/bin:/sbin:/bin";

std::string folderOf(const std::string &path) {
  const std::size_t slash = path.rfind('/');
  return slash == std::string::npos ? "." : path.substr(0, slash + 1);
}

std::string absolute(const std::string &path) {
  std::error_code error;
  const std::string result = std::filesystem::absolute(path, error);
  if (error)
    throw JudgementError("cannot find the current directory: " + error.message());
  return result;
}

/// An archive that claims to be larger than the file system is not tried: that would fill it.
void requireSpace(const Patch &patch, const std::string &folder) {
  std::error_code error;
  const std::filesystem::space_info space = std::filesystem::space(folder, error);
  std::uintmax_t needed = 0;
  for (const Member &member : patch.members)
    needed += static_cast<std::uintmax_t>(member.size > 0 ? member.size : 0);
  if (!error && needed > space.available)
    throw JudgementError("no room in " + folder + " to unpack " + patch.path + ": it needs " +
                         std::to_string(needed) + " bytes");
}

/// Runs tar as the installer does, in a folder that goes again.
ChildResult tryTar(const Patch &patch) {
  const TemporaryFolder folder;
  requireSpace(patch, folder.path());
  const ChildResult tar =
      runChild({"tar", "-xf", absolute(patch.path)}, {SystemPath, {"LC_ALL=C"}, folder.path(), TarLimit});
  if (tar.status == 127)
    throw JudgementError("cannot run tar: " + tar.err);
  return tar;
}

void readChecksums(Subject &subject) {
  const std::string list = folderOf(subject.patch.path) + "/SHA256SUMS";
  subject.hasChecksumList = std::filesystem::exists(std::filesystem::symlink_status(list));
  subject.listedChecksum = listedChecksum(list, subject.patch.file);
  if (!subject.listedChecksum.empty())
    subject.checksum = sha256OfFile(subject.patch.path);
}

} // namespace

Subject examine(const std::string &path, bool isInDirectory) {
  Patch patch = readPatch(path);
  Subject subject{std::move(patch), isInDirectory, {}, {}, false, "", "", {}};
  subject.ini = readIniText(subject.patch.descriptorText);
  subject.tar = tryTar(subject.patch);
  readChecksums(subject);
  for (const Member &member : subject.patch.members)
    subject.byPath[relativePath(member.name)] = &member;
  return subject;
}

Finder::Finder(const Rule &rule, std::string patch, FindingList &findings)
    : rule_(rule), patch_(std::move(patch)), findings_(findings) {}

Finder::~Finder() {
  if (count_ > MostTold)
    findings_.push_back({rule_.name, rule_.severity, patch_, "",
                         "and " + std::to_string(count_ - MostTold) + " more of these", rule_.remedy});
}

void Finder::operator()(const std::string &where, const std::string &text) {
  if (++count_ <= MostTold)
    of(patch_, where, text);
}

void Finder::of(const std::string &patch, const std::string &where, const std::string &text) {
  findings_.push_back({rule_.name, rule_.severity, patch, where, text, rule_.remedy});
}

std::string atLine(std::size_t line) {
  return "patch.ini:" + std::to_string(line);
}

bool isUpdated(const std::string &relativePath) {
  static const std::string root = "updated_files";
  return relativePath.compare(0, root.size(), root) == 0 &&
         (relativePath.size() == root.size() || relativePath[root.size()] == '/');
}
