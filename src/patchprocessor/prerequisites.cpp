// May the patch be applied at all: no server that it touches runs, the installed level suits, and what it
// needs is installed.
#include "patchprocessor/patchprocessor.h"

#include <algorithm>
#include <cstdio>

#include "failure.h"
#include "orvcomponentregistry.h"
#include "target.h"
#include "utilities.h"

#define LOG_COMPONENT "patchprocessor"

namespace {

bool isActive(const char *code) {
  const ORVComponent *const component = getComponent(code);
  return component != nullptr && !component->getActiveInstances().empty();
}

/// Refuses a patch whose server or console runs. The user reads the message here and now, which is why the
/// record gets the code alone.
/// KEEP(running-empty-text): the driver later prints the empty text.
bool refuseRunning(PatchError *err, PatchError::Code code, const char *key, const std::string &patchFile) {
  const std::string message = NLS::getFormattedString(key, patchFile.c_str());
  LOG_ERROR("%s", message.c_str());
  fprintf(stderr, "\n\n%s\n", message.c_str());
  fillRecord(err, code, "");
  return false;
}

/// The lowest level of a version's release.
Version releaseOf(const Version &version) {
  return {version.getVV(), version.getRR(), "00", "00"};
}

/// The type under which a prerequisite is installed.
ORVComponent::Type prereqKind(const std::string &prereq, ORVComponent::Type patchKind) {
  if (prereq == "kzt")
    return ORVComponent::TYPE_CLI;
  return prereq == "khv" || prereq == "kbn" ? ORVComponent::TYPE_AGENT : patchKind;
}

} // namespace

bool PatchProcessor::checkForActivePrograms(PatchError *err) {
  LOG_TRACE("PatchProcessor::checkForActivePrograms() %s", "entry");
  const std::string product = patchFileName().getProduct();
  const char *const patchFile = patchFilePath_.c_str();
  bool result = true;
  if (product == "kqa" && isActive("kqa")) {
    LOG_TRACE("Found a running instance of the VEMS server. Aborting installation of %s.", patchFile);
    result = refuseRunning(err, PatchError::MonitoringServerRunning, "ERROR_VEMS_RUNNING", patchFilePath_);
  } else if (product == "kpt" && isActive("kpt")) {
    LOG_TRACE("Found a running instance of the VEPS server. Aborting installation of %s.", patchFile);
    result = refuseRunning(err, PatchError::PortalServerRunning, "ERROR_VEPS_RUNNING", patchFilePath_);
  } else if (product == "kzt" && Util::isManageGUIRunning()) {
    LOG_TRACE("Found a running instance of the Manage Veyra Enterprize Monitoring Services console. Aborting "
              "installation of %s.",
              patchFile);
    result = refuseRunning(err, PatchError::ConsoleRunning, "ERROR_MVEMS_RUNNING", patchFilePath_);
  }
  LOG_TRACE("PatchProcessor::checkForActivePrograms() = %d", result);
  LOG_TRACE("PatchProcessor::checkForActivePrograms() %s", "exit");
  return result;
}

bool PatchProcessor::checkPrereqs(PatchError *err) {
  LOG_TRACE("PatchProcessor::checkPrereqs() %s", "entry");
  const bool result = verifyPrereqs(err);
  LOG_TRACE("PatchProcessor::checkPrereqs() = %d", result);
  return result;
}

bool PatchProcessor::verifyPrereqs(PatchError *err) {
  const PatchFileName fileName = patchFileName();
  const std::string product = descriptor_->getProductCode();
  // KEEP(support-patch-refused): the patched component is looked up by the target's kind and the full
  // platform. The version file of a server's support for another product, such as oxvms.ver, has "vms" where
  // the platform stands, so such a patch is refused here.
  const ORVComponent *const installed = ORVComponentRegistry::getInstance()->getInstalledComponentByArch(
      product, targetKind(fileName.getTarget()), fileName.getFullPlatform());
  if (installed == nullptr)
    return FAILURE(err, PatchError::MissingProduct, "ERROR_PP_MISSING_PROD", product.c_str());
  if (!verifyLevel(*installed, err))
    return false;
  const std::vector<std::string> prereqs = descriptor_->getPrereqs();
  return std::all_of(prereqs.begin(), prereqs.end(),
                     [&](const std::string &prereq) { return verifyPrereq(prereq, *installed, err); });
}

