#include "temporaryfolder.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>

#include "judgement.h"

namespace {

namespace fs = std::filesystem;

/// An archive may have closed a directory to its owner; what is in it could then not be removed.
void openDirectories(const fs::path &folder) {
  std::error_code ignored;
  fs::permissions(folder, fs::perms::owner_all, fs::perm_options::add, ignored);
  for (fs::directory_iterator entry(folder, ignored); entry != fs::directory_iterator();
       entry.increment(ignored))
    if (entry->symlink_status(ignored).type() == fs::file_type::directory)
      openDirectories(entry->path());
}

std::string systemFolder() {
  const char *const folder = getenv("TMPDIR");
  return folder == nullptr || *folder == '\0' ? "/tmp" : folder;
}

} // namespace

TemporaryFolder::TemporaryFolder() : TemporaryFolder(systemFolder()) {}

TemporaryFolder::TemporaryFolder(const std::string &parent) : path_(parent + "/orvpatchctl.XXXXXX") {
  if (mkdtemp(path_.data()) == nullptr)
    throw JudgementError("cannot make a folder for temporary files: " + path_ + ": " + strerror(errno));
}

TemporaryFolder::~TemporaryFolder() {
  std::error_code ignored;
  openDirectories(path_);
  fs::remove_all(path_, ignored);
}
