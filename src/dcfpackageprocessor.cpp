#include "dcfpackageprocessor.h"

#include <algorithm>
#include <cstdio>

#include <sys/stat.h>

#include "failure.h"
#include "target.h"
#include "utilities.h"

#define LOG_COMPONENT "dcfpackageprocessor"

namespace {

/// Whether the path is neither a regular file nor a directory: File::isFile is true for devices and pipes
/// too. A directory that has replaced the file since then is not ignored silently.
bool isSpecial(const std::string &path) {
  struct stat status = {};
  return stat(path.c_str(), &status) == 0 && !S_ISREG(status.st_mode) && !S_ISDIR(status.st_mode);
}

/// Whether the requirements of the patch's target are installed under the home.
bool isSupported(const std::string &home, const PatchFileName &name) {
  const Target &target = *findTarget(name.getTarget()); // a valid name has one
  const std::string &platform = name.getFullPlatform();
  if (target.isServerInstalled != nullptr && !target.isServerInstalled(platform))
    return false;
  const std::string code = Util::toLower(name.getProduct().substr(1));
  if (Util::pathExists(home + "registry/" + versionFileName(&target, code, platform)))
    return true;
  LOG_TRACE("%s support not installed for: %s", target.logName, name.getProduct().c_str());
  return false;
}

std::string targetOf(PatchProcessor &processor) {
  return PatchFileName(File(processor.getPatchFilename()).getName()).getTarget();
}

} // namespace

const char *DCFPackageProcessor::getPlatform() {
  return "lpp";
}

bool DCFPackageProcessor::isApplicable(const std::string &home, const File &file) {
  const std::string name = file.getName();
  LOG_TRACE("DCFPackageProcessor::isApplicable('%s','%s')  %s", home.c_str(), name.c_str(), "entry");
  const PatchFileName patch(name);
  bool result = false;
  if (!patch.isValid())
    LOG_TRACE(
        "Specified filename: %s, is not a valid patch filename, therefore the file is not an applicable "
        "patch.",
        name.c_str());
  else if (patch.getPlatform() != getPlatform() && patch.getPlatform() != "unix")
    LOG_TRACE("Platform specified in patch filename: %s, does not match current platform: %s. Patch is not "
              "applicable.",
              patch.getPlatform().c_str(), getPlatform());
  else
    result = isSupported(home, patch);
  LOG_TRACE("DCFPackageProcessor::isApplicable() retval: [%d]", result);
  return result;
}

DCFPackageProcessor *DCFPackageProcessor::createProcessor(const std::string &path, PatchError *error) {
  LOG_TRACE("DCFPackageProcessor::createProcessor(%s) - %s", path.c_str(), "entry");
  std::unique_ptr<DCFPackageProcessor> processor(new DCFPackageProcessor(path));
  if (!processor->load(error)) {
    processor.reset();
    LOG_TRACE("Unable to load patch(s)");
  }
  LOG_TRACE("DCFPackageProcessor::createProcessor(%s) - %s", path.c_str(), "exit");
  return processor.release();
}

DCFPackageProcessor::DCFPackageProcessor(const std::string &path)
    : path_(path), _patchProcessors(std::make_unique<OwnedList<PatchProcessor>>()) {}

DCFPackageProcessor::~DCFPackageProcessor() {
  LOG_TRACE("DCFPackageProcessor::~DCFPackageProcessor() %s", "entry");
  _patchProcessors.reset();
  LOG_TRACE("DCFPackageProcessor::~DCFPackageProcessor() %s", "exit");
}

bool DCFPackageProcessor::load(PatchError *error) {
  LOG_TRACE("DCFPackageProcessor::load() %s", "entry");
  const std::string home = Util::getQuillHome();
  LOG_TRACE("QUILLHOME=[%s]", home.c_str());
  const bool result = loadPath(home, error);
  if (result && getPatchProcessors()->size() > 1)
    sort();
  LOG_TRACE("DCFPackageProcessor::load() %s retval: [%d]", "exit", result);
  return result;
}

bool DCFPackageProcessor::loadPath(const std::string &home, PatchError *error) {
  File path(path_);
  if (!path.exists())
    return FAILURE(error, PatchError::PathNotFound, "ERROR_DCFPP_PATH", path_.c_str());
  if (path.isDirectory())
    return loadDirectory(home, path, error);
  // A device or a socket is neither file nor directory: nothing is loaded, and that is no failure.
  return isSpecial(path_) || loadFile(home, path, error);
}

bool DCFPackageProcessor::loadFile(const std::string &home, const File &file, PatchError *error) {
  LOG_TRACE("[%s] is a file.", file.getPath().c_str());
  if (!isApplicable(home, file))
    return FAILURE(error, PatchError::NotApplicable, "ERROR_DCFPP_NOT_APPLICABLE", path_.c_str());
  if (!loadPatch(home, file, error))
    return false;
  LOG_TRACE("Patch pushback succeeded.");
  return true;
}

