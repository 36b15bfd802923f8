// Directories that are closed to other users until the work in them is done.
//
// A user who may write to a directory can exchange new files in it. Each directory is therefore made with
// mode 0700 and opened by the destructor, whether the work succeeded or not.
#pragma once

#include <string>
#include <vector>

#include "heldfile.h"

class NewDirectories {
public:
  NewDirectories() = default;
  NewDirectories(const NewDirectories &) = delete;
  NewDirectories &operator=(const NewDirectories &) = delete;
  /// Gives each directory the mode of its making with all permissions added, the last one first, so that all
  /// work below a directory is done when other users may enter it. A directory that has been exchanged, or
  /// cannot be opened, is not changed.
  ~NewDirectories();

  /// Makes one directory, whatever the umask; false with the reason in errno.
  bool make(const std::string &path);

private:
  /// No descriptors: there may be more directories than those.
  struct Directory {
    std::string path;
    FileIdentity identity;
  };
  static void openToAll(const Directory &directory);

  std::vector<Directory> made_;
};
