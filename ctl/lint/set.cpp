// The patches of one directory: what they do to one another.
#include <map>

#include "dcfpackageprocessor.h"
#include "lint/rules.h"
#include "lint/subject.h"

namespace {

/// Patches for other systems are not installed, and so cannot be in one another's way.
bool isTaken(const PatchFileName &name) {
  return name.isValid() &&
         (name.getPlatform() == DCFPackageProcessor::getPlatform() || name.getPlatform() == "unix");
}

/// The lowest level at which the patch itself can be installed.
Version releaseOf(const Version &level) {
  return {level.getVV(), level.getRR(), "00", "00"};
}

/// Whether `required` is a level that the system need not have before `bringer` is installed, but has then.
bool bringsIt(const Patch &bringer, const std::string &product, const Version &required) {
  if (bringer.descriptor == nullptr || bringer.descriptor->getProductCode() != product)
    return false;
  const Version &level = *bringer.descriptor->getVersion();
  return releaseOf(level) < required && required <= level;
}

void findBringer(const PatchSet &set, const Patch &patch, const std::string &prereq, Finder &found) {
  Version required;
  if (!patch.descriptor->getPrereqVersion(prereq, required))
    return;
  for (const Subject &other : set.patches)
    if (&other.patch != &patch && isTaken(other.patch.name) && bringsIt(other.patch, prereq, required))
      found.of(patch.file, "patch.ini",
               "\"" + prereq + "\" at level " + required.getDottedVersionString() + " comes with " +
                   other.patch.file + " only");
}

} // namespace

void sameProductTwice(const PatchSet &set, Finder &found) {
  std::map<std::string, std::string> seen;
  for (const Subject &subject : set.patches) {
    const PatchFileName &name = subject.patch.name;
    if (!isTaken(name))
      continue;
    const std::string key = name.getProduct() + "_" + name.getFullPlatform();
    const auto [first, isNew] = seen.emplace(key, subject.patch.file);
    if (!isNew)
      found.of(subject.patch.file, "", "for the same product as " + first->second);
  }
}

void prereqInSameSet(const PatchSet &set, Finder &found) {
  for (const Subject &subject : set.patches) {
    const Patch &patch = subject.patch;
    if (patch.descriptor == nullptr || !isTaken(patch.name))
      continue;
    for (const std::string &prereq : patch.descriptor->getPrereqs())
      if (prereq != patch.descriptor->getProductCode())
        findBringer(set, patch, prereq, found);
  }
}

void companionIsPatch(const PatchSet &set, Finder &found) {
  for (const std::string &file : set.companions)
    found.of(file, "", "its name is that of a patch");
}
