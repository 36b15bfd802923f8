#include "fuzz.h"

#include <cstdint>
#include <cstdio>
#include <cstdlib>

#include <sys/mman.h>
#include <unistd.h>

#include "logger.h"

namespace {

/// Standard output as with PATCH_DEBUG, since that is buffered, without a reader.
bool silenceLog() {
  glbLogToSTDOUT = true;
  return freopen("/dev/null", "w", stdout) != nullptr;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  static const bool silent = silenceLog();
  REQUIRE(silent);
  check(std::string(reinterpret_cast<const char *>(data), size));
  return 0;
}

namespace fuzz {

void fail(const char *file, int line, const char *condition) {
  fprintf(stderr, "%s:%d: does not hold: %s\n", file, line, condition);
  abort();
}

std::string takeLine(std::string &input) {
  const std::size_t end = input.find('\n');
  const std::string line = input.substr(0, end);
  input.erase(0, end == std::string::npos ? end : end + 1);
  return line;
}

TextFile::TextFile() : fd_(memfd_create("input", 0)), path_("/proc/self/fd/" + std::to_string(fd_)) {
  REQUIRE(fd_ >= 0);
}

TextFile::~TextFile() {
  close(fd_);
}

void TextFile::write(const std::string &content) const {
  REQUIRE(ftruncate(fd_, 0) == 0);
  REQUIRE(pwrite(fd_, content.data(), content.size(), 0) == static_cast<ssize_t>(content.size()));
}

std::vector<std::string> pieces(const std::string &text, const std::string &delimiters) {
  std::vector<std::string> found;
  std::string piece;
  for (const char c : upToNul(text) + delimiters.front()) {
    if (delimiters.find(c) == std::string::npos) {
      piece += c;
    } else if (!piece.empty()) {
      found.push_back(piece);
      piece.clear();
    }
  }
  return found;
}

std::string trimmed(const std::string &text) {
  const std::string white = " \t\n\r";
  std::size_t begin = 0;
  std::size_t end = text.size();
  while (begin < end && contains(white, text.substr(begin, 1)))
    ++begin;
  while (begin < end && contains(white, text.substr(end - 1, 1)))
    --end;
  return text.substr(begin, end - begin);
}

std::string lower(const std::string &text) {
  std::string result;
  for (const char c : text)
    result += c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
  return result;
}

std::string productCode(const std::string &text) {
  return (text.size() == 2 ? "k" : "") + lower(text);
}

std::string upToNul(const std::string &text) {
  return text.substr(0, text.find('\0'));
}

std::vector<std::string> lines(const std::string &content) {
  std::vector<std::string> found;
  std::string line;
  for (const char c : upToNul(content)) {
    if (c != '\n') {
      line += c;
      continue;
    }
    if (!line.empty() && line.back() == '\r')
      line.pop_back();
    if (!line.empty())
      found.push_back(line);
    line.clear();
  }
  found.push_back(line);
  return found;
}

bool startsWith(const std::string &text, const std::string &prefix) {
  return text.compare(0, prefix.size(), prefix) == 0;
}

bool contains(const std::string &text, const std::string &piece) {
  return text.find(piece) != std::string::npos;
}

} // namespace fuzz
