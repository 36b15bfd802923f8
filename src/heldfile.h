// A file or directory held by a descriptor while its owner and mode are set.
//
// Between two calls another user may put something else in the place of a name; what a descriptor was opened
// on stays what it is. Symbolic links are never followed, nothing is waited for, and what is neither a
// regular file nor a directory is not opened for reading, which can have effects on a device.
#pragma once

#include <string>

#include <fcntl.h>
#include <sys/stat.h>

#include "filedescriptor.h"

class HeldFile {
public:
  enum class Kind { Regular, Directory, Other };

  /// `path` must not end in "/", which would ask for what a link leads to.
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
