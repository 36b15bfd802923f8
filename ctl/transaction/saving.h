// Keeping the old files whole, and putting them back.
//
// The installer replaces a file by removing its name and linking the new one, and never writes into the old
// one. A second name for the old file therefore keeps all of it: content, owner, mode, ACL, capabilities,
// times. Only where no link can be made, and for files that are written in place, a copy is made.
#pragma once

#include <string>

#include "transaction/record.h"

/// Saves what the record names below `folder`/before/, and puts it on disk. RefusalError when something
/// cannot be saved.
void saveFiles(const std::string &home, const std::string &folder, Record &record);

/// Notes the state of the files that the patches brought.
void noteInstalled(const std::string &home, Record &record);

/// Takes the files, directories and files written in place back to what the record has of them. What was
/// changed since the installation is left alone and told in `messages`. May be repeated after any
/// interruption.
void restoreFiles(const std::string &home, const std::string &folder, const Record &record,
                  std::vector<std::string> &messages);

/// Moves the left-overs back that saveFiles has set aside, where the installation was not begun.
/// JudgementError when it cannot.
void bringBackSetAside(const std::string &home, const std::string &folder, const Record &record);

/// Gives new directories the mode, owner and group of their parents, in place of 0777; tells where it cannot.
void closeDirectories(const std::string &home, const Record &record, std::vector<std::string> &messages);
