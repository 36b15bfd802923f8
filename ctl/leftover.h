// What earlier runs have left in temporary directories.
#pragma once

#include <functional>
#include <string>

/// The first file below updated_files of a temporary directory ("tmp/kyn") that the home lacks, links
/// included, and that is not `isSpare`; empty when there is none. JudgementError when it cannot be looked
/// through.
std::string onlyCopyIn(
    const std::string &home, const std::string &directory,
    const std::function<bool(const std::string &path)> &isSpare = [](const std::string &) { return false; });
