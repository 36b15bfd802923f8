#include "inputfile.h"

#include <cerrno>
#include <cstring>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "judgement.h"

namespace {

[[noreturn]] void cannotRead(const std::string &path, int error) {
  throw JudgementError("cannot read " + path + ": " + strerror(error));
}

} // namespace

InputFile::InputFile(const std::string &path) : path_(path), file_(path.c_str(), O_RDONLY) {
  const int error = errno;
  if (!file_.isOpen()) {
    if (error == ENOENT)
      return;
    cannotRead(path, error);
  }
  if (!S_ISREG(status().st_mode))
    throw JudgementError("no regular file: " + path);
}

/// All zeros for a file that does not exist.
struct stat InputFile::status() const {
  struct stat status = {};
  if (exists() && fstat(file_.get(), &status) != 0)
    cannotRead(path_, errno);
  return status;
}

std::size_t InputFile::read(char *buffer, std::size_t size) const {
  if (!exists())
    return 0;
  const ssize_t count = file_.read(buffer, size);
  if (count < 0)
    cannotRead(path_, errno);
  return static_cast<std::size_t>(count);
}

std::string InputFile::content(std::size_t limit) const {
  std::string text;
  char buffer[65536];
  for (std::size_t count = read(buffer, sizeof buffer); count > 0; count = read(buffer, sizeof buffer)) {
    if (text.size() + count > limit)
      throw JudgementError(path_ + " is larger than " + std::to_string(limit) + " bytes");
    text.append(buffer, count);
  }
  return text;
}

std::uint64_t InputFile::size() const {
  return static_cast<std::uint64_t>(status().st_size);
}

std::time_t InputFile::modified() const {
  return status().st_mtime;
}

void InputFile::seek(std::uint64_t position) const {
  if (exists() && lseek(file_.get(), static_cast<off_t>(position), SEEK_SET) < 0)
    cannotRead(path_, errno);
}

bool InputFile::isStillThere() const {
  struct stat named = {};
  if (!exists() || stat(path_.c_str(), &named) != 0)
    return false;
  const struct stat mine = status();
  return mine.st_dev == named.st_dev && mine.st_ino == named.st_ino;
}
