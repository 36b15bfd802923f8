// A patch's archive, member for member, in one pass and without extracting anything.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

struct archive;
struct archive_entry;

struct Member {
  enum class Type { File, Directory, SymbolicLink, HardLink, Special };

  std::string name; ///< as stored, bytes
  Type type = Type::File;
  std::string linkTarget;
  unsigned mode = 0; ///< the twelve permission bits
  std::int64_t size = 0;
  std::int64_t time = 0; ///< seconds since the epoch
  std::int64_t user = 0;
  std::int64_t group = 0;
};

/// Reads a tar archive, compressed or not.
class ArchiveReader {
public:
  /// JudgementError when the file cannot be opened or is no regular file. What is no archive is an archive
  /// without members and with a problem.
  explicit ArchiveReader(const std::string &path);

  /// The next member; false at the end of what can be read.
  bool next(Member &member);
  /// Up to `size` bytes of the current member's content; 0 at its end or when it cannot be read on.
  std::size_t read(char *buffer, std::size_t size);
  /// The content of the current member, at most `limit` bytes of it.
  std::string content(std::size_t limit);
  /// Why reading ended before the end; empty when all was read. A read error is no property of the archive:
  /// next() and read() throw a JudgementError.
  const std::string &problem() const { return problem_; }
  /// Once next() was false without a problem: whether an empty block stood where the next member would. An
  /// archive that was cut off between two members ends without it.
  bool hasEndMark() const;

private:
  void noteProblem();

  struct Close {
    void operator()(archive *reader) const;
  };
  std::string path_;
  std::unique_ptr<archive, Close> reader_;
  std::string problem_;
};

/// All members of an archive, and the reader's problem if it had one.
struct Listing {
  std::vector<Member> members;
  std::string problem;
};
Listing listArchive(const std::string &path);
