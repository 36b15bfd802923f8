// A descriptor line for line, with the places of what the installer's parser keeps and of what it drops.
//
// It reads lines, sections and entries as that parser does, but forgets nothing: sections and keys that come
// again and lines that belong nowhere are all there.
#pragma once

#include <string>
#include <vector>

struct IniLine {
  std::size_t number; ///< from 1
  std::string raw;    ///< without the line end
  std::string text;   ///< trimmed
};

struct IniEntry {
  std::size_t line;
  std::string text; ///< the whole line, trimmed
  std::string key;
  std::string value;
  bool isCut; ///< it has a "="
};

struct IniSection {
  std::size_t line;
  std::string header; ///< the line, trimmed
  std::string name;   ///< as the installer makes it of the header
  std::vector<IniEntry> entries;

  bool isKnown() const; ///< to the installer
  bool isCommandList() const;
};

struct IniText {
  std::vector<IniLine> lines;
  std::vector<IniSection> sections; ///< in the order of the file
  std::vector<IniEntry> stray;      ///< entries before the first section
  bool hasNul = false;              ///< the installer reads up to the first NUL byte

  /// The sections that count: of several of one name the last one.
  std::vector<const IniSection *> effectiveSections() const;
  /// The one of this name that counts; null without one.
  const IniSection *section(const std::string &name) const;
};

IniText readIniText(const std::string &content);
