// What the rules of lint look at, and how they tell what they have found.
#pragma once

#include <string>
#include <unordered_map>
#include <vector>

#include "child.h"
#include "finding.h"
#include "lint/initext.h"
#include "patch.h"

/// One patch, and all that was learnt about it before the rules are asked.
struct Subject {
  Patch patch;
  bool isInDirectory;           ///< it was found in a directory that was given, not given itself
  IniText ini;                  ///< the descriptor, line for line
  ChildResult tar;              ///< what `tar -xf` said
  bool hasChecksumList = false; ///< there is a SHA256SUMS beside it
  std::string listedChecksum;   ///< the patch's in that list; empty when it does not name it
  std::string checksum;         ///< the file's own, when the list names it
  /// Members by their paths without "./"; of several of one path the last one, which is the one that stays.
  std::unordered_map<std::string, const Member *> byPath;
};

/// Reads a patch file and tries its archive.
Subject examine(const std::string &path, bool isInDirectory);

/// A directory of patches: those that are, and the files that only look like one.
struct PatchSet {
  std::vector<Subject> patches;
  std::vector<std::string> companions; ///< file names
};

/// Takes the findings of one rule on one patch. From a certain number on they are only counted.
class Finder {
public:
  Finder(const Rule &rule, std::string patch, FindingList &findings);
  Finder(const Finder &) = delete;
  Finder &operator=(const Finder &) = delete;
  ~Finder();

  void operator()(const std::string &where, const std::string &text);
  /// The same for a patch of a set; all of these are told.
  void of(const std::string &patch, const std::string &where, const std::string &text);

private:
  const Rule &rule_;
  std::string patch_;
  FindingList &findings_;
  std::size_t count_ = 0;
};

/// "patch.ini:12"
std::string atLine(std::size_t line);
/// Whether a relative path is updated_files or lies below it.
bool isUpdated(const std::string &relativePath);
/// Whether a member makes tar(1) fail in a way that a rule of its own tells.
bool explainsTar(const Member &member);
