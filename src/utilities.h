// Stateless look-ups and helpers that all layers share.
//
// The home is always the environment variable QUILLHOME, taken verbatim: it ends in "/", and every path below
// it is built by plain concatenation.
#pragma once

#include <string>
#include <vector>

class Util {
public:
  /// Value of QUILLHOME; empty when it is not set.
  static std::string getQuillHome();
  /// Node name up to its first ".".
  static std::string getHostName();
  /// Login name of the real user; empty when the user has no password entry.
  static std::string getUserName();

  /// Removes carriage returns, line feeds, tabs and blanks at both ends, in place.
  static void trimString(std::string &s);
  /// The non-empty pieces of `s` between any of the delimiter characters; text after a NUL is ignored.
  static std::vector<std::string> tokenizeString(const std::string &s, const char *delimiters);
  /// Replaces the first "/./" by "/".
  static std::string removeDotFromPath(const std::string &path);
  /// `s` with its letters in lower case, byte by byte.
  static std::string toLower(const std::string &s);
  /// Normalised product code: lower case, and "k" before a two-letter code.
  static std::string normalizeProductCode(const std::string &code);

  /// Whether `path` is accessible; two trace lines, and one more when it is not.
  static bool pathExists(const std::string &path);
  /// home + "tmp/" + name; the directory is neither made nor checked.
  static std::string getTempDir(const std::string &name);
  /// Working directory without a trailing "/"; empty when the system cannot tell.
  static std::string getCurrentDirectory();
  static bool setCurrentDirectory(const std::string &dir);

  /// Reads a whole file into a new NUL-terminated buffer, which the caller releases with free().
  /// Returns 0, or an error number (22 for anything that is not a readable regular file) and a null buffer.
  static int readFile(const char *name, char **buffer);
  /// Reads the non-empty lines up to the first NUL byte, and one final piece after the last line end even
  /// when it is empty. LF and CR LF end a line. Returns 0, or readFile's error number and no lines.
  static int readFileByLines(const char *name, std::vector<std::string> &lines);

  /// Puts name=value into the environment of this process and of its children; ends the process as
  /// endWithoutMemory does when there is no room for it.
  static void setEnvironment(const std::string &name, const std::string &value);

  /// Ends the process where it is, as a kill would, but with a message and a status of its own, which is far
  /// from the codes of the operations: it says nothing about the patch. Needs no memory itself.
  [[noreturn]] static void endWithoutMemory();

  static bool isVEMSInstalled();                 ///< monitoring server
  static bool isVEPSInstalled(std::string arch); ///< portal server
  static bool isVEPDInstalled(std::string arch); ///< portal desktop client
  /// Whether the management console runs; false on any failure.
  static bool isManageGUIRunning();
};
