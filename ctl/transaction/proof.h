// Proof that the home still is what a transaction has left: its record knows what no archive tells, the owner
// and mode of each file before, and the instances that ran.
#pragma once

#include <string>

#include "home.h"
#include "verification.h"

/// Compares the home with the record of an installation: files (there, of the same type, the very file that
/// was installed, mode, owner), new directories, levels, history and instances. JudgementError when there is
/// no such transaction, when it did not end, or when it was taken back.
Verification verifyTransaction(const Home &home, const std::string &id);
