#include "output.h"

#include <cstdio>
#include <cstdlib>

#include <nlohmann/json.hpp>
#include <unistd.h>

namespace {

bool wantsColors(ColorMode mode) {
  if (mode != ColorMode::Auto)
    return mode == ColorMode::Always;
  const char *const none = getenv("NO_COLOR");
  return isatty(STDOUT_FILENO) == 1 && (none == nullptr || *none == '\0');
}

} // namespace

void printDocument(const nlohmann::ordered_json &document) {
  printf("%s\n", document.dump(2).c_str());
}

Palette::Palette(const OutputOptions &options) : colors_(wantsColors(options.color)) {}

std::string Palette::error(const std::string &text) const {
  return colors_ ? "\x1b[31m" + text + "\x1b[0m" : text;
}

std::string Palette::warning(const std::string &text) const {
  return colors_ ? "\x1b[33m" + text + "\x1b[0m" : text;
}
