// The patch history, patchlogs/patches.hist: a line for every attempt to install a patch.
#pragma once

#include <cstddef>
#include <ctime>
#include <string>
#include <string_view>
#include <vector>

struct HistoryRecord {
  std::size_t line = 0; ///< in the file, from 1
  std::string product;  ///< as the patch wrote it, "kyn"
  std::string platform; ///< "lpp266"
  std::string target;   ///< "vema"
  std::string name;     ///< the patch's, without padding
  std::string result;   ///< "PASS" or "FAIL"
  std::string user;
  std::string time; ///< local, "MM/DD/YYYY HH:MM:SS"; empty when the system could not tell it
};

/// A line that is neither a record nor a comment: the file was edited, or a disk was full.
struct ForeignLine {
  std::size_t line = 0;
  std::string text;
};

struct History {
  std::vector<HistoryRecord> records; ///< in the order of the file
  std::vector<ForeignLine> foreign;
};

/// `home` ends in "/". A home without a history has an empty one; JudgementError when it cannot be read.
History readHistory(const std::string &home);

/// Reads the text of a history.
History parseHistory(std::string_view text);

/// "YYYY-MM-DD" of a record's time; empty when it has none.
std::string dayOf(const HistoryRecord &record);

/// Second of the day of a record's time; -1 without one.
int secondOf(const HistoryRecord &record);

/// The moments that a record's local time may mean: two in the hour that comes twice in autumn, none for a
/// record without a time.
std::vector<std::time_t> momentsOf(const HistoryRecord &record);
