#include "productkind.h"

#include <map>

std::optional<std::string> fixedKindOf(const std::string &product) {
  static const std::map<std::string, std::string> kinds = {
      {"kqa", "vems"}, {"kpt", "veps"}, {"kdk", "vepd"}, {"kzt", "vecm"}};
  const auto kind = kinds.find(product);
  return kind == kinds.end() ? std::nullopt : std::optional(kind->second);
}

std::string kindOf(const std::string &product) {
  return fixedKindOf(product).value_or("vema");
}
