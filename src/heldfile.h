// A file or directory held by a descriptor while its owner and mode are set.
//
// Between two calls another user may exchange a name, but not the file behind a descriptor. Symbolic links
// are never followed, no open waits, and only regular files and directories are opened for reading, since
// that can have effects on a device.
#pragma once

#include <string>

#include <fcntl.h>
#include <sys/stat.h>

#include "filedescriptor.h"

/// What stays the same while names are exchanged.
struct FileIdentity {
  dev_t device;
  ino_t inode;
};
FileIdentity identityOf(const struct stat &status);
bool operator==(const FileIdentity &a, const FileIdentity &b);

class HeldFile {
public:
  enum class Kind { Regular, Directory, Other };

  /// `path` must not end in "/", which would follow a link.
  HeldFile(const std::string &path, Kind kind) : HeldFile(AT_FDCWD, path, kind) {}
  /// The entry `name` of an open directory.
  HeldFile(int directory, const std::string &name, Kind kind);

  bool isHeld() const { return file_.isOpen(); }
  /// The name is a symbolic link: nothing is held then.
  bool isLink() const { return isLink_; }

  /// False with the reason in errno, as the calls of the same names.
  bool setOwner(uid_t owner, gid_t group) const;
  bool setMode(mode_t mode) const;
  bool look(struct stat &status) const;

private:
  bool isLink_ = false;
  FileDescriptor file_;
};
