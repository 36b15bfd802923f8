#include "patchfilename.h"

#include <algorithm>
#include <array>
#include <vector>

#include "logger.h"
#include "target.h"
#include "utilities.h"

#define LOG_COMPONENT "patchfilename"

namespace {

struct PlatformFamily {
  const char *prefix;
  bool wholePart; ///< the family is the whole second part, not just the prefix
};

// KEEP(lia-is-li): the first matching prefix decides, so a name that begins with "lia" belongs to "li", and
// "lia" is never the family.
const std::array<PlatformFamily, 10> families = {{{"li", false},
                                                  {"ls", false},
                                                  {"lia", false},
                                                  {"lx", false},
                                                  {"lpp", false},
                                                  {"aix", false},
                                                  {"hp", false},
                                                  {"sol", false},
                                                  {"winnt", true},
                                                  {"unix", true}}};

} // namespace

PatchFileName::PatchFileName(const std::string &name) {
  valid_ = parse(name);
}

bool PatchFileName::parse(const std::string &name) {
  const std::vector<std::string> parts = Util::tokenizeString(name, "_");
  if (parts.size() != 4) {
    LOG_TRACE("invalid patch file name: %s", name.c_str());
    return false;
  }
  return parseProduct(parts[0]) && parsePlatform(parts[1]) && parseTarget(parts[2]) && parseFixPack(parts[3]);
}

bool PatchFileName::parseProduct(const std::string &part) {
  if (part.size() != 3) {
    LOG_TRACE("invalid product in patch file name: %s", part.c_str());
    return false;
  }
  product_ = part;
  return true;
}

bool PatchFileName::parsePlatform(const std::string &part) {
  fullPlatform_ = part;
  platform_ = part;
  const auto family =
      std::find_if(families.begin(), families.end(),
                   [&part](const PlatformFamily &candidate) { return part.rfind(candidate.prefix, 0) == 0; });
  if (family == families.end()) {
    LOG_TRACE("invalid platform architecture in patch file name: %s", part.c_str());
    return false;
  }
  if (!family->wholePart)
    platform_ = family->prefix;
  return true;
}

bool PatchFileName::parseTarget(const std::string &part) {
  target_ = part;
  if (findTarget(part) == nullptr) {
    LOG_TRACE("Invalid target: %s", part.c_str());
    return false;
  }
  return true;
}

bool PatchFileName::parseFixPack(const std::string &part) {
  const std::size_t point = part.find('.');
  if (point == std::string::npos) {
    LOG_TRACE("invalid fixpack level in patch file name: %s", part.c_str());
    return false;
  }
  fixPackName_ = part.substr(0, point);
  return true;
}
