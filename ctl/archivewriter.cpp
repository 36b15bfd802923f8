#include "archivewriter.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>
#include <vector>

#include <archive.h>
#include <archive_entry.h>
#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "filedescriptor.h"
#include "judgement.h"
#include "signals.h"

namespace {

constexpr std::size_t BlockSize = 64UL * 1024;

struct CloseDirectory {
  void operator()(DIR *stream) const { closedir(stream); }
};
struct FreeWriter {
  void operator()(archive *writer) const { archive_write_free(writer); }
};
struct FreeEntry {
  void operator()(archive_entry *entry) const { archive_entry_free(entry); }
};

struct SourceFile {
  std::string path; ///< relative to the tree
  struct stat status;
};

[[noreturn]] void cannot(const char *what, const std::string &path) {
  throw JudgementError(std::string("cannot ") + what + " " + path + ": " + strerror(errno));
}

/// The names in a directory, sorted by bytes.
std::vector<std::string> namesIn(const std::string &directory) {
  const std::unique_ptr<DIR, CloseDirectory> stream(opendir(directory.c_str()));
  if (stream == nullptr)
    cannot("read", directory);
  std::vector<std::string> names;
  errno = 0;
  while (const dirent *const entry = readdir(stream.get())) {
    const std::string name = entry->d_name;
    if (name != "." && name != "..")
      names.push_back(name);
    errno = 0;
  }
  if (errno != 0)
    cannot("read", directory);
  std::sort(names.begin(), names.end());
  return names;
}

/// Adds a file, or a directory with all that it holds.
void collect(const std::string &tree, const std::string &path, std::vector<SourceFile> &files) {
  SourceFile file = {path, {}};
  const std::string place = tree + "/" + path;
  if (lstat(place.c_str(), &file.status) != 0)
    cannot("read", place);
  files.push_back(file);
  if (S_ISDIR(file.status.st_mode))
    for (const std::string &name : namesIn(place))
      collect(tree, std::string(path).append("/").append(name), files);
}

/// Everything that goes into the archive, in its order.
std::vector<SourceFile> filesOf(const std::string &tree) {
  static const std::string first = "patch.ini";
  static const std::string last = "updated_files";
  std::vector<std::string> names = namesIn(tree);
  const auto rank = [](const std::string &name) { return name == first ? 0 : name == last ? 2 : 1; };
  std::stable_sort(names.begin(), names.end(),
                   [&rank](const std::string &a, const std::string &b) { return rank(a) < rank(b); });
  std::vector<SourceFile> files;
  for (const std::string &name : names)
    if (name.front() != '.')
      collect(tree, name, files);
  return files;
}

/// The time that directories bear: their own change with every copy of the tree.
std::int64_t newestTime(const std::vector<SourceFile> &files) {
  std::int64_t newest = 0;
  for (const SourceFile &file : files)
    if (!S_ISDIR(file.status.st_mode))
      newest = std::max<std::int64_t>(newest, file.status.st_mtime);
  return newest;
}

mode_t plainMode(const struct stat &status) {
  return S_ISDIR(status.st_mode) || (status.st_mode & 0100U) != 0 ? 0755 : 0644;
}

class Writer {
public:
  Writer(std::string tree, std::string path)
      : tree_(std::move(tree)), path_(std::move(path)), writer_(archive_write_new()) {
    require(archive_write_set_format_gnutar(writer_.get()));
    require(archive_write_open_filename(writer_.get(), path_.c_str()));
  }

  void add(const SourceFile &file, std::int64_t time) {
    const std::unique_ptr<archive_entry, FreeEntry> entry(archive_entry_new());
    const bool isDirectory = S_ISDIR(file.status.st_mode);
    archive_entry_copy_pathname(entry.get(), (file.path + (isDirectory ? "/" : "")).c_str());
    archive_entry_set_mode(entry.get(), (file.status.st_mode & S_IFMT) | plainMode(file.status));
    archive_entry_set_mtime(entry.get(), time, 0);
    archive_entry_set_size(entry.get(), S_ISREG(file.status.st_mode) ? file.status.st_size : 0);
    if (S_ISLNK(file.status.st_mode))
      archive_entry_copy_symlink(entry.get(), linkTarget(file.path).c_str());
    require(archive_write_header(writer_.get(), entry.get()));
    if (S_ISREG(file.status.st_mode))
      copyContent(file);
  }

  void close() { require(archive_write_close(writer_.get())); }

private:
  void require(int result) const {
    if (result != ARCHIVE_OK)
      throw JudgementError("cannot write " + path_ + ": " + archive_error_string(writer_.get()));
  }

  std::string linkTarget(const std::string &path) const {
    const std::string place = tree_ + "/" + path;
    char target[4096];
    const ssize_t length = readlink(place.c_str(), target, sizeof target);
    if (length < 0)
      cannot("read", place);
    return {target, static_cast<std::size_t>(length)};
  }

  void copyContent(const SourceFile &file) {
    const std::string place = tree_ + "/" + file.path;
    const FileDescriptor source(place.c_str(), O_RDONLY);
    if (!source.isOpen())
      cannot("read", place);
    std::int64_t written = 0;
    std::vector<char> buffer(BlockSize);
    ssize_t count = 0;
    while ((count = source.read(buffer.data(), buffer.size())) > 0) {
      if (archive_write_data(writer_.get(), buffer.data(), static_cast<std::size_t>(count)) != count)
        break;
      written += count;
    }
    if (count < 0)
      cannot("read", place);
    if (written != file.status.st_size)
      throw JudgementError("cannot write " + path_ + ": " + place +
                           " has another size by now, or the disk is full");
  }

  std::string tree_;
  std::string path_;
  std::unique_ptr<archive, FreeWriter> writer_;
};

} // namespace

void writePatchArchive(const std::string &tree, const std::string &archive,
                       std::optional<std::int64_t> latest) {
  const std::vector<SourceFile> files = filesOf(tree);
  const std::int64_t newest = newestTime(files);
  Writer writer(tree, archive);
  for (const SourceFile &file : files) {
    const std::int64_t time = S_ISDIR(file.status.st_mode) ? newest : file.status.st_mtime;
    stopIfInterrupted();
    writer.add(file, std::min(time, latest.value_or(time)));
  }
  writer.close();
}
