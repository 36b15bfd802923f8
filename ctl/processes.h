// Processes of this host, as the kernel tells them.
#pragma once

#include <string>
#include <vector>

#include <sys/types.h>

/// Runs of the installer on a home, each as "process 123: orvpatch -h HOME -i PATCH"; this process is left
/// out.
std::vector<std::string> installerRuns(const std::string &home);

/// RefusalError when one is at work: files change under what is looked at.
void demandNoRun(const std::string &home);

/// Real user of a process, by the kernel; false when there is no such process.
bool ownerOf(const std::string &pid, uid_t &user);

/// Login name of a user; the number when the user has no account.
std::string loginName(uid_t user);