bool PatchProcessor::verifyLevel(const ORVComponent &installed, PatchError *err) {
  const Version &patchLevel = *descriptor_->getVersion();
  const Version &installedLevel = *installed.getVersion();
  const std::string patchText = patchLevel.getDottedVersionString();
  const std::string installedText = installedLevel.getDottedVersionString();
  if (patchLevel < installedLevel)
    return FAILURE(err, PatchError::BacklevelPatch, "ERROR_PP_OLD_PATCH", patchText.c_str(),
                   installedText.c_str());
  const Version release = releaseOf(patchLevel);
  if (releaseOf(installedLevel) < release)
    return FAILURE(err, PatchError::WrongPrereqVersion, "ERROR_PP_PREREQ_VER",
                   descriptor_->getProductCode().c_str(), installedText.c_str(),
                   release.getDottedVersionString().c_str());
  return true;
}

bool PatchProcessor::verifyPrereq(const std::string &prereq, const ORVComponent &installed, PatchError *err) {
  LOG_TRACE("Check for prereq for %s", prereq.c_str());
  Version required;
  static_cast<void>(descriptor_->getPrereqVersion(prereq, required)); // it is one of the descriptor's own
  if (prereq == descriptor_->getProductCode()) {
    LOG_TRACE("Prereq previously verified.");
    return true;
  }
  const std::string arch = getArchFromPrereqs(prereq, installed.getPrereqs());
  const ORVComponent::Type type = prereqKind(prereq, targetKind(patchFileName().getTarget()));
  const ORVComponentRegistry &registry = *ORVComponentRegistry::getInstance();
  const ORVComponent *const component = arch.empty()
                                            ? registry.getInstalledComponent(prereq, type)
                                            : registry.getInstalledComponentByArch(prereq, type, arch);
  const std::string requiredText = required.getDottedVersionString();
  if (component == nullptr)
    return FAILURE(err, PatchError::MissingProduct, "ERROR_PP_MISSING_PREREQ",
                   (prereq + " " + requiredText).c_str());
  const Version &level = *component->getVersion();
  const std::string levelString = level.getVersionString();
  LOG_TRACE("Comparing installed version %s to required version %s.", levelString.c_str(),
            required.getVersionString().c_str());
  if (level < required)
    return FAILURE(err, PatchError::WrongPrereqVersion, "ERROR_PP_PREREQ_VER", prereq.c_str(),
                   level.getDottedVersionString().c_str(), requiredText.c_str());
  LOG_TRACE("Prereq verified.");
  return true;
}

std::string PatchProcessor::getArchFromPrereqs(const std::string &prereq,
                                               std::vector<std::string> componentPrereqs) {
  LOG_TRACE("PatchProcessor::getArchFromPrereqs() %s", "entry");
  const std::string key = prereq.substr(std::min<std::size_t>(1, prereq.size()));
  const auto entry =
      std::find_if(componentPrereqs.begin(), componentPrereqs.end(),
                   [&key](const std::string &text) { return text.find(key) != std::string::npos; });
  std::string arch;
  if (entry != componentPrereqs.end())
    arch = *entry == "none" ? *entry : entry->substr(std::min<std::size_t>(2, entry->size()));
  LOG_TRACE("PatchProcessor::getArchFromPrereqs returning = %s", arch.c_str());
  LOG_TRACE("PatchProcessor::getArchFromPrereqs() %s", "exit");
  return arch;
}
