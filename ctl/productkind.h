// The kind of component under which a product is installed.
#pragma once

#include <optional>
#include <string>

/// The kind of the products that have one of their own, the servers, the portal client and the command-line
/// component; none for the others, which are agents or support in a server. Codes are in "k" form.
std::optional<std::string> fixedKindOf(const std::string &product);

/// The kind of a product's own patches: "vema" for agents.
std::string kindOf(const std::string &product);
