// Where transactions lie: patchlogs/transactions/<UTC time>-<pid>/ of the home, accessible to the runner
// alone.
#pragma once

#include <string>
#include <vector>

class TransactionPlace {
public:
  /// `home` ends in "/". Makes patchlogs and the folder when they are missing. RefusalError when something
  /// else has the folder's name, or when it is not the runner's alone.
  explicit TransactionPlace(const std::string &home);

  /// The ids of all transactions, oldest first.
  std::vector<std::string> ids() const;
  std::string folderOf(const std::string &id) const { return root_ + "/" + id; }
  /// Makes the folder of a new transaction with before/ and patches/ in it; its id.
  std::string create() const;
  /// Removes a transaction with all that it holds.
  void remove(const std::string &id) const;
  /// Removes the oldest ones until `count` are left; the ones that have not ended are kept.
  void keepNewest(std::size_t count) const;

private:
  std::string root_;
};
