#include "lint/initext.h"

#include <algorithm>
#include <map>

#include "utilities.h"

namespace {

constexpr const char *commandLists[] = {"PrePatchCommands", "PreCommands", "PostCommands"};
constexpr const char *otherSections[] = {"ProductInfo", "PreReqs", "Dependents"};

template <class List>
bool isOneOf(const List &list, const std::string &name) {
  return std::find(std::begin(list), std::end(list), name) != std::end(list);
}

std::string trimmed(std::string text) {
  Util::trimString(text);
  return text;
}

IniEntry entryOf(const IniLine &line) {
  const std::size_t equals = line.text.find('=');
  if (equals == std::string::npos)
    return {line.number, line.text, line.text, "", false};
  return {line.number, line.text, trimmed(line.text.substr(0, equals)), trimmed(line.text.substr(equals + 1)),
          true};
}

/// The last character of a header is dropped whatever it is.
IniSection sectionOf(const IniLine &line) {
  const std::string name = line.text.size() < 2 ? "" : trimmed(line.text.substr(1, line.text.size() - 2));
  return {line.number, line.text, name, {}};
}

void addLine(IniText &ini, const std::string &raw) {
  ini.lines.push_back({ini.lines.size() + 1, raw, trimmed(raw)});
  const IniLine &line = ini.lines.back();
  if (line.text.empty() || line.text.front() == '#')
    return;
  if (line.text.front() == '[')
    ini.sections.push_back(sectionOf(line));
  else
    (ini.sections.empty() ? ini.stray : ini.sections.back().entries).push_back(entryOf(line));
}

} // namespace

bool IniSection::isCommandList() const {
  return isOneOf(commandLists, name);
}

bool IniSection::isKnown() const {
  return isCommandList() || isOneOf(otherSections, name);
}

std::vector<const IniSection *> IniText::effectiveSections() const {
  std::map<std::string, const IniSection *> last;
  for (const IniSection &section : sections)
    last[section.name] = &section;
  std::vector<const IniSection *> effective;
  for (const IniSection &section : sections)
    if (last[section.name] == &section)
      effective.push_back(&section);
  return effective;
}

const IniSection *IniText::section(const std::string &name) const {
  const auto found = std::find_if(sections.rbegin(), sections.rend(),
                                  [&name](const IniSection &section) { return section.name == name; });
  return found == sections.rend() ? nullptr : &*found;
}

IniText readIniText(const std::string &content) {
  IniText ini;
  const std::size_t nul = content.find('\0');
  ini.hasNul = nul != std::string::npos;
  const std::string text = content.substr(0, nul);
  for (std::size_t start = 0; start < text.size();) {
    const std::size_t end = std::min(text.find('\n', start), text.size());
    const bool hasReturn = end > start && text[end - 1] == '\r';
    addLine(ini, text.substr(start, end - start - (hasReturn ? 1 : 0)));
    start = end + 1;
  }
  return ini;
}
