// One patch as the installer will read it: its file name, its descriptor, its members.
//
// Name and descriptor are read by the installer's own units, so that what this program says of a patch cannot
// differ from what the installer does with it.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "nls.h"
#include "patcharchive.h"
#include "patchdescriptor.h"
#include "patchfilename.h"

struct Patch {
  std::string path; ///< as given
  std::string file; ///< its last component
  PatchFileName name;
  std::vector<Member> members;
  std::string archiveProblem; ///< why the archive could not be read to its end; empty when it could
  bool hasDescriptor = false; ///< a member is named exactly "patch.ini"
  std::string descriptorText; ///< its bytes
  /// Null without a valid descriptor; `descriptorError` then has the installer's own message.
  std::unique_ptr<PatchDescriptor> descriptor;
  PatchError descriptorError;
  bool hasEndMark = false; ///< the archive was read up to an empty block, which ends it
};

/// Reads one patch file. JudgementError when it cannot be opened.
Patch readPatch(const std::string &path);

/// The patch files that a path means: itself, or, of a directory, the files whose names are those of patches,
/// in the installer's order (by target, then as the directory lists them). JudgementError for a path that
/// cannot be read, and for a directory without any patch.
std::vector<std::string> patchFiles(const std::string &path);
