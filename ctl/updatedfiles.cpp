#include "updatedfiles.h"

#include "text.h"

std::string updatedFilePath(const std::string &memberName) {
  static const std::string root = "updated_files/";
  const std::string path = relativePath(memberName);
  return path.compare(0, root.size(), root) == 0 ? path.substr(root.size()) : "";
}

std::map<std::string, std::size_t> updatedFiles(const std::vector<Member> &members) {
  std::map<std::string, std::size_t> files;
  for (std::size_t i = 0; i < members.size(); ++i) {
    const std::string path = updatedFilePath(members[i].name);
    if (!path.empty())
      files[path] = i;
  }
  return files;
}
