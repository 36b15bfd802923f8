// Texts for documents and terminals: byte strings made printable, times, levels.
#pragma once

#include <cstdint>
#include <ctime>
#include <string>
#include <string_view>

/// For a JSON string: bytes that are no UTF-8 are written \xHH, a backslash as two. Valid UTF-8 stays.
std::string jsonText(std::string_view bytes);

/// The bytes that jsonText was given.
std::string bytesOfJsonText(std::string_view text);

/// For a terminal: the same, and control characters are written \xHH too, so that no name moves the cursor.
std::string terminalText(std::string_view bytes);

/// RFC 3339 in UTC, "2026-03-09T14:05:00Z".
std::string utcTime(std::time_t time);

/// "0755": the twelve permission bits in four octal digits.
std::string octalMode(unsigned mode);

/// A path of a home relative to it, without "./" and without slashes in a row.
std::string relativePath(std::string_view path);
