// The text of patch.ini: what the installer's parser drops, overwrites or takes for something else.
#include <algorithm>
#include <map>

#include "lint/rules.h"
#include "lint/subject.h"
#include "utilities.h"

namespace {

constexpr std::size_t LongestLine = 1000;
constexpr const char *ByteOrderMark = "\xEF\xBB\xBF";

bool startsWith(const std::string &text, const char *prefix) {
  return text.rfind(prefix, 0) == 0;
}

void findTwins(const IniSection &section, Finder &found) {
  std::map<std::string, const IniEntry *> seen;
  for (const IniEntry &entry : section.entries) {
    const std::string key = section.name == "PreReqs" ? Util::normalizeProductCode(entry.key) : entry.key;
    const auto [first, isNew] = seen.emplace(key, &entry);
    if (!isNew)
      found(atLine(entry.line), "\"" + entry.key + "\" again; it stands in line " +
                                    std::to_string(first->second->line) + " of [" + section.name +
                                    "] already");
  }
}

bool isQuoted(const std::string &text) {
  return text.size() >= 2 && (text.front() == '"' || text.front() == '\'') && text.back() == text.front();
}

bool hasTrailingComment(const std::string &text) {
  return text.find(" #") != std::string::npos || text.find(" ;") != std::string::npos ||
         text.find("\t#") != std::string::npos || text.find("\t;") != std::string::npos;
}

/// The other INI dialect that the line is written in; null when it is plain.
const char *foreignFormOf(const IniEntry &entry) {
  if (entry.text.front() == ';')
    return R"(";" begins no comment here)";
  if (hasTrailingComment(entry.text))
    return "a comment behind an entry belongs to the entry";
  if (isQuoted(entry.value) || isQuoted(entry.key))
    return "quotes belong to the text";
  if (entry.text.back() == '\\')
    return R"(a line is not continued by "\")";
  return nullptr;
}

void findForeign(const std::vector<IniEntry> &entries, Finder &found) {
  for (const IniEntry &entry : entries)
    if (const char *const form = foreignFormOf(entry))
      found(atLine(entry.line), std::string(form) + ": " + entry.text);
}

std::string oddityOf(const IniLine &line) {
  if (line.number == 1 && startsWith(line.raw, ByteOrderMark))
    return "the file begins with a byte-order mark, which counts as text";
  if (line.raw.find('\r') != std::string::npos)
    return "a carriage return inside the line does not end it";
  if (line.raw.size() > LongestLine)
    return "the line has " + std::to_string(line.raw.size()) + " bytes";
  return "";
}

} // namespace

void nulByte(const Subject &subject, Finder &found) {
  if (subject.ini.hasNul)
    found(atLine(std::max<std::size_t>(subject.ini.lines.size(), 1)),
          "a NUL byte: nothing that follows it is read");
}

void sectionTwice(const Subject &subject, Finder &found) {
  std::map<std::string, std::size_t> seen;
  for (const IniSection &section : subject.ini.sections) {
    const auto [first, isNew] = seen.emplace(section.name, section.line);
    if (!isNew && section.isKnown())
      found(atLine(section.line), "[" + section.name + "] again: the entries below line " +
                                      std::to_string(first->second) + " are lost");
  }
}

/// A product that stands twice in Dependents is stopped and started once, which is as it should be.
void keyTwice(const Subject &subject, Finder &found) {
  for (const char *const name : {"ProductInfo", "PreReqs"})
    if (const IniSection *const section = subject.ini.section(name))
      findTwins(*section, found);
}

void strayLine(const Subject &subject, Finder &found) {
  for (const IniEntry &entry : subject.ini.stray)
    if (entry.line != 1 || !startsWith(entry.text, ByteOrderMark))
      found(atLine(entry.line), "an entry before the first section: " + entry.text);
}

void looksLikeSection(const Subject &subject, Finder &found) {
  for (const IniSection &section : subject.ini.sections)
    if (!section.isKnown())
      found(atLine(section.line), "\"" + section.header + "\" opens a section named \"" + section.name +
                                      "\", which has no meaning");
}

void foreignSyntax(const Subject &subject, Finder &found) {
  findForeign(subject.ini.stray, found);
  for (const IniSection *section : subject.ini.effectiveSections())
    if (section->isKnown())
      findForeign(section->entries, found);
}

void oddText(const Subject &subject, Finder &found) {
  for (const IniLine &line : subject.ini.lines) {
    const std::string oddity = oddityOf(line);
    if (!oddity.empty())
      found(atLine(line.number), oddity);
  }
}
