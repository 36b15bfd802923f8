// Copies of the product executable. Both steps are placeholders in this version: they trace and succeed. The
// search for them is complete, but no step calls it.
#include "patchprocessor/patchprocessor.h"

#include "logger.h"
#include "utilities.h"

#define LOG_COMPONENT "patchprocessor"

namespace {

/// The text after the first "." in lower case; empty without one.
std::string extensionOf(const std::string &name) {
  const std::size_t point = name.find('.');
  return point == std::string::npos ? "" : Util::toLower(name.substr(point + 1));
}

/// The text before the first "." in lower case; a name without one is unchanged.
std::string baseOf(const std::string &name) {
  const std::size_t point = name.find('.');
  return point == std::string::npos ? name : Util::toLower(name.substr(0, point));
}

/// The name of a copy begins like the executable's and has the same extension, ignoring case.
bool isCopyOf(const std::string &exe, const std::string &name) {
  const std::string lowerName = Util::toLower(name);
  const std::string base = baseOf(exe);
  return lowerName.rfind(base, 0) == 0 && lowerName != exe && extensionOf(name) == extensionOf(exe);
}

void findCopies(const std::string &exe, std::vector<File *> &found) {
  LOG_TRACE("ProductEXE = %s", exe.c_str());
  const std::string path = Util::getQuillHome() + "vmaorv6";
  LOG_TRACE("Checking for matching productEXE files in %s, matching %s", path.c_str(), exe.c_str());
  File directory(path);
  if (!directory.isDirectory()) {
    LOG_TRACE("Could not locate: %s", path.c_str());
    return;
  }
  if (directory.listFiles()->empty()) {
    LOG_TRACE("No files located in: %s", path.c_str());
    return;
  }
  for (const File *file : *directory.listFiles()) {
    if (!isCopyOf(exe, file->getName()))
      continue;
    const std::string copy = file->getAbsolutePath();
    LOG_TRACE("Found pruductEXE file to update: %s", copy.c_str());
    found.push_back(new File(copy));
  }
}

} // namespace

bool PatchProcessor::updateProductEXEFiles(PatchError *) {
  LOG_TRACE("PatchProcessor::updateProductEXEFiles() %s", "entry");
  LOG_TRACE("PatchProcessor::updateProductEXEFiles() = %d", true);
  return true;
}

bool PatchProcessor::listProductEXEFiles(PatchError *) {
  LOG_TRACE("PatchProcessor::listProductEXEFiles() %s", "entry");
  LOG_TRACE("PatchProcessor::listProductEXEFiles() = %d", true);
  return true;
}

bool PatchProcessor::findProductEXEFiles(std::vector<File *> &found, PatchError *) {
  LOG_TRACE("PatchProcessor::findProductEXEFiles() %s", "entry");
  const std::string exe = descriptor_->getProductEXE();
  if (!exe.empty())
    findCopies(exe, found);
  LOG_TRACE("PatchProcessor::findProductEXEFiles() %s", "exit");
  return true;
}
