// Directories that are closed to other users as long as the work in them goes on.
//
// A user who may write into a directory can exchange what is made or moved there. Each directory is therefore
// made with mode 0700 and opened when the object goes, whatever became of the work.
#pragma once

#include <string>
#include <vector>

#include <sys/types.h>

class NewDirectories {
public:
  NewDirectories() = default;
  NewDirectories(const NewDirectories &) = delete;
  NewDirectories &operator=(const NewDirectories &) = delete;
  /// Gives each directory the mode that the system gave it with all permissions added, the last one first, so
  /// that nothing below a directory is left to be done when others may enter it. What stands in the place of
  /// one that was made, or cannot be opened, is left alone.
  ~NewDirectories();

  /// Makes one directory, whatever the umask; false with the reason in errno.
  bool make(const std::string &path);

private:
  /// Not a descriptor for each: there may be more directories than descriptors.
  struct Directory {
    std::string path;
    dev_t device;
    ino_t inode;
  };
  static void openToAll(const Directory &directory);

  std::vector<Directory> made_;
};
