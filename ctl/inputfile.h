// A regular file that is read to its end, or it cannot be judged: an error on the way is never taken for the
// end.
#pragma once

#include <cstddef>
#include <cstdint>
#include <ctime>
#include <string>

#include <sys/stat.h>

#include "filedescriptor.h"

class InputFile {
public:
  /// A missing file is no error: it exists() not, and reads as an empty one. JudgementError when it is there
  /// and cannot be opened, or is no regular file.
  explicit InputFile(const std::string &path);

  bool exists() const { return file_.isOpen(); }
  /// Up to `size` bytes from where the last read ended; 0 at the end. JudgementError when that fails.
  std::size_t read(char *buffer, std::size_t size) const;
  /// All that is left; JudgementError when it fails or when that is more than `limit` bytes.
  std::string content(std::size_t limit) const;
  /// Size now, in bytes.
  std::uint64_t size() const;
  /// When it was last written to, seconds since the epoch.
  std::time_t modified() const;
  /// Goes on reading `position` bytes behind the start.
  void seek(std::uint64_t position) const;
  /// Whether the path still leads to this file: a log is rotated by renaming it.
  bool isStillThere() const;

private:
  struct stat status() const;

  std::string path_;
  FileDescriptor file_;
};
