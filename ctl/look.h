// What stands at a path. "Nothing is there" and "it cannot be seen" are two answers: who takes the second for
// the first judges wrongly, and an undo would remove what it believes to be new.
#pragma once

#include <functional>
#include <optional>
#include <string>

#include <sys/stat.h>

/// What is at the path itself; none where nothing is. JudgementError when the system does not tell.
std::optional<struct stat> lookAt(const std::string &path);
/// The same of what a symbolic link there leads to.
std::optional<struct stat> lookBehind(const std::string &path);

bool isDirectory(const std::string &path);

/// Calls `each` with the name of every entry but "." and "..", in the order of the directory; false when
/// there is no such directory. JudgementError when it cannot be read to its end.
bool listDirectory(const std::string &path, const std::function<void(const std::string &name)> &each);
