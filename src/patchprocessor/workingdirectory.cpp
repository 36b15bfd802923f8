#include "patchprocessor/workingdirectory.h"

#include "failure.h"
#include "utilities.h"

#define LOG_COMPONENT "patchprocessor"

namespace {

bool change(const std::string &directory, PatchError *err) {
  if (!Util::setCurrentDirectory(directory))
    return FAILURE(err, PatchError::CannotChangeDirectory, "ERROR_PP_SET_CWD", directory.c_str());
  return true;
}

} // namespace

WorkingDirectory::~WorkingDirectory() {
  if (isEntered_)
    static_cast<void>(Util::setCurrentDirectory(before_));
}

bool WorkingDirectory::enter(const std::string &directory, PatchError *err) {
  before_ = Util::getCurrentDirectory();
  isEntered_ = change(directory, err);
  return isEntered_;
}

bool WorkingDirectory::leave(PatchError *err) {
  isEntered_ = false;
  return change(before_, err);
}
