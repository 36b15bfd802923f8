// What changed in the home that the patches did not bring: commands did it, and an undo does not take it
// back.
#pragma once

#include <map>
#include <string>
#include <vector>

#include "home.h"
#include "transaction/record.h"

class HomeChanges {
public:
  /// Notes the state of every file of the home that the record does not name; log, history, tmp and
  /// transactions apart.
  void lookBefore(const Home &home, const Record &record);
  /// The paths that are new, gone or different now, sorted.
  std::vector<std::string> others(const Home &home, const Record &record) const;

private:
  std::map<std::string, FileState> before_;
};

/// Takes the results of the patches from the lines that the installation has added to the history.
void noteResults(const Home &home, Record &record);

/// Mode and owner of a file that was installed and is `now` so: a replaced one has those of the old one, a
/// new one 0755 and the owner that the installation gave it.
void verifyAttributes(const TouchedFile &file, const FileState &now, Verification &verification);
