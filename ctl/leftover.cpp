#include "leftover.h"

#include <filesystem>

#include "judgement.h"
#include "look.h"

std::string onlyCopyIn(const std::string &home, const std::string &directory,
                       const std::function<bool(const std::string &path)> &isSpare) {
  namespace fs = std::filesystem;
  const std::string root = home + directory + "/updated_files/";
  std::error_code error;
  for (fs::recursive_directory_iterator entry(root, error), end; !error && entry != end;
       entry.increment(error)) {
    const std::string path = entry->path().string().substr(root.size());
    const std::optional<struct stat> status = lookAt(entry->path());
    if (status && !S_ISDIR(status->st_mode) && !lookAt(home + path) && !isSpare(path))
      return path;
  }
  if (error && error != std::errc::no_such_file_or_directory)
    throw JudgementError("cannot look through " + root + ": " + error.message());
  return "";
}
