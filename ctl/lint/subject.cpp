#include "lint/subject.h"

#include <filesystem>

#include "checksums.h"
#include "lint/trial.h"
#include "text.h"

namespace {

/// Findings of one rule on one patch that are told in full.
constexpr std::size_t MostTold = 20;

std::string folderOf(const std::string &path) {
  const std::size_t slash = path.rfind('/');
  return slash == std::string::npos ? "." : path.substr(0, slash + 1);
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
