// One patch file applied to one home.
//
// The caller creates a processor, initializes it, calls the two checks, and then run() or testRun() with
// cleanUp() before and after. Every operation that takes an error record accepts null, logs its failure, and
// returns false; the first failure ends a sequence, and nothing is undone.
#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "file.h"
#include "nls.h"
#include "orvcomponent.h"
#include "patchdescriptor.h"
#include "patchfilename.h"

class PatchProcessor {
public:
  // lifecycle.cpp: the two sequences, and the temporary directory that they work in

  /// A new processor that the caller owns; nothing is checked yet.
  static PatchProcessor *createProcessor(const std::string &patchFilePath, const std::string &home,
                                         PatchError *err);
  PatchProcessor(const PatchProcessor &) = delete;
  PatchProcessor &operator=(const PatchProcessor &) = delete;
  virtual ~PatchProcessor();

  /// Applies the patch in nine steps, each only when all before succeeded; then always restarts the OS agent
  /// when one was stopped, and writes the history line. Leaves the temporary directory in place.
  bool run(PatchError *err);
  /// Prints what run() would do. Changes nothing but the temporary directory and the log.
  bool testRun(PatchError *err);
  /// Extracts and reads patch.ini.
  bool initialize(PatchError *err);
  /// Extracts the whole archive into the temporary directory; codes 3 and 24.
  bool extract(PatchError *err);
  /// Extracts patch.ini alone; codes 3 and 24.
  bool extractINI(PatchError *err);
  /// Reads the extracted patch.ini; codes 5 to 7.
  bool parsePatchDescriptor(PatchError *err);
  /// Removes the temporary directory; code 27.
  bool cleanUp(PatchError *err);

  const PatchDescriptor *getDescriptor() const { return descriptor_.get(); } ///< null before initialize()
  std::string getPatchFilename();                                            ///< the path as given

  // prerequisites.cpp: checks before a patch is applied

  /// False while the server or console that the patch touches runs: codes 35 to 37, with an empty text in the
  /// record, since the message has been printed to standard error already.
  bool checkForActivePrograms(PatchError *err);
  /// Installed level and prerequisites: codes 9 to 11.
  bool checkPrereqs(PatchError *err);
  /// The architecture of a product in the component's own prerequisite list; "none" or empty without one.
  std::string getArchFromPrereqs(const std::string &prereq, std::vector<std::string> componentPrereqs);

  // dependents.cpp: the instances that are stopped and started again

  bool buildDependentsList(PatchError *err);
  bool printDependentsList(PatchError *err);
  bool stopDependents(PatchError *err);  ///< codes 14, 15, 18 and 19
  bool startDependents(PatchError *err); ///< codes 12, 13, 16, 19 and 20

  // osagent.cpp

  /// Hands `resultCode` to the OS agent and starts its default instance, when an instance of it was stopped.
  bool startOSAgentIfNeeded(int resultCode, PatchError *err);

  // scripts.cpp: the commands of a patch

  bool runPrePatchScripts(PatchError *err); ///< code 22
  bool runPreScripts(PatchError *err);      ///< code 21
  bool runPostScripts(PatchError *err);     ///< code 23
  /// Runs the commands in order from the temporary directory, which is first in PATH; codes -1 and 24.
  bool runScripts(std::vector<std::string> commands, PatchError *err);

  // fileinstall.cpp: updated_files

  bool moveFiles(PatchError *err); ///< codes 24 to 26
  bool listFiles(PatchError *err); ///< code 24; false without an error when there are no files
  bool moveFile(File *entry, PatchError *err);
  bool listFile(File *entry, PatchError *err);

  // productexe.cpp: copies of the product executable

  bool updateProductEXEFiles(PatchError *err);
  bool listProductEXEFiles(PatchError *err);
  /// Appends a new File, which the caller owns, for every copy of the product executable.
  bool findProductEXEFiles(std::vector<File *> &found, PatchError *err);

  // records.cpp: version file and history

  bool updatePatchVerFile(PatchError *err); ///< code 28
  void updatePatchRegistry(bool passed);

private:
  using Instances = std::vector<std::string>;

  PatchProcessor(const std::string &patchFilePath, const std::string &home);

  PatchFileName patchFileName() const;
  std::string tempDir() const;    ///< where the archive is extracted
  std::string contentDir() const; ///< where its commands and files are looked for

  std::optional<bool> unpack(const std::vector<std::string> &members, PatchError *err);
  bool runTar(const std::vector<std::string> &members, const std::string &archive, PatchError *err);
  bool verifyPrereqs(PatchError *err);
  bool verifyLevel(const ORVComponent &installed, PatchError *err);
  bool verifyPrereq(const std::string &prereq, const ORVComponent &installed, PatchError *err);
  bool hasDependents() const;
  void collectAll();
  void collectListed(const std::vector<std::string> &codes);
  bool stopAll(PatchError *err);
  bool stopListed(const std::vector<std::string> &codes, PatchError *err);
  bool startInstances(PatchError *err);
  void writeResultFile(int resultCode) const;
  bool runList(const std::vector<std::string> &commands, PatchError::Code code, PatchError *err);

  std::string patchFilePath_;
  std::string home_;
  std::unique_ptr<PatchDescriptor> descriptor_;
  std::map<std::string, Instances> dependents_;
  bool mayHaveMoved_ = false; ///< files of the product, which must be on disk before the level is
};

/// Product code of the OS agent, which has its own restart rule.
extern const std::string glbOsAgentPC;

/// Puts on disk, in one call, what the file system of `directory` still has to write. A system that cannot do
/// it does not keep a patch from being installed.
void flushToDisk(const std::string &directory);

/// Path of the version file that records the level of the patched component.
std::string getVerFileName(const PatchDescriptor *descriptor, const std::string &home,
                           const std::string &patchFilePath);

/// The check behind the hidden "-utest" form: makes and initializes a processor for a sample patch.
void patchProcessorSelfCheck();
