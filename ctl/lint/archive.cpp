// The archive as a whole: can it be read, does tar take it, is it the one that was checked in.
#include <algorithm>

#include "lint/rules.h"
#include "lint/subject.h"
#include "text.h"

namespace {

/// As much as an ordinary user's pipe holds at most.
constexpr std::size_t MostOutput = std::size_t{1024} * 1024;

bool isTooLoud(const ChildResult &tar) {
  return tar.out.size() > MostOutput || tar.err.size() > MostOutput;
}

bool isNoArchive(const Patch &patch) {
  return patch.members.empty() && !patch.archiveProblem.empty();
}

std::string firstLine(const std::string &text) {
  return text.substr(0, text.find('\n'));
}

/// What the top of the archive has in place of the descriptor.
std::string placeOfDescriptor(const Subject &subject) {
  for (const Member &member : subject.patch.members)
    if (relativePath(member.name) == "patch.ini" && member.type == Member::Type::File)
      return "the descriptor is named \"" + member.name + R"(", not "patch.ini")";
  return subject.byPath.count("patch.ini") != 0 ? "the member patch.ini is no file" : "no member patch.ini";
}

} // namespace

void noDescriptor(const Subject &subject, Finder &found) {
  if (!subject.patch.hasDescriptor && !isNoArchive(subject.patch))
    found("", placeOfDescriptor(subject));
}

void descriptorInvalid(const Subject &subject, Finder &found) {
  if (subject.patch.hasDescriptor && subject.patch.descriptor == nullptr)
    found("patch.ini", subject.patch.descriptorError.text);
}

void incompleteArchive(const Subject &subject, Finder &found) {
  const Patch &patch = subject.patch;
  if (isNoArchive(patch))
    return;
  if (!patch.archiveProblem.empty())
    found("", "the archive cannot be read to its end: " + patch.archiveProblem);
  else if (!patch.hasEndMark)
    found("", patch.members.empty() ? "the archive is empty"
                                    : "the archive is cut off behind \"" + patch.members.back().name +
                                          "\": it has no end mark");
}

void tarFails(const Subject &subject, Finder &found) {
  const Patch &patch = subject.patch;
  if (!subject.tar.isInTime) {
    found("", "tar -xf had not ended after ten minutes");
    return;
  }
  const bool isExplained = (!patch.archiveProblem.empty() && !patch.members.empty()) ||
                           std::any_of(patch.members.begin(), patch.members.end(), explainsTar);
  if (subject.tar.status != 0 && !isExplained)
    found("", "tar -xf ends with status " + std::to_string(subject.tar.status) + ": " +
                  firstLine(subject.tar.err));
}

void tarTooLoud(const Subject &subject, Finder &found) {
  if (isTooLoud(subject.tar))
    found("", "tar -xf writes " + std::to_string(std::max(subject.tar.out.size(), subject.tar.err.size())) +
                  " bytes of messages, such as: " + firstLine(subject.tar.err + subject.tar.out));
}

void checksumDiffers(const Subject &subject, Finder &found) {
  if (subject.listedChecksum != subject.checksum)
    found("SHA256SUMS", "the list has " + subject.listedChecksum + ", the file " + subject.checksum);
}

void noChecksum(const Subject &subject, Finder &found) {
  if (subject.hasChecksumList && subject.listedChecksum.empty())
    found("SHA256SUMS", "the list of the folder does not name the patch");
}
