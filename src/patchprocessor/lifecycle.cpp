// The two sequences, and what surrounds them: creation, extraction, the descriptor, clean-up.
#include "patchprocessor/patchprocessor.h"

#include <cstdio>

#include "failure.h"
#include "patchprocessor/workingdirectory.h"
#include "process.h"
#include "utilities.h"

#define LOG_COMPONENT "patchprocessor"

namespace {

/// One list of commands in the report, under its heading.
void printCommands(const std::vector<std::string> &commands, const char *headingKey, const char *noneKey) {
  printf("%s\n", NLS::getString(commands.empty() ? noneKey : headingKey).c_str());
  for (const std::string &command : commands)
    printf("    %s\n", command.c_str());
}

} // namespace

bool PatchProcessor::run(PatchError *err) {
  LOG_TRACE("PatchProcessor::run() %s", "entry");
  // clang-format off
  bool result = extract(err)
                && runPrePatchScripts(err)
                && stopDependents(err)
                && runPreScripts(err)
                && moveFiles(err)
                && updateProductEXEFiles(err) // GCOVR_EXCL_BR_LINE: a placeholder, which always succeeds
                && runPostScripts(err)
                && updatePatchVerFile(err)
                && startDependents(err);
  // clang-format on
  if (!startOSAgentIfNeeded(err == nullptr ? 0 : err->code, err)) {
    // KEEP(osagent-wording): the line says so even when an earlier step has failed already.
    LOG_TRACE("Patch seems to be successfully applied. However, the OS agent could not be restarted");
    result = false;
  }
  updatePatchRegistry(result);
  LOG_TRACE("PatchProcessor::run() = %d", result);
  return result;
}

bool PatchProcessor::testRun(PatchError *err) {
  LOG_TRACE("PatchProcessor::testRun() %s", "entry");
  printCommands(descriptor_->getPrePatchCommands(), "PP_TEST_PREPATCHSCRIPT", "PP_TEST_NO_PREPATCHSCRIPT");
  printf("\n");
  static_cast<void>(printDependentsList(err)); // it cannot fail the report
  printCommands(descriptor_->getPreCommands(), "PP_TEST_PRESCRIPT", "PP_TEST_NO_PRESCRIPT");
  bool result = extract(err) && listFiles(err);
  if (result)
    result = listProductEXEFiles(err);
  if (result) {
    printCommands(descriptor_->getPostCommands(), "PP_TEST_POSTSCRIPT", "PP_TEST_NO_POSTSCRIPT");
    printf("\n");
  }
  LOG_TRACE("PatchProcessor::testRun() = %d", result);
  return result;
}

PatchProcessor *PatchProcessor::createProcessor(const std::string &patchFilePath, const std::string &home,
                                                PatchError *) {
  LOG_TRACE("PatchProcessor::createProcessor(%s, %s) %s", patchFilePath.c_str(), home.c_str(), "entry");
  auto *const processor = new PatchProcessor(patchFilePath, home);
  LOG_TRACE("PatchProcessor::createProcessor(%s, %s) %s", patchFilePath.c_str(), home.c_str(), "exit");
  return processor;
}

PatchProcessor::PatchProcessor(const std::string &patchFilePath, const std::string &home)
    : patchFilePath_(patchFilePath), home_(home) {}

PatchProcessor::~PatchProcessor() {
  LOG_TRACE("PatchProcessor::~PatchProcessor() %s", "entry");
  descriptor_.reset();
  LOG_TRACE("PatchProcessor::~PatchProcessor() %s", "exit");
}

std::string PatchProcessor::getPatchFilename() {
  LOG_TRACE("PatchProcessor::getPatchFilename() %s", "entry");
  LOG_TRACE("PatchProcessor::getPatchFilename() retval [%s]", patchFilePath_.c_str());
  return patchFilePath_;
}

PatchFileName PatchProcessor::patchFileName() const {
  return PatchFileName(File(patchFilePath_).getName());
}

/// Shared by all patches of one product code: a patch's own leftovers are removed before it runs.
std::string PatchProcessor::tempDir() const {
  return Util::getTempDir(patchFileName().getProduct());
}

// KEEP(two-temp-directories): one would expect tempDir() here too. A patch whose file name and descriptor
// name different products is extracted into the directory of the one, and its commands and files are looked
// for in that of the other.
std::string PatchProcessor::contentDir() const {
  return Util::getTempDir(descriptor_->getProductCode());
}

