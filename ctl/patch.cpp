#include "patch.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include <unistd.h>

#include "file.h"
#include "judgement.h"
#include "look.h"
#include "memoryfile.h"
#include "target.h"

namespace {

/// The installer reads a descriptor of any size that fits into memory; no honest one comes near this.
constexpr std::size_t LargestDescriptor = 16 * 1024 * 1024;

/// A file without a name, in memory alone, with a path under which it can be read.
class MemoryFile {
public:
  explicit MemoryFile(const std::string &content) : fd_(memoryFile("patch.ini")) {
    if (fd_ < 0 || ::write(fd_, content.data(), content.size()) != static_cast<ssize_t>(content.size())) {
      const int error = errno;
      close(fd_);
      throw JudgementError(std::string("no memory for patch.ini: ") + strerror(error));
    }
  }
  MemoryFile(const MemoryFile &) = delete;
  MemoryFile &operator=(const MemoryFile &) = delete;
  ~MemoryFile() { close(fd_); }

  std::string path() const { return "/proc/self/fd/" + std::to_string(fd_); }

private:
  int fd_;
};

std::size_t rankOf(const std::string &path) {
  return targetOrder(PatchFileName(File(path).getName()).getTarget());
}

/// tar extracts each member of that name in turn, so that the last one stays.
void readMembers(Patch &patch) {
  ArchiveReader reader(patch.path);
  Member member;
  while (reader.next(member)) {
    if (member.name == "patch.ini" && member.type == Member::Type::File) {
      patch.hasDescriptor = true;
      patch.descriptorText = reader.content(LargestDescriptor);
    }
    patch.members.push_back(member);
  }
  patch.archiveProblem = reader.problem();
  patch.hasEndMark = patch.archiveProblem.empty() && reader.hasEndMark();
}

} // namespace

Patch readPatch(const std::string &path) {
  const std::string file = File(path).getName();
  Patch patch{path, file, PatchFileName(file), {}, "", false, "", nullptr, {}, false};
  readMembers(patch);
  if (patch.hasDescriptor) {
    const MemoryFile descriptor(patch.descriptorText);
    patch.descriptor.reset(PatchDescriptor::parseFile(descriptor.path(), &patch.descriptorError));
    if (patch.descriptor == nullptr && patch.descriptorError.code == PatchError::CannotReadFile)
      throw JudgementError(patch.descriptorError.text); // the file in memory: no fault of the patch
  }
  return patch;
}

std::vector<std::string> patchFiles(const std::string &path) {
  const std::optional<struct stat> given = lookBehind(path);
  if (!given)
    throw JudgementError("cannot read " + path);
  if (!S_ISDIR(given->st_mode))
    return {path};
  const std::string top = path.back() == '/' ? path : path + "/";
  std::vector<std::string> files;
  listDirectory(path, [&](const std::string &name) {
    if (PatchFileName(name).isValid() && !isDirectory(top + name))
      files.push_back(top + name);
  });
  if (files.empty())
    throw JudgementError("no patch in " + path);
  std::stable_sort(files.begin(), files.end(),
                   [](const std::string &a, const std::string &b) { return rankOf(a) < rankOf(b); });
  return files;
}
