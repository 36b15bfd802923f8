#include "patcharchive.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>

#include <archive.h>
#include <archive_entry.h>
#include <sys/stat.h>

#include "judgement.h"

namespace {

constexpr std::size_t BlockSize = 64 * 1024;

Member::Type typeOf(archive_entry *entry) {
  if (archive_entry_hardlink(entry) != nullptr)
    return Member::Type::HardLink;
  switch (archive_entry_filetype(entry)) {
  case AE_IFREG:
    return Member::Type::File;
  case AE_IFDIR:
    return Member::Type::Directory;
  case AE_IFLNK:
    return Member::Type::SymbolicLink;
  default:
    return Member::Type::Special;
  }
}

std::string textOf(const char *text) {
  return text == nullptr ? "" : text;
}

/// What tar(1) recognises, and nothing that would be handed to another program.
void supportFilters(archive *reader) {
  archive_read_support_filter_bzip2(reader);
  archive_read_support_filter_compress(reader);
  archive_read_support_filter_gzip(reader);
  archive_read_support_filter_lzip(reader);
  archive_read_support_filter_lzma(reader);
  archive_read_support_filter_xz(reader);
  archive_read_support_filter_zstd(reader);
}

Member memberOf(archive_entry *entry) {
  Member member;
  member.name = textOf(archive_entry_pathname(entry));
  member.type = typeOf(entry);
  member.linkTarget = textOf(member.type == Member::Type::HardLink ? archive_entry_hardlink(entry)
                                                                   : archive_entry_symlink(entry));
  member.mode = archive_entry_perm(entry) & 07777U;
  member.size = archive_entry_size(entry);
  member.time = archive_entry_mtime(entry);
  member.user = archive_entry_uid(entry);
  member.group = archive_entry_gid(entry);
  return member;
}

} // namespace

void ArchiveReader::Close::operator()(archive *reader) const {
  archive_read_free(reader);
}

ArchiveReader::ArchiveReader(const std::string &path) : path_(path), reader_(archive_read_new()) {
  struct stat status = {};
  if (stat(path.c_str(), &status) != 0)
    throw JudgementError("cannot read " + path + ": " + strerror(errno));
  if (!S_ISREG(status.st_mode))
    throw JudgementError("no regular file: " + path);
  supportFilters(reader_.get());
  archive_read_support_format_tar(reader_.get());
  archive_read_support_format_empty(reader_.get());
  if (archive_read_open_filename(reader_.get(), path.c_str(), BlockSize) != ARCHIVE_OK)
    noteProblem();
}

/// libarchive numbers the faults of an archive -1, EILSEQ and EINVAL; any other number is that of a system
/// call.
void ArchiveReader::noteProblem() {
  const int error = archive_errno(reader_.get());
  const std::string text = textOf(archive_error_string(reader_.get()));
  if (error == ENOMEM)
    throw std::bad_alloc();
  if (error > 0 && error != EILSEQ && error != EINVAL)
    throw JudgementError("cannot read " + path_ + ": " + text);
  problem_ = text.empty() ? "damaged" : text;
}

bool ArchiveReader::hasEndMark() const {
  return archive_filter_bytes(reader_.get(), 0) > archive_read_header_position(reader_.get());
}

bool ArchiveReader::next(Member &member) {
  if (!problem_.empty())
    return false;
  archive_entry *entry = nullptr;
  const int result = archive_read_next_header(reader_.get(), &entry);
  if (result == ARCHIVE_EOF)
    return false;
  if (result != ARCHIVE_OK && result != ARCHIVE_WARN) {
    noteProblem();
    return false;
  }
  member = memberOf(entry);
  return true;
}

std::size_t ArchiveReader::read(char *buffer, std::size_t size) {
  const la_ssize_t count = archive_read_data(reader_.get(), buffer, size);
  if (count >= 0)
    return static_cast<std::size_t>(count);
  noteProblem();
  return 0;
}

std::string ArchiveReader::content(std::size_t limit) {
  std::string text;
  char buffer[BlockSize];
  while (text.size() < limit) {
    const std::size_t count = read(buffer, std::min(sizeof buffer, limit - text.size()));
    if (count == 0)
      break;
    text.append(buffer, count);
  }
  return text;
}

Listing listArchive(const std::string &path) {
  Listing listing;
  ArchiveReader reader(path);
  Member member;
  while (reader.next(member))
    listing.members.push_back(member);
  listing.problem = reader.problem();
  return listing;
}
