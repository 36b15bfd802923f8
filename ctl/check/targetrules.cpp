// The files and directories that the patches touch: whether each can be replaced, what would be lost, and
// room.
#include <algorithm>
#include <cerrno>
#include <cstring>

#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/xattr.h>
#include <unistd.h>

#include "check/hostcheck.h"
#include "filedescriptor.h"
#include "judgement.h"
#include "look.h"
#include "updatedfiles.h"

namespace {

using Size = unsigned long long;

[[noreturn]] void cannotLook(const std::string &path) {
  throw JudgementError("cannot look at " + path + ": " + strerror(errno));
}

/// False where the file cannot be opened by this user, or where the file system has no such flags.
bool isFixed(const std::string &path) {
  const FileDescriptor file(path.c_str(), O_RDONLY | O_NOFOLLOW);
  if (!file.isOpen() && errno != EACCES && errno != EPERM && errno != ENXIO)
    cannotLook(path);
  int flags = 0;
  if (!file.isOpen())
    return false;
  if (ioctl(file.get(), FS_IOC_GETFLAGS, &flags) == 0)
    return (flags & (FS_IMMUTABLE_FL | FS_APPEND_FL)) != 0;
  if (errno != ENOTTY && errno != EOPNOTSUPP && errno != EINVAL && errno != ENOSYS)
    cannotLook(path);
  return false;
}

/// Names of the extended attributes, ACL and capabilities among them. The security label is left out: on a
/// system that has them each file has one, and restores it by policy.
std::string attributesOf(const std::string &path) {
  char names[4096];
  const ssize_t size = llistxattr(path.c_str(), names, sizeof names);
  if (size < 0 && errno != EOPNOTSUPP && errno != ERANGE)
    cannotLook(path);
  std::string text;
  for (const char *name = names; size > 0 && name < names + size; name += strlen(name) + 1)
    if (strcmp(name, "security.selinux") != 0)
      text += (text.empty() ? "" : ", ") + std::string(name);
  return text;
}

/// One file that a patch brings, against what has its name in the home now.
void checkTarget(HostCheck &check, const Patch &patch, const std::string &path) {
  const std::string target = check.home + path;
  const std::optional<struct stat> status = lookAt(target);
  if (!status)
    return;
  if (S_ISDIR(status->st_mode))
    return check.add("target-is-directory", patch.file, path, "a directory of the home has this name");
  if (S_ISLNK(status->st_mode))
    return check.add("target-is-link", patch.file, path, "a symbolic link of the home has this name");
  if (isFixed(target))
    check.add("target-immutable", patch.file, path, "the file is immutable or append-only");
  if (status->st_nlink > 1)
    check.add("other-names", patch.file, path, "the file has " + std::to_string(status->st_nlink) + " names");
  const std::string attributes = attributesOf(target);
  if (!attributes.empty())
    check.add("attributes-lost", patch.file, path, "the file has " + attributes);
}

std::string parentOf(const std::string &path) {
  const std::size_t slash = path.rfind('/');
  return slash == std::string::npos ? "" : path.substr(0, slash);
}

/// The directory itself, or the nearest one above it that is there; relative to the home.
std::string nearestExisting(const std::string &home, std::string directory) {
  while (!directory.empty() && !lookAt(home + directory))
    directory = parentOf(directory);
  return directory;
}

/// A file in HOME/tmp (or the home, where there is no tmp yet) that is linked into directories and removed
/// again.
class LinkProbe {
public:
  explicit LinkProbe(const std::string &home) : home_(home) {
    const std::string name = ".orvpatchctl-probe-source";
    const std::optional<struct stat> tmp = lookBehind(home + "tmp");
    const bool hasTmp = tmp && S_ISDIR(tmp->st_mode);
    source_ = home + (hasTmp ? "tmp/" : "") + name;
    target_ = ".orvpatchctl-probe";
    removeStale(source_);
    const FileDescriptor file(source_.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW);
    error_ = file.isOpen() ? 0 : errno;
  }
  LinkProbe(const LinkProbe &) = delete;
  LinkProbe &operator=(const LinkProbe &) = delete;
  ~LinkProbe() {
    if (error_ == 0)
      static_cast<void>(unlink(source_.c_str()));
  }

