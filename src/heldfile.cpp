#include "heldfile.h"

#include <cerrno>

#include <fcntl.h>
#include <unistd.h>

namespace {

bool isLinkAt(int directory, const std::string &name) {
  struct stat status = {};
  return fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISLNK(status.st_mode);
}

/// A descriptor of the file or directory; -1 when it is a symbolic link or no descriptor can be had. O_PATH
/// serves for files that their owner may not read.
int open(int directory, const std::string &name, HeldFile::Kind kind, bool &isLink) {
  const int flags = O_NOFOLLOW | O_CLOEXEC | (kind == HeldFile::Kind::Directory ? O_DIRECTORY : 0);
  int fd = -1;
  if (kind != HeldFile::Kind::Other)
    fd = openat(directory, name.c_str(), flags | O_RDONLY | O_NONBLOCK | O_NOCTTY);
  if (fd >= 0)
    return fd;
  isLink = isLinkAt(directory, name);
  return isLink ? -1 : openat(directory, name.c_str(), flags | O_PATH);
}

} // namespace

FileIdentity identityOf(const struct stat &status) {
  return {status.st_dev, status.st_ino};
}

bool operator==(const FileIdentity &a, const FileIdentity &b) {
  return a.device == b.device && a.inode == b.inode;
}

HeldFile::HeldFile(int directory, const std::string &name, Kind kind)
    : file_(open(directory, name, kind, isLink_)) {}

bool HeldFile::setOwner(uid_t owner, gid_t group) const {
  if (fchown(file_.get(), owner, group) == 0)
    return true;
  // The usual calls refuse a descriptor of O_PATH.
  return errno == EBADF && fchownat(file_.get(), "", owner, group, AT_EMPTY_PATH) == 0;
}

bool HeldFile::setMode(mode_t mode) const {
  if (fchmod(file_.get(), mode) == 0)
    return true;
  return errno == EBADF && chmod(("/proc/self/fd/" + std::to_string(file_.get())).c_str(), mode) == 0;
}

bool HeldFile::look(struct stat &status) const {
  return fstat(file_.get(), &status) == 0;
}
