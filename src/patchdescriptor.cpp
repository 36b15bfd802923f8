#include "patchdescriptor.h"

#include "failure.h"
#include "utilities.h"

#define LOG_COMPONENT "patchdescriptor.cpp"

namespace {

/// Handles a missing optional key: removes the error of its look-up from the record.
/// KEEP(optional-hides-cause): once a required key is missing, the record is not changed, and so names the
/// optional key in place of the required one.
void forgetMissing(PatchError *err, bool result) {
  if (result)
    fillRecord(err, PatchError::None, "");
}

/// "k" form of an entry name; `prefixed` is true when the "k" was added.
std::string normalized(const std::string &name, bool &prefixed) {
  prefixed = name.size() == 2;
  return Util::normalizeProductCode(name);
}

} // namespace

PatchDescriptor::PatchDescriptor(const PatchDescriptor &other)
    : productCode_(other.productCode_), patchName_(other.patchName_),
      patchDescriptiveName_(other.patchDescriptiveName_),
      version_(other.version_ == nullptr ? nullptr : std::make_unique<Version>(*other.version_)),
      arch_(other.arch_), productEXE_(other.productEXE_), prereqs_(other.prereqs_),
      dependents_(other.dependents_), prePatchCommands_(other.prePatchCommands_),
      preCommands_(other.preCommands_), postCommands_(other.postCommands_) {
  LOG_TRACE("PatchDescriptor::PatchDescriptor(PatchDescriptor) %s", "entry");
}

PatchDescriptor::~PatchDescriptor() {
  LOG_TRACE("PatchDescriptor::~PatchDescriptor %s", "entry");
}

PatchDescriptor *PatchDescriptor::parseFile(const std::string &path, PatchError *err) {
  LOG_TRACE("PatchDescriptor::parseFile(%s) %s", path.c_str(), "entry");
  std::unique_ptr<IniFile> ini(IniFile::parseFile(path, err));
  if (ini == nullptr)
    return nullptr;
  auto descriptor = std::make_unique<PatchDescriptor>();
  if (!descriptor->parse(ini.get(), err)) {
    // The record keeps the error of the section builders.
    LOG_ERROR_MESSAGE("ERROR_PATCH_PARSE");
    descriptor.reset();
  }
  ini.reset();
  LOG_TRACE("PatchDescriptor::parseFile(%s) %s", path.c_str(), "exit");
  return descriptor.release();
}

bool PatchDescriptor::parse(const IniFile *ini, PatchError *err) {
  LOG_TRACE("PatchDescriptor::parse %s", "entry");
  const bool result = buildSections(ini, err);
  LOG_TRACE("PatchDescriptor::parse = %d", result);
  return result;
}

bool PatchDescriptor::buildSections(const IniFile *ini, PatchError *err) {
  const Section *const productInfo = ini->getSection("ProductInfo");
  if (productInfo == nullptr) {
    // Not logged here: ERROR_PATCH_PARSE follows.
    fillRecord(err, PatchError::MissingSection,
               NLS::getFormattedString("ERROR_PATCH_MISSING_SECTION", "ProductInfo"));
    return false;
  }
  struct OptionalSection {
    const char *name;
    const char *missingName;
    bool (PatchDescriptor::*build)(const Section *, PatchError *);
  };
  static const OptionalSection optionalSections[] = {
      {"PreReqs", "PreReqs", &PatchDescriptor::buildPreReqsSection},
      {"Dependents", "Dependents", &PatchDescriptor::buildDependentsSection},
      // KEEP(prepatch-missing-name): its absence is traced under the name of the pre commands.
      {"PrePatchCommands", "PreCommands", &PatchDescriptor::buildPrePatchCmdsSection},
      {"PreCommands", "PreCommands", &PatchDescriptor::buildPreCmdsSection},
      {"PostCommands", "PostCommands", &PatchDescriptor::buildPostCmdsSection},
  };
  bool result = buildInfoSection(productInfo, err);
  for (const OptionalSection &optional : optionalSections) {
    const Section *const section = ini->getSection(optional.name);
    // KEEP(no-section-after-failure): after a failure, existing sections are traced as missing too.
    if (result && section != nullptr)
      result = (this->*optional.build)(section, err); // GCOVR_EXCL_BR_LINE: none of these is virtual
    else
      LOG_TRACE("No %s section found", optional.missingName);
  }
  return result;
}

bool getSectionProperty(const Section *section, const std::string &key, std::string &value, PatchError *err) {
  if (section->getEntryValue(key, value))
    return true;
  fillRecord(err, PatchError::MissingProperty,
             NLS::getFormattedString("ERROR_PATCH_MISSING_PROP", key.c_str()));
  return false;
}

