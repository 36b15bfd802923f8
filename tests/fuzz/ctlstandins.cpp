// In place of child.cpp: no program is started; every one ends at once, silently and well.
#include "child.h"

ChildResult runChild(const std::vector<std::string> &words, const ChildEnvironment &) {
  const bool isSum = words.front() == "sha256sum";
  return {0, isSum ? std::string(64, '0') + "  -\n" : "", "", true};
}

std::string findProgram(const std::string &name, const std::string &) {
  return "/bin/" + name;
}
