#include "version.h"

#include <cstring>
#include <initializer_list>

#include "logger.h"

#define LOG_COMPONENT "version.cpp"

namespace {

void copyField(char *field, const char *text) {
  strncpy(field, text, 2);
  field[2] = '\0';
}

bool hasDots(const std::string &text, std::initializer_list<std::size_t> positions) {
  for (const std::size_t position : positions)
    if (text[position] != '.')
      return false;
  return true;
}

} // namespace

Version::Version() {
  store("06", "10", "00", "00");
}

Version::Version(const char *vv, const char *rr, const char *mm, const char *ff) {
  store(vv, rr, mm, ff);
}

Version::Version(const std::string &text) {
  set(text);
}

void Version::store(const char *vv, const char *rr, const char *mm, const char *ff) {
  copyField(vv_, vv);
  copyField(rr_, rr);
  copyField(mm_, mm);
  copyField(ff_, ff);
}

void Version::set(const std::string &text) {
  const char *const c = text.c_str();
  if (text.empty()) {
    LOG_TRACE("Missing VVRRMMFF version string:  Defaulting to 06100000");
    store("06", "10", "00", "00");
  } else if (text.size() == 6) {
    LOG_TRACE("Version string provided: %s. Will pad with 00 on the end.", c);
    store(c, c + 2, c + 4, "00");
  } else if (text.size() == 8 && hasDots(text, {2, 5})) {
    LOG_TRACE("Version string provided: %s. Will pad ff with 00.", c);
    store(c, c + 3, c + 6, "00");
  } else if (text.size() == 8) {
    // KEEP(version-unchecked): the characters are not checked, dots and letters included. A level is text,
    // and version files in the field hold levels that are not digits.
    LOG_TRACE("Version string provided: %s.", c);
    store(c, c + 2, c + 4, c + 6);
  } else if (text.size() == 11 && hasDots(text, {2, 5, 8})) {
    LOG_TRACE("Version string provided: %s.", c);
    store(c, c + 3, c + 6, c + 9);
  } else {
    LOG_TRACE("Unrecognized VVRRMMFF version string format provided: %s. Defaulting to 06100000", c);
    store("06", "10", "00", "00");
  }
}

std::string Version::getVersionString() const {
  return std::string(vv_) + rr_ + mm_ + ff_;
}

std::string Version::getDottedVersionString() const {
  return std::string(vv_) + "." + rr_ + "." + mm_ + "." + ff_;
}

// KEEP(version-equality): equality ignores the fix level and the order includes it, so for two fix levels of
// one modification both == and > may hold. The prerequisite checks rely on < alone.
bool operator==(const Version &a, const Version &b) {
  return strcmp(a.getVV(), b.getVV()) == 0 && strcmp(a.getRR(), b.getRR()) == 0 &&
         strcmp(a.getMM(), b.getMM()) == 0;
}

bool operator!=(const Version &a, const Version &b) {
  return !(a == b);
}

bool operator<(const Version &a, const Version &b) {
  return a.getVersionString() < b.getVersionString();
}

bool operator<=(const Version &a, const Version &b) {
  return a.getVersionString() <= b.getVersionString();
}

bool operator>(const Version &a, const Version &b) {
  return a.getVersionString() > b.getVersionString();
}

bool operator>=(const Version &a, const Version &b) {
  return a.getVersionString() >= b.getVersionString();
}
