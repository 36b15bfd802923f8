// What an installation will change, told before it begins: levels, files, directories, files written in
// place.
#pragma once

#include <string>
#include <vector>

#include "home.h"
#include "patch.h"
#include "transaction/record.h"

/// Fills the record's temporary and new directories with those that the report makes: a transaction that is
/// interrupted before its plan is made leaves nothing else.
void planReport(const Home &home, const std::string &path, Record &record);

/// Fills the record's patches, files, rewritten files, directories, left-overs to set aside and the instances
/// that run now.
void planInstallation(const Home &home, const std::vector<Patch> &patches, Record &record);

/// Every running instance of the home.
std::vector<RecordedInstance> runningInstances(const Home &home);

/// The level that a version file has, "06.10.00.02"; empty when it has none.
std::string levelIn(const std::string &versionFile);
