#include "text.h"

#include <cstdio>

namespace {

/// Length of the well-formed UTF-8 sequence at the start of `bytes`; 0 when there is none. Overlong forms,
/// surrogates and what lies beyond U+10FFFF are not well-formed.
std::size_t utf8Length(std::string_view bytes) {
  const auto at = [bytes](std::size_t i) {
    return i < bytes.size() ? static_cast<unsigned char>(bytes[i]) : 0U;
  };
  const unsigned first = at(0);
  if (first < 0x80)
    return 1;
  const std::size_t length = first >= 0xF0 ? 4 : first >= 0xE0 ? 3 : 2;
  if (first < 0xC2 || first > 0xF4)
    return 0;
  for (std::size_t i = 1; i < length; ++i)
    if ((at(i) & 0xC0U) != 0x80U)
      return 0;
  const unsigned second = at(1);
  const bool outOfRange = (first == 0xE0 && second < 0xA0) || (first == 0xED && second > 0x9F) ||
                          (first == 0xF0 && second < 0x90) || (first == 0xF4 && second > 0x8F);
  return outOfRange ? 0 : length;
}

std::string hexByte(char byte) {
  char text[5];
  snprintf(text, sizeof text, "\\x%02X", static_cast<unsigned>(static_cast<unsigned char>(byte)));
  return text;
}

std::string escaped(std::string_view bytes, bool controlsToo) {
  std::string text;
  while (!bytes.empty()) {
    const std::size_t length = utf8Length(bytes);
    const unsigned char first = static_cast<unsigned char>(bytes.front());
    if (first == '\\')
      text += "\\\\";
    else if (length == 0 || (controlsToo && (first < 0x20 || first == 0x7F)))
      text += hexByte(bytes.front());
    else
      text += bytes.substr(0, length);
    bytes.remove_prefix(length == 0 ? 1 : length);
  }
  return text;
}

} // namespace

std::string jsonText(std::string_view bytes) {
  return escaped(bytes, false);
}

std::string bytesOfJsonText(std::string_view text) {
  const auto digit = [](char c) { return static_cast<unsigned>(c <= '9' ? c - '0' : c - 'A' + 10); };
  std::string bytes;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '\\' || i + 1 == text.size()) {
      bytes += text[i];
    } else if (text[i + 1] == 'x' && i + 3 < text.size()) {
      bytes += static_cast<char>(digit(text[i + 2]) * 16 + digit(text[i + 3]));
      i += 3;
    } else {
      bytes += text[++i];
    }
  }
  return bytes;
}

std::string terminalText(std::string_view bytes) {
  return escaped(bytes, true);
}

std::string utcTime(std::time_t time) {
  tm parts = {};
  char text[32] = "";
  if (gmtime_r(&time, &parts) != nullptr)
    static_cast<void>(strftime(text, sizeof text, "%Y-%m-%dT%H:%M:%SZ", &parts));
  return text;
}

std::string octalMode(unsigned mode) {
  char text[8];
  snprintf(text, sizeof text, "%04o", mode & 07777U);
  return text;
}

std::string relativePath(std::string_view path) {
  std::string result;
  while (!path.empty()) {
    const std::size_t slash = path.find('/');
    const std::string_view component = path.substr(0, slash);
    if (!component.empty() && component != ".")
      result += (result.empty() ? "" : "/") + std::string(component);
    path.remove_prefix(slash == std::string_view::npos ? path.size() : slash + 1);
  }
  return result;
}