bool DCFPackageProcessor::loadDirectory(const std::string &home, File &directory, PatchError *error) {
  LOG_INFO_MESSAGE("DCFPP_PROCESS_DIR", directory.getName().c_str());
  const std::vector<File *> &files = *directory.listFiles();
  if (files.empty())
    return FAILURE(error, PatchError::NoFiles, "ERROR_DCFPP_NO_FILES", path_.c_str());
  const bool result = std::all_of(files.begin(), files.end(),
                                  [&](const File *file) { return loadEntry(home, *file, error); });
  if (!getPatchProcessors()->empty())
    return result;
  LOG_TRACE("_patchProcessors empty. No patches to install");
  // KEEP(no-applicable-overwrites): this code replaces that of a patch that failed before any was accepted.
  return FAILURE(error, PatchError::NoApplicablePatch, "ERROR_DCFPP_NO_APPLICABLE", path_.c_str());
}

/// Handles one entry of the directory; true when the scan goes on.
bool DCFPackageProcessor::loadEntry(const std::string &home, const File &file, PatchError *error) {
  LOG_INFO_MESSAGE("DCFPP_PROCESS_PATCH", file.getName().c_str());
  // A pipe or a device with a patch's name is ignored: reading an archive from it could wait for ever.
  const std::string path = file.getPath();
  if (isSpecial(path) || !isApplicable(home, file)) {
    LOG_INFO_MESSAGE("DCFPP_NOT_APPLICABLE", path.c_str());
    return true;
  }
  if (!loadPatch(home, file, error))
    return false;
  LOG_TRACE("Patch pushback succeeded. success: %d", true);
  return true;
}

/// Makes the processor of an applicable patch, and checks it. A processor that fails is destroyed at once.
bool DCFPackageProcessor::loadPatch(const std::string &home, const File &file, PatchError *error) {
  const std::string path = file.getPath();
  LOG_TRACE("[%s] is applicable.", path.c_str());
  std::unique_ptr<PatchProcessor> processor(PatchProcessor::createProcessor(path, home, error));
  LOG_TRACE("Calling initialize ");
  if (!processor->initialize(error)) {
    LOG_TRACE("Error initializing patch: %s", path.c_str());
    return false;
  }
  LOG_TRACE("Patch initialization succeeded");
  if (!processor->checkForActivePrograms(error)) {
    LOG_TRACE("Patch installation terminated because of an active server.");
    return false;
  }
  if (!processor->checkPrereqs(error)) {
    LOG_TRACE("Missing prereqs for patch: %s", path.c_str());
    return false;
  }
  _patchProcessors->append(std::move(processor));
  return true;
}

bool DCFPackageProcessor::sort() {
  std::vector<PatchProcessor *> &processors = *getPatchProcessors();
  LOG_TRACE("DCFPackageProcessor::sort() - %s", "entry");
  LOG_TRACE("Total number of eligible patch files to sort: %d", static_cast<int>(processors.size()));
  if (processors.size() >= 2) {
    std::vector<PatchProcessor *> sorted;
    for (const Target &target : targets)
      std::copy_if(processors.begin(), processors.end(), std::back_inserter(sorted),
                   [&target](PatchProcessor *processor) { return targetOf(*processor) == target.name; });
    processors.swap(sorted);
  }
  LOG_TRACE("DCFPackageProcessor::sort() - %s", "exit");
  return true;
}

bool DCFPackageProcessor::run(PatchError *error) {
  LOG_TRACE("DCFPackageProcessor::run() %s", "entry");
  const bool result = std::all_of(getPatchProcessors()->begin(), getPatchProcessors()->end(),
                                  [error](PatchProcessor *processor) { return apply(*processor, error); });
  LOG_TRACE("DCFPackageProcessor::run() %s", "exit");
  return result;
}

/// KEEP(cleanup-unchecked): a clean-up that fails leaves its code and text in the record and stops nothing.
bool DCFPackageProcessor::apply(PatchProcessor &processor, PatchError *error) {
  static_cast<void>(processor.cleanUp(error));
  if (!processor.run(error)) {
    LOG_TRACE("Unable to apply patch: %s", processor.getDescriptor()->getPatchDescriptiveName().c_str());
    return false;
  }
  static_cast<void>(processor.cleanUp(error));
  return true;
}

bool DCFPackageProcessor::testRun(PatchError *error) {
  LOG_TRACE("DCFPackageProcessor::testRun() %s", "entry");
  if (getPatchProcessors()->empty()) {
    const std::string message = NLS::getString("DCFPP_TEST_NO_PATCH");
    LOG_INFO("%s", message.c_str());
    printf("\n%s\n\n", message.c_str());
  }
  const bool result = std::all_of(getPatchProcessors()->begin(), getPatchProcessors()->end(),
                                  [error](PatchProcessor *processor) { return report(*processor, error); });
  LOG_TRACE("DCFPackageProcessor::testRun() %s", "exit");
  return result;
}

bool DCFPackageProcessor::report(PatchProcessor &processor, PatchError *error) {
  static_cast<void>(processor.cleanUp(error));
  printf("\n%s\n", std::string(70, '=').c_str());
  const std::string file = processor.getPatchFilename();
  const std::string name = processor.getDescriptor()->getPatchDescriptiveName();
  printf("%s\n    %s\n\n", NLS::getFormattedString("DCFPP_PROCESS_PATCH", file.c_str()).c_str(),
         name.c_str());
  if (!processor.testRun(error)) {
    LOG_TRACE("Unable to apply patch: %s", name.c_str());
    return false;
  }
  static_cast<void>(processor.cleanUp(error));
  return true;
}
