// patch.ini, validated and normalised: the product of the patch, its level, its prerequisites, the products
// whose instances must be stopped, and three lists of commands.
//
// Every list is in ascending byte-wise order, not in file order, and identical lines are one entry: where the
// order counts, the names of commands begin with numbers.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "inifile.h"
#include "nls.h"
#include "version.h"

class PatchDescriptor {
public:
  PatchDescriptor() = default;
  PatchDescriptor(const PatchDescriptor &other);
  PatchDescriptor &operator=(const PatchDescriptor &) = delete;
  virtual ~PatchDescriptor();

  /// A new descriptor that the caller owns; null when the file cannot be read (code 5), has no ProductInfo
  /// section (6) or lacks a required key (7). ERROR_PATCH_PARSE is then in the log, never in the record.
  static PatchDescriptor *parseFile(const std::string &path, PatchError *err);

  /// Fills the object from a parsed file; codes 6 and 7.
  bool parse(const IniFile *ini, PatchError *err);

  // One for each section, called by parse(). Only the first can fail.
  bool buildInfoSection(const Section *section, PatchError *err);
  bool buildPreReqsSection(const Section *section, PatchError *err);
  bool buildDependentsSection(const Section *section, PatchError *err);
  bool buildPrePatchCmdsSection(const Section *section, PatchError *err);
  bool buildPreCmdsSection(const Section *section, PatchError *err);
  bool buildPostCmdsSection(const Section *section, PatchError *err);

  std::string getProductCode() const { return productCode_; } ///< "k" form, lower case
  std::string getPatchName() const { return patchName_; }
  std::string getPatchDescriptiveName() const { return patchDescriptiveName_; }
  std::string getProductEXE() const { return productEXE_; }
  Version *getVersion() const { return version_.get(); } ///< owned by the descriptor; null before parsing
  std::vector<std::string> getArch() const { return arch_; }
  std::vector<std::string> getPrereqs() const; ///< product codes, ascending
  std::vector<std::string> getDependents() const { return dependents_; }
  std::vector<std::string> getPrePatchCommands() const { return prePatchCommands_; }
  std::vector<std::string> getPreCommands() const { return preCommands_; }
  std::vector<std::string> getPostCommands() const { return postCommands_; }

  /// Sets `version` to the required level of `code` (normalised form); false, with `version` untouched, when
  /// it is not a prerequisite.
  bool getPrereqVersion(const std::string &code, Version &version) const;

private:
  bool buildSections(const IniFile *ini, PatchError *err);

  std::string productCode_;
  std::string patchName_;
  std::string patchDescriptiveName_;
  std::unique_ptr<Version> version_;
  std::vector<std::string> arch_;
  std::string productEXE_;
  std::map<std::string, std::string> prereqs_;
  std::vector<std::string> dependents_;
  std::vector<std::string> prePatchCommands_;
  std::vector<std::string> preCommands_;
  std::vector<std::string> postCommands_;
};

/// The value of a key of a section; a missing key is code 7, ERROR_PATCH_MISSING_PROP, and is not logged.
bool getSectionProperty(const Section *section, const std::string &key, std::string &value, PatchError *err);
/// The same, split at commas and blanks; a missing key leaves no values.
bool getSectionProperty(const Section *section, const std::string &key, std::vector<std::string> &values,
                        PatchError *err);
