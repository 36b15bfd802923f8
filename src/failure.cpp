#include "failure.h"

void fillRecord(PatchError *err, int code, const std::string &text) {
  if (err == nullptr)
    return;
  err->code = code;
  err->text = text;
}

bool reportFailure(int line, const char *component, PatchError *err, int code, const char *key, ...) {
  va_list arguments;
  va_start(arguments, key);
  const std::string text = NLS::getFormattedStringV(key, arguments);
  va_end(arguments);
  setLine(line);
  logError(component, "%s", text.c_str());
  fillRecord(err, code, text);
  return false;
}
