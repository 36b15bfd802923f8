// The three lists of commands. Each entry is looked at by the first of these rules that has to do with it:
// cut at "=", made of several words, not there, not executable.
#include <algorithm>
#include <cctype>
#include <map>

#include <unistd.h>

#include "lint/rules.h"
#include "lint/subject.h"
#include "text.h"

namespace {

enum class Fault { None, Cut, HasBlank, NotFound, NotExecutable };

/// Where a command that the patch does not bring is looked for: the folders of every system.
constexpr const char *systemFolders[] = {"/usr/sbin/", "/usr/bin/", "/sbin/", "/bin/"};

bool isOfSystem(const std::string &command) {
  return std::any_of(std::begin(systemFolders), std::end(systemFolders), [&command](const char *folder) {
    return access((folder + command).c_str(), X_OK) == 0;
  });
}

bool hasBlank(const std::string &command) {
  return command.find_first_of(" \t") != std::string::npos;
}

/// An absolute path is a matter of the system that is patched.
Fault faultOf(const Subject &subject, const IniEntry &entry) {
  if (entry.isCut)
    return Fault::Cut;
  const std::string &command = entry.key;
  if (command.front() == '/')
    return Fault::None;
  const auto member = subject.byPath.find(relativePath(command));
  if (member != subject.byPath.end() && member->second->type != Member::Type::Directory) {
    const bool isPlain = member->second->type == Member::Type::File;
    return isPlain && (member->second->mode & 0100U) == 0 ? Fault::NotExecutable : Fault::None;
  }
  if (command.find('/') == std::string::npos && isOfSystem(command))
    return Fault::None;
  return hasBlank(command) ? Fault::HasBlank : Fault::NotFound;
}

template <class Visit>
void visitLists(const Subject &subject, Visit visit) {
  for (const IniSection *section : subject.ini.effectiveSections())
    if (section->isCommandList())
      visit(*section);
}

template <class Text>
void findFault(const Subject &subject, Finder &found, Fault fault, Text textOf) {
  visitLists(subject, [&](const IniSection &section) {
    for (const IniEntry &entry : section.entries)
      if (faultOf(subject, entry) == fault)
        found(atLine(entry.line), textOf(entry));
  });
}

std::size_t leadingDigits(const std::string &command) {
  const auto end =
      std::find_if(command.begin(), command.end(), [](unsigned char c) { return std::isdigit(c) == 0; });
  return static_cast<std::size_t>(end - command.begin());
}

/// The commands of a list in the order of the file, each once.
std::vector<std::string> commandsOf(const IniSection &section) {
  std::vector<std::string> commands;
  std::map<std::string, bool> seen;
  for (const IniEntry &entry : section.entries)
    if (seen.emplace(entry.key, true).second)
      commands.push_back(entry.key);
  return commands;
}

bool isNumbered(const std::vector<std::string> &commands) {
  const std::size_t width = leadingDigits(commands.front());
  return width > 0 && std::all_of(commands.begin(), commands.end(), [width](const std::string &command) {
           return leadingDigits(command) == width;
         });
}

} // namespace

void commandCut(const Subject &subject, Finder &found) {
  findFault(subject, found, Fault::Cut, [](const IniEntry &entry) {
    return "\"" + entry.text + R"(" is cut at "=": the program ")" + entry.key + "\" is run";
  });
}

void commandHasBlank(const Subject &subject, Finder &found) {
  findFault(subject, found, Fault::HasBlank, [](const IniEntry &entry) {
    return "a program of the name \"" + entry.key + "\" is looked for, blanks included";
  });
}

void commandNotFound(const Subject &subject, Finder &found) {
  findFault(subject, found, Fault::NotFound, [](const IniEntry &entry) {
    return "\"" + entry.key + "\" is neither in the archive nor a program of the system";
  });
}

void commandNotExecutable(const Subject &subject, Finder &found) {
  findFault(subject, found, Fault::NotExecutable, [&subject](const IniEntry &entry) {
    return "\"" + entry.key + "\" has mode " + octalMode(subject.byPath.at(relativePath(entry.key))->mode);
  });
}

void commandTwice(const Subject &subject, Finder &found) {
  visitLists(subject, [&found](const IniSection &section) {
    std::map<std::string, std::size_t> seen;
    for (const IniEntry &entry : section.entries) {
      const auto [first, isNew] = seen.emplace(entry.key, entry.line);
      if (!isNew)
        found(atLine(entry.line), "\"" + entry.key + "\" stands in line " + std::to_string(first->second) +
                                      " already; it runs once");
    }
  });
}

void commandOrder(const Subject &subject, Finder &found) {
  visitLists(subject, [&found](const IniSection &section) {
    std::vector<std::string> commands = commandsOf(section);
    if (commands.size() < 2 || isNumbered(commands))
      return;
    std::sort(commands.begin(), commands.end());
    std::string order;
    for (const std::string &command : commands)
      order += (order.empty() ? "" : ", ") + command;
    found(atLine(section.line), "[" + section.name + "] runs in this order: " + order);
  });
}
