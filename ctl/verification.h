// Proof after an installation: every member of updated_files stands in the home as the archive has it, the
// version file has the patch's level, and the history says PASS.
//
// The installer ends well where files are silently missing (a source that was not there, a directory that it
// could not open), so its verdict is no proof. Owner and mode are not compared: a replaced file keeps its
// own.
#pragma once

#include <set>
#include <string>
#include <vector>

#include <nlohmann/json_fwd.hpp>

#include "home.h"
#include "patch.h"

struct Difference {
  std::string path; ///< relative to the home
  std::string kind; ///< missing, type, content, level, history, mode, owner or instance
  std::string text;
};

struct Verification {
  std::vector<Difference> differences;
  std::size_t files = 0; ///< members of updated_files that are no directories

  void add(const std::string &path, const std::string &kind, const std::string &text) {
    differences.push_back({path, kind, text});
  }
  void append(const Verification &other) {
    files += other.files;
    differences.insert(differences.end(), other.differences.begin(), other.differences.end());
  }
};

/// Compares the members of updated_files with the home, which ends in "/". A later member of the same name
/// replaces an earlier one, as in an extraction. JudgementError when the archive or a file of the home cannot
/// be read to its end: what cannot be seen is not judged.
void verifyFiles(const std::string &home, const Patch &patch, std::set<std::string> &covered,
                 Verification &verification);

/// Compares every VRMF line of a version file, a path of the home, with a level, "06.10.00.02".
void verifyLevel(const std::string &home, const std::string &versionFile, const std::string &wanted,
                 Verification &verification);

/// What the history has of a patch.
struct HistoryName {
  std::string product;
  std::string platform;
  std::string target;
  std::string name;
};

/// Asks the last history line of this patch for its result.
void verifyHistory(const std::string &home, const HistoryName &patch, Verification &verification);

/// All of it for patches in the installer's order: the last patch of a path or of a version file decides.
Verification verifyPatches(const Home &home, const std::vector<Patch> &patches);

/// {"differences": [...], "files": N}
nlohmann::ordered_json toJson(const Verification &verification);
