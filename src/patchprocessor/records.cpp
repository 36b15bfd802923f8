// The records of a patch: the level in the product's version file, and a line in the patch history.
#include "patchprocessor/patchprocessor.h"

#include <cerrno>
#include <cstring>
#include <ctime>

#include <fcntl.h>
#include <unistd.h>

#include "failure.h"
#include "filedescriptor.h"
#include "signalguard.h"
#include "target.h"
#include "utilities.h"

#define LOG_COMPONENT "patchprocessor"

namespace {

/// Puts a file on disk. That a file system does not offer it is no failure.
bool flush(const FileDescriptor &file) {
  return fsync(file.get()) == 0 || errno == EINVAL || errno == ENOSYS || errno == EROFS;
}

/// Writes all of `text` and puts it on disk; 0 or an error number.
int appendToDisk(FileDescriptor &file, const std::string &text) {
  return file.write(text) && flush(file) && file.close() ? 0 : errno;
}

/// The same from the beginning of the file, which is then cut to the new length. It is cut only after all of
/// the text is written: a full disk, or the end of the program in between, leaves a file with a level.
int replaceOnDisk(FileDescriptor &file, const std::string &text) {
  return file.write(text) && ftruncate(file.get(), static_cast<off_t>(text.size())) == 0 && flush(file) &&
                 file.close()
             ? 0
             : errno;
}

std::string paddedTo(std::size_t width, std::string text) {
  if (text.size() < width)
    text.resize(width, ' ');
  return text;
}

std::string historyHeader() {
  const std::string rule(80, '#');
  return rule +
         "\n# Norvik Veyra Monitoring Patch History File\n#\n"
         "# Format: <Product Code> | <Architecture> | <Comp> | <Patch Name> | PASS/FAIL | <user> | <date>\n" +
         rule + "\n";
}

/// Current date and time in local time; empty when they cannot be determined.
std::string now() {
  const time_t seconds = time(nullptr);
  tm local = {};
  char text[49] = "";
  if (localtime_r(&seconds, &local) != nullptr)
    static_cast<void>(strftime(text, sizeof text, "%m/%d/%Y %H:%M:%S", &local));
  return text;
}

} // namespace

void flushToDisk(const std::string &directory) {
  const FileDescriptor opened(directory.c_str(), O_RDONLY | O_DIRECTORY);
  if (opened.isOpen())
    static_cast<void>(syncfs(opened.get()));
}

std::string getVerFileName(const PatchDescriptor *descriptor, const std::string &home,
                           const std::string &patchFilePath) {
  const PatchFileName fileName(File(patchFilePath).getName());
  const Target *const target = findTarget(fileName.getTarget());
  const std::string product = Util::toLower(descriptor->getProductCode());
  // KEEP(vecm-zt-file): a command-line patch updates the file of "zt", whatever its own product code.
  const bool isCommandLine = target != nullptr && target->kind == ORVComponent::TYPE_CLI;
  const std::string code = isCommandLine ? target->ownCode : product.substr(product.empty() ? 0 : 1);
  return home + "registry/" + versionFileName(target, code, fileName.getFullPlatform());
}

bool PatchProcessor::updatePatchVerFile(PatchError *err) {
  LOG_TRACE("PatchProcessor::updatePatchVerFile() %s", "entry");
  const std::string path = getVerFileName(descriptor_.get(), home_, patchFilePath_);
  std::vector<std::string> lines;
  int error = Util::readFileByLines(path.c_str(), lines);
  if (error != 0)
    return FAILURE(err, PatchError::CannotUpdateVersion, "ERROR_PP_UPDATE_VRMF", path.c_str(),
                   std::to_string(error).c_str());
  // The whole text first, for a single write.
  const std::string level = "VRMF = " + descriptor_->getVersion()->getVersionString();
  std::string text;
  for (const std::string &line : lines)
    text += (line.rfind("VRMF", 0) == 0 ? level : line) + "\n";

  // A file system may put the new level on disk before the names of the moved files.
  if (mayHaveMoved_)
    flushToDisk(home_);
  const SignalGuard guard;
  FileDescriptor file(path.c_str(), O_WRONLY | O_CREAT);
  if (!file.isOpen())
    return FAILURE(err, PatchError::CannotUpdateVersion, "ERROR_PP_UPDATE_VRMF", path.c_str(),
                   strerror(errno));
  // KEEP(version-write-true): a level that could not be written is logged, but does not fail the patch, whose
  // files are all in place.
  error = replaceOnDisk(file, text);
  if (error != 0)
    LOG_ERROR_MESSAGE("ERROR_PP_UPDATE_VRMF", path.c_str(), strerror(error));
  LOG_TRACE("PatchProcessor::updatePatchVerFile() = %d", true);
  return true;
}

void PatchProcessor::updatePatchRegistry(bool passed) {
  LOG_TRACE("PatchProcessor::updatePatchRegistry() %s", "entry");
  const PatchFileName fileName = patchFileName();
  const std::string record = descriptor_->getProductCode() + " | " + fileName.getFullPlatform() + " | " +
                             fileName.getTarget() + " | " + paddedTo(20, descriptor_->getPatchName()) +
                             " | " + (passed ? "PASS" : "FAIL") + " | " + paddedTo(15, Util::getUserName()) +
                             " | " + now() + "\n";
  const std::string path = home_ + "patchlogs/patches.hist";
  const SignalGuard guard;
  FileDescriptor file(path.c_str(), O_WRONLY | O_CREAT | O_APPEND);
  int error = errno;
  if (file.isOpen()) {
    const bool isEmpty = lseek(file.get(), 0, SEEK_END) == 0;
    error = appendToDisk(file, (isEmpty ? historyHeader() : "") + record);
  }
  if (error != 0)
    LOG_ERROR_MESSAGE("ERROR_PP_UPDATE_HIST", path.c_str(), strerror(error));
  LOG_TRACE("PatchProcessor::updatePatchRegistry() %s", "exit");
}
