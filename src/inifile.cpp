#include "inifile.h"

#include <cstring>

#include "failure.h"
#include "utilities.h"

#define LOG_COMPONENT "inifile.cpp"

namespace {

/// KEEP(sorted-names): all lists of a descriptor are in ascending byte-wise order, not in file order; a
/// repeated name is one entry.
template <class Map>
std::vector<std::string> keysOf(const Map &map) {
  std::vector<std::string> keys;
  keys.reserve(map.size());
  for (const auto &pair : map)
    keys.push_back(pair.first);
  return keys;
}

std::string trimmed(std::string text) {
  Util::trimString(text);
  return text;
}

} // namespace

std::vector<std::string> Section::getEntryNames() const {
  return keysOf(entries_);
}

bool Section::getEntryValue(const std::string &key, std::string &value) const {
  const auto found = entries_.find(key);
  if (found == entries_.end())
    return false;
  value = found->second;
  return true;
}

void Section::writeEntry(const std::string &key, const std::string &value) {
  entries_[key] = value;
}

IniFile::IniFile(const IniFile &other) : path_(other.path_) {
  for (const auto &pair : other.sections_)
    sections_[pair.first] = std::make_unique<Section>(*pair.second);
}

IniFile::~IniFile() {
  LOG_TRACE("IniFile::~IniFile()");
}

IniFile *IniFile::parseFile(const std::string &path, PatchError *err) {
  LOG_TRACE("IniFile::parse(%s) %s", path.c_str(), "entry");
  auto file = std::make_unique<IniFile>(path);
  if (!file->parse(err)) {
    // The record keeps the cause that parse() has stored.
    LOG_ERROR_MESSAGE("ERROR_INIFILE_PARSE", path.c_str());
    file.reset();
  }
  LOG_TRACE("IniFile::parse(%s) %s", path.c_str(), "exit");
  return file.release();
}

bool IniFile::parse(PatchError *err) {
  LOG_TRACE("IniFile::parse()");
  bool result = true;
  std::vector<std::string> lines;
  const int error = Util::readFileByLines(path_.c_str(), lines);
  if (error != 0)
    result =
        FAILURE(err, PatchError::CannotReadFile, "ERROR_INIFILE_CANT_READ", path_.c_str(), strerror(error));
  Section *current = nullptr;
  for (const std::string &line : lines)
    parseLine(trimmed(line), current, err);
  LOG_TRACE("IniFile::parse()");
  return result;
}

void IniFile::parseLine(const std::string &line, Section *&current, PatchError *err) {
  if (line.empty() || line.front() == '#')
    return;
  if (line.front() == '[') {
    current = openSection(line);
    return;
  }
  if (current == nullptr) {
    // KEEP(stray-entry): the line is skipped and the file counts as read, but the record keeps the code: a
    // later failure without its own code ends with this one.
    FAILURE(err, PatchError::PropertyBeforeSection, "ERROR_INIFILE_PROP");
    return;
  }
  const std::size_t equals = line.find('=');
  if (equals == std::string::npos)
    current->writeEntry(line, "");
  else
    current->writeEntry(trimmed(line.substr(0, equals)), trimmed(line.substr(equals + 1)));
}

Section *IniFile::openSection(const std::string &line) {
  // KEEP(section-last-character): the last character is dropped whatever it is, so "[abc" names "ab".
  const std::string name = line.size() < 2 ? "" : trimmed(line.substr(1, line.size() - 2));
  // KEEP(section-replaced): a repeated header starts an empty section; nothing is merged.
  std::unique_ptr<Section> &section = sections_[name];
  section = std::make_unique<Section>(name);
  LOG_TRACE("Created section: %s", name.c_str());
  return section.get();
}

std::vector<std::string> IniFile::getSectionNames() const {
  return keysOf(sections_);
}

Section *IniFile::getSection(const std::string &name) const {
  const auto found = sections_.find(name);
  return found == sections_.end() ? nullptr : found->second.get();
}
