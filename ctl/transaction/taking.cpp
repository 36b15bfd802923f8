#include "transaction/taking.h"

#include <cerrno>
#include <cstring>
#include <filesystem>

#include <sys/stat.h>
#include <unistd.h>

#include "child.h"
#include "judgement.h"
#include "patch.h"

namespace {

namespace fs = std::filesystem;

void copyInto(const std::string &from, const std::string &folder) {
  const ChildResult copied =
      runChild({"cp", "--reflink=auto", "--", from, folder}, {"/usr/bin:/bin", {"LC_ALL=C"}});
  if (copied.status != 0)
    throw RefusalError("cannot copy " + from + ": " + copied.err);
}

} // namespace

std::string takePatches(const std::string &path, const std::string &folder) {
  const std::vector<std::string> files = patchFiles(path);
  fs::path given(path);
  if (!given.has_filename())
    given = given.parent_path();
  const bool isDirectory = fs::is_directory(given);
  const std::string target = isDirectory ? folder + "/" + given.filename().string() : folder;
  if (isDirectory && mkdir(target.c_str(), 0700) != 0)
    throw RefusalError("cannot make " + target + ": " + strerror(errno));
  for (const std::string &file : files)
    copyInto(file, target);
  const fs::path beside = isDirectory                   ? given
                          : given.parent_path().empty() ? fs::path(".")
                                                        : given.parent_path();
  for (const char *name : {"SHA256SUMS", "SHA256SUMS.asc"})
    if (fs::exists(beside / name))
      copyInto((beside / name).string(), target);
  return isDirectory ? target : folder + "/" + given.filename().string();
}

void removePatches(const std::string &folder) {
  std::error_code ignored;
  fs::remove_all(folder, ignored);
}
