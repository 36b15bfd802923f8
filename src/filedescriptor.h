// An open file descriptor that closes itself, and writing to it.
#pragma once

#include <string>

#include <sys/types.h>

class FileDescriptor {
public:
  /// Opens `path` with `flags`, without waiting and close-on-exec; a new file gets mode 0666 less the umask.
  FileDescriptor(const char *path, int flags);
  /// Takes ownership of an open descriptor, or of none (-1).
  explicit FileDescriptor(int fd) : fd_(fd) {}
  FileDescriptor(FileDescriptor &&other) noexcept : fd_(other.release()) {}
  FileDescriptor &operator=(FileDescriptor &&other) noexcept;
  FileDescriptor(const FileDescriptor &) = delete;
  FileDescriptor &operator=(const FileDescriptor &) = delete;
  ~FileDescriptor();

  bool isOpen() const { return fd_ >= 0; }
  int get() const { return fd_; }

  /// Writes all of `text`: one write, unless the system takes it in pieces or a signal interrupts it. False,
  /// with the reason in errno, when it cannot be written to the end.
  bool write(const std::string &text) const;
  bool write(const char *text, std::size_t length) const;

  /// Reads at most `size` bytes, again after a signal; -1, with the reason in errno, on failure.
  ssize_t read(char *buffer, std::size_t size) const;

  /// Releases ownership of the descriptor; -1 when there is none.
  int release();

  /// Closes now, to learn whether that succeeds; false with the reason in errno.
  bool close();

private:
  int fd_;
};
