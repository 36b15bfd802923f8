// INI files: named sections of entries, read whole, never written.
//
// The syntax is tolerant: no quoting, no escapes, no continuation; a line without "=" is an entry with an
// empty value, as in the command lists of a descriptor. Names are returned in byte-wise order, not in file
// order.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "nls.h"

/// One section: its trimmed name and its entries, by key. Keys are case-sensitive.
class Section {
public:
  explicit Section(const std::string &name) : name_(name) {}
  Section(const Section &other) = default; // GCOVR_EXCL_BR_LINE: exceptions alone
  Section &operator=(const Section &other) = default;
  virtual ~Section() = default;

  std::string getName() const { return name_; }
  /// All keys, in ascending byte-wise order.
  std::vector<std::string> getEntryNames() const;
  /// False, with `value` untouched, when there is no such key.
  bool getEntryValue(const std::string &key, std::string &value) const;
  /// Adds the entry or replaces its value.
  void writeEntry(const std::string &key, const std::string &value);

private:
  std::string name_;
  std::map<std::string, std::string> entries_;
};

class IniFile {
public:
  /// Stores the path; nothing is read before parse().
  explicit IniFile(const std::string &path) : path_(path) {}
  /// Copies every section.
  IniFile(const IniFile &other);
  IniFile &operator=(const IniFile &) = delete;
  virtual ~IniFile();

  /// A parsed file that the caller owns; null when it cannot be read (code 5, ERROR_INIFILE_CANT_READ, and
  /// ERROR_INIFILE_PARSE in the log).
  static IniFile *parseFile(const std::string &path, PatchError *err);

  /// Reads the file. False when it cannot be read (code 5). An entry before the first section is skipped: the
  /// result stays true, but the record then holds code 4, ERROR_INIFILE_PROP.
  bool parse(PatchError *err);

  /// All section names, in ascending byte-wise order.
  std::vector<std::string> getSectionNames() const;
  /// The section, owned by this object; null when there is none.
  Section *getSection(const std::string &name) const;

private:
  void parseLine(const std::string &line, Section *&current, PatchError *err);
  Section *openSection(const std::string &line);

  std::string path_;
  std::map<std::string, std::unique_ptr<Section>> sections_;
};