  /// 0, or why no file can be linked into the directory.
  int tryLink(const std::string &directory) const {
    if (error_ != 0)
      return error_;
    const std::string target = home_ + directory + (directory.empty() ? "" : "/") + target_;
    removeStale(target);
    if (link(source_.c_str(), target.c_str()) != 0)
      return errno;
    return unlink(target.c_str()) == 0 ? 0 : errno;
  }

private:
  /// A kill between the two calls leaves an empty file, which the next check finds under the same name.
  static void removeStale(const std::string &target) {
    struct stat status = {};
    if (lstat(target.c_str(), &status) == 0 && S_ISREG(status.st_mode) && status.st_size == 0 &&
        status.st_uid == geteuid())
      static_cast<void>(unlink(target.c_str()));
  }

  std::string home_;
  std::string source_;
  std::string target_;
  int error_ = 0;
};

void checkDirectories(HostCheck &check, const LinkProbe &probe, const Patch &patch,
                      const std::set<std::string> &directories) {
  for (const std::string &directory : directories) {
    const std::string shown = directory.empty() ? "." : directory;
    if (isFixed(check.home + directory))
      check.add("target-immutable", patch.file, shown, "the directory is immutable or append-only");
    else if (const int error = probe.tryLink(directory))
      check.add("no-hard-link", patch.file, shown, strerror(error));
  }
}

/// What a patch needs while it is extracted, and what it leaves, in bytes and inodes.
struct Need {
  Size bytes = 0;
  Size inodes = 0;
  Size growth = 0; ///< bytes more than before, once it is installed
  Size newFiles = 0;
};

Size rounded(Size bytes, Size block) {
  return (bytes + block - 1) / block * block;
}

Need needOf(const HostCheck &check, const Patch &patch, Size block) {
  Need need;
  for (const Member &member : patch.members) {
    const Size bytes =
        member.type == Member::Type::Directory ? block : rounded(static_cast<Size>(member.size), block);
    const std::string path = updatedFilePath(member.name);
    const std::optional<struct stat> old = path.empty() ? std::nullopt : lookAt(check.home + path);
    const Size oldBytes = old ? static_cast<Size>(old->st_blocks) * 512 : 0;
    need.bytes += bytes;
    need.inodes += 1;
    if (!path.empty()) {
      need.growth += bytes > oldBytes ? bytes - oldBytes : 0;
      need.newFiles += old ? 0 : 1;
    }
  }
  return need;
}

/// Patches are extracted one after another; what the earlier ones have brought stays.
void checkRoom(HostCheck &check) {
  struct statvfs system = {};
  if (statvfs(check.home.c_str(), &system) != 0)
    cannotLook(check.home);
  const Size block = system.f_frsize == 0 ? 1 : system.f_frsize;
  const Size freeBytes = block * (geteuid() == 0 ? system.f_bfree : system.f_bavail);
  const Size freeInodes = geteuid() == 0 ? system.f_ffree : system.f_favail;
  Size bytesBefore = 0;
  Size filesBefore = 0;
  for (const Patch &patch : check.patches) {
    const Need need = needOf(check, patch, block);
    if (bytesBefore + need.bytes > freeBytes)
      check.add("space", patch.file, "",
                std::to_string(bytesBefore + need.bytes) + " bytes are needed, " + std::to_string(freeBytes) +
                    " free");
    // A file system that makes inodes as it needs them tells of none.
    if (system.f_files != 0 && filesBefore + need.inodes > freeInodes)
      check.add("inodes", patch.file, "",
                std::to_string(filesBefore + need.inodes) + " are needed, " + std::to_string(freeInodes) +
                    " free");
    bytesBefore += need.growth;
    filesBefore += need.newFiles;
  }
}

} // namespace

void checkTargets(HostCheck &check) {
  const LinkProbe probe(check.home);
  for (const Patch &patch : check.patches) {
    std::set<std::string> directories;
    for (const auto &[path, index] : updatedFiles(patch.members)) {
      const bool isDirectory = patch.members[index].type == Member::Type::Directory;
      directories.insert(nearestExisting(check.home, isDirectory ? path : parentOf(path)));
      if (!isDirectory)
        checkTarget(check, patch, path);
    }
    checkDirectories(check, probe, patch, directories);
  }
  checkRoom(check);
}
