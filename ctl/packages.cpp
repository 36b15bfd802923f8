#include "packages.h"

#include "dcfpackageprocessor.h"
#include "judgement.h"
#include "patchprocessor/patchprocessor.h"

std::vector<Patch> applicablePatches(const Home &home, const std::string &path) {
  std::vector<Patch> patches;
  for (const std::string &file : patchFiles(path)) {
    if (!DCFPackageProcessor::isApplicable(home.path(), File(file)))
      continue;
    patches.push_back(readPatch(file));
    const Patch &patch = patches.back();
    if (patch.descriptor == nullptr)
      throw JudgementError(
          patch.file + ": " +
          (patch.hasDescriptor ? patch.descriptorError.text : "the archive has no patch.ini"));
  }
  if (patches.empty())
    throw JudgementError("no patch that applies to this home: " + path);
  return patches;
}

std::string versionFileOf(const Home &home, const Patch &patch) {
  return getVerFileName(patch.descriptor.get(), home.path(), patch.path);
}
