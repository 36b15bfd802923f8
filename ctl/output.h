// Where a command writes: one JSON document, or plain text with at most two colours.
#pragma once

#include <string>

#include <nlohmann/json_fwd.hpp>

enum class ColorMode { Auto, Always, Never };

struct OutputOptions {
  bool json = false;
  ColorMode color = ColorMode::Auto;
};

/// Prints the document on standard output, indented, with a line end. Every string in it has passed jsonText.
void printDocument(const nlohmann::ordered_json &document);

/// Paints text red (errors) or yellow (warnings) where colours are wanted.
class Palette {
public:
  /// Colours for standard output: as the options say, and by itself only on a terminal without NO_COLOR.
  explicit Palette(const OutputOptions &options);
  std::string error(const std::string &text) const;
  std::string warning(const std::string &text) const;

private:
  bool colors_;
};
