#include "filedescriptor.h"

#include <cerrno>

#include <fcntl.h>
#include <unistd.h>

// O_NONBLOCK: opening a pipe in place of a file fails instead of waiting for ever. For files and directories
// the flag has no effect.
FileDescriptor::FileDescriptor(const char *path, int flags)
    : fd_(open(path, flags | O_CLOEXEC | O_NONBLOCK | O_NOCTTY, 0666)) {}

FileDescriptor &FileDescriptor::operator=(FileDescriptor &&other) noexcept {
  if (this != &other) {
    close();
    fd_ = other.release();
  }
  return *this;
}

FileDescriptor::~FileDescriptor() {
  close();
}

int FileDescriptor::release() {
  const int fd = fd_;
  fd_ = -1;
  return fd;
}

bool FileDescriptor::write(const std::string &text) const {
  return write(text.data(), text.size());
}

bool FileDescriptor::write(const char *text, std::size_t length) const {
  while (length > 0) {
    const ssize_t written = ::write(fd_, text, length);
    if (written < 0 && errno == EINTR)
      continue;
    if (written < 0)
      return false;
    if (written == 0) { // no reason is given, and a repetition would never end
      errno = ENOSPC;
      return false;
    }
    text += written;
    length -= static_cast<std::size_t>(written);
  }
  return true;
}

ssize_t FileDescriptor::read(char *buffer, std::size_t size) const {
  ssize_t count = 0;
  do
    count = ::read(fd_, buffer, size);
  while (count < 0 && errno == EINTR);
  return count;
}

bool FileDescriptor::close() {
  const int fd = release();
  return fd < 0 || ::close(fd) == 0;
}
