#include "productkind.h"

#include "target.h"

std::optional<std::string> fixedKindOf(const std::string &product) {
  for (const Target &target : targets)
    if (target.ownCode != nullptr && product == std::string("k") + target.ownCode)
      return target.name;
  return std::nullopt;
}

std::string kindOf(const std::string &product) {
  return fixedKindOf(product).value_or("vema");
}