bool PatchProcessor::initialize(PatchError *err) {
  LOG_TRACE("PatchProcessor::initialize() %s", "entry");
  bool result = extractINI(err);
  if (!result) {
    LOG_TRACE("Unable to extract patch contents for: %s", patchFilePath_.c_str());
  } else {
    result = parsePatchDescriptor(err);
    if (!result)
      LOG_TRACE("Unable to load patch.ini contents for: %s", patchFilePath_.c_str());
  }
  LOG_TRACE("PatchProcessor::initialize() retval [%d]", result);
  return result;
}

bool PatchProcessor::extract(PatchError *err) {
  LOG_TRACE("PatchProcessor::extract() %s", "entry");
  const std::optional<bool> result = unpack({}, err);
  if (result.has_value())
    LOG_TRACE("PatchProcessor::extract() = %d", *result);
  return result.value_or(false);
}

bool PatchProcessor::extractINI(PatchError *err) {
  LOG_TRACE("PatchProcessor::extractINI() %s", "entry");
  const std::optional<bool> result = unpack({"patch.ini"}, err);
  if (result.has_value())
    LOG_TRACE("PatchProcessor::extractINI() = %d", *result);
  return result.value_or(false);
}

/// Unpacks these members, or all, in the temporary directory, which is made before. No result, and no result
/// line, when it cannot be entered.
std::optional<bool> PatchProcessor::unpack(const std::vector<std::string> &members, PatchError *err) {
  const std::string directory = tempDir();
  if (!File(directory).mkdir()) {
    FAILURE(err, PatchError::CannotExtract, "ERROR_PP_MAKE_DIR", directory.c_str());
    return std::nullopt;
  }
  // The path may have been given relative to the directory that is left.
  const std::string archive = File(patchFilePath_).getAbsolutePath();
  WorkingDirectory workingDirectory;
  if (!workingDirectory.enter(directory, err))
    return std::nullopt;
  return runTar(members, archive, err);
}

bool PatchProcessor::runTar(const std::vector<std::string> &members, const std::string &archive,
                            PatchError *err) {
  std::vector<std::string> command = {"tar", "-xf", archive};
  command.insert(command.end(), members.begin(), members.end());
  CommandResult tar;
  if (!runCommand(command, tar))
    return FAILURE(err, PatchError::CannotExtract, "PROC_CANT_RUN", "tar -xf");
  LOG_TRACE("tar returned: %d", tar.rc);
  LOG_TRACE("stdout: %s", tar.out.c_str());
  LOG_TRACE("stderr: %s", tar.err.c_str());
  if (tar.rc != 0)
    return FAILURE(err, PatchError::CannotExtract, "PROC_BAD_RC", "tar -xf", tar.rc);
  return true;
}

bool PatchProcessor::parsePatchDescriptor(PatchError *err) {
  LOG_TRACE("PatchProcessor::parsePatchDescriptor() %s", "entry");
  std::string path = tempDir();
  if (path.back() != '/')
    path += '/';
  descriptor_.reset(PatchDescriptor::parseFile(path + "patch.ini", err));
  const bool result = descriptor_ != nullptr;
  LOG_TRACE("PatchProcessor::parsePatchDescriptor() = %d", result);
  return result;
}

bool PatchProcessor::cleanUp(PatchError *err) {
  LOG_TRACE("PatchProcessor::cleanUp() %s", "entry");
  const std::string directory = tempDir();
  const bool result = File(directory).rmdir();
  if (!result)
    FAILURE(err, PatchError::CannotRemoveDirectory, "ERROR_PP_RM_DIR", directory.c_str());
  LOG_TRACE("PatchProcessor::cleanUp() = %d", result);
  return result;
}

void patchProcessorSelfCheck() {
  // A product code that no product bears, so that the check meets no other patch's temporary directory.
  static const char samplePatch[] = "kzz_unix_vema_fp0001.tar";
  static const char rule[] = "----------------------------------------";
  printf("%s\n- Testing patchProcesser API's\n%s\n", rule, rule);
  PatchError error;
  const std::unique_ptr<PatchProcessor> processor(
      PatchProcessor::createProcessor(samplePatch, Util::getQuillHome(), &error));
  if (!processor->initialize(&error))
    fprintf(stderr, "Can't initialize patch processor, Error: %s\n", error.text.c_str());
}
