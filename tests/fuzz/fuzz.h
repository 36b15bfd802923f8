// What all fuzzers share. A fuzzer is one source with one function, check(), which takes any bytes and aborts
// when the program breaks a rule; the same sources, linked to replay.cpp, replay the corpus as ordinary
// tests.
//
// The log goes to /dev/null, and standard output with it. Child processes are never started: standins.cpp
// takes the place of process.cpp.
#pragma once

#include <string>
#include <vector>

/// Aborts, saying where, unless the condition holds; also in builds without assertions.
#define REQUIRE(condition)                                                                                   \
  do {                                                                                                       \
    if (!(condition))                                                                                        \
      fuzz::fail(__FILE__, __LINE__, #condition);                                                            \
  } while (false)

/// Defined by each fuzzer: everything that must hold for this input.
void check(const std::string &input);

namespace fuzz {

[[noreturn]] void fail(const char *file, int line, const char *condition);

/// Removes the first line from `input` and returns it, without its line feed.
std::string takeLine(std::string &input);

/// A file in memory.
class TextFile {
public:
  TextFile();
  TextFile(const TextFile &) = delete;
  TextFile &operator=(const TextFile &) = delete;
  ~TextFile();

  const std::string &path() const { return path_; }
  void write(const std::string &content) const;

private:
  int fd_;
  std::string path_;
};

// Told once more, in plain words, what the program does to texts: the expectations come from here.

/// What stands between the delimiters, without empty pieces.
std::vector<std::string> pieces(const std::string &text, const std::string &delimiters);
/// Without carriage returns, line feeds, tabs and blanks at either end.
std::string trimmed(const std::string &text);
/// With A to Z, and nothing else, in lower case.
std::string lower(const std::string &text);
/// A product code as the program keeps it: lower case, "k" before two letters.
std::string productCode(const std::string &text);
/// The text as a C string would hold it.
std::string upToNul(const std::string &text);
/// The lines of a text file as its reader yields them.
std::vector<std::string> lines(const std::string &content);

bool startsWith(const std::string &text, const std::string &prefix);
bool contains(const std::string &text, const std::string &piece);

/// Each element is less than the next.
template <class List>
bool isStrictlyAscending(const List &list) {
  for (std::size_t i = 1; i < list.size(); ++i)
    if (!(list[i - 1] < list[i]))
      return false;
  return true;
}

} // namespace fuzz
