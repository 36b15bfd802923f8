// From a path on the command line to applied patches: chooses the files that are patches for this system,
// checks each, and orders them.
//
// All patches are checked before the first is applied; the first failure ends the command.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "file.h"
#include "nls.h"
#include "ownedlist.h"
#include "patchprocessor/patchprocessor.h"

class DCFPackageProcessor {
public:
  /// A loaded package processor that the caller owns; null when load() failed.
  static DCFPackageProcessor *createProcessor(const std::string &path, PatchError *error);
  DCFPackageProcessor(const DCFPackageProcessor &) = delete;
  DCFPackageProcessor &operator=(const DCFPackageProcessor &) = delete;
  virtual ~DCFPackageProcessor();

  /// Takes the file, or every applicable file of the directory, through initialization and checks.
  /// Codes 30, 31, 32 and 34, and those of PatchProcessor's steps. A directory in which a patch fails before
  /// any was accepted reports 32 in place of that patch's own code.
  bool load(PatchError *error);
  /// Reorders by target: vecm, vems, veps, vepd, vema; stable within a target. Always true.
  bool sort();
  /// Applies all, stopping at the first failure. An empty list is a success.
  bool run(PatchError *error);
  /// Reports on all, stopping at the first failure.
  bool testRun(PatchError *error);

  /// The ready processors in order of application; owned by this object.
  std::vector<PatchProcessor *> *getPatchProcessors() { return _patchProcessors->items(); }

  /// Platform family of this build.
  static const char *getPlatform();
  /// Whether the patch can apply to this system, by its name and by the version files that must exist under
  /// `home`. Writes trace lines only.
  static bool isApplicable(const std::string &home, const File &file);

private:
  explicit DCFPackageProcessor(const std::string &path);

  bool loadPath(const std::string &home, PatchError *error);
  bool loadFile(const std::string &home, const File &file, PatchError *error);
  bool loadDirectory(const std::string &home, File &directory, PatchError *error);
  bool loadEntry(const std::string &home, const File &file, PatchError *error);
  bool loadPatch(const std::string &home, const File &file, PatchError *error);
  static bool apply(PatchProcessor &processor, PatchError *error);
  static bool report(PatchProcessor &processor, PatchError *error);

  std::string path_;
  std::unique_ptr<OwnedList<PatchProcessor>> _patchProcessors;
};