bool getSectionProperty(const Section *section, const std::string &key, std::vector<std::string> &values,
                        PatchError *err) {
  std::string value;
  const bool found = getSectionProperty(section, key, value, err);
  values = Util::tokenizeString(value, ", ");
  return found;
}

bool PatchDescriptor::buildInfoSection(const Section *section, PatchError *err) {
  LOG_TRACE("PatchDescriptor::buildInfoSection%s", "entry");
  std::string code;
  bool result = getSectionProperty(section, "productCode", code, err);
  bool prefixed = false;
  productCode_ = normalized(code, prefixed);
  if (prefixed)
    LOG_TRACE("2 letter product code, prepending the letter k, result: %s", productCode_.c_str());

  std::string ver;
  std::string rel;
  std::string mod;
  std::string lvl;
  struct Required {
    const char *key;
    std::string *value;
  };
  const Required required[] = {{"patchName", &patchName_}, {"patchDescriptiveName", &patchDescriptiveName_},
                               {"productVer", &ver},       {"productRel", &rel},
                               {"productMod", &mod},       {"productLvl", &lvl}};
  // A missing key does not end the search: the record names the last one.
  for (const Required &property : required) {
    const bool found = getSectionProperty(section, property.key, *property.value, err);
    result = result && found;
  }
  version_ = std::make_unique<Version>(ver.c_str(), rel.c_str(), mod.c_str(), lvl.c_str());

  if (!getSectionProperty(section, "productBinArch", arch_, err)) {
    LOG_TRACE("skipping optional property productBinArch");
    forgetMissing(err, result);
  }
  if (!getSectionProperty(section, "productEXE", productEXE_, err)) {
    LOG_TRACE("skipping optional property productEXE");
    productEXE_.clear();
    forgetMissing(err, result);
  }
  LOG_TRACE("PatchDescriptor::buildInfoSection = %d", result);
  return result;
}

bool PatchDescriptor::buildPreReqsSection(const Section *section, PatchError *) {
  LOG_TRACE("PatchDescriptor::buildPreReqsSection%s", "entry");
  for (const std::string &name : section->getEntryNames()) {
    std::string level;
    section->getEntryValue(name, level);
    bool prefixed = false;
    const std::string code = normalized(name, prefixed);
    if (prefixed)
      LOG_TRACE("2 letter pre-req, prepending a 'k'");
    prereqs_[code] = level;
  }
  LOG_TRACE("PatchDescriptor::buildPreReqsSection = %d", true);
  return true;
}

bool PatchDescriptor::buildDependentsSection(const Section *section, PatchError *) {
  LOG_TRACE("PatchDescriptor::buildDependentsSection%s", "entry");
  dependents_.clear();
  for (const std::string &name : section->getEntryNames()) {
    bool prefixed = false;
    dependents_.push_back(normalized(name, prefixed));
    if (prefixed)
      LOG_TRACE("read a two-letter dependent, prepending 'k' to it");
  }
  LOG_TRACE("PatchDescriptor::buildDependentsSection = %d", true);
  return true;
}

bool PatchDescriptor::buildPrePatchCmdsSection(const Section *section, PatchError *) {
  LOG_TRACE("PatchDescriptor::buildPrePatchCmdsSection%s", "entry");
  prePatchCommands_ = section->getEntryNames();
  LOG_TRACE("PatchDescriptor::buildPrePatchCmdsSection = %d", true);
  return true;
}

bool PatchDescriptor::buildPreCmdsSection(const Section *section, PatchError *) {
  LOG_TRACE("PatchDescriptor::buildPreCmdsSection%s", "entry");
  preCommands_ = section->getEntryNames();
  LOG_TRACE("PatchDescriptor::buildPreCmdsSection = %d", true);
  return true;
}

bool PatchDescriptor::buildPostCmdsSection(const Section *section, PatchError *) {
  LOG_TRACE("PatchDescriptor::buildPostCmdsSection %s", "entry");
  postCommands_ = section->getEntryNames();
  LOG_TRACE("PatchDescriptor::buildPostCmdsSection = %d", true);
  return true;
}

std::vector<std::string> PatchDescriptor::getPrereqs() const {
  std::vector<std::string> codes;
  for (const auto &pair : prereqs_)
    codes.push_back(pair.first);
  return codes;
}

bool PatchDescriptor::getPrereqVersion(const std::string &code, Version &version) const {
  const auto found = prereqs_.find(code);
  if (found == prereqs_.end())
    return false;
  version.set(found->second);
  return true;
}
